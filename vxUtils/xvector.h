// A vector of plain values that lie back to back in a byte buffer.
#pragma once

#include <cstddef>
#include <cstring>
#include <type_traits>

#include "platform/assertion.h"
#include "platform/types.h"
#include "platform/vector_of_byte.h"

namespace vemo {

// True when the elements of [first, last) equal those that begin at `other`; stops at the first pair that
// differs.
template <class T>
bool IsEqual(const T* first, const T* last, const T* other) {
  for (; first != last; ++first, ++other) {
    if (!(*first == *other)) return false;
  }
  return true;
}

// Positions and counts are in elements. Whatever makes the vector grow may throw std::bad_alloc, which leaves
// the elements as they were unless the operation says otherwise, and ends pointers to elements. The object
// may be relocated as raw bytes: nothing in it points into it.
template <class T>
class xvector {
 public:
  static_assert(std::is_trivially_copyable_v<T>, "elements are moved and dropped as raw bytes");
  static_assert(alignof(T) <= VectorOfByte::kAlignment);

  using value_type = T;

  xvector() noexcept = default;
  xvector(const xvector& other) : xvector() { *this = other; }
  xvector(xvector&& other) noexcept { swap(other); }
  // Leaves the vector empty when the copy cannot be allocated.
  xvector& operator=(const xvector& other) {
    if (this != &other) m_buffer.assign(other.m_buffer);
    return *this;
  }
  // Leaves `other` with what this vector held.
  xvector& operator=(xvector&& other) noexcept {
    swap(other);
    return *this;
  }
  ~xvector() = default;

  ssize_t size() const noexcept { return m_buffer.size() / kElementBytes; }
  bool empty() const noexcept { return m_buffer.size() == 0; }

  T* data() noexcept { return reinterpret_cast<T*>(m_buffer.data()); }
  const T* data() const noexcept { return reinterpret_cast<const T*>(m_buffer.data()); }
  T* data_end() noexcept { return data() + size(); }
  const T* data_end() const noexcept { return data() + size(); }
  T* begin() noexcept { return data(); }
  const T* begin() const noexcept { return data(); }
  T* end() noexcept { return data_end(); }
  const T* end() const noexcept { return data_end(); }

  T& operator[](ssize_t i) {
    VEMO_ASSERT(0 <= i && i < size());
    return data()[i];
  }
  const T& operator[](ssize_t i) const {
    VEMO_ASSERT(0 <= i && i < size());
    return data()[i];
  }

  // Makes room for `count` further elements; growing follows the rule of push_back, so that calling this
  // before every insertion costs amortised constant time. What then fits does not throw.
  void ReserveMore(ssize_t count) {
    const ssize_t needed = m_buffer.size() + count * kElementBytes;
    m_buffer.reserve(m_buffer.capacity() < needed ? needed + m_buffer.capacity() : needed);
  }

  // Appends a copy. A full buffer grows to the needed size plus its old capacity. `element` may lie in this
  // vector.
  void push_back(const T& element) {
    const T copy = element;
    std::memcpy(m_buffer.appendbytes(kElementBytes), &copy, sizeof(T));
  }

  // Appends `count` elements for the caller to fill in, and returns the first. Grows as push_back does.
  T* AppendRaw(ssize_t count) { return reinterpret_cast<T*>(m_buffer.appendbytes(count * kElementBytes)); }

  // Replaces the contents by copies of [first, last), which must not lie in this vector. Leaves the vector
  // empty when it cannot be allocated.
  void assign(const T* first, const T* last) {
    clear();
    std::byte* gap = m_buffer.insertbytes(0, (last - first) * kElementBytes);
    CopyElements(first, last, gap);
  }

  // Inserts a copy of `element`, which must not lie in this vector, before position `i` (0..size()).
  void insert(ssize_t i, const T& element) {
    ReserveMore(1);
    std::memcpy(m_buffer.insertbytes(i * kElementBytes, kElementBytes), &element, sizeof(T));
  }

  // Removes the elements [i, i + count).
  void erase(ssize_t i, ssize_t count) noexcept {
    m_buffer.erasebytes(i * kElementBytes, count * kElementBytes);
  }

  // Removes all elements and keeps the capacity.
  void clear() noexcept { m_buffer.clear(); }
  void erase() noexcept { clear(); }

  void swap(xvector& other) noexcept { m_buffer.swap(other.m_buffer); }

  // Same length and equal elements in the same order.
  bool _Eq(const xvector& other) const {
    return size() == other.size() && IsEqual(begin(), end(), other.begin());
  }
  friend bool operator==(const xvector& a, const xvector& b) { return a._Eq(b); }

  VectorOfByte m_buffer;

 private:
  static constexpr ssize_t kElementBytes = sizeof(T);

  static void CopyElements(const T* src1, const T* src2, std::byte* dst) {
    VEMO_ASSERT(src1 == src2 || dst != nullptr);
    if (src1 < src2) std::memcpy(dst, src1, static_cast<std::size_t>(src2 - src1) * sizeof(T));
  }
};

}  // namespace vemo
