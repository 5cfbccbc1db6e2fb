#include "engines/lmdb/space_state.h"

#define XXH_INLINE_ALL
#include <xxhash.h>

#include <algorithm>
#include <bit>

#include "engines/lmdb/lmdb_layout.h"
#include "engines/lmdb/space_folder.h"
#include "engines/lmdb/tree_cursor.h"

namespace vemo {
namespace {

constexpr unsigned kMainNumber = 1;
constexpr unsigned kFreeNumber = 2;
constexpr unsigned kFirstTableNumber = 3;

class Digest {
 public:
  Digest() { XXH3_64bits_reset(&m_state); }
  void Add(const void* data, std::size_t bytes) { XXH3_64bits_update(&m_state, data, bytes); }
  void Add(std::uint64_t number) { Add(&number, sizeof number); }
  std::uint64_t Value() const { return XXH3_64bits_digest(&m_state); }

 private:
  XXH3_state_t m_state;
};

[[noreturn]] void Throw(const std::string& space, const std::string& fault) {
  throw DamagedStorage(space + ": " + kDataFile + ": " + fault + "; restore the space from a backup",
                       {space, "", OID(), "", std::nullopt});
}

bool IsPlausible(const TableRoot& root, PageNumber lastPage) noexcept {
  if ((root.depth == 0) != (root.root == kNoPage) || root.depth > kMaxDepth) return false;
  return root.root == kNoPage || (root.root >= kMetaPages && root.root <= lastPage);
}

// What follows from no other page. A file may end before its last page: pages that were free when they would have been
// written never are. But a transaction cannot leave more of those than it may change.
void CheckMeta(PageFile& file, const MetaPage& meta, const std::string& space) {
  constexpr PageNumber kMostUnwritten = PageNumber{1} << 18;
  const std::uint64_t pages = file.Measure() / meta.freePages.pageBytes;
  if (meta.lastPage < kMetaPages - 1 || meta.lastPage > pages + kMostUnwritten) {
    Throw(space, "the file has " + std::to_string(pages) + " pages, and its meta page tells of " +
                     std::to_string(meta.lastPage) + " (it was cut off, or the meta page is damaged)");
  }
  if (!IsPlausible(meta.freePages, meta.lastPage) || !IsPlausible(meta.main, meta.lastPage) ||
      meta.freePages.flags != kNumberKeys || meta.main.depth > 2 * kTableCount) {
    Throw(space, "the meta page of transaction " + std::to_string(meta.transaction) + " is damaged");
  }
}

// Pages that are read one after the other are asked for together.
void WillNeedRoot(PageFile& file, const SpaceState& state, const PageTable& table) noexcept {
  if (table.root.root != kNoPage) file.WillNeed(table.root.root * state.pageBytes, state.pageBytes);
}

void ReadMain(const std::shared_ptr<PageFile>& file, SpaceState& state, const std::string& space) {
  Digest digest;
  digest.Add(&state.meta, sizeof state.meta);
  PageReader reader = MakeReader(file, state, space);
  TreeCursor cursor(reader, state.main);
  unsigned number = kFirstTableNumber;
  for (bool found = cursor.First(); found; found = cursor.Next()) {
    const std::string_view name = cursor.Key();
    digest.Add(name.size());
    digest.Add(name.data(), name.size());
    digest.Add(cursor.Node().flags());
    if (cursor.Node().flags() != kSubTable) {
      state.hasOtherEntries = true;
      continue;
    }
    PageTable table;
    table.name = std::string(name);
    table.root = LoadAs<TableRoot>(cursor.Node().value());
    table.number = number++;
    table.isTagged = name != kSystemTable;
    table.seed = TableSeed(name);
    digest.Add(&table.root, sizeof table.root);
    state.tables.push_back(std::move(table));
  }
  state.rootsDigest = digest.Value();
  for (const PageTable& table : state.tables) WillNeedRoot(*file, state, table);
}

void AddList(TreeCursor& cursor, PageNumber lastPage, PageSet& free) {
  const ByteView list = cursor.StoredValue();
  if (list.size() % sizeof(PageNumber) != 0 || list.empty()) cursor.Fail("a list of free pages has an impossible size");
  const std::uint64_t count = LoadAs<std::uint64_t>(list.data());
  if (count > list.size() / sizeof(PageNumber) - 1) cursor.Fail("a list of free pages is longer than its room");
  PageNumber above = lastPage + 1;
  for (std::uint64_t i = 1; i <= count; ++i) {
    const PageNumber page = LoadAs<PageNumber>(list.data() + i * sizeof(PageNumber));
    if (page < kMetaPages || page >= above) cursor.Fail("a list of free pages is out of order");
    if (!free.Add(page)) cursor.Fail("a page is free twice");
    above = page;
  }
}

void ReadFreePages(const std::shared_ptr<PageFile>& file, SpaceState& state, const std::string& space) {
  auto free = std::make_shared<PageSet>();
  PageReader reader(file, state.pageBytes, state.meta.lastPage, nullptr, space);
  TreeCursor cursor(reader, state.freeTable);
  Digest digest;
  std::uint64_t entries = 0;
  for (bool found = cursor.First(); found; found = cursor.Next(), ++entries) {
    AddList(cursor, state.meta.lastPage, *free);
    digest.Add(cursor.Key().data(), cursor.Key().size());
    const ByteView list = cursor.StoredValue();
    digest.Add(list.data(), (LoadAs<std::uint64_t>(list.data()) + 1) * sizeof(PageNumber));
    if (cursor.Node().hasBigValue()) {
      digest.Add(cursor.Node().bigValuePage());
      digest.Add(PageView(list.data() - kPageHeaderBytes).runPages());
    }
  }
  // Else LMDB could stop before the end of the list, or look behind it.
  if (entries != state.freeTable.root.entries) {
    reader.Fail(state.freeTable.root.root, state.freeTable, "it does not have as many entries as its root tells", {});
  }
  state.freeDigest = digest.Value();
  state.free = std::move(free);
}

}  // namespace

const PageTable* SpaceState::Table(std::string_view name) const noexcept {
  const auto found = std::find_if(tables.begin(), tables.end(), [&](const PageTable& t) { return t.name == name; });
  return found == tables.end() ? nullptr : &*found;
}

namespace {

// Whether no meta page tells of a commit behind the one that makes a space.
bool WasNeverCommitted(const std::uint8_t* first, const std::uint8_t* second) noexcept {
  for (const std::uint8_t* page : {first, second}) {
    if (page == nullptr) continue;
    const auto meta = LoadAs<MetaPage>(page + kPageHeaderBytes);
    if (meta.magic == kLmdbMagic && meta.transaction > 1) return false;
  }
  return true;
}

}  // namespace

HeaderFault FaultOfHeader(PageFile& file) {
  file.Measure();
  const std::uint8_t* first = file.At(0, kPageHeaderBytes + sizeof(MetaPage));
  if (first == nullptr) return {"it is shorter than a page", true};
  const auto meta = LoadAs<MetaPage>(first + kPageHeaderBytes);
  const std::size_t pageBytes = meta.freePages.pageBytes;
  const bool isPageSize = std::has_single_bit(pageBytes) && pageBytes >= kMinPageBytes && pageBytes <= kMaxPageBytes;
  const std::uint8_t* second = isPageSize ? file.At(pageBytes, kPageHeaderBytes + sizeof(MetaPage)) : nullptr;
  if (meta.magic != kLmdbMagic) {
    // A second meta page at the usual place tells that this was one.
    constexpr std::size_t kUsualPageBytes = 4096;
    const std::uint8_t* other = file.At(kUsualPageBytes, kPageHeaderBytes + sizeof(MetaPage));
    const bool isForeign = other == nullptr || LoadAs<MetaPage>(other + kPageHeaderBytes).magic != kLmdbMagic ||
                           WasNeverCommitted(nullptr, other);
    return {isForeign ? "it is not a file of LMDB" : "its first meta page is damaged", isForeign};
  }
  if (meta.version != kLmdbVersion) return {"it is of version " + std::to_string(meta.version) + " of LMDB's files, and this program reads version 1", true};
  if (!isPageSize) return {"the page size in its first meta page is impossible"};
  if (second == nullptr) return {"it is cut off within its meta pages", WasNeverCommitted(first, nullptr)};
  for (std::uint64_t i = 0; i < kMetaPages; ++i) {
    const PageView page(i == 0 ? first : second);
    const auto one = LoadAs<MetaPage>(page.data() + kPageHeaderBytes);
    if (page.number() != i || page.flags() != kMetaPageFlag || one.magic != kLmdbMagic || one.version != kLmdbVersion ||
        one.address != 0 || one.freePages.pageBytes != pageBytes || one.freePages.flags != kNumberKeys) {
      return {"its meta page " + std::to_string(i) + " is damaged", WasNeverCommitted(first, second)};
    }
  }
  return {};
}

std::size_t PageBytesOf(PageFile& file) {
  return LoadAs<MetaPage>(file.At(0, kPageHeaderBytes + sizeof(MetaPage)) + kPageHeaderBytes).freePages.pageBytes;
}

MetaPage ReadMetaPage(PageFile& file, std::uint64_t index, std::size_t pageBytes) {
  const std::uint8_t* page = file.At(index * pageBytes, kPageHeaderBytes + sizeof(MetaPage));
  MetaPage meta{};
  for (;;) {
    if (page == nullptr) return meta;
    meta = LoadAs<MetaPage>(page + kPageHeaderBytes);
    std::atomic_thread_fence(std::memory_order_acquire);
    if (std::memcmp(&meta, page + kPageHeaderBytes, sizeof meta) == 0) return meta;
  }
}

std::optional<MetaPage> ReadMeta(PageFile& file, std::uint64_t transaction) {
  const MetaPage meta = ReadMetaPage(file, transaction % kMetaPages, PageBytesOf(file));
  if (meta.transaction != transaction) return std::nullopt;
  return meta;
}

std::shared_ptr<const SpaceState> ReadState(const std::shared_ptr<PageFile>& file, const MetaPage& meta,
                                            const std::string& space) {
  CheckMeta(*file, meta, space);
  auto state = std::make_shared<SpaceState>();
  state->meta = meta;
  state->pageBytes = meta.freePages.pageBytes;
  state->freeTable.name = "free pages";
  state->freeTable.root = meta.freePages;
  state->freeTable.number = kFreeNumber;
  state->freeTable.order = KeyOrder::kNumbers;
  state->main.name = "main";
  state->main.root = meta.main;
  state->main.number = kMainNumber;
  state->main.isMain = true;
  WillNeedRoot(*file, *state, state->main);
  WillNeedRoot(*file, *state, state->freeTable);
  try {
    ReadFreePages(file, *state, space);
  } catch (const DamagedStorage& damaged) {
    state->freeFault = damaged.what();
  }
  ReadMain(file, *state, space);
  return state;
}

PageReader MakeReader(const std::shared_ptr<PageFile>& file, const SpaceState& state, const std::string& space) {
  return PageReader(file, state.pageBytes, state.meta.lastPage, state.free, space);
}

}  // namespace vemo
