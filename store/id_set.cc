#include "store/id_set.h"

#include <utility>

namespace vemo {

namespace {

constexpr std::uint64_t ChunkOf(OID oid) noexcept { return oid.m_value / IdSet::kIdsPerChunk; }
constexpr std::size_t WordOf(OID oid) noexcept {
  return static_cast<std::size_t>(oid.m_value % IdSet::kIdsPerChunk / 64);
}
constexpr std::uint64_t BitOf(OID oid) noexcept { return std::uint64_t{1} << oid.m_value % 64; }

}  // namespace

bool IdSet::Insert(OID oid) {
  Chunk& chunk = m_chunks[ChunkOf(oid)];
  std::uint64_t& word = chunk.words[WordOf(oid)];
  if ((word & BitOf(oid)) != 0) return false;
  word |= BitOf(oid);
  ++chunk.count;
  ++m_size;
  return true;
}

bool IdSet::Erase(OID oid) noexcept {
  const auto found = m_chunks.find(ChunkOf(oid));
  if (found == m_chunks.end()) return false;
  std::uint64_t& word = found->second.words[WordOf(oid)];
  if ((word & BitOf(oid)) == 0) return false;
  word &= ~BitOf(oid);
  --m_size;
  if (--found->second.count == 0) m_chunks.erase(found);
  return true;
}

bool IdSet::Contains(OID oid) const noexcept {
  const auto found = m_chunks.find(ChunkOf(oid));
  return found != m_chunks.end() && (found->second.words[WordOf(oid)] & BitOf(oid)) != 0;
}

void IdSet::clear() noexcept {
  m_chunks.clear();
  m_size = 0;
}

void IdSet::swap(IdSet& other) noexcept {
  m_chunks.swap(other.m_chunks);
  std::swap(m_size, other.m_size);
}

std::size_t IdSet::MemoryBytes() const noexcept {
  // A node of the table holds its link and the allocator's word beside the pair.
  constexpr std::size_t kNodeBytes = sizeof(std::pair<const std::uint64_t, Chunk>) + 2 * sizeof(void*);
  return m_chunks.size() * kNodeBytes + m_chunks.bucket_count() * sizeof(void*);
}

}  // namespace vemo
