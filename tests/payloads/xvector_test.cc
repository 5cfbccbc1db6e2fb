#include "vxUtils/xvector.h"

#include <gtest/gtest.h>

#include <array>
#include <new>
#include <type_traits>
#include <utility>
#include <vector>

#include "tests/support/assertion_death.h"
#include "tests/support/failing_allocator.h"

namespace vemo {
namespace {

static_assert(std::is_nothrow_default_constructible_v<xvector<int>>);
static_assert(std::is_nothrow_move_constructible_v<xvector<int>>);
static_assert(std::is_nothrow_move_assignable_v<xvector<int>>);

xvector<int> Vector(const std::vector<int>& numbers) {
  xvector<int> vector;
  vector.assign(numbers.data(), numbers.data() + numbers.size());
  return vector;
}

std::vector<int> Elements(const xvector<int>& vector) {
  return {vector.begin(), vector.end()};
}

TEST(XVector, StartsEmpty) {
  const xvector<int> vector;
  EXPECT_TRUE(vector.empty());
  EXPECT_EQ(vector.size(), 0);
  EXPECT_EQ(vector.begin(), vector.end());
}

TEST(XVector, KeepsElementsBackToBackInItsBuffer) {
  const xvector<int> vector = Vector({5, 6, 7});
  EXPECT_EQ(vector.m_buffer.size(), 12);
  EXPECT_EQ(vector.size(), 3);
  EXPECT_EQ(vector.data() + 3, vector.data_end());
  EXPECT_EQ(static_cast<const void*>(vector.data()), vector.m_buffer.data());
  EXPECT_EQ(vector[0], 5);
  EXPECT_EQ(vector[2], 7);
}

TEST(XVector, IndexingAssertsItsBounds) {
  xvector<int> vector = Vector({5, 6});
  [[maybe_unused]] const xvector<int>& constant = vector;
  EXPECT_ASSERTION(vector[-1] = 0, "0 <= i && i < size()");
  EXPECT_ASSERTION(vector[2] = 0, "0 <= i && i < size()");
  EXPECT_ASSERTION(static_cast<void>(constant[2]), "0 <= i && i < size()");
}

TEST(XVector, PushBackGrowsToTheNeededSizePlusTheOldCapacity) {
  xvector<std::array<long, 2>> vector;
  const ssize_t capacities[] = {16, 48, 48, 112, 112, 112, 112, 240};
  for (const ssize_t capacity : capacities) {
    vector.push_back({1, 2});
    EXPECT_EQ(vector.m_buffer.capacity(), capacity) << vector.size();
  }
}

TEST(XVector, PushBackTakesAnElementOfItsOwn) {
  xvector<int> vector = Vector({5});
  vector.push_back(vector[0]);
  EXPECT_EQ(Elements(vector), (std::vector<int>{5, 5}));
}

TEST(XVector, ReservingMoreMakesThatManyAppendsSafe) {
  xvector<int> vector = Vector({1, 2});
  vector.ReserveMore(3);
  const test::FailingAllocation fail(1);
  vector.push_back(3);
  vector.insert(0, 0);
  vector.push_back(4);
  EXPECT_FALSE(fail.HasFailed());
  EXPECT_EQ(vector.size(), 5);
}

TEST(XVector, ReservingBeforeEachOfManyInsertionsAllocatesRarely) {
  xvector<int> vector;
  int allocations = 0;
  for (int i = 0; i < 1000; ++i) {
    const ssize_t before = vector.m_buffer.capacity();
    vector.insert(0, i);
    if (vector.m_buffer.capacity() != before) ++allocations;
  }
  EXPECT_LE(allocations, 12);
}

TEST(XVector, AssignTakesTheExactCapacityAndReplacesTheElements) {
  xvector<int> vector = Vector({1, 2, 3});
  EXPECT_EQ(vector.m_buffer.capacity(), 12);
  const int numbers[] = {7, 8};
  vector.assign(numbers, numbers + 2);
  EXPECT_EQ(Elements(vector), (std::vector<int>{7, 8}));
  EXPECT_EQ(vector.m_buffer.capacity(), 12);
  vector.assign(nullptr, nullptr);
  EXPECT_TRUE(vector.empty());
}

TEST(XVector, AssigningARangeThatEndsBeforeItBeginsIsAnAssertion) {
  xvector<int> vector;
  [[maybe_unused]] const int numbers[] = {7, 8};
  EXPECT_ASSERTION(vector.assign(numbers + 1, numbers), "src1 == src2 || dst != nullptr");
}

TEST(XVector, CopiesAreEqualAndIndependent) {
  const xvector<int> original = Vector({1, 2, 3});
  xvector<int> copy = original;
  EXPECT_EQ(copy, original);
  copy[0] = 9;
  EXPECT_EQ(original[0], 1);
  xvector<int> assigned = Vector({4});
  assigned = original;
  EXPECT_EQ(assigned, original);
}

TEST(XVector, AssigningAVectorToItselfLeavesItUnchanged) {
  xvector<int> vector = Vector({1, 2, 3});
  xvector<int>& same = vector;
  vector = same;
  EXPECT_EQ(Elements(vector), (std::vector<int>{1, 2, 3}));
  vector = std::move(same);
  EXPECT_EQ(Elements(vector), (std::vector<int>{1, 2, 3}));
}

TEST(XVector, MovingTakesTheBuffer) {
  xvector<int> source = Vector({1, 2, 3, 4, 5, 6, 7, 8, 9});
  const int* data = source.data();
  const xvector<int> target = std::move(source);
  EXPECT_EQ(target.data(), data);
  EXPECT_TRUE(source.empty());
  xvector<int> small = Vector({1, 2});
  const xvector<int> moved = std::move(small);
  EXPECT_EQ(Elements(moved), (std::vector<int>{1, 2}));
  EXPECT_TRUE(small.empty());
  xvector<int> assigned = Vector({4});
  assigned = Vector({5, 6});
  EXPECT_EQ(Elements(assigned), (std::vector<int>{5, 6}));
}

TEST(XVector, InsertsAndErasesAnywhere) {
  xvector<int> vector = Vector({2, 5});
  vector.insert(0, 1);
  vector.insert(2, 3);
  vector.insert(4, 6);
  EXPECT_EQ(Elements(vector), (std::vector<int>{1, 2, 3, 5, 6}));
  vector.erase(1, 2);
  EXPECT_EQ(Elements(vector), (std::vector<int>{1, 5, 6}));
  vector.erase(2, 1);
  vector.erase(0, 0);
  EXPECT_EQ(Elements(vector), (std::vector<int>{1, 5}));
}

TEST(XVector, ClearAndEraseEmptyItAndKeepTheCapacity) {
  xvector<int> vector = Vector({1, 2});
  vector.clear();
  EXPECT_TRUE(vector.empty());
  EXPECT_EQ(vector.m_buffer.capacity(), 8);
  vector = Vector({1});
  vector.erase();
  EXPECT_TRUE(vector.empty());
}

int comparisons = 0;
struct Counted {
  int number;
  friend bool operator==(const Counted& a, const Counted& b) {
    ++comparisons;
    return a.number == b.number;
  }
};

TEST(XVector, EqualityReadsNoElementWhereLengthsDiffer) {
  xvector<Counted> a, b;
  a.push_back({1});
  comparisons = 0;
  EXPECT_FALSE(a == b);
  EXPECT_FALSE(a._Eq(b));
  EXPECT_EQ(comparisons, 0);
}

TEST(XVector, EqualityStopsAtTheFirstPairThatDiffers) {
  xvector<Counted> a, b;
  for (const int number : {1, 2, 3, 4}) {
    a.push_back({number});
    b.push_back({number == 2 ? 9 : number});
  }
  comparisons = 0;
  EXPECT_FALSE(a == b);
  EXPECT_EQ(comparisons, 2);
  EXPECT_TRUE(a == a);
  EXPECT_EQ(comparisons, 6);
}

// The capacity after three elements is more than lies in the vector itself; what it promises must be there all the same.
TEST(XVector, WhatWasReservedFitsWithoutAllocation) {
  for (const int filled : {0, 1, 2, 3, 7, 8, 9}) {
    for (const ssize_t more : {1, 4, 6, 40}) {
      xvector<int> vector;
      for (int i = 0; i < filled; ++i) vector.push_back(i);
      vector.ReserveMore(more);
      const test::FailingAllocation fail(1);
      for (ssize_t i = 0; i < more; ++i) vector.push_back(7);
      EXPECT_EQ(vector.size(), filled + more);
    }
  }
}

TEST(XVector, AFailedAllocationThrowsAndLeaksNothing) {
  const auto before = test::LiveAllocations();
  {
    xvector<int> vector = Vector({1, 2, 3, 4, 5, 6, 7, 8});
    {
      const test::FailingAllocation fail(1);
      EXPECT_THROW(vector.push_back(9), std::bad_alloc);
    }
    EXPECT_EQ(Elements(vector), (std::vector<int>{1, 2, 3, 4, 5, 6, 7, 8}));
    vector.push_back(9);
    {
      const test::FailingAllocation fail(1);
      EXPECT_THROW(xvector<int> copy(vector), std::bad_alloc);
    }
  }
  EXPECT_EQ(test::LiveAllocations(), before);
}

}  // namespace
}  // namespace vemo
