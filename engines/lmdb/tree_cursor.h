// A position in a table of LMDB, on checked pages.
#pragma once

#include <array>
#include <optional>
#include <string_view>

#include "engines/lmdb/page_reader.h"

namespace vemo {

// Every function may throw DamagedStorage. `reader` and `table` must outlive the cursor; keys and values stay as long as
// the transaction that keeps the pages.
class TreeCursor {
 public:
  TreeCursor(PageReader& reader, const PageTable& table);

  // Go to the first, last, next or previous entry; false when there is none, and then the cursor is nowhere.
  bool First();
  bool Last();
  bool Next();
  bool Previous();

  // Goes to the first entry whose key is not less than `key`; false when there is none. Where no entry has this key,
  // that is proved: see page_reader.h.
  bool Seek(std::string_view key);
  // Whether there is an entry of this key, which the cursor then is at. That there is none is proved.
  bool Find(std::string_view key) { return Seek(key) && m_exact; }

  // Of the entry that the cursor is at.
  std::string_view Key() const noexcept { return Node().key(); }
  NodeView Node() const noexcept { return Leaf().page.node(Leaf().node); }
  PageNumber LeafNumber() const noexcept { return Leaf().number; }
  // The value as it is stored, its overflow run checked.
  ByteView StoredValue() const;
  // The value behind its tag, which must be right.
  ByteView Value() const;
  [[noreturn]] void Fail(const char* fault) const;

  // Checks the leaves on both sides of the one that the cursor is at which LMDB may read when entries of this one
  // are removed: it moves entries over from neighbours, or merges with them, until pages are a quarter full.
  void CheckNeighbours() const;

 private:
  struct Frame {
    PageView page;
    PageNumber number = 0;
    std::size_t node = 0;
    std::size_t count = 0;
  };

  const Frame& Leaf() const noexcept { return m_frames[m_depth - 1]; }
  Frame& Leaf() noexcept { return m_frames[m_depth - 1]; }
  void Enter(unsigned level, PageNumber number, std::uint64_t place);
  void EnterChild(unsigned level);
  KeyBounds BoundsBelow(unsigned level) const noexcept;
  bool Step(bool forwards);
  bool DescendToEdge(unsigned level, bool left);
  void DescendTo(std::string_view key);
  void ProveAbsence() const;
  void CheckTag() const;

  PageReader* m_reader;
  const PageTable* m_table;
  unsigned m_depth = 0;
  bool m_exact = false;
  std::array<Frame, kMaxDepth> m_frames;
};

}  // namespace vemo
