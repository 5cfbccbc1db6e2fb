// Which pages of a commit have been checked, and from where each is reached.
//
// 1. A mark is set once, behind the check of the whole page, and never changes. Who finds it needs nothing else that the
//    one who set it has written: the page itself lies in the file, as the commit has left it, before anybody knows of the
//    commit. So marks need no order among threads.
// 2. Two threads may check a page at once. The mark of one of them stays, and where the other came from another place it
//    is told.
//
// Any thread may call. Takes 8 bytes a page, in chunks of neighbours that are made when the first of them is marked: up to a
// fivehundredth of data.mdb, for as long as the state is the newest or somebody reads it.
#pragma once

#include <array>
#include <atomic>
#include <cstdint>
#include <vector>

#include "engines/lmdb/page_format.h"

namespace vemo {

class PageMarks {
 public:
  explicit PageMarks(PageNumber lastPage) : m_chunks(lastPage / kPagesInChunk + 1) {}
  ~PageMarks();
  PageMarks(const PageMarks&) = delete;
  PageMarks& operator=(const PageMarks&) = delete;

  // The place from which `page`, the last one at most, is reached; 0 where it is not marked.
  std::uint64_t Of(PageNumber page) const noexcept {
    const Chunk* chunk = m_chunks[page / kPagesInChunk].load(std::memory_order_acquire);
    return chunk != nullptr ? (*chunk)[page % kPagesInChunk].load(std::memory_order_relaxed) : 0;
  }

  // Marks `page` as reached from `place`, which is not 0. False where it is marked with another place, and stays so.
  bool Set(PageNumber page, std::uint64_t place);

 private:
  static constexpr std::size_t kPagesInChunk = 512;
  using Chunk = std::array<std::atomic<std::uint64_t>, kPagesInChunk>;

  Chunk& ChunkOf(PageNumber page);

  std::vector<std::atomic<Chunk*>> m_chunks;  // null: none of its pages is marked
};

}  // namespace vemo
