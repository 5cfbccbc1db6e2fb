// What deleted objects leave in the engine: nothing, at the latest a few commits later.
#include <algorithm>

#include "tests/store/store_fixture.h"

namespace vemo::test {
namespace {

class DeletionTest : public StoreTest {
 protected:
  // Commits something else, so that a slice of the queue is worked off. Returns how many records it removed.
  std::size_t CommitSlice() {
    WriteTransaction transaction(space());
    transaction.SetMeta("tick", std::to_string(m_ticks++));
    transaction.Commit();
    return watch().removed.size();
  }

  // Everything in the engine is what the roots reach, and nothing else.
  template <class Map>
  void ExpectNoLeak(const std::vector<std::string>& roots) {
    std::unordered_set<OID> reached;
    Snapshot snapshot(space());
    for (const std::string& name : roots) {
      const auto& map = snapshot.Root<Map>(name);
      EXPECT_EQ(FaultsOf(map), "") << name;
      reached.merge(NodeIds(map));
      reached.insert(map.GetPersistObjState().m_oid);
    }
    const StoredState stored = Stored();
    for (const auto& [oid, record] : stored.records)
      EXPECT_TRUE(reached.contains(oid)) << oid.m_value << " leaked";
    EXPECT_EQ(stored.records.size(), reached.size());
    EXPECT_TRUE(stored.queue.empty());
  }

  int m_ticks = 0;
};
INSTANTIATE_STORE_TEST(DeletionTest);

TEST_P(DeletionTest, NodesThatWereMergedAwayLeaveAtThatCommit) {
  CommitFilled<TombstonesMap>(space(), "t", 7000);
  ASSERT_EQ(Snapshot(space()).Root<TombstonesMap>("t").m_height, 2);
  const std::size_t before = Stored().records.size();
  {
    WriteTransaction transaction(space());
    auto& map = transaction.Root<TombstonesMap>("t");
    for (std::uint64_t n = 1; n <= 6900; ++n) map.Delete(Key(n));
    transaction.Commit();
  }
  EXPECT_LT(Stored().records.size(), before / 10);
  ExpectNoLeak<TombstonesMap>({"t"});
  site.Reopen();
  ExpectNoLeak<TombstonesMap>({"t"});
}

TEST_P(DeletionTest, TheNodesOfAClearedMapInMemoryLeaveAtThatCommit) {
  site.Close();
  site.Open({.create = true, .cacheBytes = 10'000'000});  // so that nodes stay in memory between transactions
  CommitFilled<TombstonesMap>(space(), "t", 3000);
  WriteTransaction transaction(space());
  transaction.Root<TombstonesMap>("t").clear();
  transaction.Commit();
  EXPECT_EQ(Stored().records.size(), 1u);
  ExpectNoLeak<TombstonesMap>({"t"});
}

TEST_P(DeletionTest, ALargeMapThatIsNotInMemoryLeavesInSlicesWhichSurviveReopening) {
  CommitFilled<TombstonesMap>(space(), "t", 40'000);
  CommitFilled<TombstonesMap>(space(), "kept", 500);
  std::size_t left = Stored().records.size();
  const auto keptNodes =
      static_cast<std::size_t>(Snapshot(space()).Root<TombstonesMap>("kept").GetNumNodes());
  site.Reopen();
  const std::uint64_t reads = watch().reads;
  {
    WriteTransaction transaction(space());
    transaction.Root<TombstonesMap>("t").clear();
    transaction.Commit();
  }
  EXPECT_LT(watch().reads - reads, 10u) << "clear does not read the map";
  std::vector<std::size_t> slices{watch().removed.size()};
  std::unordered_set<OID> removed(watch().removed.begin(), watch().removed.end());
  left -= slices.back();
  EXPECT_FALSE(Stored().queue.empty());
  for (int commit = 0; !Stored().queue.empty(); ++commit) {
    ASSERT_LT(commit, 20);
    if (commit % 2 == 0) site.Reopen();
    slices.push_back(CommitSlice());
    for (const OID oid : watch().removed)
      EXPECT_TRUE(removed.insert(oid).second) << oid.m_value << " deleted twice";
    left -= slices.back();
    EXPECT_EQ(Stored().records.size(), left);
  }
  EXPECT_GT(slices.size(), 4u);
  EXPECT_LE(*std::max_element(slices.begin(), slices.end()), 256u);
  EXPECT_EQ(left, keptNodes + 2);
  ExpectNoLeak<TombstonesMap>({"t", "kept"});
}

TEST_P(DeletionTest, ASliceOfACommitThatFailsIsDoneAgain) {
  CommitFilled<TombstonesMap>(space(), "t", 7000);
  site.Reopen();
  {
    WriteTransaction transaction(space());
    transaction.Root<TombstonesMap>("t").clear();
    transaction.Commit();
  }
  const StoredState stored = Stored();
  {
    WriteTransaction transaction(space());
    transaction.SetMeta("m", "");
    watch().failingCommit.Set(1);
    EXPECT_THROW(transaction.Commit(), InjectedFailure);
  }
  EXPECT_EQ(Stored(), stored);
  while (!Stored().queue.empty()) CommitSlice();
  ExpectNoLeak<TombstonesMap>({"t"});
}

TEST_P(DeletionTest, ARecordThatIsMissingInTheQueueIsNoError) {
  CommitFilled<TombstonesMap>(space(), "t", 7000);
  site.Reopen();
  {
    WriteTransaction transaction(space());
    transaction.Root<TombstonesMap>("t").clear();
    transaction.Commit();
  }
  CommitSlice();
  const std::vector<OID> queue = Stored().queue;
  ASSERT_GT(queue.size(), 3u);
  site.Tamper(queue[0], std::nullopt);
  site.Tamper(queue[2], std::nullopt);
  while (!Stored().queue.empty()) CommitSlice();
  ExpectNoLeak<TombstonesMap>({"t"});
}

TEST_P(DeletionTest, ADamagedRecordInTheQueueLeavesWithTheOthers) {
  CommitFilled<TombstonesMap>(space(), "t", 3000);
  site.Reopen();
  {
    WriteTransaction transaction(space());
    transaction.Root<TombstonesMap>("t").clear();
    transaction.Commit();
  }
  const std::vector<OID> queue = Stored().queue;
  ASSERT_GT(queue.size(), 3u);
  Bytes damaged = Stored().records.at(queue[1]);
  damaged[damaged.size() / 2] ^= 1;
  site.Tamper(queue[1], damaged);
  while (!Stored().queue.empty()) CommitSlice();
  ExpectNoLeak<TombstonesMap>({"t"});
}

TEST_P(DeletionTest, AClearTakesChangedAndNewNodesAlong) {
  CommitFilled<TombstonesMap>(space(), "t", 7000);
  site.Reopen();
  {
    WriteTransaction transaction(space());
    auto& map = transaction.Root<TombstonesMap>("t");
    Fill(map, 3000, 3010, 5);
    Fill(map, 7001, 7400);
    for (std::uint64_t n = 1; n < 200; ++n) map.Delete(Key(n));
    map.clear();
    EXPECT_EQ(map.m_height, -1);
    Fill(map, 1, 120);
    transaction.Commit();
  }
  EXPECT_EQ(Snapshot(space()).Root<TombstonesMap>("t").size(), 120);
  while (!Stored().queue.empty()) CommitSlice();
  ExpectNoLeak<TombstonesMap>({"t"});
}

TEST_P(DeletionTest, ATreeThatWasNeverCommittedLeavesNothing) {
  WriteTransaction transaction(space());
  auto& map = transaction.Root<TombstonesMap>("t");
  Fill(map, 1, 7000);
  map.clear();
  transaction.Commit();
  EXPECT_TRUE(watch().removed.empty());
  EXPECT_TRUE(watch().queued.empty());
  EXPECT_EQ(Stored().records.size(), 1u);
}

TEST_P(DeletionTest, AnAbortRestoresAClearedMapWhateverOfItWasInMemory) {
  CommitFilled<TombstonesMap>(space(), "t", 7000);
  const auto numbers = NumbersOf(Snapshot(space()).Root<TombstonesMap>("t"));
  const StoredState stored = Stored();
  for (const bool inMemory : {true, false}) {
    if (!inMemory) site.Reopen();
    {
      WriteTransaction transaction(space());
      auto& map = transaction.Root<TombstonesMap>("t");
      map.Insert(Key(3500), {}, true);
      map.clear();
      Fill(map, 1, 10);
    }
    EXPECT_EQ(Stored(), stored);
    WriteTransaction transaction(space());
    EXPECT_EQ(NumbersOf(transaction.View<TombstonesMap>("t")), numbers);
    EXPECT_EQ(FaultsOf(transaction.View<TombstonesMap>("t")), "");
  }
}

// A leaf is reached along the chain without its parent: the clear that follows must still find it.
TEST_P(DeletionTest, AClearFindsChangedLeavesBelowNodesThatAreNotInMemory) {
  CommitFilled<TombstonesMap>(space(), "t", 12'000);
  ASSERT_EQ(Snapshot(space()).Root<TombstonesMap>("t").m_height, 2);
  for (const bool all : {false, true}) {
    site.Reopen();
    WriteTransaction transaction(space());
    auto& map = transaction.Root<TombstonesMap>("t");
    ASSERT_NE(map.rFind(Key(1)), nullptr);  // the first internal node and its first leaf are in memory now
    std::uint64_t visited = 0;
    for (auto& [key, payload] : map) {
      payload = PayloadOf<TombstonesMap>(1);
      if (!all && ++visited == 4'000) break;  // beyond the leaves of that node
    }
    map.clear();
    Fill(map, 1, 60);
    if (!all) continue;  // an abort
    transaction.Commit();
  }
  EXPECT_EQ(Snapshot(space()).Root<TombstonesMap>("t").size(), 60);
  while (!Stored().queue.empty()) CommitSlice();
  ExpectNoLeak<TombstonesMap>({"t"});
}

TEST_P(DeletionTest, AClearReadsNoLeafToFindChangedOnesOfOtherMaps) {
  CommitFilled<TombstonesMap>(space(), "t", 12'000);
  CommitFilled<TombstonesMap>(space(), "u", 10);
  site.Reopen();
  WriteTransaction transaction(space());
  transaction.Root<TombstonesMap>("u").Delete(Key(1));
  const std::uint64_t reads = watch().reads;
  transaction.Root<TombstonesMap>("t").clear();
  EXPECT_LT(watch().reads - reads, 20u);
  transaction.Commit();
  while (!Stored().queue.empty()) CommitSlice();
  ExpectNoLeak<TombstonesMap>({"t", "u"});
}

TEST_P(DeletionTest, ADamagedMapCanBeCleared) {
  CommitFilled<TombstonesMap>(space(), "t", 12'000);
  OID damagedNode;
  {
    Snapshot snapshot(space());
    const auto& map = snapshot.Root<TombstonesMap>("t");
    damagedNode = static_cast<const TombstonesMap::InternalNode*>(map.m_root.Get())->ChildReference(1).m_oid;
  }
  site.Reopen();
  Bytes damaged = Stored().records.at(damagedNode);
  damaged.back() ^= 1;
  site.Tamper(damagedNode, damaged);
  WriteTransaction transaction(space());
  auto& map = transaction.Root<TombstonesMap>("t");
  map.Insert(Key(1), {}, true);
  map.begin()->second = {};
  transaction.Root<TombstonesMap>("u").Insert(Key(1), {}, true);
  map.clear();
  transaction.Commit();
  while (!Stored().queue.empty()) CommitSlice();
  EXPECT_FALSE(Stored().records.contains(damagedNode));
}

}  // namespace
}  // namespace vemo::test
