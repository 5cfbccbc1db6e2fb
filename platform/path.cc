#include "platform/path.h"

#include <algorithm>

namespace vemo {

Path::Path(std::span<const Element> elements) {
  std::ranges::copy(elements, Resize(static_cast<std::uint32_t>(elements.size())).begin());
}

void Path::AssignSlowly(const Path& other) {
  if (this != &other) std::ranges::copy(other.elements(), Resize(other.m_size).begin());
}

// Either before or after, the path is a long one.
std::span<Path::Element> Path::ResizeOnHeap(std::uint32_t size) {
  if (size <= kInlineCapacity) {
    Element* const heap = Heap();
    std::fill(m_inline, m_inline + kInlineCapacity, 0);
    std::copy_n(heap, size, m_inline);
    delete[] heap;
    m_size = size;
    return {m_inline, size};
  }
  if (!IsOnHeap() || size > m_inline[0]) {
    auto* const grown = new Element[size];
    std::ranges::copy(elements(), grown);
    if (IsOnHeap()) delete[] Heap();
    SetHeap(grown);
    m_inline[0] = size;
  }
  m_size = size;
  return {Heap(), size};
}

int Path::CompareElements(const Path& a, const Path& b) noexcept {
  const auto x = a.elements(), y = b.elements();
  if (std::ranges::equal(x, y)) return 0;
  return std::ranges::lexicographical_compare(x, y) ? -1 : 1;
}

}  // namespace vemo
