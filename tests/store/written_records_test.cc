// Which records a commit writes.
#include <algorithm>

#include "tests/store/store_fixture.h"
#include "tests/support/failing_allocator.h"

namespace vemo::test {
namespace {

class WrittenRecordsTest : public StoreTest {
 protected:
  std::unordered_set<OID> Written() const {
    const auto& ids = const_cast<WrittenRecordsTest*>(this)->watch().written;
    const std::unordered_set<OID> unique(ids.begin(), ids.end());
    EXPECT_EQ(unique.size(), ids.size()) << "a record was written twice";
    return unique;
  }
  // Every record but those of the maps themselves.
  std::size_t NodeRecords(std::size_t maps) { return Stored().records.size() - maps; }
};
INSTANTIATE_STORE_TEST(WrittenRecordsTest);

TEST_P(WrittenRecordsTest, TheFirstCommitWritesTheMapAndAllItsNodes) {
  CommitFilled<TombstonesMap>(space(), "t", 1000);
  Snapshot snapshot(space());
  const auto& map = snapshot.Root<TombstonesMap>("t");
  std::unordered_set<OID> expected = NodeIds(map);
  EXPECT_EQ(expected.size(), static_cast<std::size_t>(map.GetNumNodes()));
  expected.insert(map.GetPersistObjState().m_oid);
  EXPECT_EQ(Written(), expected);
  EXPECT_EQ(Stored().records.size(), expected.size());
}

TEST_P(WrittenRecordsTest, OnePayloadReplacedInALargeMapWritesOneLeaf) {
  CommitFilled<TombstonesMap>(space(), "t", 5000);
  for (const bool reopened : {false, true}) {
    if (reopened) site.Reopen();
    WriteTransaction transaction(space());
    auto& map = transaction.Root<TombstonesMap>("t");
    EXPECT_FALSE(map.Insert(Key(2500), PayloadOf<TombstonesMap>(1), true));
    const OID leaf = map.find(Key(2500)).m_leaf->GetPersistObjState().m_oid;
    transaction.Commit();
    EXPECT_EQ(Written(), std::unordered_set<OID>{leaf});
  }
}

TEST_P(WrittenRecordsTest, OneKeyInsertedWithoutASplitWritesItsLeafAndTheMap) {
  CommitFilled<TombstonesMap>(space(), "t", 5000);
  WriteTransaction transaction(space());
  auto& map = transaction.Root<TombstonesMap>("t");
  map.Insert(LongKey(2500), {}, false);
  const OID leaf = map.find(LongKey(2500)).m_leaf->GetPersistObjState().m_oid;
  transaction.Commit();
  EXPECT_EQ(Written(), (std::unordered_set<OID>{leaf, map.GetPersistObjState().m_oid}));
}

TEST_P(WrittenRecordsTest, ASplitWritesTheNewLeafThoughNobodyMarkedIt) {
  CommitFilled<TombstonesMap>(space(), "t", 100);  // one full leaf
  WriteTransaction transaction(space());
  auto& map = transaction.Root<TombstonesMap>("t");
  map.Insert(Key(101), {}, false);
  const std::unordered_set<OID> nodes = NodeIds(map);
  ASSERT_EQ(nodes.size(), 3u);
  transaction.Commit();
  std::unordered_set<OID> expected = nodes;
  expected.insert(map.GetPersistObjState().m_oid);
  EXPECT_EQ(Written(), expected);
  site.Reopen();
  EXPECT_EQ(Snapshot(space()).Root<TombstonesMap>("t").size(), 101);
}

TEST_P(WrittenRecordsTest, WhatDoesNotChangeIsNotWritten) {
  CommitFilled<TombstonesMap>(space(), "t", 1000);
  CommitFilled<InsertionsMap>(space(), "i", 1000);
  WriteTransaction transaction(space());
  auto& map = transaction.Root<TombstonesMap>("t");
  auto& other = transaction.Root<InsertionsMap>("i");
  EXPECT_FALSE(map.Insert(Key(3), PayloadOf<TombstonesMap>(77), false));  // keeps what is there
  EXPECT_FALSE(map.Delete(Key(5000)));
  EXPECT_TRUE(map == std::as_const(map));
  EXPECT_EQ(NumbersOf(std::as_const(other)).size(), 1000u);
  EXPECT_NE(other.rFind(Key(5)), nullptr);
  transaction.SetMeta("m", "");
  transaction.Commit();
  EXPECT_EQ(Written(), std::unordered_set<OID>{});
}

TEST_P(WrittenRecordsTest, ALoopOverAMapThatIsNotConstantWritesEveryLeafAndNoOtherNode) {
  site.Close();
  site.Open({.create = true, .cacheBytes = 10'000'000});  // so that nodes stay in memory between transactions
  CommitFilled<TombstonesMap>(space(), "t", 1000);
  WriteTransaction transaction(space());
  auto& map = transaction.Root<TombstonesMap>("t");
  for (auto& [key, payload] : map) payload = PayloadOf<TombstonesMap>(NumberOf(key) + 1);
  transaction.Commit();
  EXPECT_EQ(Written().size(), static_cast<std::size_t>(map.GetNumNodes()) - 1);  // height 1: all but the root
  site.Reopen();
  EXPECT_EQ(NumbersOf(Snapshot(space()).Root<TombstonesMap>("t")).at(1000), 1001u);
}

TEST_P(WrittenRecordsTest, NodesOfAMapOnTheStackThatNoRootReachesAreDropped) {
  CommitFilled<TombstonesMap>(space(), "t", 10);
  const std::size_t before = Stored().records.size();
  WriteTransaction transaction(space());
  TombstonesMap stack;
  Fill(stack, 1, 1000);
  transaction.Root<TombstonesMap>("t").Delete(Key(1));
  transaction.Commit();
  EXPECT_EQ(Stored().records.size(), before);
  EXPECT_EQ(Written().size(), 2u);
}

TEST_P(WrittenRecordsTest, WhatIsDroppedAlsoLeavesMemory) {
  const auto round = [&] {
    WriteTransaction transaction(space());
    TombstonesMap stack;
    Fill(stack, 1, 1000);
    transaction.Root<TombstonesMap>("t").Insert(Key(1), {}, true);
    transaction.Commit();
  };
  round();
  const std::int64_t live = LiveAllocations();
  for (int i = 0; i < 5; ++i) round();
  EXPECT_LT(LiveAllocations(), live + 20);  // a thousand payloads and twenty nodes each
}

TEST_P(WrittenRecordsTest, AssignmentWritesTheWholeNewTree) {
  CommitFilled<TombstonesMap>(space(), "from", 1000);
  CommitFilled<TombstonesMap>(space(), "to", 10);
  {
    WriteTransaction transaction(space());
    auto& to = transaction.Root<TombstonesMap>("to");
    to = transaction.View<TombstonesMap>("from");
    const std::unordered_set<OID> nodes = NodeIds(to);
    transaction.Commit();
    const std::unordered_set<OID> written = Written();
    for (const OID oid : nodes) EXPECT_TRUE(written.contains(oid)) << oid.m_value;
    EXPECT_TRUE(written.contains(to.GetPersistObjState().m_oid));
  }
  site.Reopen();
  Snapshot snapshot(space());
  EXPECT_EQ(NumbersOf(snapshot.Root<TombstonesMap>("to")), NumbersOf(snapshot.Root<TombstonesMap>("from")));
  EXPECT_EQ(FaultsOf(snapshot.Root<TombstonesMap>("to")), "");
}

TEST_P(WrittenRecordsTest, ANodeThatIsMadeAndMergedAwayInOneTransactionIsNeverWritten) {
  CommitFilled<TombstonesMap>(space(), "t", 100);
  const std::size_t before = Stored().records.size();
  WriteTransaction transaction(space());
  auto& map = transaction.Root<TombstonesMap>("t");
  Fill(map, 101, 1000);
  for (std::uint64_t n = 1000; n > 60; --n) map.Delete(Key(n));
  EXPECT_EQ(map.m_height, 0);
  transaction.Commit();
  EXPECT_EQ(Stored().records.size(), before);
  EXPECT_TRUE(watch().removed.empty());
  site.Reopen();
  EXPECT_EQ(Snapshot(space()).Root<TombstonesMap>("t").size(), 60);
}

}  // namespace
}  // namespace vemo::test
