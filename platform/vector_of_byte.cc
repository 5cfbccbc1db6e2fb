#include "platform/vector_of_byte.h"

#include <cstring>
#include <new>
#include <utility>

namespace vemo {

VectorOfByte::~VectorOfByte() { ::operator delete(m_data); }

void VectorOfByte::reserve(ssize_t capacity) {
  if (capacity <= m_capacity) return;
  auto* grown = static_cast<std::byte*>(::operator new(static_cast<std::size_t>(capacity)));
  if (m_size > 0) std::memcpy(grown, m_data, static_cast<std::size_t>(m_size));
  ::operator delete(m_data);
  m_data = grown;
  m_capacity = capacity;
}

std::byte* VectorOfByte::insertbytes(ssize_t position, ssize_t count) {
  reserve(m_size + count);
  if (m_data == nullptr) return nullptr;
  std::byte* gap = m_data + position;
  std::memmove(gap + count, gap, static_cast<std::size_t>(m_size - position));
  m_size += count;
  return gap;
}

std::byte* VectorOfByte::appendbytes(ssize_t count) {
  if (m_capacity < m_size + count) reserve(m_size + count + m_capacity);
  std::byte* end = m_data + m_size;
  m_size += count;
  return end;
}

void VectorOfByte::erasebytes(ssize_t position, ssize_t count) noexcept {
  if (count == 0) return;
  std::byte* gap = m_data + position;
  std::memmove(gap, gap + count, static_cast<std::size_t>(m_size - position - count));
  m_size -= count;
}

void VectorOfByte::swap(VectorOfByte& other) noexcept {
  std::swap(m_data, other.m_data);
  std::swap(m_size, other.m_size);
  std::swap(m_capacity, other.m_capacity);
}

}  // namespace vemo
