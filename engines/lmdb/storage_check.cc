#include "engines/lmdb/storage_check.h"

#include <utility>

#include "engines/lmdb/lmdb_layout.h"

namespace vemo {
namespace {

constexpr std::size_t kMostFindings = 1000;

class PagesCheck {
 public:
  PagesCheck(const std::shared_ptr<PageFile>& file, const SpaceState& state, const std::string& space)
      : m_state(state), m_reader(MakeReader(file, state, space)) {}

  StorageReport Run() {
    if (m_state.free == nullptr) Find(m_state.freeFault, m_state.freeTable.root.root);
    CheckTable(m_state.freeTable);
    CheckTable(m_state.main);
    for (const PageTable& table : m_state.tables) {
      const std::uint64_t entries = CheckTable(table);
      if (table.name == kRecordsTable) m_report.records = entries;
    }
    CheckNumbers();
    if (m_report.findings.empty()) CountPages();
    if (m_unlisted > 0) m_report.findings.push_back({std::to_string(m_unlisted) + " more faults", std::nullopt});
    return std::move(m_report);
  }

 private:
  struct Tally {
    std::uint64_t branchPages = 0, leafPages = 0, overflowPages = 0, entries = 0;
    bool isWhole = true;
  };

  void Find(std::string what, std::optional<std::uint64_t> page) {
    if (m_report.findings.size() < kMostFindings) {
      m_report.findings.push_back({std::move(what), page});
    } else {
      ++m_unlisted;
    }
  }
  void Find(const DamagedStorage& damaged) {
    Find(damaged.fault().empty() ? damaged.what() : damaged.fault(), damaged.page());
  }

  std::uint64_t CheckTable(const PageTable& table) {
    Tally tally;
    const TableRoot& root = table.root;
    if ((root.depth == 0) != (root.root == kNoPage) || root.depth > kMaxDepth) {
      Find("the root of the table \"" + table.name + "\" is damaged", std::nullopt);
      return 0;
    }
    if (root.depth > 0) CheckPage(table, root.root, PageReader::Place(table), root.depth, {}, tally);
    const bool isAsTold = tally.branchPages == root.branchPages && tally.leafPages == root.leafPages &&
                          tally.overflowPages == root.overflowPages && tally.entries == root.entries;
    if (tally.isWhole && !isAsTold) {
      Find("the table \"" + table.name + "\" is not as large as its root tells", std::nullopt);
    }
    return tally.entries;
  }

  // Each step takes one from `levels`, so that it goes no deeper than a table may be.
  void CheckPage(const PageTable& table, PageNumber number, std::uint64_t place, unsigned levels,
                 const KeyBounds& bounds, Tally& tally) {
    const bool isLeaf = levels == 1;
    PageView page;
    try {
      page = m_reader.Enter(number, place, isLeaf, table, [&] { return bounds; });
    } catch (const DamagedStorage& damaged) {
      Find(damaged);
      tally.isWhole = false;
      return;
    }
    m_used.Add(number);
    ++(isLeaf ? tally.leafPages : tally.branchPages);
    const std::size_t count = page.count();
    if (isLeaf) {
      tally.entries += count;
      for (std::size_t i = 0; i < count; ++i) CheckNode(table, number, page.node(i), tally);
      return;
    }
    for (std::size_t i = 0; i < count; ++i) {
      KeyBounds below = bounds;
      if (i > 0) below.from = page.node(i).key();
      if (i + 1 < count) below.before = page.node(i + 1).key();
      CheckPage(table, page.node(i).child(), PageReader::Place(number, i), levels - 1, below, tally);
    }
  }

  void CheckNode(const PageTable& table, PageNumber number, NodeView node, Tally& tally) {
    try {
      ByteView value(node.value(), node.hasBigValue() ? 0 : node.valueBytes());
      if (node.hasBigValue()) {
        value = m_reader.Run(node.bigValuePage(), node.valueBytes(), table, node.key());
        const std::uint32_t pages = PageView(value.data() - kPageHeaderBytes).runPages();
        tally.overflowPages += pages;
        UseRun(table, node.bigValuePage(), pages);
      }
      if (!table.isTagged) return;
      if (value.size() < kTagBytes || LoadAs<std::uint64_t>(value.data()) != ValueTag(table.seed, node.key())) {
        m_reader.Fail(number, table, "the value of a key belongs to another key", {node.key(), node.key()});
      }
    } catch (const DamagedStorage& damaged) {
      Find(damaged);
      tally.isWhole = false;
    }
  }

  void UseRun(const PageTable& table, PageNumber first, std::uint32_t pages) {
    if (pages > m_state.meta.lastPage - first + 1) {
      m_reader.Fail(first, table, "its run of pages is longer than the space", {});
    }
    for (PageNumber page = first; page < first + pages; ++page) {
      if (!m_used.Add(page)) m_reader.Fail(page, table, "it is reached from two places", {});
      if (m_state.free != nullptr && m_state.free->Contains(page)) {
        m_reader.Fail(page, table, "it is in use and among the free pages", {});
      }
    }
  }

  void CheckNumbers() {
    if (m_state.Table(kSystemTable) == nullptr) return;
    try {
      ReadNumbers(m_reader, m_state);
      ReadNextId(m_reader, m_state);
    } catch (const DamagedStorage& damaged) {
      Find(damaged);
    }
  }

  // Where nothing else is wrong, pages that are neither in use nor free tell of a list or of a root that is not the
  // commit's own.
  void CountPages() {
    const PageNumber lastPage = m_state.meta.lastPage;
    if (m_used.count() + m_state.free->count() == lastPage + 1 - kMetaPages) return;
    for (PageNumber page = kMetaPages; page <= lastPage; ++page) {
      if (!m_used.Contains(page) && !m_state.free->Contains(page)) Find("it is neither in use nor free", page);
    }
  }

  const SpaceState& m_state;
  PageReader m_reader;
  PageSet m_used;
  StorageReport m_report;
  std::uint64_t m_unlisted = 0;
};

}  // namespace

StorageReport CheckPages(const std::shared_ptr<PageFile>& file, const SpaceState& state, const std::string& space) {
  return PagesCheck(file, state, space).Run();
}

}  // namespace vemo
