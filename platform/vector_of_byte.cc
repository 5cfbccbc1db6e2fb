#include "platform/vector_of_byte.h"

#include <algorithm>
#include <cstring>
#include <new>

#include "platform/relocate.h"

namespace vemo {

void VectorOfByte::FreeHeap() noexcept { ::operator delete(m_heap.data); }

void VectorOfByte::MoveToHeap(ssize_t capacity) {
  auto* grown = static_cast<std::byte*>(::operator new(static_cast<std::size_t>(capacity)));
  const ssize_t bytes = size();
  if (bytes > 0) std::memcpy(grown, data(), static_cast<std::size_t>(bytes));
  if (m_onHeap) FreeHeap();
  m_heap = {grown, bytes, capacity};
  m_onHeap = true;
}

void VectorOfByte::ReserveOnHeap(ssize_t wanted) {
  if (!m_onHeap || wanted > m_heap.capacity) MoveToHeap(std::max(wanted, capacity()));
}

void VectorOfByte::AssignSlowly(const VectorOfByte& other) {
  clear();
  std::byte* const copy = insertbytes(0, other.size());
  if (other.size() > 0) std::memcpy(copy, other.data(), static_cast<std::size_t>(other.size()));
}

std::byte* VectorOfByte::insertbytes(ssize_t position, ssize_t count) {
  const ssize_t old = size();
  reserve(old + count);
  if (capacity() == 0) return nullptr;
  std::byte* gap = data() + position;
  std::memmove(gap + count, gap, static_cast<std::size_t>(old - position));
  SetSize(old + count);
  return gap;
}

std::byte* VectorOfByte::AppendOnHeap(ssize_t count) {
  const ssize_t old = size();
  const ssize_t needed = old + count;
  ReserveOnHeap(capacity() < needed ? needed + capacity() : capacity());
  m_heap.size = needed;
  return m_heap.data + old;
}

void VectorOfByte::erasebytes(ssize_t position, ssize_t count) noexcept {
  if (count == 0) return;
  std::byte* gap = data() + position;
  std::memmove(gap, gap + count, static_cast<std::size_t>(size() - position - count));
  SetSize(size() - count);
}

void VectorOfByte::swap(VectorOfByte& other) noexcept {
  if (this != &other) memswap(this, &other, sizeof(*this));
}

}  // namespace vemo
