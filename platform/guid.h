// 16-byte identifiers of sites.
#pragma once

#include <array>
#include <cstdint>
#include <cstring>
#include <string>
#include <string_view>

#include "platform/xostream.h"

namespace vemo {

struct Guid {
  std::uint32_t Data1 = 0;
  std::uint16_t Data2 = 0;
  std::uint16_t Data3 = 0;
  std::array<std::uint8_t, 8> Data4{};

  friend bool operator==(const Guid& a, const Guid& b) noexcept { return std::memcmp(&a, &b, sizeof(Guid)) == 0; }
};
static_assert(sizeof(Guid) == 16, "a Guid is written as it lies in memory");

inline constexpr Guid Guid_NULL{};

// The text form 01234567-89ab-cdef-0123-456789abcdef: Data1, Data2 and Data3 as numbers, then the bytes of Data4.
std::string GuidText(const Guid& guid);
xostream& operator<<(xostream& os, const Guid& guid);

// The 16 bytes in the order of RFC 4122 (network byte order), which is the order of the text form.
std::array<std::uint8_t, 16> GuidToNetworkBytes(const Guid& guid);
Guid GuidFromNetworkBytes(const std::array<std::uint8_t, 16>& bytes);

// Reads the text form, upper or lower case. Throws UsageError on anything else.
Guid ParseGuid(std::string_view text);

}  // namespace vemo
