// A set of object ids that takes about one bit for each id of the ranges that it holds.
//
// Ids are handed out in sequence, so those of a space lie close together, and a set of all of them is a bitmap with few
// holes. The bitmap is cut into chunks that are found by a hash table: an id far off, such as a damaged reference names, costs
// one chunk and not the distance.
//
// Threads: one at a time; constant functions may run beside one another.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <unordered_map>
#include <utility>

#include "platform/oid.h"

namespace vemo {

class IdSet {
 public:
  // The ids that share a chunk, of which the first is a multiple of this: 512 bytes of bits.
  static constexpr std::uint64_t kIdsPerChunk = 4'096;

  // Returns whether the id was not in the set. Constant time; throws std::bad_alloc, which leaves the set as it was.
  bool Insert(OID oid);
  // Returns whether the id was in the set. A chunk without ids gives its memory back.
  bool Erase(OID oid) noexcept;
  bool Contains(OID oid) const noexcept;

  std::size_t size() const noexcept { return m_size; }
  bool empty() const noexcept { return m_size == 0; }
  void clear() noexcept;
  void swap(IdSet& other) noexcept;

  // What the set takes on the heap: chunks, and what the hash table takes for each.
  std::size_t MemoryBytes() const noexcept;

 private:
  static constexpr std::size_t WordOf(OID oid) noexcept {
    return static_cast<std::size_t>(oid.m_value % kIdsPerChunk / 64);
  }
  static constexpr std::uint64_t BitOf(OID oid) noexcept { return std::uint64_t{1} << oid.m_value % 64; }

  struct Chunk {
    std::array<std::uint64_t, kIdsPerChunk / 64> words{};
    std::uint32_t count = 0;
  };

  std::unordered_map<std::uint64_t, Chunk> m_chunks;  // by id / kIdsPerChunk
  std::size_t m_size = 0;
};

inline bool IdSet::Insert(OID oid) {
  Chunk& chunk = m_chunks[oid.m_value / kIdsPerChunk];
  std::uint64_t& word = chunk.words[WordOf(oid)];
  if ((word & BitOf(oid)) != 0) return false;
  word |= BitOf(oid);
  ++chunk.count;
  ++m_size;
  return true;
}

inline bool IdSet::Erase(OID oid) noexcept {
  const auto found = m_chunks.find(oid.m_value / kIdsPerChunk);
  if (found == m_chunks.end()) return false;
  std::uint64_t& word = found->second.words[WordOf(oid)];
  if ((word & BitOf(oid)) == 0) return false;
  word &= ~BitOf(oid);
  --m_size;
  if (--found->second.count == 0) m_chunks.erase(found);
  return true;
}

inline bool IdSet::Contains(OID oid) const noexcept {
  const auto found = m_chunks.find(oid.m_value / kIdsPerChunk);
  return found != m_chunks.end() && (found->second.words[WordOf(oid)] & BitOf(oid)) != 0;
}

inline void IdSet::clear() noexcept {
  m_chunks.clear();
  m_size = 0;
}

inline void IdSet::swap(IdSet& other) noexcept {
  m_chunks.swap(other.m_chunks);
  std::swap(m_size, other.m_size);
}

inline std::size_t IdSet::MemoryBytes() const noexcept {
  // A node of the table holds its link and the allocator's word beside the pair.
  constexpr std::size_t kNodeBytes = sizeof(std::pair<const std::uint64_t, Chunk>) + 2 * sizeof(void*);
  return m_chunks.size() * kNodeBytes + m_chunks.bucket_count() * sizeof(void*);
}

}  // namespace vemo
