// Moving objects as raw bytes.
//
// A map entry travels between slots by memmove: it is neither constructed at its new place nor destroyed at its old one,
// whose bytes count as raw storage afterwards. That is sound for types of which no part, and nothing that they own,
// holds the address of the object itself. Such a type says so by specialising kIsRelocatable beside its definition.
#pragma once

#include <array>
#include <cstddef>
#include <cstring>
#include <type_traits>
#include <utility>

#include "platform/field_id.h"
#include "platform/types.h"

namespace vemo {

template <class T>
inline constexpr bool kIsRelocatable = std::is_trivially_copyable_v<T>;
template <class T>
inline constexpr bool kIsRelocatable<const T> = kIsRelocatable<T>;
template <class First, class Second>
inline constexpr bool kIsRelocatable<std::pair<First, Second>> = kIsRelocatable<First> && kIsRelocatable<Second>;
template <>
inline constexpr bool kIsRelocatable<Path> = true;
template <>
inline constexpr bool kIsRelocatable<FieldId> = true;

// Moves `count` objects from consecutive places to consecutive places; the ranges may overlap.
template <class T>
void Relocate(T* destination, const T* source, ssize_t count) noexcept {
  static_assert(kIsRelocatable<T>);
  if (count > 0) {
    std::memmove(static_cast<void*>(destination), static_cast<const void*>(source),
                 static_cast<std::size_t>(count) * sizeof(T));
  }
}

// Exchanges two byte ranges that do not overlap.
inline void memswap(void* a, void* b, std::size_t bytes) noexcept {
  auto* x = static_cast<std::byte*>(a);
  auto* y = static_cast<std::byte*>(b);
  std::array<std::byte, 64> piece;
  while (bytes > 0) {
    const std::size_t n = bytes < piece.size() ? bytes : piece.size();
    std::memcpy(piece.data(), x, n);
    std::memcpy(x, y, n);
    std::memcpy(y, piece.data(), n);
    x += n;
    y += n;
    bytes -= n;
  }
}

}  // namespace vemo
