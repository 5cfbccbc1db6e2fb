// Residents stay within the budget of the space, whatever the size of its maps.
#include <sstream>

#include "store/dump.h"
#include "store/scan.h"
#include "store/statistics.h"
#include "store/verify.h"
#include "tests/store/bounded_map.h"
#include "tests/support/seed.h"

namespace vemo::test {
namespace {

using BoundedMemoryTest = BoundedTest;
INSTANTIATE_BOUNDED_TEST(BoundedMemoryTest);

TEST_P(BoundedMemoryTest, RandomReadsInShortTransactions) {
  MakeLargeMap();
  std::mt19937_64 random(TestSeed(31));
  for (int i = 0; i < 3'000; ++i) {
    WriteTransaction transaction(space());
    EXPECT_LE(ResidentBytes(), kCacheBytes);
    const std::uint64_t n = 1 + random() % kKeysOfLargeMap;
    ASSERT_EQ(NumberUnder(transaction.View<TombstonesMap>("t"), n), n);
    EXPECT_LE(ResidentBytes(), kCacheBytes + kOperationBytes);
  }
  EXPECT_LE(ResidentBytes(), kCacheBytes);
  EXPECT_GT(ResidentBytes(), kCacheBytes / 2) << "the budget is there to be used";
}

TEST_P(BoundedMemoryTest, RandomReadsInShortSnapshots) {
  MakeLargeMap();
  std::mt19937_64 random(TestSeed(32));
  for (int i = 0; i < 1'000; ++i) {
    Snapshot snapshot(space());
    const std::uint64_t n = 1 + random() % kKeysOfLargeMap;
    ASSERT_EQ(NumberUnder(snapshot.Root<TombstonesMap>("t"), n), n);
    EXPECT_LE(ResidentBytes(), kCacheBytes + kOperationBytes);
  }
}

TEST_P(BoundedMemoryTest, ALongSnapshotThatTrimsStaysWithinItsShare) {
  MakeLargeMap();
  std::mt19937_64 random(TestSeed(33));
  Snapshot snapshot(space());
  const auto& map = snapshot.Root<TombstonesMap>("t");
  for (int i = 0; i < 3'000; ++i) {
    const std::uint64_t n = 1 + random() % kKeysOfLargeMap;
    ASSERT_EQ(NumberUnder(map, n), n);
    snapshot.Trim();
    ASSERT_LE(ResidentBytes(), kCacheBytes / 2) << "the other half is the writer's";
  }
}

TEST_P(BoundedMemoryTest, ASnapshotTakesItsShareFromTheWriter) {
  MakeLargeMap();
  for (std::uint64_t n = 1; n <= kKeysOfLargeMap; n += 50) {
    WriteTransaction transaction(space());
    NumberUnder(transaction.View<TombstonesMap>("t"), n);
  }
  ASSERT_GT(ResidentBytes(), kCacheBytes / 2);
  const Snapshot first(space());
  EXPECT_LE(ResidentBytes(), kCacheBytes / 2);
  const Snapshot second(space());
  EXPECT_LE(ResidentBytes(), kCacheBytes / 3);
}

TEST_P(BoundedMemoryTest, AScanOfASnapshotVisitsEverythingInOrder) {
  MakeLargeMap();
  Snapshot snapshot(space());
  std::uint64_t last = 100;
  EXPECT_TRUE(ScanMap(snapshot, snapshot.Root<TombstonesMap>("t"), Key(101), [&](const FieldId& key, const auto& payload) {
    EXPECT_EQ(NumberOf(key), last + 1);
    last = PayloadNumber<VectorTombstones>::Number(payload);
    EXPECT_LE(ResidentBytes(), kCacheBytes / 2 + kOperationBytes);
    return true;
  }));
  EXPECT_EQ(last, kKeysOfLargeMap);
}

TEST_P(BoundedMemoryTest, AScanWhoseVisitorLooksThingsUpTrimsBetweenLeaves) {
  MakeLargeMap();
  Snapshot snapshot(space());
  const auto& map = snapshot.Root<TombstonesMap>("t");
  std::uint64_t mostBytes = 0;
  EXPECT_TRUE(ScanMap(snapshot, map, FieldId(), [&](const FieldId& key, const auto&) {
    if (NumberOf(key) % 10 == 0) map.rFind(Key(kKeysOfLargeMap + 1 - NumberOf(key)));
    mostBytes = std::max(mostBytes, ResidentBytes());
    return true;
  }));
  EXPECT_LE(mostBytes, kCacheBytes / 2 + kOperationBytes);
  EXPECT_GT(space().CacheStatistics().evictions, 0u);
}

TEST_P(BoundedMemoryTest, AScanOfATransactionSeesItsChangesAndKeepsThem) {
  MakeLargeMap();
  WriteTransaction transaction(space());
  transaction.Root<TombstonesMap>("t").Insert(Key(kKeysOfLargeMap / 2), PayloadOf<TombstonesMap>(7), true);
  std::uint64_t visited = 0, changed = 0;
  EXPECT_TRUE(ScanMap(transaction, transaction.View<TombstonesMap>("t"), FieldId(), [&](const FieldId& key, const auto& payload) {
    ++visited;
    if (PayloadNumber<VectorTombstones>::Number(payload) != NumberOf(key)) ++changed;
    EXPECT_LE(ResidentBytes(), kCacheBytes + kOperationBytes);
    return true;
  }));
  EXPECT_EQ(visited, kKeysOfLargeMap);
  EXPECT_EQ(changed, 1u);
}

TEST_P(BoundedMemoryTest, AScanStopsWhereItIsTold) {
  CommitFilled<TombstonesMap>(space(), "t", 500);
  Snapshot snapshot(space());
  const auto& map = snapshot.Root<TombstonesMap>("t");
  std::uint64_t last = 0;
  EXPECT_FALSE(ScanMap(snapshot, map, Key(3), [&](const FieldId& key, const auto&) { return (last = NumberOf(key)) < 250; }));
  EXPECT_EQ(last, 250u);
  EXPECT_TRUE(ScanMap(snapshot, map, Key(501), [&](const FieldId&, const auto&) { return false; }));
}

TEST_P(BoundedMemoryTest, AScanOfAnEmptyMapVisitsNothing) {
  InTransaction(space(), [](WriteTransaction& transaction) { transaction.Root<TombstonesMap>("t"); });
  Snapshot snapshot(space());
  EXPECT_TRUE(ScanMap(snapshot, snapshot.Root<TombstonesMap>("t"), FieldId(), [](const FieldId&, const auto&) { return false; }));
}

TEST_P(BoundedMemoryTest, CheckingAndCountingLoadNothing) {
  MakeLargeMap();
  Snapshot snapshot(space());
  const VerifyReport report = VerifySpace(snapshot);
  EXPECT_TRUE(report.findings.empty());
  EXPECT_EQ(report.entries, kKeysOfLargeMap);
  EXPECT_EQ(CollectStatistics(snapshot).maps.front().entries, kKeysOfLargeMap);
  EXPECT_EQ(space().CacheStatistics().loads, 0u);
  EXPECT_EQ(ResidentBytes(), 0u);
}

// Of fewer keys: the text of the tombstones of a key is as long as its number.
TEST_P(BoundedMemoryTest, ADumpIsTheTextOfTheMapAndLoadsNothing) {
  const auto expectDumped = [&]<class Map>(const Map*, std::uint64_t count) {
    const std::string root = "root of " + std::to_string(count);
    CommitFilled<Map>(space(), root, count);
    OpenBounded();
    Snapshot snapshot(space());
    std::ostringstream dumped;
    xostream os(dumped);
    DumpMap(snapshot, root, os);
    EXPECT_EQ(space().CacheStatistics().loads, 0u);
    EXPECT_EQ(dumped.str(), ToText(snapshot.Root<Map>(root)));
  };
  expectDumped(static_cast<InsertionsMap*>(nullptr), 6'000);
  expectDumped(static_cast<TombstonesMap*>(nullptr), 500);
  expectDumped(static_cast<HistoriesMap*>(nullptr), 90);
  expectDumped(static_cast<InsertionsMap*>(nullptr), 0);
  Snapshot snapshot(space());
  std::ostringstream dumped;
  xostream os(dumped);
  EXPECT_THROW(DumpMap(snapshot, "none", os), UsageError);
}

TEST_P(BoundedMemoryTest, ALargeMapIsMadeInBatches) {
  OpenBounded();
  for (std::uint64_t n = 1; n <= kKeysOfLargeMap; n += 500) {
    {
      WriteTransaction transaction(space());
      Fill(transaction.Root<TombstonesMap>("t"), n, n + 499);
      const CacheStatistics cache = space().CacheStatistics();
      ASSERT_LE(cache.residentBytes, kCacheBytes + cache.pinnedBytes + kOperationBytes);
      transaction.Commit();
    }
    ASSERT_LE(ResidentBytes(), kCacheBytes);
    ASSERT_EQ(space().CacheStatistics().pinnedBytes, 0u);
  }
  Snapshot snapshot(space());
  EXPECT_TRUE(VerifySpace(snapshot).findings.empty());
  EXPECT_EQ(snapshot.Root<TombstonesMap>("t").size(), static_cast<ssize_t>(kKeysOfLargeMap));
}

TEST_P(BoundedMemoryTest, ALargeMapIsEmptiedInBatches) {
  MakeLargeMap();
  for (std::uint64_t n = 1; n <= kKeysOfLargeMap; n += 500) {
    {
      WriteTransaction transaction(space());
      auto& map = transaction.Root<TombstonesMap>("t");
      for (std::uint64_t key = n; key < n + 500; ++key) ASSERT_TRUE(map.Delete(Key(key)));
      transaction.Commit();
    }
    ASSERT_LE(ResidentBytes(), kCacheBytes);
  }
  Snapshot snapshot(space());
  EXPECT_TRUE(VerifySpace(snapshot).findings.empty());
  EXPECT_TRUE(snapshot.Root<TombstonesMap>("t").empty());
}

// With changed leaves about, the nodes above those that are not in memory have to be looked at.
TEST_P(BoundedMemoryTest, ALargeMapIsClearedWithLittleMemory) {
  MakeLargeMap();
  {
    WriteTransaction transaction(space());
    auto& map = transaction.Root<TombstonesMap>("t");
    transaction.Root<TombstonesMap>("u").Insert(Key(1), {}, true);
    for (std::uint64_t n = 1; n <= kKeysOfLargeMap; n += 10'000) map.Insert(Key(n), PayloadOf<TombstonesMap>(1), true);
    transaction.TrimTo(0);
    const std::uint64_t loads = space().CacheStatistics().loads;
    map.clear();
    EXPECT_LE(space().CacheStatistics().loads, loads + 1);
    transaction.Commit();
  }
  for (int commit = 0; !StoredStateOf(site.engine()).queue.empty(); ++commit) {
    ASSERT_LT(commit, 100);
    InTransaction(space(), [](WriteTransaction& transaction) { transaction.SetMeta("m", ""); });
    ASSERT_LE(ResidentBytes(), kCacheBytes);
  }
  Snapshot snapshot(space());
  const VerifyReport report = VerifySpace(snapshot);
  EXPECT_TRUE(report.findings.empty());
  EXPECT_EQ(report.records, 3u) << "two maps, and the node of one";
}

}  // namespace
}  // namespace vemo::test
