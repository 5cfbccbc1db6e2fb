// What leaves memory, what stays, and what is counted.
#include <new>
#include <tuple>

#include "tests/store/bounded_map.h"
#include "tests/support/failing_allocator.h"

namespace vemo::test {
namespace {

using TrimTest = BoundedTest;
INSTANTIATE_BOUNDED_TEST(TrimTest);

TEST_P(TrimTest, WithoutABudgetNothingLeaves) {
  CommitFilled<TombstonesMap>(space(), "t", 5'000);
  WriteTransaction transaction(space());
  Snapshot snapshot(space());
  EXPECT_EQ(NumbersOf(snapshot.Root<TombstonesMap>("t")).size(), 5'000u);
  const std::uint64_t bytes = ResidentBytes();
  EXPECT_FALSE(transaction.Trim());
  EXPECT_FALSE(snapshot.Trim());
  EXPECT_EQ(ResidentBytes(), bytes);
  EXPECT_EQ(space().CacheStatistics().evictions, 0u);
}

TEST_P(TrimTest, ATransactionKeepsWhatItHasChanged) {
  CommitFilled<TombstonesMap>(space(), "t", 5'000);
  {
    WriteTransaction transaction(space());
    auto& map = transaction.Root<TombstonesMap>("t");
    for (std::uint64_t n = 1; n <= 5'000; n += 500) map.Insert(Key(n), PayloadOf<TombstonesMap>(n + 1), true);
    Fill(map, 5'001, 5'200);
    EXPECT_TRUE(transaction.TrimTo(0));
    const CacheStatistics cache = space().CacheStatistics();
    EXPECT_GT(cache.pinnedBytes, 0u);
    EXPECT_EQ(cache.residentBytes, cache.pinnedBytes) << "all else has left";
    for (std::uint64_t n = 1; n <= 5'200; ++n) {
      ASSERT_EQ(NumberUnder(map, n), n <= 5'000 && n % 500 == 1 ? n + 1 : n);
    }
    EXPECT_EQ(FaultsOf(map), "");
    transaction.Commit();
  }
  EXPECT_EQ(space().CacheStatistics().pinnedBytes, 0u);
  Snapshot snapshot(space());
  EXPECT_EQ(FaultsOf(snapshot.Root<TombstonesMap>("t")), "");
  EXPECT_EQ(NumberUnder(snapshot.Root<TombstonesMap>("t"), 501), 502u);
}

TEST_P(TrimTest, ATransactionThatIsAbandonedAfterwardsRestoresEverything) {
  CommitFilled<TombstonesMap>(space(), "t", 5'000);
  const StoredState stored = StoredStateOf(site.engine());
  const std::string text = ToText(Snapshot(space()).Root<TombstonesMap>("t"));
  const TombstonesMap* address = nullptr;
  {
    WriteTransaction transaction(space());
    auto& map = transaction.Root<TombstonesMap>("t");
    address = &map;
    for (std::uint64_t n = 1; n <= 3'000; ++n) {
      map.Delete(Key(n));
      if (n % 100 == 0) transaction.TrimTo(0);
    }
    Fill(map, 6'000, 6'500);
    transaction.TrimTo(0);
  }
  EXPECT_EQ(StoredStateOf(site.engine()), stored);
  EXPECT_EQ(space().CacheStatistics().pinnedBytes, 0u);
  WriteTransaction transaction(space());
  EXPECT_EQ(&transaction.View<TombstonesMap>("t"), address);
  EXPECT_EQ(ToText(transaction.View<TombstonesMap>("t")), text);
}

TEST_P(TrimTest, NodesOfMapsOnTheStackStayWhileTheyAreNew) {
  WriteTransaction transaction(space());
  TombstonesMap stack;
  Fill(stack, 1, 1'000);
  transaction.TrimTo(0);
  EXPECT_EQ(FaultsOf(stack), "");
  transaction.Root<TombstonesMap>("t").swap(stack);
  transaction.TrimTo(0);
  transaction.Commit();
  EXPECT_EQ(NumbersOf(Snapshot(space()).Root<TombstonesMap>("t")).size(), 1'000u);
}

TEST_P(TrimTest, ASnapshotReadsTheSameAfterwards) {
  CommitFilled<TombstonesMap>(space(), "t", 5'000);
  Snapshot snapshot(space());
  const auto& map = snapshot.Root<TombstonesMap>("t");
  const std::string text = ToText(map);
  EXPECT_TRUE(snapshot.TrimTo(0));
  EXPECT_FALSE(snapshot.TrimTo(0)) << "there is nothing left to leave";
  EXPECT_EQ(&snapshot.Root<TombstonesMap>("t"), &map);
  EXPECT_EQ(ToText(map), text);
  snapshot.TrimTo(0);
  CommitFilled<TombstonesMap>(space(), "t", 100);
  snapshot.Refresh();
  EXPECT_EQ(NumbersOf(map).size(), 5'000u);
}

TEST_P(TrimTest, WhatIsUsedAgainStaysAndIsACheapMiss) {
  MakeLargeMap();
  site.Close();
  site.Open({.create = true, .cacheBytes = 20 * kCacheBytes});  // so that a pass has many to choose from
  std::mt19937_64 random(5);
  Snapshot snapshot(space());
  const auto& map = snapshot.Root<TombstonesMap>("t");
  for (int i = 0; i < 5'000; ++i) {
    NumberUnder(map, 1);  // the leaf that is wanted every time
    NumberUnder(map, 1 + random() % kKeysOfLargeMap);
    snapshot.Trim();
  }
  const CacheStatistics cache = space().CacheStatistics();
  EXPECT_GT(cache.cheapMisses, 20u);
  EXPECT_GE(cache.hits, cache.cheapMisses);
  EXPECT_EQ(cache.loads - cache.evictions, [&] {
    std::uint64_t left = 0;
    for (const auto& [oid, record] : StoredStateOf(site.engine()).records) {
      if (snapshot.Objects().Find(oid).m_self != nullptr) ++left;
    }
    return left;
  }()) << "what was loaded has left or is there";
  EXPECT_GT(cache.evictions, 5 * cache.passes) << "a pass makes many leave";
}

TEST_P(TrimTest, TheChoiceFollowsFromTheSeed) {
  MakeLargeMap();
  const auto run = [&](std::uint64_t seed) {
    OpenBounded(seed);
    std::mt19937_64 random(6);
    for (int i = 0; i < 1'000; ++i) {
      WriteTransaction transaction(space());
      NumberUnder(transaction.View<TombstonesMap>("t"), 1 + random() % 5'000);
    }
    const CacheStatistics cache = space().CacheStatistics();
    return std::tuple(cache.hits, cache.cheapMisses, cache.loads, cache.evictions);
  };
  const auto first = run(1);
  EXPECT_EQ(run(1), first);
  EXPECT_NE(run(2), first);
}

TEST_P(TrimTest, TheBytesOfLongPathsAndPayloadsAreCounted) {
  const auto bytesOf = [&](auto fill) {
    site.Open({.create = true});
    WriteTransaction transaction(space());
    fill(transaction);
    transaction.Commit();
    const std::uint64_t bytes = ResidentBytes();
    InTransaction(space(), [](WriteTransaction& next) { next.DeleteRoot("t"); });
    EXPECT_EQ(ResidentBytes(), 0u);
    site.Close();
    return bytes;
  };
  site.Close();
  const auto fillWith = [](std::uint64_t runs, KeyMaker key) {
    return [runs, key](WriteTransaction& transaction) {
      auto& map = transaction.Root<InsertionsMap>("t");
      for (std::uint64_t n = 1; n <= 100; ++n) {
        VectorInsertions payload;
        for (std::uint64_t run = 0; run < runs; ++run) payload.m_c.InsertAfter(nullptr, {});
        map.Insert(key(n), payload, true);
      }
    };
  };
  const std::uint64_t plain = bytesOf(fillWith(0, &Key));
  const std::uint64_t longKeys = bytesOf(fillWith(0, &LongKey));
  const std::uint64_t payloads = bytesOf(fillWith(10, &Key));
  EXPECT_GE(longKeys, plain + 100 * 6 * sizeof(Path::Element));
  EXPECT_GE(payloads, plain + 1'000 * sizeof(FrontLinkedList<VectorInsertionInterval, VectorInsertionInterval, true>::Node));
}

bool TrimsTo(Snapshot& snapshot, std::size_t bytes) {
  try {
    return snapshot.TrimTo(bytes);
  } catch (const std::bad_alloc&) {
    return false;
  }
}

TEST_P(TrimTest, APassWithoutMemoryChangesNothing) {
  CommitFilled<InsertionsMap>(space(), "t", 3'000);
  Snapshot snapshot(space());
  const auto& map = snapshot.Root<InsertionsMap>("t");
  const std::string text = ToText(map);
  const std::uint64_t bytes = ResidentBytes();
  std::int64_t nth = 1;
  for (bool failed = true; failed; ++nth) {
    {
      FailingAllocation failing(nth);
      const bool trimmed = TrimsTo(snapshot, bytes / 4);
      failed = failing.HasFailed();
      EXPECT_NE(trimmed, failed);
    }
    if (!failed) break;
    EXPECT_EQ(ResidentBytes(), bytes);
    EXPECT_EQ(ToText(map), text);
  }
  EXPECT_GT(nth, 5);
  EXPECT_LT(ResidentBytes(), bytes);
  EXPECT_EQ(ToText(map), text);
}

}  // namespace
}  // namespace vemo::test
