// An owning, contiguous, growable byte buffer.
#pragma once

#include <cstddef>

#include "platform/types.h"

namespace vemo {

// The bytes are aligned for any scalar type and move when the capacity grows. The object itself may be relocated as raw
// bytes: nothing in it points into it. Allocation failure throws std::bad_alloc and leaves the buffer as it was.
class VectorOfByte {
 public:
  VectorOfByte() noexcept = default;
  ~VectorOfByte();
  VectorOfByte(const VectorOfByte&) = delete;
  VectorOfByte& operator=(const VectorOfByte&) = delete;

  std::byte* data() noexcept { return m_data; }
  const std::byte* data() const noexcept { return m_data; }
  ssize_t size() const noexcept { return m_size; }
  ssize_t capacity() const noexcept { return m_capacity; }

  // Sets the size to 0 and keeps the capacity.
  void clear() noexcept { m_size = 0; }

  // Makes the capacity `capacity` bytes where it is smaller.
  void reserve(ssize_t capacity);

  // Opens a gap of `count` bytes at `position` (0..size()) and returns its start; null where nothing is stored. Needs
  // no more than the exact capacity.
  std::byte* insertbytes(ssize_t position, ssize_t count);

  // Appends `count` bytes and returns their start. A buffer that is too small grows to the needed size plus its old
  // capacity, so that appending costs amortised constant time.
  std::byte* appendbytes(ssize_t count);

  // Removes the bytes [position, position + count).
  void erasebytes(ssize_t position, ssize_t count) noexcept;

  // Exchanges contents and capacities.
  void swap(VectorOfByte& other) noexcept;

 private:
  std::byte* m_data = nullptr;
  ssize_t m_size = 0;
  ssize_t m_capacity = 0;
};

}  // namespace vemo
