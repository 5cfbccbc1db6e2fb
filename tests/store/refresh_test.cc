// Moving a snapshot to the newest commit.
#include "tests/store/store_fixture.h"

namespace vemo::test {
namespace {

using RefreshTest = StoreTest;
INSTANTIATE_STORE_TEST(RefreshTest);

TEST_P(RefreshTest, ShowsTheNewestCommitInTheSameMap) {
  CommitFilled<TombstonesMap>(space(), "t", 1000);
  Snapshot snapshot(space());
  const auto& map = snapshot.Root<TombstonesMap>("t");
  EXPECT_EQ(NumbersOf(map).size(), 1000u);
  {
    WriteTransaction transaction(space());
    auto& written = transaction.Root<TombstonesMap>("t");
    for (std::uint64_t n = 200; n <= 600; ++n) written.Delete(Key(n));
    written.Insert(Key(5000), PayloadOf<TombstonesMap>(7), true);
    transaction.Commit();
  }
  EXPECT_EQ(NumbersOf(map).size(), 1000u);
  snapshot.Refresh();
  EXPECT_EQ(&snapshot.Root<TombstonesMap>("t"), &map);
  EXPECT_EQ(NumbersOf(map).size(), 600u);
  EXPECT_EQ(NumbersOf(map).at(5000), 7u);
  EXPECT_EQ(FaultsOf(map), "");
  EXPECT_EQ(snapshot.Generation(), Stored().generation);
}

TEST_P(RefreshTest, KeepsNodesThatDidNotChangeInMemory) {
  site.Close();
  site.Open({.create = true, .cacheBytes = 10'000'000});
  CommitFilled<TombstonesMap>(space(), "t", 5000);
  Snapshot snapshot(space());
  const auto& map = snapshot.Root<TombstonesMap>("t");
  EXPECT_EQ(FaultsOf(map), "");
  const auto* payload = map.rFind(Key(10));
  {
    WriteTransaction transaction(space());
    transaction.Root<TombstonesMap>("t").Insert(Key(4990), PayloadOf<TombstonesMap>(1), true);
    transaction.Commit();
  }
  const std::uint64_t before = watch().reads;
  snapshot.Refresh();
  EXPECT_EQ(map.rFind(Key(10)), payload) << "a leaf that did not change keeps its place";
  EXPECT_EQ(PayloadNumber<VectorTombstones>::Number(*map.rFind(Key(4990))), 1u);
  EXPECT_GT(watch().reads, before);
}

TEST_P(RefreshTest, SeesRootsThatCameWentAndWereRenamed) {
  CommitFilled<TombstonesMap>(space(), "t", 10);
  CommitFilled<TombstonesMap>(space(), "gone", 10);
  Snapshot snapshot(space());
  EXPECT_EQ(snapshot.Root<TombstonesMap>("t").size(), 10);
  EXPECT_EQ(snapshot.Root<TombstonesMap>("gone").size(), 10);
  {
    WriteTransaction transaction(space());
    transaction.RenameRoot("t", "u");
    transaction.DeleteRoot("gone");
    transaction.Root<InsertionsMap>("t");
    transaction.Commit();
  }
  snapshot.Refresh();
  EXPECT_EQ(snapshot.RootNames(), (std::vector<std::string>{"t", "u"}));
  EXPECT_EQ(snapshot.Root<TombstonesMap>("u").size(), 10);
  EXPECT_EQ(snapshot.Root<InsertionsMap>("t").size(), 0);
  EXPECT_THROW(snapshot.Root<TombstonesMap>("gone"), UsageError);
}

TEST_P(RefreshTest, OfAClearedMapIsEmpty) {
  CommitFilled<TombstonesMap>(space(), "t", 1000);
  Snapshot snapshot(space());
  const auto& map = snapshot.Root<TombstonesMap>("t");
  EXPECT_EQ(FaultsOf(map), "");
  {
    WriteTransaction transaction(space());
    transaction.Root<TombstonesMap>("t").clear();
    transaction.Commit();
  }
  snapshot.Refresh();
  EXPECT_TRUE(map.empty());
  EXPECT_EQ(map.m_height, -1);
}

TEST_P(RefreshTest, WithoutANewCommitChangesNothing) {
  CommitFilled<TombstonesMap>(space(), "t", 100);
  Snapshot snapshot(space());
  const auto& map = snapshot.Root<TombstonesMap>("t");
  const auto* payload = map.rFind(Key(10));
  const std::uint64_t number = PayloadNumber<TombstonesMap::Payload>::Number(*payload);
  snapshot.Refresh();
  EXPECT_EQ(PayloadNumber<TombstonesMap::Payload>::Number(*map.rFind(Key(10))), number);
  // A node that was evicted may be read to another place.
  if (!Evicts(GetParam())) {
    EXPECT_EQ(map.rFind(Key(10)), payload);
  }
}

// Each commit is compared with its own model, over many of them, in a snapshot that lives through all.
TEST_P(RefreshTest, FollowsManyCommits) {
  std::map<std::uint64_t, std::uint64_t> model;
  CommitFilled<TombstonesMap>(space(), "t", 300);
  for (std::uint64_t n = 1; n <= 300; ++n) model[n] = n;
  Snapshot snapshot(space());
  const auto& map = snapshot.Root<TombstonesMap>("t");
  for (std::uint64_t round = 0; round < 40; ++round) {
    {
      WriteTransaction transaction(space());
      auto& written = transaction.Root<TombstonesMap>("t");
      for (std::uint64_t i = 0; i < 25; ++i) {
        const std::uint64_t n = 1 + (round * 7919 + i * 104729) % 900;
        if ((n + round) % 3 == 0) {
          written.Delete(Key(n));
          model.erase(n);
        } else {
          written.Insert(Key(n), PayloadOf<TombstonesMap>(round), true);
          model[n] = round;
        }
      }
      transaction.Commit();
    }
    snapshot.Refresh();
    ASSERT_EQ(NumbersOf(map), model) << "round " << round;
    ASSERT_EQ(FaultsOf(map), "") << "round " << round;
  }
}

}  // namespace
}  // namespace vemo::test
