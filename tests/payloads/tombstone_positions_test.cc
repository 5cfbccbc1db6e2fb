// Tombstones as positions: the mapping between p and q, and how editing moves it.
#include <gtest/gtest.h>

#include <new>
#include <random>
#include <vector>

#include "tests/payloads/example_payloads.h"
#include "tests/support/assertion_death.h"
#include "tests/support/failing_allocator.h"
#include "tests/support/seed.h"
#include "vxUtils/ByteForms.h"

namespace vemo {
namespace {

using test::Intervals;
using test::Tombstones;
using List = IntervalList<ssize_t>;

VectorTombstones AfterInsert(VectorTombstones map, ssize_t q, ssize_t n) {
  map.Insert(q, n);
  map.AssertValid();
  return map;
}

// The map after Erasep; `erased` is what it reported.
VectorTombstones AfterErase(VectorTombstones map, ssize_t p, ssize_t n, List& erased) {
  erased = Intervals({{77, 78}});
  map.Erasep(p, n, erased);
  map.AssertValid();
  return map;
}

TEST(TombstonePositions, OfAMapWithoutTombstonesAreTheSame) {
  const VectorTombstones map;
  EXPECT_EQ(map.GetQ(5), 5);
  EXPECT_EQ(map.GetP(5), 5);
  EXPECT_TRUE(map.Exists(5));
  EXPECT_EQ(map.NumTombstones(), 0);
  EXPECT_EQ(map.NumTombstonesBefore(5), 0);
}

TEST(TombstonePositions, SkipTombstones) {
  const VectorTombstones map = Tombstones({{1, 3}, {5, 6}});  // .**..*..
  const std::vector<ssize_t> liveAt = {0, 3, 4, 6, 7};
  for (std::size_t p = 0; p < liveAt.size(); ++p)
    EXPECT_EQ(map.GetQ(static_cast<ssize_t>(p)), liveAt[p]) << p;
  const std::vector<ssize_t> liveBefore = {0, 1, 1, 1, 2, 3, 3, 4};
  for (std::size_t q = 0; q < liveBefore.size(); ++q)
    EXPECT_EQ(map.GetP(static_cast<ssize_t>(q)), liveBefore[q]) << q;
  const std::vector<bool> live = {true, false, false, true, true, false, true, true};
  for (std::size_t q = 0; q < live.size(); ++q) EXPECT_EQ(map.Exists(static_cast<ssize_t>(q)), live[q]) << q;
  const std::vector<ssize_t> tombstonesBefore = {0, 0, 1, 2, 2, 2, 3, 3};
  for (std::size_t q = 0; q < tombstonesBefore.size(); ++q) {
    EXPECT_EQ(map.NumTombstonesBefore(static_cast<ssize_t>(q)), tombstonesBefore[q]) << q;
  }
  EXPECT_EQ(map.NumTombstones(), 3);
}

TEST(TombstonePositions, BeginBehindARunAtZero) {
  const VectorTombstones map = Tombstones({{0, 2}});
  EXPECT_EQ(map.GetQ(0), 2);
  EXPECT_EQ(map.GetP(2), 0);
}

TEST(TombstonePositions, AreNotNegative) {
  VectorTombstones map;
  [[maybe_unused]] List erased;
  EXPECT_ASSERTION(map.GetQ(-1), "0 <= p");
  EXPECT_ASSERTION(map.GetP(-1), "0 <= q");
  EXPECT_ASSERTION(map.Exists(-1), "0 <= q");
  EXPECT_ASSERTION(map.NumTombstonesBefore(-1), "0 <= q");
  EXPECT_ASSERTION(map.Insert(-1, 1), "0 <= q");
  EXPECT_ASSERTION(map.Insert(0, -1), "0 <= n");
  EXPECT_ASSERTION(map.Erasep(-1, 1, erased), "0 <= p");
  EXPECT_ASSERTION(map.Erasep(0, -1, erased), "0 <= n");
}

TEST(TombstonePositions, AssertValidRefusesListsThatBreakTheInvariant) {
  Tombstones({}).AssertValid();
  Tombstones({{0, 1}, {2, 3}}).AssertValid();
  EXPECT_ASSERTION(Tombstones({{3, 3}}).AssertValid(), "!i->empty()");
  EXPECT_ASSERTION(Tombstones({{-1, 3}}).AssertValid(), "i != begin() || 0 <= i->t1");
  EXPECT_ASSERTION(Tombstones({{0, 1}, {1, 2}}).AssertValid(), "(i-1)->t2 < i->t1");
}

TEST(TombstoneInsert, MovesTheRunsAtAndBehindThePosition) {
  const VectorTombstones map = Tombstones({{1, 3}, {5, 6}});
  EXPECT_EQ(AfterInsert(map, 0, 2), Tombstones({{3, 5}, {7, 8}}));
  EXPECT_EQ(AfterInsert(map, 1, 2), Tombstones({{3, 5}, {7, 8}}));
  EXPECT_EQ(AfterInsert(map, 3, 2), Tombstones({{1, 3}, {7, 8}}));
  EXPECT_EQ(AfterInsert(map, 5, 2), Tombstones({{1, 3}, {7, 8}}));
  EXPECT_EQ(AfterInsert(map, 6, 2), map);
  EXPECT_EQ(AfterInsert(map, 100, 2), map);
}

TEST(TombstoneInsert, SplitsTheRunThatThePositionLiesInside) {
  EXPECT_EQ(AfterInsert(Tombstones({{1, 4}, {6, 7}}), 2, 3), Tombstones({{1, 2}, {5, 7}, {9, 10}}));
}

TEST(TombstoneInsert, OfNothingChangesNothing) {
  EXPECT_EQ(AfterInsert(Tombstones({{1, 4}}), 2, 0), Tombstones({{1, 4}}));
}

TEST(TombstoneErase, MakesARunAmongLiveElements) {
  List erased;
  EXPECT_EQ(AfterErase(Tombstones({}), 2, 3, erased), Tombstones({{2, 5}}));
  EXPECT_EQ(erased, Intervals({{2, 5}}));
  EXPECT_EQ(AfterErase(Tombstones({{0, 1}, {9, 10}}), 2, 3, erased), Tombstones({{0, 1}, {3, 6}, {9, 10}}));
  EXPECT_EQ(erased, Intervals({{3, 6}}));
}

TEST(TombstoneErase, MergesWithTheRunsThatItTouches) {
  const VectorTombstones map = Tombstones({{1, 3}, {5, 6}});  // .**..*
  List erased;
  EXPECT_EQ(AfterErase(map, 1, 1, erased), Tombstones({{1, 4}, {5, 6}}));
  EXPECT_EQ(erased, Intervals({{3, 4}}));
  EXPECT_EQ(AfterErase(map, 2, 1, erased), Tombstones({{1, 3}, {4, 6}}));
  EXPECT_EQ(erased, Intervals({{4, 5}}));
  EXPECT_EQ(AfterErase(map, 1, 2, erased), Tombstones({{1, 6}}));
  EXPECT_EQ(erased, Intervals({{3, 5}}));
}

TEST(TombstoneErase, SwallowsTheRunsBetweenAndReportsTheGaps) {
  const VectorTombstones map = Tombstones({{1, 3}, {5, 6}, {20, 21}});
  List erased;
  EXPECT_EQ(AfterErase(map, 0, 5, erased), Tombstones({{0, 8}, {20, 21}}));
  EXPECT_EQ(erased, Intervals({{0, 1}, {3, 5}, {6, 8}}));
}

TEST(TombstoneErase, OfNothingChangesNothing) {
  List erased;
  EXPECT_EQ(AfterErase(Tombstones({{1, 4}}), 2, 0, erased), Tombstones({{1, 4}}));
  EXPECT_TRUE(erased.empty());
}

// Runs `change` on a copy of a map without spare capacity, with each of its allocations failing in turn.
template <class Change>
void ExpectStrongGuarantee(const VectorTombstones& map, const VectorTombstones& changed, Change change) {
  const auto before = test::LiveAllocations();
  int failures = 0;
  for (bool failed = true; failed;) {
    VectorTombstones copy = map;
    bool threw = false;
    {
      const test::FailingAllocation fail(failures + 1);
      try {
        change(copy);
      } catch (const std::bad_alloc&) {
        threw = true;
      }
      failed = fail.HasFailed();
    }
    EXPECT_EQ(threw, failed);
    EXPECT_EQ(copy, failed ? map : changed);
    if (failed) ++failures;
  }
  EXPECT_GT(failures, 0);
  EXPECT_EQ(test::LiveAllocations(), before);
}

TEST(TombstoneInsert, AFailedAllocationLeavesTheMapAsItWas) {
  ExpectStrongGuarantee(Tombstones({{1, 4}, {6, 7}}), Tombstones({{1, 2}, {5, 7}, {9, 10}}),
                        [](VectorTombstones& map) { map.Insert(2, 3); });
}

// Erases; where that fails, nothing may be reported as erased.
void EraseOrReportNothing(VectorTombstones& map, ssize_t p, ssize_t n) {
  List erased;
  try {
    map.Erasep(p, n, erased);
  } catch (const std::bad_alloc&) {
    EXPECT_TRUE(erased.empty());
    throw;
  }
}

TEST(TombstoneErase, AFailedAllocationLeavesTheMapAsItWasAndReportsNothing) {
  const VectorTombstones map = Tombstones({{1, 3}, {5, 6}, {20, 21}});
  ExpectStrongGuarantee(map, Tombstones({{0, 8}, {20, 21}}),
                        [](VectorTombstones& copy) { EraseOrReportNothing(copy, 0, 5); });
  ExpectStrongGuarantee(map, Tombstones({{1, 3}, {5, 6}, {8, 9}, {20, 21}}),
                        [](VectorTombstones& copy) { EraseOrReportNothing(copy, 5, 1); });
}

TEST(TombstoneInsert, ThatSplitsNoRunAllocatesNothing) {
  VectorTombstones map = Tombstones({{1, 3}, {5, 6}});
  const test::FailingAllocation fail(1);
  map.Insert(1, 2);
  EXPECT_FALSE(fail.HasFailed());
}

// The same vector, element by element: true is a tombstone; behind the end everything is live.
class Model {
 public:
  void Insert(ssize_t q, ssize_t n) {
    if (q > size()) m_tombstone.resize(static_cast<std::size_t>(q), false);
    m_tombstone.insert(m_tombstone.begin() + q, static_cast<std::size_t>(n), false);
  }

  List Erase(ssize_t p, ssize_t n) {
    std::vector<bool> died;
    for (ssize_t q = 0, live = 0; live < p + n; ++q) {
      if (q == size()) m_tombstone.push_back(false);
      const bool dies = Exists(q) && live >= p;
      if (Exists(q)) ++live;
      died.push_back(dies);
      if (dies) m_tombstone[static_cast<std::size_t>(q)] = true;
    }
    return Runs(died);
  }

  ssize_t size() const { return static_cast<ssize_t>(m_tombstone.size()); }
  bool Exists(ssize_t q) const { return q >= size() || !m_tombstone[static_cast<std::size_t>(q)]; }
  List Runs() const { return Runs(m_tombstone); }

 private:
  // The maximal runs of true.
  static List Runs(const std::vector<bool>& flags) {
    List runs;
    for (std::size_t q = 0; q < flags.size(); ++q) {
      if (!flags[q]) continue;
      const auto t1 = static_cast<ssize_t>(q);
      if (runs.empty() || runs[runs.size() - 1].t2 < t1) runs.push_back({t1, t1});
      ++runs[runs.size() - 1].t2;
    }
    return runs;
  }

  std::vector<bool> m_tombstone;
};

void ExpectSamePositions(const VectorTombstones& map, const Model& model) {
  ssize_t live = 0;
  for (ssize_t q = 0; q < model.size() + 3; ++q) {
    ASSERT_EQ(map.GetP(q), live) << q;
    ASSERT_EQ(map.NumTombstonesBefore(q), q - live) << q;
    ASSERT_EQ(map.Exists(q), model.Exists(q)) << q;
    if (!model.Exists(q)) continue;
    ASSERT_EQ(map.GetQ(live), q);
    ++live;
  }
  ASSERT_EQ(map.NumTombstones(), model.size() + 3 - live);
}

TEST(TombstonePositions, AgreeWithAModelOverRandomEdits) {
  std::mt19937_64 random(test::TestSeed(20261121));
  const auto upTo = [&random](ssize_t most) {
    return static_cast<ssize_t>(random() % static_cast<std::uint64_t>(most + 1));
  };
  for (int walk = 0; walk < 200; ++walk) {
    VectorTombstones map;
    Model model;
    for (int step = 0; step < 40; ++step) {
      if (random() % 2 == 0) {
        const ssize_t q = upTo(model.size() + 2), n = upTo(3);
        map.Insert(q, n);
        model.Insert(q, n);
      } else {
        const ssize_t p = upTo(map.GetP(model.size()) + 2), n = upTo(3);
        List erased;
        map.Erasep(p, n, erased);
        ASSERT_EQ(erased, model.Erase(p, n)) << ToText(erased);
      }
      map.AssertValid();
      ASSERT_EQ(map.m_tombstones, model.Runs()) << ToText(map);
      ASSERT_NO_FATAL_FAILURE(ExpectSamePositions(map, model));
    }
    VectorTombstones read;
    FromBytes(ToBytes(map), read);
    ASSERT_EQ(read, map);
  }
}

}  // namespace
}  // namespace vemo
