#include "platform/guid.h"

#include "platform/error.h"

namespace vemo {

namespace {

constexpr char kHexDigits[] = "0123456789abcdef";

bool IsDashBefore(std::size_t byte) { return byte == 4 || byte == 6 || byte == 8 || byte == 10; }

int HexValue(char c) {
  if ('0' <= c && c <= '9') return c - '0';
  if ('a' <= c && c <= 'f') return c - 'a' + 10;
  if ('A' <= c && c <= 'F') return c - 'A' + 10;
  return -1;
}

}  // namespace

std::array<std::uint8_t, 16> GuidToNetworkBytes(const Guid& guid) {
  std::array<std::uint8_t, 16> bytes{};
  for (int i = 0; i < 4; ++i) bytes[i] = static_cast<std::uint8_t>(guid.Data1 >> (24 - 8 * i));
  for (int i = 0; i < 2; ++i) bytes[4 + i] = static_cast<std::uint8_t>(guid.Data2 >> (8 - 8 * i));
  for (int i = 0; i < 2; ++i) bytes[6 + i] = static_cast<std::uint8_t>(guid.Data3 >> (8 - 8 * i));
  for (int i = 0; i < 8; ++i) bytes[8 + i] = guid.Data4[i];
  return bytes;
}

Guid GuidFromNetworkBytes(const std::array<std::uint8_t, 16>& bytes) {
  Guid guid;
  for (int i = 0; i < 4; ++i) guid.Data1 = guid.Data1 << 8 | bytes[i];
  guid.Data2 = static_cast<std::uint16_t>(bytes[4] << 8 | bytes[5]);
  guid.Data3 = static_cast<std::uint16_t>(bytes[6] << 8 | bytes[7]);
  for (int i = 0; i < 8; ++i) guid.Data4[i] = bytes[8 + i];
  return guid;
}

std::string GuidText(const Guid& guid) {
  const auto bytes = GuidToNetworkBytes(guid);
  std::string text;
  text.reserve(36);
  for (std::size_t i = 0; i < bytes.size(); ++i) {
    if (IsDashBefore(i)) text.push_back('-');
    text.push_back(kHexDigits[bytes[i] >> 4]);
    text.push_back(kHexDigits[bytes[i] & 15]);
  }
  return text;
}

xostream& operator<<(xostream& os, const Guid& guid) { return os.put(GuidText(guid)); }

Guid ParseGuid(std::string_view text) {
  std::array<std::uint8_t, 16> bytes{};
  std::size_t at = 0;
  bool good = text.size() == 36;
  for (std::size_t i = 0; good && i < bytes.size(); ++i) {
    if (IsDashBefore(i)) good = text[at++] == '-';
    const int high = HexValue(text[at]), low = HexValue(text[at + 1]);
    good = good && high >= 0 && low >= 0;
    bytes[i] = static_cast<std::uint8_t>(high << 4 | low);
    at += 2;
  }
  if (!good) throw UsageError("\"" + std::string(text) + "\" is not a Guid of the form 01234567-89ab-cdef-0123-456789abcdef");
  return GuidFromNetworkBytes(bytes);
}

}  // namespace vemo
