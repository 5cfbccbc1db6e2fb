// Numbers as keys whose bytewise order is the numbers' order.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>

namespace vemo {

using BigEndian64 = std::array<std::uint8_t, 8>;

inline BigEndian64 ToBigEndian(std::uint64_t value) noexcept {
  BigEndian64 bytes{};
  for (std::size_t i = bytes.size(); i-- > 0; value >>= 8) bytes[i] = static_cast<std::uint8_t>(value);
  return bytes;
}

// Reads the 8 bytes at `data`.
inline std::uint64_t FromBigEndian(const void* data) noexcept {
  const auto* bytes = static_cast<const std::uint8_t*>(data);
  std::uint64_t value = 0;
  for (std::size_t i = 0; i < sizeof(BigEndian64); ++i) value = value << 8 | bytes[i];
  return value;
}

}  // namespace vemo
