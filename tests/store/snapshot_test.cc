// Snapshots beside one another, beside transactions, and on other threads.
#include <thread>

#include "tests/store/store_fixture.h"

namespace vemo::test {
namespace {

using SnapshotTest = StoreTest;
INSTANTIATE_STORE_TEST(SnapshotTest);

void DeleteAndInsert(CSpace& space, std::uint64_t firstDeleted, std::uint64_t lastDeleted,
                     std::uint64_t inserted) {
  WriteTransaction transaction(space);
  auto& map = transaction.Root<TombstonesMap>("t");
  for (std::uint64_t n = firstDeleted; n <= lastDeleted; ++n) map.Delete(Key(n));
  map.Insert(Key(inserted), PayloadOf<TombstonesMap>(inserted), true);
  transaction.Commit();
}

TEST_P(SnapshotTest, TwoCommitsAndATransactionAreWalkedInStepOnOneThread) {
  CommitFilled<TombstonesMap>(space(), "t", 2000);
  Snapshot older(space());
  DeleteAndInsert(space(), 501, 700, 9000);
  Snapshot newer(space());
  WriteTransaction transaction(space());
  auto& written = transaction.Root<TombstonesMap>("t");
  for (std::uint64_t n = 1; n <= 300; ++n) written.Delete(Key(n));

  // Nothing of the two snapshots is in memory yet: each reference resolves in the view that it was read in.
  const auto& a = older.Root<TombstonesMap>("t");
  const auto& b = newer.Root<TombstonesMap>("t");
  const auto& c = std::as_const(written);
  auto i = a.begin(), j = b.begin(), k = c.begin();
  std::uint64_t steps = 0;
  while (i != a.end() || j != b.end() || k != c.end()) {
    if (i != a.end()) {
      EXPECT_EQ(NumberOf(i->first), ++steps);
      ++i;
    }
    if (j != b.end()) ++j;
    if (k != c.end()) ++k;
  }
  EXPECT_EQ(steps, 2000u);
  EXPECT_EQ(NumbersOf(a).size(), 2000u);
  EXPECT_EQ(NumbersOf(b).size(), 1801u);
  EXPECT_EQ(NumbersOf(c).size(), 1501u);
  EXPECT_EQ(FaultsOf(a) + FaultsOf(b) + FaultsOf(c), "");
  transaction.Commit();
  EXPECT_EQ(NumbersOf(a).size(), 2000u);
  EXPECT_EQ(NumbersOf(b).size(), 1801u);
}

TEST_P(SnapshotTest, MapsOfTwoCommitsCompare) {
  CommitFilled<TombstonesMap>(space(), "t", 1000);
  CommitFilled<TombstonesMap>(space(), "u", 1000);
  Snapshot first(space());
  {
    WriteTransaction transaction(space());
    transaction.SetMeta("m", "");
    transaction.Commit();
  }
  Snapshot second(space());
  {
    WriteTransaction transaction(space());
    transaction.Root<TombstonesMap>("t").Insert(Key(700), PayloadOf<TombstonesMap>(0), true);
    transaction.Commit();
  }
  Snapshot third(space());
  EXPECT_TRUE(first.Root<TombstonesMap>("t") == second.Root<TombstonesMap>("t"));
  EXPECT_FALSE(second.Root<TombstonesMap>("t") == third.Root<TombstonesMap>("t"));
  EXPECT_TRUE(first.Root<TombstonesMap>("t") == third.Root<TombstonesMap>("u"));
  EXPECT_NE(&first.Root<TombstonesMap>("t"), &second.Root<TombstonesMap>("t"));
  WriteTransaction transaction(space());
  EXPECT_TRUE(transaction.View<TombstonesMap>("t") == third.Root<TombstonesMap>("t"));
  EXPECT_FALSE(transaction.View<TombstonesMap>("t") == first.Root<TombstonesMap>("t"));
}

TEST_P(SnapshotTest, AMapCanBeCopiedOutOfASnapshot) {
  CommitFilled<TombstonesMap>(space(), "t", 1000);
  Snapshot snapshot(space());
  const auto& old = snapshot.Root<TombstonesMap>("t");
  {
    WriteTransaction transaction(space());
    transaction.Root<TombstonesMap>("t").clear();
    transaction.Commit();
  }
  {
    WriteTransaction transaction(space());
    transaction.Root<TombstonesMap>("t") = old;
    transaction.Commit();
  }
  EXPECT_EQ(CommittedText<TombstonesMap>("t"), ToText(old));
}

TEST_P(SnapshotTest, OutlivesLaterCommitsAndEverySliceOfADeletion) {
  CommitFilled<TombstonesMap>(space(), "t", 20'000);
  site.Reopen();
  Snapshot snapshot(space());
  const auto& map = snapshot.Root<TombstonesMap>("t");
  EXPECT_NE(map.rFind(Key(10'000)), nullptr);
  {
    WriteTransaction transaction(space());
    transaction.Root<TombstonesMap>("t").clear();
    transaction.Commit();
  }
  for (int i = 0; !Stored().queue.empty(); ++i) {
    ASSERT_LT(i, 20);
    WriteTransaction transaction(space());
    transaction.SetMeta("m", std::to_string(i));
    transaction.Commit();
  }
  EXPECT_EQ(Stored().records.size(), 1u);
  EXPECT_EQ(FaultsOf(map), "");
  EXPECT_EQ(NumbersOf(map).size(), 20'000u);
  EXPECT_EQ(snapshot.Meta("m"), std::nullopt);
  EXPECT_EQ(Snapshot(space()).Root<TombstonesMap>("t").size(), 0);
}

TEST_P(SnapshotTest, DoesNotSeeWhatATransactionHasNotCommitted) {
  CommitFilled<TombstonesMap>(space(), "t", 300);
  WriteTransaction transaction(space());
  Fill(transaction.Root<TombstonesMap>("t"), 1000, 1100);
  transaction.Root<TombstonesMap>("new");
  Snapshot snapshot(space());
  EXPECT_EQ(snapshot.Root<TombstonesMap>("t").size(), 300);
  EXPECT_FALSE(snapshot.HasRoot("new"));
  EXPECT_THROW(snapshot.Root<TombstonesMap>("new"), UsageError);
  transaction.Commit();
  EXPECT_EQ(NumbersOf(snapshot.Root<TombstonesMap>("t")).size(), 300u);
  EXPECT_TRUE(Snapshot(space()).HasRoot("new"));
}

TEST_P(SnapshotTest, OtherThreadsReadTheirSnapshotsWhileThisOneCommits) {
  CommitFilled<TombstonesMap>(space(), "t", 1);
  constexpr std::uint64_t kCommits = 60;
  std::vector<std::thread> readers;
  for (int reader = 0; reader < 4; ++reader) {
    readers.emplace_back([&] {
      for (std::uint64_t seen = 0; seen < kCommits;) {
        Snapshot snapshot(space());
        const auto& map = snapshot.Root<TombstonesMap>("t");
        const auto numbers = NumbersOf(map);
        EXPECT_EQ(static_cast<ssize_t>(numbers.size()), map.size());
        EXPECT_EQ(FaultsOf(map), "");
        EXPECT_EQ(snapshot.Meta("size").value_or("1"), std::to_string(numbers.size()));
        EXPECT_GE(snapshot.Generation() - 2, seen);
        seen = snapshot.Generation() - 2;
      }
    });
  }
  for (std::uint64_t commit = 1; commit <= kCommits; ++commit) {
    WriteTransaction transaction(space());
    auto& map = transaction.Root<TombstonesMap>("t");
    if (commit % 5 == 0) map.clear();
    Fill(map, 50 * commit, 50 * commit + 49);
    transaction.SetMeta("size", std::to_string(map.size()));
    transaction.Commit();
  }
  for (std::thread& reader : readers) reader.join();
}

TEST_P(SnapshotTest, CanBeHandedToAnotherThread) {
  CommitFilled<TombstonesMap>(space(), "t", 1000);
  site.Reopen();
  Snapshot snapshot(space());
  const auto& map = snapshot.Root<TombstonesMap>("t");
  EXPECT_NE(map.rFind(Key(1)), nullptr);
  std::thread([&] { EXPECT_EQ(NumbersOf(map).size(), 1000u); }).join();
  EXPECT_EQ(FaultsOf(map), "");
}

}  // namespace
}  // namespace vemo::test
