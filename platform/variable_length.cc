#include "platform/variable_length.h"

#include <bit>

namespace vemo {

std::uint8_t* SerialiseLongVariableLengthUint64(std::uint8_t* p, std::uint64_t value) noexcept {
  const auto bits = static_cast<unsigned>(std::bit_width(value));
  const unsigned following = bits > 56 ? 8 : bits <= 7 ? 0 : (bits - 1) / 7;
  const unsigned prefix = 0xFF00u >> following & 0xFFu;
  const std::uint64_t top = following >= 8 ? 0 : value >> (8 * following);
  *p++ = static_cast<std::uint8_t>(prefix | top);
  for (unsigned i = following; i-- > 0;) *p++ = static_cast<std::uint8_t>(value >> (8 * i));
  return p;
}

LongNumber DeserialiseLongVariableLengthUint32(const std::uint8_t* p) noexcept {
  const std::uint32_t first = p[0];
  if (first < 0xE0u) return {p + 3, (first & 0x1Fu) << 16 | std::uint32_t{p[1]} << 8 | p[2]};
  if (first < 0xF0u) return {p + 4, (first & 0x0Fu) << 24 | std::uint32_t{p[1]} << 16 | std::uint32_t{p[2]} << 8 | p[3]};
  return {p + 5, std::uint32_t{p[1]} << 24 | std::uint32_t{p[2]} << 16 | std::uint32_t{p[3]} << 8 | p[4]};
}

const std::uint8_t* DeserialiseLongVariableLengthUint64(const std::uint8_t* p, std::uint64_t& value) noexcept {
  if (*p == 0xFF) [[likely]] {  // most ids of 64 bits are drawn at random
    value = DeserialiseVariableLengthUint64FromNine(p, 9);
    return p + 9;
  }
  const std::size_t following = VariableLengthBytes(*p) - 1;
  std::uint64_t x = following >= 7 ? 0 : *p & (0x7Fu >> following);
  for (std::size_t i = 1; i <= following; ++i) x = x << 8 | p[i];
  value = x;
  return p + 1 + following;
}

}  // namespace vemo
