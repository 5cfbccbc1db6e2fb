// An owning, contiguous, growable byte buffer.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>

#include "platform/types.h"

namespace vemo {

// Up to kInlineBytes bytes lie in the object itself, more on the heap. The bytes are aligned to kAlignment and move when the
// buffer grows and when it is relocated, which may be done as raw bytes: nothing in it points into it. The capacity follows
// one rule of growth wherever the bytes lie, so it can be more than kInlineBytes before there is memory on the heap: reserve
// makes sure of what it names. Allocation failure throws std::bad_alloc and leaves the buffer as it was.
class VectorOfByte {
 public:
  // Two intervals: most vectors have few runs of tombstones, and reading a record is then free of allocations.
  static constexpr ssize_t kInlineBytes = 32;
  static constexpr std::size_t kAlignment = 8;

  VectorOfByte() noexcept : m_inline{} {}
  ~VectorOfByte() {
    if (m_onHeap) FreeHeap();
  }
  VectorOfByte(const VectorOfByte&) = delete;
  VectorOfByte& operator=(const VectorOfByte&) = delete;

  std::byte* data() noexcept { return m_onHeap ? m_heap.data : m_inline; }
  const std::byte* data() const noexcept { return m_onHeap ? m_heap.data : m_inline; }
  ssize_t size() const noexcept { return m_onHeap ? m_heap.size : m_inlineSize; }
  ssize_t capacity() const noexcept { return m_onHeap ? m_heap.capacity : m_inlineCapacity; }

  // Sets the size to 0 and keeps the capacity.
  void clear() noexcept { SetSize(0); }

  // Makes the capacity `capacity` bytes where it is smaller; filling up to `capacity` bytes does not throw from then on.
  void reserve(ssize_t capacity) {
    if (m_onHeap || capacity > kInlineBytes) {
      ReserveOnHeap(capacity);
    } else if (capacity > m_inlineCapacity) {
      m_inlineCapacity = static_cast<std::uint8_t>(capacity);
    }
  }

  // Replaces the contents by those of `other`, another buffer. The capacity grows to the exact need; a failed allocation
  // leaves the buffer empty.
  void assign(const VectorOfByte& other) {
    if (m_onHeap || other.m_onHeap) return AssignSlowly(other);
    std::memcpy(m_inline, other.m_inline, sizeof(m_inline));  // all of it: a constant count is copied without a call
    m_inlineSize = other.m_inlineSize;
    if (m_inlineCapacity < m_inlineSize) m_inlineCapacity = m_inlineSize;
  }

  // Opens a gap of `count` bytes at `position` (0..size()) and returns its start; null in a buffer without capacity. Needs
  // no more than the exact capacity.
  std::byte* insertbytes(ssize_t position, ssize_t count);

  // Appends `count` bytes and returns their start. A buffer that is too small grows to the needed size plus its old
  // capacity, so that appending costs amortised constant time.
  std::byte* appendbytes(ssize_t count) {
    if (m_onHeap || m_inlineSize + count > kInlineBytes) return AppendOnHeap(count);
    std::byte* const appended = m_inline + m_inlineSize;
    m_inlineSize = static_cast<std::uint8_t>(m_inlineSize + count);
    if (m_inlineCapacity < m_inlineSize) m_inlineCapacity = static_cast<std::uint8_t>(m_inlineCapacity + m_inlineSize);
    return appended;
  }

  // Removes the bytes [position, position + count).
  void erasebytes(ssize_t position, ssize_t count) noexcept;

  // Exchanges contents and capacities.
  void swap(VectorOfByte& other) noexcept;

 private:
  struct Heap {
    std::byte* data;
    ssize_t size;
    ssize_t capacity;
  };

  void SetSize(ssize_t size) noexcept {
    if (m_onHeap) {
      m_heap.size = size;
    } else {
      m_inlineSize = static_cast<std::uint8_t>(size);
    }
  }
  void AssignSlowly(const VectorOfByte& other);
  void ReserveOnHeap(ssize_t capacity);
  std::byte* AppendOnHeap(ssize_t count);
  void FreeHeap() noexcept;
  void MoveToHeap(ssize_t capacity);

  union {
    alignas(kAlignment) std::byte m_inline[kInlineBytes];
    Heap m_heap;
  };
  std::uint8_t m_inlineSize = 0;
  std::uint8_t m_inlineCapacity = 0;  // at most 2 * kInlineBytes by the rule of growth
  bool m_onHeap = false;
};

}  // namespace vemo
