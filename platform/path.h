// The place of a field inside its object.
#pragma once

#include <algorithm>
#include <cstdint>
#include <initializer_list>
#include <span>

#include "platform/types.h"

namespace vemo {

// A sequence of unsigned 32-bit steps, ordered lexicographically (a path before its continuations). Up to four steps
// lie in the object itself, longer paths on the heap; copying those may throw std::bad_alloc. A Path may be relocated
// as raw bytes: nothing in it points into it.
class Path {
 public:
  using Element = std::uint32_t;
  static constexpr std::uint32_t kInlineCapacity = 4;

  Path() noexcept : m_size(0), m_capacity(kInlineCapacity), m_inline{} {}
  Path(std::initializer_list<Element> elements) : Path(std::span<const Element>(elements.begin(), elements.size())) {}
  explicit Path(std::span<const Element> elements);
  Path(const Path& other) : Path(other.elements()) {}
  Path(Path&& other) noexcept;
  Path& operator=(const Path& other);
  Path& operator=(Path&& other) noexcept;
  ~Path() {
    if (IsOnHeap()) delete[] m_heap;
  }

  std::span<const Element> elements() const noexcept { return {data(), m_size}; }
  std::uint32_t size() const noexcept { return m_size; }
  bool empty() const noexcept { return m_size == 0; }

  // Makes the path `size` elements long, for the caller to fill in; what it held stays where it does not grow beyond the
  // storage it has.
  std::span<Element> Resize(std::uint32_t size);

  friend bool operator==(const Path& a, const Path& b) noexcept {
    return a.m_size == b.m_size && std::equal(a.data(), a.data() + a.m_size, b.data());
  }
  friend bool operator<(const Path& a, const Path& b) noexcept {
    return std::lexicographical_compare(a.data(), a.data() + a.m_size, b.data(), b.data() + b.m_size);
  }

 private:
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
