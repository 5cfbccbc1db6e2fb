#include "platform/path.h"

#include <algorithm>
#include <utility>

namespace vemo {

Path::Path(std::span<const Element> elements) : Path() {
  std::ranges::copy(elements, Resize(static_cast<std::uint32_t>(elements.size())).begin());
}

Path::Path(Path&& other) noexcept : Path() { *this = std::move(other); }

Path& Path::operator=(const Path& other) {
  if (this != &other) std::ranges::copy(other.elements(), Resize(other.m_size).begin());
  return *this;
}

Path& Path::operator=(Path&& other) noexcept {
  if (this == &other) return *this;
  if (IsOnHeap()) delete[] m_heap;
  m_size = std::exchange(other.m_size, 0);
  m_capacity = std::exchange(other.m_capacity, kInlineCapacity);
  if (IsOnHeap()) {
    m_heap = other.m_heap;
  } else {
    std::copy_n(other.m_inline, kInlineCapacity, m_inline);
  }
  std::fill_n(other.m_inline, kInlineCapacity, 0);
  return *this;
}

std::span<Path::Element> Path::Resize(std::uint32_t size) {
  if (size > m_capacity) {
    auto* grown = new Element[size];
    if (IsOnHeap()) delete[] m_heap;
    m_heap = grown;
    m_capacity = size;
  }
  m_size = size;
  if (!IsOnHeap()) std::fill(m_inline + size, m_inline + kInlineCapacity, 0);
  return {data(), m_size};
}

int Path::CompareElements(const Path& a, const Path& b) noexcept {
  const auto x = a.elements(), y = b.elements();
  if (std::ranges::equal(x, y)) return 0;
  return std::ranges::lexicographical_compare(x, y) ? -1 : 1;
}

// The copy takes no more room than it needs.
void Path::CopyFromHeap(const Path& other) {
  m_size = 0;
  std::ranges::copy(other.elements(), Resize(other.m_size).begin());
}

}  // namespace vemo
