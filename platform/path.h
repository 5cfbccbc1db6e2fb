// The place of a field inside its object.
#pragma once

#include <cstdint>
#include <cstring>
#include <initializer_list>
#include <span>

#include "platform/types.h"

namespace vemo {

// A sequence of unsigned 32-bit steps, ordered lexicographically (a path before its continuations). Up to three steps
// lie in the object itself, longer paths on the heap; copying those may throw std::bad_alloc. A Path may be relocated
// as raw bytes: nothing in it points into it. 16 bytes: keys are compared all the time, and small ones share cache lines.
//
// Invariant: steps in the object behind the last one are 0, so that two paths that both lie in their objects compare step by
// step without a look at their lengths, and by their lengths where all steps are equal.
class Path {
 public:
  using Element = std::uint32_t;
  static constexpr std::uint32_t kInlineCapacity = 3;

  Path() noexcept = default;
  Path(std::initializer_list<Element> elements) : Path(std::span<const Element>(elements.begin(), elements.size())) {}
  explicit Path(std::span<const Element> elements);
  Path(const Path& other) { *this = other; }
  Path(Path&& other) noexcept { Take(other); }
  Path& operator=(const Path& other) {
    if (IsOnHeap() || other.IsOnHeap()) {
      AssignSlowly(other);
    } else {
      CopyBytes(other);
    }
    return *this;
  }
  Path& operator=(Path&& other) noexcept {
    if (this == &other) return *this;
    if (IsOnHeap()) delete[] Heap();
    Take(other);
    return *this;
  }
  ~Path() {
    if (IsOnHeap()) delete[] Heap();
  }

  std::span<const Element> elements() const noexcept { return {data(), m_size}; }
  std::uint32_t size() const noexcept { return m_size; }
  bool empty() const noexcept { return m_size == 0; }

  // Makes the path `size` elements long, for the caller to fill in; what it held stays where the size allows.
  std::span<Element> Resize(std::uint32_t size) {
    if (IsOnHeap() || size > kInlineCapacity) return ResizeOnHeap(size);
    if (size < m_size) {
      // Over all of them: of a loop from `size` on, compilers make a call.
      for (std::uint32_t i = 0; i < kInlineCapacity; ++i) m_inline[i] = i < size ? m_inline[i] : 0;
    }
    m_size = size;
    return {m_inline, size};
  }

  // -1, 0 or 1 as `a` is before, equal to or behind `b`.
  static int Compare(const Path& a, const Path& b) noexcept {
    if (a.IsOnHeap() || b.IsOnHeap()) [[unlikely]] return CompareElements(a, b);
    if (a.m_inline[0] != b.m_inline[0]) return a.m_inline[0] < b.m_inline[0] ? -1 : 1;
    const std::uint64_t x = a.LastPair(), y = b.LastPair();
    if (x != y) return x < y ? -1 : 1;
    return a.m_size == b.m_size ? 0 : a.m_size < b.m_size ? -1 : 1;
  }
  friend bool operator==(const Path& a, const Path& b) noexcept { return Compare(a, b) == 0; }
  friend bool operator<(const Path& a, const Path& b) noexcept { return Compare(a, b) < 0; }

 private:
  bool IsOnHeap() const noexcept { return m_size > kInlineCapacity; }
  const Element* data() const noexcept { return IsOnHeap() ? Heap() : m_inline; }
  // The second and third step as one number, which orders as they do.
  std::uint64_t LastPair() const noexcept { return std::uint64_t{m_inline[1]} << 32 | m_inline[2]; }

  // Where the steps of a long path lie.
  Element* Heap() const noexcept {
    Element* heap;
    std::memcpy(&heap, m_inline + 1, sizeof(heap));
    return heap;
  }
  void SetHeap(Element* heap) noexcept { std::memcpy(m_inline + 1, &heap, sizeof(heap)); }

  void CopyBytes(const Path& other) noexcept {
    m_size = other.m_size;
    std::memcpy(m_inline, other.m_inline, sizeof(m_inline));
  }
  // Moves what `other` holds here, where nothing is held, and leaves it empty.
  void Take(Path& other) noexcept {
    CopyBytes(other);
    other.m_size = 0;
    std::memset(other.m_inline, 0, sizeof(other.m_inline));
  }
  void AssignSlowly(const Path& other);
  std::span<Element> ResizeOnHeap(std::uint32_t size);
  static int CompareElements(const Path& a, const Path& b) noexcept;

  std::uint32_t m_size = 0;
  Element m_inline[kInlineCapacity] = {};  // on the heap: the capacity, and the pointer in the other two
};
static_assert(sizeof(Path) == 16);

}  // namespace vemo
