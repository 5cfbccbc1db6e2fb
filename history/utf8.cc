#include "history/utf8.h"

#include <cstdint>

#include "platform/error.h"

namespace vemo {

namespace {

// What a first byte announces: the length of the code point, its topmost bits, and the smallest number that
// needs this length.
struct Lead {
  std::size_t length;
  std::uint32_t bits;
  std::uint32_t smallest;
};

Lead ReadLead(unsigned char byte, std::size_t offset) {
  if (byte < 0x80) return {1, byte, 0};
  if ((byte & 0xe0) == 0xc0) return {2, byte & 0x1fu, 0x80};
  if ((byte & 0xf0) == 0xe0) return {3, byte & 0x0fu, 0x800};
  if ((byte & 0xf8) == 0xf0) return {4, byte & 0x07u, 0x10000};
  throw MalformedBytes(offset, "this byte cannot start a UTF-8 character");
}

// The length in bytes of the code point at `offset`.
std::size_t CodePointLength(std::string_view text, std::size_t offset) {
  const Lead lead = ReadLead(static_cast<unsigned char>(text[offset]), offset);
  std::uint32_t value = lead.bits;
  for (std::size_t i = 1; i < lead.length; ++i) {
    if (offset + i == text.size()) throw MalformedBytes(offset, "the text ends inside a UTF-8 character");
    const auto byte = static_cast<unsigned char>(text[offset + i]);
    if ((byte & 0xc0) != 0x80) throw MalformedBytes(offset, "a UTF-8 character is cut off");
    value = value << 6 | (byte & 0x3fu);
  }
  if (value < lead.smallest) throw MalformedBytes(offset, "a UTF-8 character is longer than it has to be");
  if (0xd800 <= value && value <= 0xdfff) throw MalformedBytes(offset, "a surrogate is not a character");
  if (value > 0x10ffff) throw MalformedBytes(offset, "a character past U+10FFFF");
  return lead.length;
}

}  // namespace

std::size_t CountCodePoints(std::string_view text) {
  std::size_t count = 0;
  for (std::size_t offset = 0; offset < text.size(); ++count) offset += CodePointLength(text, offset);
  return count;
}

void SplitCodePoints(std::string_view text, std::vector<std::string_view>& codePoints) {
  codePoints.clear();
  for (std::size_t offset = 0; offset < text.size();) {
    const std::size_t length = CodePointLength(text, offset);
    codePoints.push_back(text.substr(offset, length));
    offset += length;
  }
}

}  // namespace vemo
