// The place of a field inside its object.
#pragma once

#include <cstdint>
#include <cstring>
#include <initializer_list>
#include <span>

#include "platform/types.h"

namespace vemo {

// A sequence of unsigned 32-bit steps, ordered lexicographically (a path before its continuations). Up to four steps
// lie in the object itself, longer paths on the heap; copying those may throw std::bad_alloc. A Path may be relocated
// as raw bytes: nothing in it points into it.
//
// Invariant: steps in the object behind the last one are 0, so that two paths that both lie in their objects compare as two
// pairs of steps each, and by their lengths where those are equal.
class Path {
 public:
  using Element = std::uint32_t;
  static constexpr std::uint32_t kInlineCapacity = 4;

  Path() noexcept : m_size(0), m_capacity(kInlineCapacity), m_inline{} {}
  Path(std::initializer_list<Element> elements) : Path(std::span<const Element>(elements.begin(), elements.size())) {}
  explicit Path(std::span<const Element> elements);
  Path(const Path& other) : m_size(other.m_size), m_capacity(kInlineCapacity), m_inline{} {
    if (other.IsOnHeap()) {
      CopyFromHeap(other);
    } else {
      std::memcpy(m_inline, other.m_inline, sizeof(m_inline));
    }
  }
  Path(Path&& other) noexcept : Path() { Take(other); }
  Path& operator=(const Path& other);
  Path& operator=(Path&& other) noexcept {
    if (this == &other) return *this;
    if (IsOnHeap()) delete[] m_heap;
    Take(other);
    return *this;
  }
  ~Path() {
    if (IsOnHeap()) delete[] m_heap;
  }

  std::span<const Element> elements() const noexcept { return {data(), m_size}; }
  std::uint32_t size() const noexcept { return m_size; }
  bool empty() const noexcept { return m_size == 0; }

  // Makes the path `size` elements long, for the caller to fill in; what it held stays where it does not grow beyond the
  // storage it has.
  std::span<Element> Resize(std::uint32_t size) {
    if (size > m_capacity) Grow(size);
    m_size = size;
    if (!IsOnHeap()) {
      for (std::uint32_t i = size; i < kInlineCapacity; ++i) m_inline[i] = 0;
    }
    return {data(), m_size};
  }

  // -1, 0 or 1 as `a` is before, equal to or behind `b`.
  static int Compare(const Path& a, const Path& b) noexcept {
    if (a.IsOnHeap() || b.IsOnHeap()) [[unlikely]] return CompareElements(a, b);
    for (std::uint32_t i = 0; i < kInlineCapacity; i += 2) {
      const std::uint64_t x = a.InlinePair(i), y = b.InlinePair(i);
      if (x != y) return x < y ? -1 : 1;
    }
    return a.m_size == b.m_size ? 0 : a.m_size < b.m_size ? -1 : 1;
  }
  friend bool operator==(const Path& a, const Path& b) noexcept { return Compare(a, b) == 0; }
  friend bool operator<(const Path& a, const Path& b) noexcept { return Compare(a, b) < 0; }

 private:
  // Two steps as one number, which orders as they do.
  std::uint64_t InlinePair(std::uint32_t i) const noexcept {
    return std::uint64_t{m_inline[i]} << 32 | m_inline[i + 1];
  }
  // Moves what `other` holds here, where nothing is held, and leaves it empty.
  void Take(Path& other) noexcept {
    m_size = other.m_size;
    m_capacity = other.m_capacity;
    std::memcpy(m_inline, other.m_inline, sizeof(m_inline));  // the steps, or the pointer to them
    other.m_size = 0;
    other.m_capacity = kInlineCapacity;
    std::memset(other.m_inline, 0, sizeof(other.m_inline));
  }
  void Grow(std::uint32_t size);
  static int CompareElements(const Path& a, const Path& b) noexcept;
  void CopyFromHeap(const Path& other);
  bool IsOnHeap() const noexcept { return m_capacity > kInlineCapacity; }
  const Element* data() const noexcept { return IsOnHeap() ? m_heap : m_inline; }
  Element* data() noexcept { return IsOnHeap() ? m_heap : m_inline; }

  std::uint32_t m_size;
  std::uint32_t m_capacity;
  union {
    Element m_inline[kInlineCapacity];
    Element* m_heap;
  };
};

}  // namespace vemo
