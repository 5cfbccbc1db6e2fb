#include "engines/lmdb/page_reader.h"

#define XXH_INLINE_ALL
#include <xxhash.h>

#include <algorithm>
#include <utility>

#include "engines/lmdb/big_endian.h"
#include "engines/lmdb/lmdb_layout.h"
#include "engines/lmdb/space_folder.h"

namespace vemo {
namespace {

// Of the changes of a commit, which may be long, what tells whose they are stands first.
constexpr std::uint64_t kMostAhead = std::uint64_t{128} << 10;

// Null for a key that is no id.
OID IdOf(std::string_view key) noexcept {
  return key.size() == sizeof(BigEndian64) ? OID(FromBigEndian(key.data())) : OID();
}

}  // namespace

std::uint64_t TableSeed(std::string_view table) noexcept { return XXH3_64bits(table.data(), table.size()); }

std::uint64_t ValueTag(std::uint64_t tableSeed, std::string_view key) noexcept {
  return XXH3_64bits_withSeed(key.data(), key.size(), tableSeed);
}

bool PageSet::Add(PageNumber page) {
  const std::size_t word = page / 64;
  if (word >= m_bits.size()) m_bits.resize(word + 1);
  const std::uint64_t bit = std::uint64_t{1} << (page % 64);
  if ((m_bits[word] & bit) != 0) return false;
  m_bits[word] |= bit;
  ++m_count;
  return true;
}

PageReader::PageReader(std::shared_ptr<PageFile> file, std::size_t pageBytes, PageNumber lastPage,
                       std::shared_ptr<const PageSet> free, std::string space)
    : m_file(std::move(file)),
      m_pageBytes(pageBytes),
      m_lastPage(lastPage),
      m_free(std::move(free)),
      m_space(std::move(space)),
      m_marks(lastPage / kMarksInChunk + 1) {}

const char* PageReader::FaultOfPlace(PageNumber first, std::uint64_t pages) const {
  if (first < kMetaPages || first > m_lastPage || pages > m_lastPage - first + 1) {
    return "it is none of the pages that the space has";
  }
  if (m_free != nullptr && m_free->Contains(first)) return "it is in use and among the free pages";
  return nullptr;
}

PageView PageReader::EnterFirst(PageNumber number, std::uint64_t place, bool isLeaf, const PageTable& table,
                                const KeyBounds& bounds) {
  if (const char* fault = FaultOfPlace(number, 1)) Fail(number, table, fault, bounds);
  std::unique_ptr<std::uint64_t[]>& chunk = m_marks[number / kMarksInChunk];
  if (chunk == nullptr) chunk = std::make_unique<std::uint64_t[]>(kMarksInChunk);
  std::uint64_t& mark = chunk[number % kMarksInChunk];
  if (mark != 0 && mark != place) Fail(number, table, "it is reached from two places", bounds);
  m_file->CountReached();
  const std::uint8_t* bytes = m_file->At(number * m_pageBytes, m_pageBytes);
  if (bytes == nullptr) Fail(number, table, "the file ends before it", bounds);
  PageRole role{number, isLeaf, table.order, table.isMain, 1, bounds};
  // LMDB leaves a branch page with a single child in its own tables only.
  if (!isLeaf && table.order == KeyOrder::kBytes) role.leastNodes = 2;
  const PageView page(bytes);
  if (const char* fault = FaultOfPage(page, m_pageBytes, role)) Fail(number, table, fault, bounds);
  mark = place;
  return page;
}

ByteView PageReader::Run(PageNumber first, std::size_t bytes, const PageTable& table, std::string_view key) const {
  const KeyBounds lost{key, key};
  const std::uint64_t pages = RunPages(bytes, m_pageBytes);
  if (const char* fault = FaultOfPlace(first, pages)) Fail(first, table, fault, lost);
  m_file->CountReached();
  if (pages > 1) m_file->WillNeed(first * m_pageBytes, std::min<std::uint64_t>(pages * m_pageBytes, kMostAhead));
  const std::uint8_t* run = m_file->At(first * m_pageBytes, kPageHeaderBytes + bytes);
  if (run == nullptr) Fail(first, table, "the file ends before it", lost);
  const bool mayBeLonger = table.order == KeyOrder::kNumbers;
  if (const char* fault = FaultOfRun(PageView(run), first, bytes, m_pageBytes, mayBeLonger)) Fail(first, table, fault, lost);
  return {run + kPageHeaderBytes, bytes};
}

void PageReader::Fail(PageNumber number, const PageTable& table, const char* fault, const KeyBounds& unreadable) const {
  ErrorPlace place{m_space, "", OID(), "", std::nullopt};
  OID next;
  if (table.name == kRecordsTable) {
    if (unreadable.from) place.oid = IdOf(*unreadable.from);
    if (unreadable.before) next = IdOf(*unreadable.before);
    if (unreadable.from == unreadable.before) next = OID(next.m_value + 1);  // a single key, or all of them
    if (!unreadable.before) next = OID();
  }
  const std::string what = "in the table \"" + table.name + "\": " + fault;
  throw DamagedStorage(m_space + ": page " + std::to_string(number) + " of " + kDataFile + ", " + what +
                           "; run vemo verify, and restore the space from a backup",
                       std::move(place), what, number, next);
}

}  // namespace vemo
