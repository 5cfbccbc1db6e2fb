#include "vxUtils/Interval.h"

#include <gtest/gtest.h>

#include "tests/payloads/example_payloads.h"
#include "tests/support/assertion_death.h"
#include "vxUtils/ByteForms.h"

namespace vemo {
namespace {

using test::Intervals;
using Interval = HalfOpenInterval<ssize_t>;
using List = IntervalList<ssize_t>;

TEST(HalfOpenInterval, DefaultIsEmptyAtZero) {
  const Interval interval;
  EXPECT_EQ(interval.t1, 0);
  EXPECT_EQ(interval.t2, 0);
  EXPECT_TRUE(interval.empty());
}

TEST(HalfOpenInterval, SizeAndEnd) {
  const Interval interval{3, 7};
  EXPECT_FALSE(interval.empty());
  EXPECT_EQ(interval.size(), 4);
  EXPECT_EQ(interval.end(), 7);
}

TEST(HalfOpenInterval, AnInvertedOneIsEmptyWithANegativeSize) {
  const Interval interval{6, 5};
  EXPECT_TRUE(interval.empty());
  EXPECT_EQ(interval.size(), -1);
}

TEST(HalfOpenInterval, EqualityNeedsBothEnds) {
  EXPECT_EQ((Interval{3, 7}), (Interval{3, 7}));
  EXPECT_NE((Interval{3, 7}), (Interval{3, 8}));
  EXPECT_NE((Interval{3, 7}), (Interval{2, 7}));
  EXPECT_NE((Interval{5, 5}), (Interval{6, 6}));
}

TEST(HalfOpenInterval, Text) {
  EXPECT_EQ(ToText(Interval{3, 7}), "[3,7)");
  EXPECT_EQ(ToText(Interval{-2, 0}), "[-2,0)");
  EXPECT_EQ(ToText(Interval{}), "[0,0)");
  EXPECT_EQ(ToText(HalfOpenInterval<int>{3, 7}), "[3,7)");
}

TEST(HalfOpenInterval, TakesSixteenBytesInAList) {
  EXPECT_EQ(sizeof(Interval), 16u);
  EXPECT_EQ(Intervals({{0, 2}, {5, 6}}).m_buffer.size(), 32);
}

TEST(IntervalList, SafePushBackAppendsWhatLiesBehindTheEnd) {
  List list;
  list.safe_push_back({0, 3});
  list.safe_push_back({4, 6});
  EXPECT_EQ(list, Intervals({{0, 3}, {4, 6}}));
}

TEST(IntervalList, SafePushBackRefusesAnEmptyInterval) {
  List list;
  EXPECT_ASSERTION(list.safe_push_back({5, 5}), "!h.empty()");
  EXPECT_ASSERTION(list.safe_push_back({6, 5}), "!h.empty()");
  list.safe_push_back({0, 3});
  EXPECT_ASSERTION(list.safe_push_back({5, 5}), "!h.empty()");
  // Emptiness is looked at before order.
  EXPECT_ASSERTION(list.safe_push_back({2, 1}), "!h.empty()");
}

TEST(IntervalList, SafePushBackRefusesWhatTouchesOrPrecedesTheEnd) {
  List list;
  list.safe_push_back({0, 3});
  EXPECT_ASSERTION(list.safe_push_back({3, 4}), "(*this)[n-1].t2 < h.t1");
  EXPECT_ASSERTION(list.safe_push_back({1, 2}), "(*this)[n-1].t2 < h.t1");
  EXPECT_ASSERTION(list.safe_push_back({-5, -4}), "(*this)[n-1].t2 < h.t1");
}

TEST(IntervalList, PushBackAndAssignCheckNothing) {
  List list;
  list.push_back({5, 6});
  list.push_back({1, 1});
  const Interval intervals[] = {{3, 3}, {3, 2}};
  list.assign(intervals, intervals + 2);
  EXPECT_EQ(list, Intervals({{3, 3}, {3, 2}}));
}

TEST(IntervalList, TheFirstAppendReservesOneElement) {
  List list;
  list.safe_push_back({0, 3});
  EXPECT_EQ(list.m_buffer.capacity(), 16);
}

TEST(IntervalList, IndexingAssertsItsBounds) {
  [[maybe_unused]] List list = Intervals({{0, 3}});
  EXPECT_ASSERTION(list[1].t1 = 0, "0 <= i && i < size()");
}

TEST(IntervalList, Equality) {
  EXPECT_EQ(List(), List());
  EXPECT_EQ(Intervals({{0, 3}, {4, 6}}), Intervals({{0, 3}, {4, 6}}));
  EXPECT_NE(Intervals({{0, 3}}), Intervals({{0, 3}, {4, 6}}));
  EXPECT_NE(Intervals({{0, 3}, {4, 7}}), Intervals({{0, 3}, {4, 6}}));
}

TEST(IntervalList, AssigningAListToItselfLeavesItUnchanged) {
  List list = Intervals({{0, 3}, {4, 6}});
  List& same = list;
  list = same;
  EXPECT_EQ(list, Intervals({{0, 3}, {4, 6}}));
}

TEST(IntervalList, Text) {
  EXPECT_EQ(ToText(List()), "{}");
  EXPECT_EQ(ToText(Intervals({{0, 2}, {5, 6}})), "{[0,2)[5,6)}");
}

}  // namespace
}  // namespace vemo
