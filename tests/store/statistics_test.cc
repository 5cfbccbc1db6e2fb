// What CollectStatistics counts, compared with the same counted in other ways.
#include "store/statistics.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <map>
#include <ostream>
#include <set>

#include "store/envelope.h"
#include "store/transaction.h"
#include "store/verify.h"
#include "tests/support/keys.h"
#include "tests/support/production_payloads.h"
#include "tests/support/temp_folder.h"
#include "vxUtils/ByteForms.h"

namespace vemo {
void PrintTo(const Amount& amount, std::ostream* os) {
  *os << amount.count << " in " << amount.bytes << " bytes";
}
}  // namespace vemo

namespace vemo::test {
namespace {

using InsertionsMap = FieldIdToVectorInsertionsMap;
using TombstonesMap = FieldIdToVectorTombstonesMap;
using HistoriesMap = FieldIdToVectorInsertionsAndDeletionsMap;

class Statistics : public testing::Test {
 protected:
  void Reopen() {
    m_space.reset();
    m_space = CSpace::Open(Uri());
  }
  std::string Uri() const { return "lmdb:" + (m_folder.path() / "space").string(); }

  template <class Map>
  void Fill(const std::string& root, std::uint64_t first, std::uint64_t last) {
    WriteTransaction txn(*m_space);
    Map& map = txn.Root<Map>(root);
    for (std::uint64_t n = first; n <= last; ++n) {
      map.Insert(Key(n), PayloadNumber<typename Map::Payload>::Make(n), true);
    }
    txn.Commit();
  }

  SpaceStatistics Collect() {
    Snapshot snapshot(*m_space);
    return CollectStatistics(snapshot);
  }

  TempFolder m_folder;
  std::unique_ptr<CSpace> m_space = CSpace::Open(Uri(), {.create = true});
};

const MapStatistics& MapOf(const SpaceStatistics& statistics, const std::string& root) {
  for (const MapStatistics& map : statistics.maps) {
    if (map.root == root) return map;
  }
  throw std::runtime_error("no statistics of " + root);
}

// The number of entries of each leaf, along the chain.
template <class Map>
std::vector<std::uint64_t> LeafSizes(const Map& map) {
  std::vector<std::uint64_t> sizes;
  for (const auto* leaf = map.m_firstLeaf.Get(); leaf != nullptr; leaf = leaf->m_next.Get()) {
    sizes.push_back(static_cast<std::uint64_t>(leaf->m_numKeyEntrys));
  }
  return sizes;
}

Amount operator+(Amount a, const Amount& b) {
  return {a.count + b.count, a.bytes + b.bytes};
}

Amount RecordsOfMaps(const SpaceStatistics& statistics) {
  Amount records;
  for (const MapStatistics& map : statistics.maps) records = records + Amount{1 + map.nodes, map.recordBytes};
  return records;
}

TEST_F(Statistics, OfANewSpaceCountNothing) {
  const SpaceStatistics statistics = Collect();
  EXPECT_EQ(statistics.records, (Amount{0, 0}));
  EXPECT_TRUE(statistics.maps.empty());
  EXPECT_EQ(statistics.meta, (Amount{0, 0}));
  EXPECT_GT(statistics.mediumBytes, 0u);
  EXPECT_EQ(statistics.mediumBytes, m_space->Usage().bytes);
}

// The example of docs/format.md.
TEST_F(Statistics, OfOneEntryHaveTheBytesOfItsTwoRecords) {
  {
    WriteTransaction txn(*m_space);
    auto& tombstones = txn.Root<TombstonesMap>("tombstones")[FieldId{OID(1), Path{0, 3}}];
    tombstones.Erasep(1, 2);
    tombstones.Erasep(3, 1);
    txn.SetMeta("name", "value!");
    txn.Commit();
  }
  const SpaceStatistics statistics = Collect();
  const MapStatistics& map = MapOf(statistics, "tombstones");
  EXPECT_EQ(map.className, "vemo::FieldIdToVectorTombstonesMap");
  EXPECT_EQ(map.entries, 1u);
  EXPECT_EQ(map.nodes, 1u);
  EXPECT_EQ(map.height, 0);
  EXPECT_EQ(map.payloadBytes, 5u);
  EXPECT_EQ(map.largestPayloadBytes, 5u);
  EXPECT_EQ(map.MeanPayloadBytes(), 5.0);
  EXPECT_EQ(map.recordBytes, 24u + 31u);
  ASSERT_EQ(map.levels.size(), 1u);
  EXPECT_EQ(map.levels[0].recordBytes, 31u);
  EXPECT_EQ(map.levels[0].capacity, 100u);
  EXPECT_EQ(map.levels[0].MeanFill(), 0.01);
  EXPECT_EQ(statistics.records, (Amount{2, 55}));
  EXPECT_EQ(statistics.meta, (Amount{1, 10}));
}

TEST_F(Statistics, OfAMapWithoutNodesHaveNoLevels) {
  {
    WriteTransaction txn(*m_space);
    txn.Root<InsertionsMap>("empty");
    txn.Commit();
  }
  const SpaceStatistics statistics = Collect();
  const MapStatistics& map = MapOf(statistics, "empty");
  EXPECT_EQ(map.height, -1);
  EXPECT_TRUE(map.levels.empty());
  EXPECT_EQ(map.MeanPayloadBytes(), 0.0);
  EXPECT_EQ(RecordsOfMaps(statistics), statistics.records);
}

TEST_F(Statistics, FillAndPayloadsAreThoseOfTheLeavesOneByOne) {
  Fill<InsertionsMap>("insertions", 1, 12'000);
  {
    WriteTransaction txn(*m_space);
    auto& map = txn.Root<InsertionsMap>("insertions");
    for (std::uint64_t n = 300; n < 4'000; n += 3) map.Delete(Key(n));
    txn.Commit();
  }
  Reopen();
  Snapshot snapshot(*m_space);
  const SpaceStatistics statistics = CollectStatistics(snapshot);
  const auto& map = snapshot.Root<InsertionsMap>("insertions");
  std::uint64_t payloadBytes = 0;
  std::uint64_t largest = 0;
  for (const auto& [key, payload] : map) {
    payloadBytes += ToBytes(payload).size();
    largest = std::max<std::uint64_t>(largest, ToBytes(payload).size());
  }
  const std::vector<std::uint64_t> leaves = LeafSizes(map);

  const MapStatistics& counted = MapOf(statistics, "insertions");
  EXPECT_EQ(counted.entries, static_cast<std::uint64_t>(map.size()));
  EXPECT_EQ(counted.nodes, static_cast<std::uint64_t>(map.GetNumNodes()));
  EXPECT_EQ(counted.height, 2);
  EXPECT_EQ(counted.payloadBytes, payloadBytes);
  EXPECT_EQ(counted.largestPayloadBytes, largest);
  ASSERT_EQ(counted.levels.size(), 3u);
  EXPECT_EQ(counted.levels[0].nodes, leaves.size());
  EXPECT_EQ(counted.levels[0].leastEntries, *std::min_element(leaves.begin(), leaves.end()));
  EXPECT_EQ(counted.levels[0].mostEntries, *std::max_element(leaves.begin(), leaves.end()));
  EXPECT_EQ(counted.levels[0].MeanFill(),
            static_cast<double>(map.size()) / (100.0 * static_cast<double>(leaves.size())));
  EXPECT_LT(counted.levels[0].LeastFill(), counted.levels[0].MostFill());
  // Every node but the root hangs at one entry of its parent, or is the leftmost child.
  EXPECT_EQ(counted.levels[1].entries + counted.levels[1].nodes, leaves.size());
  EXPECT_EQ(counted.levels[2].entries + 1, counted.levels[1].nodes);
}

TEST_F(Statistics, CountEveryRecordOnce) {
  Fill<InsertionsMap>("a", 1, 3'000);
  Fill<TombstonesMap>("b", 5, 700);
  Fill<HistoriesMap>("c", 100, 1'500);
  {
    WriteTransaction txn(*m_space);
    txn.Own<TombstonesMap>().Insert(Key(1), PayloadNumber<VectorTombstones>::Make(1), true);
    txn.Commit();
  }
  Snapshot snapshot(*m_space);
  const SpaceStatistics statistics = CollectStatistics(snapshot);
  ASSERT_EQ(statistics.maps.size(), 4u);
  EXPECT_EQ(statistics.maps[0].root, "");
  EXPECT_EQ(statistics.maps[0].entries, 1u);
  EXPECT_EQ(statistics.maps[3].root, "c");
  EXPECT_EQ(RecordsOfMaps(statistics), statistics.records);
  EXPECT_EQ(statistics.records.count, m_space->Usage().records);
  EXPECT_EQ(statistics.unreachable, (Amount{0, 0}));
  EXPECT_EQ(statistics.commit, snapshot.Generation());
}

TEST_F(Statistics, ShowAClearedTreeAwaitingDeletionUntilCommitsHaveWorkedItOff) {
  Fill<TombstonesMap>("t", 1, 40'000);
  const SpaceStatistics before = Collect();
  Reopen();
  {
    WriteTransaction txn(*m_space);
    txn.Root<TombstonesMap>("t").clear();
    txn.Commit();
  }
  SpaceStatistics statistics = Collect();
  EXPECT_EQ(MapOf(statistics, "t").nodes, 0u);
  EXPECT_GT(statistics.queuedDeletions, 0u);
  EXPECT_GE(statistics.awaitingDeletion.count, statistics.queuedDeletions);
  EXPECT_GT(statistics.awaitingDeletion.count, before.records.count / 2);
  int commits = 0;
  for (; statistics.queuedDeletions > 0; ++commits) {
    EXPECT_EQ(RecordsOfMaps(statistics) + statistics.awaitingDeletion, statistics.records);
    const std::uint64_t left = statistics.awaitingDeletion.count;
    WriteTransaction txn(*m_space);
    txn.SetMeta("commit", std::to_string(commits));
    txn.Commit();
    statistics = Collect();
    ASSERT_LT(statistics.awaitingDeletion.count, left);
  }
  EXPECT_GT(commits, 1);
  EXPECT_EQ(statistics.awaitingDeletion, (Amount{0, 0}));
  EXPECT_EQ(statistics.records.count, 1u);
}

TEST_F(Statistics, CountATreeThatNobodyNamesAsUnreachable) {
  Fill<InsertionsMap>("a", 1, 1'000);
  Fill<InsertionsMap>("b", 1, 400);
  const SpaceStatistics before = Collect();
  {
    WriteTransaction txn(*m_space);
    txn.Root<InsertionsMap>("b") = txn.Root<InsertionsMap>("a");  // the old tree of b stays behind
    txn.Commit();
  }
  Snapshot snapshot(*m_space);
  const SpaceStatistics statistics = CollectStatistics(snapshot);
  std::uint64_t nodeBytes = 0;
  for (const LevelStatistics& level : MapOf(before, "b").levels) nodeBytes += level.recordBytes;
  EXPECT_EQ(statistics.unreachable, (Amount{MapOf(before, "b").nodes, nodeBytes}));
  EXPECT_EQ(statistics.unreachable.count, VerifySpace(snapshot).unreachable);
  EXPECT_EQ(RecordsOfMaps(statistics) + statistics.unreachable, statistics.records);
}

TEST_F(Statistics, AreThoseOfTheSnapshotsCommit) {
  Fill<TombstonesMap>("t", 1, 150);
  Snapshot old(*m_space);
  Fill<TombstonesMap>("t", 151, 900);
  const SpaceStatistics statistics = CollectStatistics(old);
  EXPECT_EQ(MapOf(statistics, "t").entries, 150u);
  EXPECT_EQ(MapOf(Collect(), "t").entries, 900u);
}

TEST_F(Statistics, LeaveAnOpenTransactionsChangesOut) {
  Fill<TombstonesMap>("t", 1, 150);
  WriteTransaction txn(*m_space);
  txn.Root<TombstonesMap>("t").Insert(Key(7'000), VectorTombstones(), true);
  EXPECT_EQ(MapOf(Collect(), "t").entries, 150u);
}

TEST_F(Statistics, ListWhoReads) {
  Snapshot first(*m_space, "first");
  EXPECT_EQ(CollectStatistics(first).readers.size(), 1u);
  {
    const Snapshot second(*m_space, "second");
    const std::vector<ReaderInfo> readers = CollectStatistics(first).readers;
    std::set<std::string> owners;  // both are of the same age, as far as the clock can tell
    for (const ReaderInfo& reader : readers) owners.insert(reader.owner);
    EXPECT_EQ(owners, (std::set<std::string>{"first", "second"}));
  }
  EXPECT_EQ(CollectStatistics(first).readers.size(), 1u);
}

TEST_F(Statistics, LoadNoNodeIntoTheSnapshot) {
  Fill<InsertionsMap>("a", 1, 1'000);
  Reopen();
  Snapshot snapshot(*m_space);
  const auto& map = snapshot.Root<InsertionsMap>("a");
  CollectStatistics(snapshot);
  EXPECT_EQ(snapshot.Objects().Find(map.m_root.m_oid).m_self, nullptr);
  EXPECT_EQ(snapshot.Objects().Find(map.m_firstLeaf.m_oid).m_self, nullptr);
}

TEST_F(Statistics, TellHowManyRecordsAreDone) {
  Fill<InsertionsMap>("a", 1, 1'000);
  Snapshot snapshot(*m_space);
  std::vector<std::uint64_t> calls;
  const SpaceStatistics statistics =
      CollectStatistics(snapshot, [&](std::uint64_t done) { calls.push_back(done); });
  ASSERT_EQ(calls.size(), statistics.records.count);
  for (std::size_t i = 0; i < calls.size(); ++i) EXPECT_EQ(calls[i], i + 1);
}

// --- Damage ---

// Spaces in an engine of the test's own, of which records can be changed from behind.
class StatisticsOfADamagedSpace : public Statistics {
 protected:
  // The id of the first leaf and, of a map of two levels, of the root.
  void SetUp() override {
    Fill<TombstonesMap>("t", 1, 1'000);
    Snapshot snapshot(*m_space);
    const auto& map = snapshot.Root<TombstonesMap>("t");
    m_root = map.m_root.m_oid;
    m_firstLeaf = map.m_firstLeaf.m_oid;
    m_lastLeaf = map.m_lastLeaf.m_oid;
    for (const OID oid : {m_root, m_firstLeaf, m_lastLeaf}) {
      const ByteView record = *snapshot.Objects().State().Read(oid);
      m_records.emplace(oid, Bytes(record.begin(), record.end()));
    }
  }

  // Collects from a snapshot whose engine answers with `records` where they have an answer.
  std::string MessageWith(OID oid, std::optional<Bytes> record, OID expectedFault) {
    Snapshot snapshot(*m_space);
    snapshot.Objects().Resume(std::make_unique<Overlay>(m_space.get(), oid, std::move(record)));
    try {
      CollectStatistics(snapshot);
    } catch (const CorruptRecord& corrupt) {
      EXPECT_EQ(corrupt.oid(), expectedFault);
      return corrupt.what();
    }
    return "nothing was thrown";
  }

  // The state of another snapshot, but for one record.
  class Overlay : public EngineSnapshot {
   public:
    Overlay(CSpace* space, OID oid, std::optional<Bytes> record)
        : m_below(*space), m_oid(oid), m_record(std::move(record)) {}
    std::uint64_t Generation() const override { return State().Generation(); }
    std::optional<ByteView> Read(OID oid) const override {
      if (oid != m_oid) return State().Read(oid);
      return m_record ? std::optional<ByteView>(*m_record) : std::nullopt;
    }
    void ScanRecords(OID first, const std::function<bool(OID, ByteView)>& visit) const override {
      State().ScanRecords(first, visit);
    }
    std::optional<ByteView> ReadNamed(NamedTable table, std::string_view name) const override {
      return State().ReadNamed(table, name);
    }
    void ScanNamed(NamedTable table, std::string_view prefix,
                   const std::function<bool(std::string_view, ByteView)>& visit) const override {
      State().ScanNamed(table, prefix, visit);
    }
    std::vector<OID> QueuedDeletions(std::size_t limit) const override {
      return State().QueuedDeletions(limit);
    }

   private:
    const EngineSnapshot& State() const { return m_below.Objects().State(); }
    mutable Snapshot m_below;
    OID m_oid;
    std::optional<Bytes> m_record;
  };

  OID m_root, m_firstLeaf, m_lastLeaf;
  std::map<OID, Bytes> m_records;
};

// A sound record of object `oid` with that body.
Bytes Seal(OID oid, std::uint32_t classNumber, ByteView body) {
  Bytes record;
  BeginRecord(record, classNumber, 1);
  record.insert(record.end(), body.begin(), body.end());
  SealRecord(record, 0, oid);
  return record;
}

std::string ObjectText(OID oid) {
  return "object " + std::to_string(oid.m_value);
}

TEST_F(StatisticsOfADamagedSpace, AreRefusedWhereARecordIsNotWhatWasWritten) {
  Bytes record = m_records.at(m_lastLeaf);
  record[record.size() / 2] ^= 0x10;
  const std::string message = MessageWith(m_lastLeaf, record, m_lastLeaf);
  EXPECT_NE(message.find(ObjectText(m_lastLeaf)), std::string::npos) << message;
  EXPECT_NE(message.find("checksum"), std::string::npos) << message;
}

TEST_F(StatisticsOfADamagedSpace, AreRefusedWhereARecordIsMissing) {
  const std::string message = MessageWith(m_firstLeaf, std::nullopt, m_firstLeaf);
  EXPECT_NE(message.find(ObjectText(m_firstLeaf) +
                         ": it is referred to, but there is no record of it (run vemo verify)"),
            std::string::npos)
      << message;
}

TEST_F(StatisticsOfADamagedSpace, AreRefusedWhereALeafStandsForAnInternalNode) {
  const RecordEnvelope leaf = OpenRecord(m_records.at(m_firstLeaf), m_firstLeaf);
  const std::string message = MessageWith(m_root, Seal(m_root, leaf.classNumber, leaf.body), m_root);
  EXPECT_NE(message.find(ObjectText(m_root) + ": a node of another class should stand here"),
            std::string::npos)
      << message;
}

// Else a node that names itself would be walked for ever.
TEST_F(StatisticsOfADamagedSpace, AreRefusedWhereANodeHangsInTheTreeTwice) {
  const RecordEnvelope envelope = OpenRecord(m_records.at(m_root), m_root);
  TombstonesMap::InternalNode root;
  FromBytes(envelope.body, root);
  root.GetEntry(3).m_ptr.m_oid = m_firstLeaf;
  const std::string message =
      MessageWith(m_root, Seal(m_root, envelope.classNumber, ToBytes(root)), m_firstLeaf);
  EXPECT_NE(message.find(ObjectText(m_firstLeaf) + ": it hangs in the maps twice"), std::string::npos)
      << message;
}

}  // namespace
}  // namespace vemo::test
