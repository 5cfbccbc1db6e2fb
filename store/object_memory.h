// How much memory an object takes: itself, and what its keys and payloads have on the heap.
#pragma once

#include <algorithm>
#include <cstddef>
#include <functional>

#include "vxOperation/src/WorkingSet/CompOp/VectorOT.h"

namespace vemo {

// What an allocation of `bytes` takes from the heap, after the C library's malloc on 64 bits: a word of its own, and a
// multiple of 16 bytes of at least 32.
constexpr std::size_t HeapBytes(std::size_t bytes) noexcept {
  constexpr std::size_t kWord = 8, kUnit = 16, kLeast = 32;
  return bytes == 0 ? 0 : std::max(kLeast, (bytes + kWord + kUnit - 1) / kUnit * kUnit);
}

inline std::size_t HeapBytesOf(const FieldId& key) noexcept {
  return key.path.size() > Path::kInlineCapacity ? HeapBytes(key.path.size() * sizeof(Path::Element)) : 0;
}

// A short buffer lies in the object itself.
inline std::size_t HeapBytesOf(const VectorOfByte& buffer) noexcept {
  const std::less<const void*> before;
  const bool isInside = !before(buffer.data(), &buffer) && before(buffer.data(), &buffer + 1);
  return isInside ? 0 : HeapBytes(static_cast<std::size_t>(buffer.capacity()));
}

inline std::size_t HeapBytesOf(const VectorTombstones& tombstones) noexcept {
  return HeapBytesOf(tombstones.m_tombstones.m_buffer);
}

template <class T, class Base, bool owns>
std::size_t HeapBytesOf(const FrontLinkedList<T, Base, owns>& list) noexcept {
  return static_cast<std::size_t>(list.size()) * HeapBytes(sizeof(typename FrontLinkedList<T, Base, owns>::Node));
}

inline std::size_t HeapBytesOf(const VectorInsertions& insertions) noexcept { return HeapBytesOf(insertions.m_c); }

inline std::size_t HeapBytesOf(const VectorInsertionsAndDeletions& both) noexcept {
  return HeapBytesOf(both.m_insertions) + HeapBytesOf(both.m_deletions);
}

// Linear in the entries of a node and the records of its lists.
template <class Traits>
std::size_t MemoryBytesOf(const TFieldMap<Traits>*) noexcept {
  return HeapBytes(sizeof(typename Traits::Map));
}

template <class Traits>
std::size_t MemoryBytesOf(const TFieldMapInternalNode<Traits>* node) noexcept {
  std::size_t bytes = HeapBytes(sizeof(typename Traits::InternalNode));
  for (ssize_t i = 0; i < node->m_numKeyEntrys; ++i) bytes += HeapBytesOf(node->GetEntry(i).m_key);
  return bytes;
}

template <class Traits>
std::size_t MemoryBytesOf(const TFieldMapLeafNode<Traits>* leaf) noexcept {
  std::size_t bytes = HeapBytes(sizeof(typename Traits::LeafNode));
  for (ssize_t i = 0; i < leaf->m_numKeyEntrys; ++i) {
    bytes += HeapBytesOf(leaf->GetEntry(i).first) + HeapBytesOf(leaf->GetEntry(i).second);
  }
  return bytes;
}

}  // namespace vemo
