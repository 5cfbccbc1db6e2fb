// Reads the pages of one commit without LMDB, and believes none of them before it was checked.
//
// 1. A page is checked when it is first reached: FaultOfPage, with the bounds that its parents hand down, and that it is
//    not among the free pages: an older version of a page may look as sound as the one that took its place. From then on
//    the reader remembers from where it was reached; a page that is reached from two places is damage.
// 2. So a descent ends after `depth` steps, and a walk through the leaves meets ascending keys only.
// 3. That a key is absent is proved by the keys beside the place where it would stand. In a tagged table each value
//    begins with a tag of its table and key, so that a key that was changed does not pass for its neighbour's neighbour.
//
// The pages must be kept from being used again by a transaction of LMDB. One thread at a time.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "engines/lmdb/page_check.h"
#include "engines/lmdb/page_file.h"
#include "engines/lmdb/page_format.h"
#include "store/engine.h"

namespace vemo {

inline constexpr std::size_t kTagBytes = 8;

// A table as a reader knows it.
struct PageTable {
  std::string name;  // "main" and "free pages" are LMDB's own
  TableRoot root{};
  unsigned number = 0;  // tells the tables of a commit apart
  KeyOrder order = KeyOrder::kBytes;
  bool isMain = false;
  bool isTagged = false;
  std::uint64_t seed = 0;  // of the tags: TableSeed of the name
};

// What the value of `key` begins with in a tagged table.
std::uint64_t TableSeed(std::string_view table) noexcept;
std::uint64_t ValueTag(std::uint64_t tableSeed, std::string_view key) noexcept;

// A set of page numbers.
class PageSet {
 public:
  // False when it is in the set already.
  bool Add(PageNumber page);
  bool Contains(PageNumber page) const noexcept {
    return page / 64 < m_bits.size() && (m_bits[page / 64] >> (page % 64) & 1) != 0;
  }
  std::uint64_t count() const noexcept { return m_count; }

 private:
  std::vector<std::uint64_t> m_bits;
  std::uint64_t m_count = 0;
};

class PageReader {
 public:
  // `free` is null while the list of free pages itself is read, and where that is damaged.
  PageReader(std::shared_ptr<PageFile> file, std::size_t pageBytes, PageNumber lastPage,
             std::shared_ptr<const PageSet> free, std::string space);

  // The page at `number`, reached from `place` (see Place), which is a leaf or not. Throws DamagedStorage. `bounds` is
  // called when the page is reached for the first time, and gives the bounds of its keys.
  template <typename Bounds>
  PageView Enter(PageNumber number, std::uint64_t place, bool isLeaf, const PageTable& table, const Bounds& bounds) {
    if (number <= m_lastPage) {
      const std::uint64_t* marks = m_marks[number / kMarksInChunk].get();
      if (marks != nullptr && marks[number % kMarksInChunk] == place) {
        if (const std::uint8_t* page = m_file->At(number * m_pageBytes, m_pageBytes)) return PageView(page);
      }
    }
    return EnterFirst(number, place, isLeaf, table, bounds());
  }

  // From where a page is reached: a node of a page, or the root of a table. Never 0.
  static std::uint64_t Place(PageNumber parent, std::size_t node) noexcept { return parent << 16 | node; }
  static std::uint64_t Place(const PageTable& table) noexcept { return std::uint64_t{1} << 63 | table.number; }

  // The bytes of the value under `key` in an overflow run, checked. Throws DamagedStorage.
  ByteView Run(PageNumber first, std::size_t bytes, const PageTable& table, std::string_view key) const;

  // Throws DamagedStorage, which says what is wrong with which page; `unreadable` are the keys that are
  // lost with it: those between the bounds, or where both are the same the one.
  [[noreturn]] void Fail(PageNumber number, const PageTable& table, const char* fault,
                         const KeyBounds& unreadable) const;

  std::size_t pageBytes() const noexcept { return m_pageBytes; }
  PageNumber lastPage() const noexcept { return m_lastPage; }
  const std::string& space() const noexcept { return m_space; }

 private:
  static constexpr std::size_t kMarksInChunk = 512;

  PageView EnterFirst(PageNumber number, std::uint64_t place, bool isLeaf, const PageTable& table,
                      const KeyBounds& bounds);
  // Why the pages from `first` on cannot belong to a table; null where they can.
  const char* FaultOfPlace(PageNumber first, std::uint64_t pages) const;

  const std::shared_ptr<PageFile> m_file;
  const std::size_t m_pageBytes;
  const PageNumber m_lastPage;
  const std::shared_ptr<const PageSet> m_free;
  const std::string m_space;
  std::vector<std::unique_ptr<std::uint64_t[]>> m_marks;  // by page, the place from which it was reached, or 0
};

}  // namespace vemo
