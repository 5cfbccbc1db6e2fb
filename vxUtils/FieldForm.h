// A field as it stands in a record, compared without being built.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>

namespace vemo {

// The bytes of a number in its shortest form order as numbers do, and no form begins another: paths are in the order of the
// bytes of their steps. `steps` points into the record, which must live as long.
struct FieldForm {
  std::uint64_t object = 0;
  std::uint64_t head = 0;  // the first eight bytes of the steps, big-endian, 0 behind the last
  const std::uint8_t* steps = nullptr;
  std::size_t bytes = 0;  // of all steps

  // As FieldId::Compare(a, b) < 0.
  static bool IsBefore(const FieldForm& a, const FieldForm& b) noexcept {
    if (a.object != b.object) return a.object < b.object;
    if (a.head != b.head) return a.head < b.head;
    if (a.bytes > sizeof(head) && b.bytes > sizeof(head)) [[unlikely]] return IsBeforeInSteps(a.steps, a.bytes, b.steps, b.bytes);
    return a.bytes < b.bytes;  // the one begins the other
  }

  // The head of up to seven bytes of steps, where eight can be read.
  static std::uint64_t HeadFromEight(const std::uint8_t* steps, std::size_t bytes) noexcept {
    std::uint64_t word;
    std::memcpy(&word, steps, sizeof(word));
    return __builtin_bswap64(word) & ~(UINT64_MAX >> (8 * bytes));
  }
  // The head of any steps.
  static std::uint64_t Head(const std::uint8_t* steps, std::size_t bytes) noexcept;

 private:
  static bool IsBeforeInSteps(const std::uint8_t* a, std::size_t aBytes, const std::uint8_t* b, std::size_t bBytes) noexcept;
};

}  // namespace vemo
