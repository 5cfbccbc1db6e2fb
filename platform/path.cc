#include "platform/path.h"

#include <algorithm>

namespace vemo {

Path::Path(std::span<const Element> elements) : Path() {
  std::ranges::copy(elements, Resize(static_cast<std::uint32_t>(elements.size())).begin());
}

Path& Path::operator=(const Path& other) {
  if (this != &other) std::ranges::copy(other.elements(), Resize(other.m_size).begin());
  return *this;
}

void Path::Grow(std::uint32_t size) {
  auto* grown = new Element[size];
  if (IsOnHeap()) delete[] m_heap;
  m_heap = grown;
  m_capacity = size;
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
