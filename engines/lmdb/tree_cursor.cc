#include "engines/lmdb/tree_cursor.h"

#include "engines/lmdb/page_check.h"

namespace vemo {
namespace {

// The first node of a page, from `first` on, whose key is not less than `key`.
std::size_t LowerBound(PageView page, std::size_t first, std::size_t count, std::string_view key) noexcept {
  while (first < count) {
    const std::size_t middle = (first + count) / 2;
    if (page.node(middle).key() < key) {
      first = middle + 1;
    } else {
      count = middle;
    }
  }
  return first;
}

}  // namespace

TreeCursor::TreeCursor(PageReader& reader, const PageTable& table) : m_reader(&reader), m_table(&table) {
  const TableRoot& root = table.root;
  if ((root.depth == 0) != (root.root == kNoPage) || root.depth > kMaxDepth) {
    reader.Fail(root.root, table, "the depth of the table cannot be right", {});
  }
  m_depth = root.depth;
}

// The keys below the node of the page at `level` at which the cursor is.
KeyBounds TreeCursor::BoundsBelow(unsigned level) const noexcept {
  KeyBounds bounds;
  for (unsigned above = level + 1; above-- > 0 && !(bounds.from && bounds.before);) {
    const Frame& frame = m_frames[above];
    if (!bounds.from && frame.node > 0) bounds.from = frame.page.node(frame.node).key();
    if (!bounds.before && frame.node + 1 < frame.count) bounds.before = frame.page.node(frame.node + 1).key();
  }
  return bounds;
}

void TreeCursor::Enter(unsigned level, PageNumber number, std::uint64_t place) {
  Frame& frame = m_frames[level];
  frame.page = m_reader->Enter(number, place, level + 1 == m_depth, *m_table,
                               [&] { return level == 0 ? KeyBounds() : BoundsBelow(level - 1); });
  frame.number = number;
  frame.count = frame.page.count();
}

void TreeCursor::EnterChild(unsigned level) {
  const Frame& parent = m_frames[level];
  Enter(level + 1, parent.page.node(parent.node).child(), PageReader::Place(parent.number, parent.node));
}

bool TreeCursor::DescendToEdge(unsigned level, bool left) {
  for (;; ++level) {
    m_frames[level].node = left ? 0 : m_frames[level].count - 1;
    if (level + 1 == m_depth) return true;
    EnterChild(level);
  }
}

bool TreeCursor::First() {
  if (m_depth == 0) return false;
  Enter(0, m_table->root.root, PageReader::Place(*m_table));
  return DescendToEdge(0, true);
}

bool TreeCursor::Last() {
  if (m_depth == 0) return false;
  Enter(0, m_table->root.root, PageReader::Place(*m_table));
  return DescendToEdge(0, false);
}

bool TreeCursor::Step(bool forwards) {
  for (unsigned level = m_depth; level-- > 0;) {
    Frame& frame = m_frames[level];
    if (forwards ? frame.node + 1 >= frame.count : frame.node == 0) continue;
    frame.node = forwards ? frame.node + 1 : frame.node - 1;
    if (level + 1 == m_depth) return true;
    EnterChild(level);
    return DescendToEdge(level + 1, forwards);
  }
  return false;
}

bool TreeCursor::Next() { return Step(true); }
bool TreeCursor::Previous() { return Step(false); }

// Leaves the cursor in the leaf where `key` is or would stand, perhaps behind its last node.
void TreeCursor::DescendTo(std::string_view key) {
  Enter(0, m_table->root.root, PageReader::Place(*m_table));
  for (unsigned level = 0; level + 1 < m_depth; ++level) {
    Frame& frame = m_frames[level];
    // Behind the last node, of those from the second on, whose key is not greater.
    frame.node = LowerBound(frame.page, 1, frame.count, key);
    if (frame.node == frame.count || frame.page.node(frame.node).key() != key) --frame.node;
    EnterChild(level);
  }
  Leaf().node = LowerBound(Leaf().page, 0, Leaf().count, key);
}

bool TreeCursor::Seek(std::string_view key) {
  m_exact = false;
  if (m_depth == 0) return false;
  DescendTo(key);
  m_exact = Leaf().node < Leaf().count && Key() == key;
  if (m_exact) return true;
  // The neighbours of the gap: the entry before, and the one after it, which may hang in another leaf.
  TreeCursor before = *this;
  if (before.Step(false)) before.CheckTag();
  if (Leaf().node == Leaf().count && !Step(true)) return false;
  CheckTag();
  return true;
}

ByteView TreeCursor::StoredValue() const {
  const NodeView node = Node();
  if (!node.hasBigValue()) return {node.value(), node.valueBytes()};
  return m_reader->Run(node.bigValuePage(), node.valueBytes(), *m_table, node.key());
}

void TreeCursor::CheckTag() const {
  if (m_table->isTagged) Value();
}

ByteView TreeCursor::Value() const {
  const ByteView stored = StoredValue();
  if (stored.size() < kTagBytes || LoadAs<std::uint64_t>(stored.data()) != ValueTag(m_table->seed, Key())) {
    Fail("the value of a key belongs to another key");
  }
  return stored.subspan(kTagBytes);
}

void TreeCursor::Fail(const char* fault) const {
  m_reader->Fail(Leaf().number, *m_table, fault, {Key(), Key()});
}

// How far LMDB can reach is bounded by what it finds there: it stops at a page that stays a quarter full. Two pages'
// worth of entries on each side are more than it can move into this one.
void TreeCursor::CheckNeighbours() const {
  const std::size_t enough = 2 * m_reader->pageBytes();
  for (const bool forwards : {true, false}) {
    TreeCursor other = *this;
    for (std::size_t bytes = 0; bytes < enough;) {
      other.Leaf().node = forwards ? other.Leaf().count - 1 : 0;
      if (!other.Step(forwards)) break;
      bytes += m_reader->pageBytes() - other.Leaf().page.upper();
    }
  }
}

}  // namespace vemo
