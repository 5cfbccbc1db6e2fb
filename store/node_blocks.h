// The memory of nodes that have left a view, for those that it loads next.
//
// A node takes several kilobytes, and its lists many small pieces. Whenever malloc is asked for a large piece, it first puts
// small ones together that were freed, and takes them apart again for the lists of that node. A view whose memory is bounded
// would have it do so with nearly every node.
#pragma once

#include <array>
#include <cstddef>

#include "store/class_registry.h"

namespace vemo {

// One thread at a time.
class NodeBlocks {
 public:
  NodeBlocks() = default;
  ~NodeBlocks() { Clear(); }
  NodeBlocks(const NodeBlocks&) = delete;
  NodeBlocks& operator=(const NodeBlocks&) = delete;

  // A new object in the default state, which DestroyObject ends as it does others. Throws std::bad_alloc.
  ptr<IPersistable> Create(const ClassEntry& classEntry);

  // Ends an object as DestroyObject does, but keeps its memory, as long as what is kept is no more than `mostBytes`.
  void End(ptr<IPersistable> object, std::size_t mostBytes) noexcept;

  // Gives back what is kept.
  void Clear() noexcept;

  std::size_t bytes() const noexcept { return m_bytes; }

 private:
  struct Block {
    Block* next;
  };
  Block*& First(const ClassEntry& classEntry) noexcept { return m_first[IndexOf(classEntry)]; }

  std::array<Block*, kNumClasses> m_first{};  // of the blocks kept for each class
  std::size_t m_bytes = 0;
};

}  // namespace vemo
