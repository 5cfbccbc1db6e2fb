// The variable-length form of unsigned integers.
//
// The number of leading one bits of the first byte is the number of bytes that follow (a prefix code, so that the
// length is known after one byte and decoding needs no loop over continuation bits); the value lies big-endian in the
// remaining bits:
//
//   0xxxxxxx                                     7 bits
//   10xxxxxx + 1 byte                           14 bits
//   110xxxxx + 2 bytes                          21 bits
//   1110xxxx + 3 bytes                          28 bits
//   11110xxx + 4 bytes                          35 bits (a 32-bit value has xxx = 000)
//   ... up to 11111111 + 8 bytes                64 bits
//
// Writers use the shortest form.
#pragma once

#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>

namespace vemo {

inline constexpr std::size_t MAX_VARIABLE_LENGTH_UINT_SIZE = 5;
inline constexpr std::size_t kMaxVariableLengthUint64Bytes = 9;

// Writes `value` at `p` (1 to 5 bytes) and returns the pointer after it.
inline std::uint8_t* SerialiseVariableLengthUint32(std::uint8_t* p, std::uint32_t value) noexcept {
  if (value < 0x80u) {
    *p++ = static_cast<std::uint8_t>(value);
  } else if (value < 0x4000u) {
    *p++ = static_cast<std::uint8_t>(0x80u | value >> 8);
    *p++ = static_cast<std::uint8_t>(value);
  } else if (value < 0x200000u) {
    *p++ = static_cast<std::uint8_t>(0xC0u | value >> 16);
    *p++ = static_cast<std::uint8_t>(value >> 8);
    *p++ = static_cast<std::uint8_t>(value);
  } else if (value < 0x10000000u) {
    *p++ = static_cast<std::uint8_t>(0xE0u | value >> 24);
    *p++ = static_cast<std::uint8_t>(value >> 16);
    *p++ = static_cast<std::uint8_t>(value >> 8);
    *p++ = static_cast<std::uint8_t>(value);
  } else {
    *p++ = 0xF0u;
    *p++ = static_cast<std::uint8_t>(value >> 24);
    *p++ = static_cast<std::uint8_t>(value >> 16);
    *p++ = static_cast<std::uint8_t>(value >> 8);
    *p++ = static_cast<std::uint8_t>(value);
  }
  return p;
}

// What a form of three bytes and more needs: returned together, so that the value of a short one never has to lie in memory.
struct LongNumber {
  const std::uint8_t* end;
  std::uint32_t value;
};
LongNumber DeserialiseLongVariableLengthUint32(const std::uint8_t* p) noexcept;

// Reads at `p` and returns the pointer after the value. Trusts its input: at least the bytes that the first one
// announces must be readable. Inlined always: reading a record is little else.
[[gnu::always_inline]] inline const std::uint8_t* DeserialiseVariableLengthUint32(const std::uint8_t* p,
                                                                                  std::uint32_t& value) noexcept {
  const std::uint32_t first = p[0];
  if (first < 0x80u) {
    value = first;
    return p + 1;
  }
  if (first < 0xC0u) {
    value = (first & 0x3Fu) << 8 | p[1];
    return p + 2;
  }
  const LongNumber number = DeserialiseLongVariableLengthUint32(p);
  value = number.value;
  return number.end;
}

// What a value above 32 bits, or a form of five bytes and more, needs.
std::uint8_t* SerialiseLongVariableLengthUint64(std::uint8_t* p, std::uint64_t value) noexcept;
const std::uint8_t* DeserialiseLongVariableLengthUint64(const std::uint8_t* p, std::uint64_t& value) noexcept;

// The same form for 64-bit values: 1 to 9 bytes.
inline std::uint8_t* SerialiseVariableLengthUint64(std::uint8_t* p, std::uint64_t value) noexcept {
  if (value <= 0xFFFFFFFFu) return SerialiseVariableLengthUint32(p, static_cast<std::uint32_t>(value));
  return SerialiseLongVariableLengthUint64(p, value);
}
inline const std::uint8_t* DeserialiseVariableLengthUint64(const std::uint8_t* p, std::uint64_t& value) noexcept {
  if (*p >= 0xF0u) return DeserialiseLongVariableLengthUint64(p, value);
  std::uint32_t low = 0;
  p = DeserialiseVariableLengthUint32(p, low);
  value = low;
  return p;
}

// The length in bytes of the form whose first byte is `first`: 1 to 9.
inline std::size_t VariableLengthBytes(std::uint8_t first) noexcept {
  return 1u + static_cast<std::size_t>(std::countl_one(first));
}

// The value of the form of `length` bytes at `p`, where nine bytes can be read whatever its length: without a branch for each.
inline std::uint64_t DeserialiseVariableLengthUint64FromNine(const std::uint8_t* p, std::size_t length) noexcept {
  std::uint64_t form;
  std::memcpy(&form, length > sizeof(form) ? p + 1 : p, sizeof(form));
  form = __builtin_bswap64(form);
  if (length > sizeof(form)) return form;
  // Behind as many leading bits as the form has bytes come 7 bits of the value for each.
  return form << length >> (64 - 7 * length);
}

}  // namespace vemo
