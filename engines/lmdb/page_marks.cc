#include "engines/lmdb/page_marks.h"

#include <memory>

namespace vemo {

PageMarks::~PageMarks() {
  for (const std::atomic<Chunk*>& chunk : m_chunks) delete chunk.load(std::memory_order_relaxed);
}

PageMarks::Chunk& PageMarks::ChunkOf(PageNumber page) {
  std::atomic<Chunk*>& place = m_chunks[page / kPagesInChunk];
  Chunk* chunk = place.load(std::memory_order_acquire);
  if (chunk != nullptr) return *chunk;
  auto made = std::make_unique<Chunk>();
  if (place.compare_exchange_strong(chunk, made.get(), std::memory_order_acq_rel)) return *made.release();
  return *chunk;  // of another thread
}

bool PageMarks::Set(PageNumber page, std::uint64_t place) {
  std::uint64_t marked = 0;
  return ChunkOf(page)[page % kPagesInChunk].compare_exchange_strong(marked, place, std::memory_order_relaxed) ||
         marked == place;
}

}  // namespace vemo
