#include "history/run_cursor.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <new>
#include <random>
#include <vector>

#include "tests/support/failing_allocator.h"
#include "tests/support/seed.h"
#include "vxOT/VectorDeletions.h"

namespace vemo::test {
namespace {

using Cursor = RunCursor<VectorDeletions>;

VectorDeletionInterval RunAt(ssize_t q, ssize_t name = 0) {
  VectorDeletionInterval run;
  run.m_opid.t = name;
  run.m_q = q;
  run.m_n = 1;
  return run;
}

VectorDeletions ListOf(const std::vector<ssize_t>& positions) {
  VectorDeletions list;
  VectorDeletions::Node* last = nullptr;
  for (const ssize_t q : positions) last = list.InsertAfter(last, RunAt(q));
  return list;
}

std::vector<ssize_t> Positions(const VectorDeletions& list) {
  std::vector<ssize_t> positions;
  for (const auto* run = list.m_first; run != nullptr; run = run->m_next) positions.push_back(run->m_q);
  return positions;
}

TEST(RunCursorTest, StandsInFrontOfTheFirstRun) {
  const VectorDeletions list = ListOf({3, 7});
  const Cursor cursor(list);
  EXPECT_EQ(cursor.before(), nullptr);
  EXPECT_EQ(cursor.after(), list.m_first);
}

TEST(RunCursorTest, HasNothingOnEitherSideInAnEmptyList) {
  VectorDeletions list;
  Cursor cursor(list);
  cursor.Seek(10);
  EXPECT_EQ(cursor.before(), nullptr);
  EXPECT_EQ(cursor.after(), nullptr);
  cursor.Shift(4);
  cursor.Settle();
  EXPECT_EQ(list.m_first, nullptr);
}

TEST(RunCursorTest, ARunThatStartsAtThePlaceSoughtIsBehindIt) {
  const VectorDeletions list = ListOf({3, 7, 9});
  Cursor cursor(list);
  cursor.Seek(7);
  EXPECT_EQ(cursor.before()->m_q, 3);
  EXPECT_EQ(cursor.after()->m_q, 7);
  cursor.Seek(8);
  EXPECT_EQ(cursor.before()->m_q, 7);
  cursor.Seek(7);
  EXPECT_EQ(cursor.before()->m_q, 3);
}

TEST(RunCursorTest, ShiftMovesTheRunsBehindItOnly) {
  VectorDeletions list = ListOf({1, 5, 8});
  Cursor cursor(list);
  cursor.Seek(4);
  cursor.Shift(10);
  cursor.Settle();
  EXPECT_EQ(Positions(list), (std::vector<ssize_t>{1, 15, 18}));
}

TEST(RunCursorTest, PaysOutShiftsOnTheWayForthAndTakesThemBackOnTheWayBack) {
  VectorDeletions list = ListOf({1, 5, 8});
  Cursor cursor(list);
  cursor.Seek(4);
  cursor.Shift(10);
  cursor.Seek(16);
  EXPECT_EQ(Positions(list), (std::vector<ssize_t>{1, 15, 8}));
  cursor.Seek(0);
  EXPECT_EQ(Positions(list), (std::vector<ssize_t>{-9, 5, 8}));
  cursor.Shift(1);
  cursor.Settle();
  EXPECT_EQ(Positions(list), (std::vector<ssize_t>{2, 16, 19}));
}

TEST(RunCursorTest, AddsRunsOnBothSidesOfAPendingShift) {
  VectorDeletions list = ListOf({10, 20});
  Cursor cursor(list);
  cursor.Seek(15);
  cursor.Shift(5);
  cursor.InsertAfter(list, RunAt(22));
  cursor.InsertBefore(list, RunAt(15));
  EXPECT_EQ(cursor.before()->m_q, 15);
  cursor.Settle();
  EXPECT_EQ(Positions(list), (std::vector<ssize_t>{10, 15, 22, 25}));
}

TEST(RunCursorTest, SettlingTwiceShiftsOnce) {
  VectorDeletions list = ListOf({1, 2});
  Cursor cursor(list);
  cursor.Shift(3);
  cursor.Settle();
  cursor.Settle();
  EXPECT_EQ(Positions(list), (std::vector<ssize_t>{4, 5}));
}

TEST(RunCursorTest, GoesOnAfterTheListWasRelocated) {
  VectorDeletions list = ListOf({1, 5});
  Cursor cursor(list);
  cursor.Seek(3);
  VectorDeletions moved(std::move(list));
  cursor.InsertBefore(moved, RunAt(3));
  cursor.Shift(2);
  cursor.Settle();
  EXPECT_EQ(Positions(moved), (std::vector<ssize_t>{1, 3, 7}));
}

TEST(RunCursorTest, AFailedAllocationAddsNothing) {
  VectorDeletions list = ListOf({1, 5});
  Cursor cursor(list);
  cursor.Seek(3);
  cursor.Shift(2);
  {
    const FailingAllocation failing(1);
    EXPECT_THROW(cursor.InsertBefore(list, RunAt(3)), std::bad_alloc);
  }
  {
    const FailingAllocation failing(1);
    EXPECT_THROW(cursor.InsertAfter(list, RunAt(4)), std::bad_alloc);
  }
  EXPECT_EQ(cursor.before()->m_q, 1);
  cursor.Settle();
  EXPECT_EQ(Positions(list), (std::vector<ssize_t>{1, 7}));
}

// A sorted vector of positions, every one right all the time.
class PlainList {
 public:
  struct Run {
    ssize_t q;
    ssize_t name;
  };

  void Seek(ssize_t q) {
    m_cursor = std::find_if(m_runs.begin(), m_runs.end(), [q](const Run& run) { return run.q >= q; }) -
               m_runs.begin();
  }
  void Shift(ssize_t n) {
    for (auto run = m_runs.begin() + m_cursor; run != m_runs.end(); ++run) run->q += n;
  }
  void InsertBefore(const Run& run) { m_runs.insert(m_runs.begin() + m_cursor++, run); }
  void InsertAfter(const Run& run) { m_runs.insert(m_runs.begin() + m_cursor, run); }

  const Run* before() const {
    return m_cursor == 0 ? nullptr : &m_runs[static_cast<std::size_t>(m_cursor) - 1];
  }
  const Run* after() const {
    return m_cursor == static_cast<std::ptrdiff_t>(m_runs.size())
               ? nullptr
               : &m_runs[static_cast<std::size_t>(m_cursor)];
  }
  const std::vector<Run>& runs() const { return m_runs; }

 private:
  std::vector<Run> m_runs;
  std::ptrdiff_t m_cursor = 0;
};

void ExpectSamePlace(const Cursor& cursor, const PlainList& plain) {
  ASSERT_EQ(cursor.before() == nullptr, plain.before() == nullptr);
  ASSERT_EQ(cursor.after() == nullptr, plain.after() == nullptr);
  if (plain.before() != nullptr) {
    ASSERT_EQ(cursor.before()->m_opid.t, plain.before()->name);
    ASSERT_EQ(cursor.before()->m_q, plain.before()->q) << "positions in front of the cursor are right";
  }
  if (plain.after() != nullptr) {
    ASSERT_EQ(cursor.after()->m_opid.t, plain.after()->name);
  }
}

TEST(RunCursorTest, AgreesWithAPlainListUnderRandomUse) {
  std::mt19937_64 random(TestSeed(6'003));
  const auto below = [&](ssize_t limit) {
    return std::uniform_int_distribution<ssize_t>(0, limit - 1)(random);
  };
  VectorDeletions list;
  Cursor cursor(list);
  PlainList plain;
  ssize_t extent = 10;  // positions sought lie below
  for (ssize_t step = 0; step < 20'000; ++step) {
    const ssize_t q = below(extent);
    cursor.Seek(q);
    plain.Seek(q);
    ASSERT_NO_FATAL_FAILURE(ExpectSamePlace(cursor, plain)) << "step " << step;
    const ssize_t choice = below(10);
    if (choice < 4) {  // room, and a run in it
      const ssize_t n = 1 + below(5);
      cursor.Shift(n);
      plain.Shift(n);
      extent += n;
      if (choice < 2 && plain.runs().size() < 500) {
        cursor.InsertBefore(list, RunAt(q, step));
        plain.InsertBefore({q, step});
      } else if (plain.runs().size() < 500) {
        cursor.InsertAfter(list, RunAt(q, step));
        plain.InsertAfter({q, step});
      }
    } else if (choice == 4 && below(10) == 0) {
      cursor.Settle();
      std::vector<ssize_t> expected;
      for (const PlainList::Run& run : plain.runs()) expected.push_back(run.q);
      ASSERT_EQ(Positions(list), expected) << "step " << step;
    }
  }
}

}  // namespace
}  // namespace vemo::test
