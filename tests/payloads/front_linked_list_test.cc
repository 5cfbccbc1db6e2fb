#include "vxOT/FrontLinkedList.h"

#include <gtest/gtest.h>

#include <initializer_list>
#include <new>
#include <stdexcept>
#include <type_traits>
#include <utility>
#include <vector>

#include "tests/payloads/example_payloads.h"
#include "tests/support/assertion_death.h"
#include "tests/support/failing_allocator.h"
#include "vxUtils/ByteForms.h"

namespace vemo {
namespace {

// A record of one number whose copying can be told to throw.
struct Number {
  static constexpr std::size_t kMinBytes = 1;

  Number() = default;
  explicit Number(ssize_t number) : n(number) {}
  Number(const Number& other) : n(other.n) {
    if (copiesUntilThrow > 0 && --copiesUntilThrow == 0) throw std::runtime_error("no copy");
  }
  Number& operator=(const Number&) = default;

  friend bool operator==(const Number& a, const Number& b) { return a.n == b.n; }

  ssize_t n = -1;
  static inline int copiesUntilThrow = 0;
};

void Serialise(Archive& ar, const Number& number) {
  SerialiseVariableLengthUint(ar, number.n);
}
void Deserialise(InputArchive& ar, Number& number) {
  DeserialiseVariableLengthUint(ar, number.n);
}
void CheckForm(BoundedReader& reader, const Number*) {
  reader.ReadUint32();
}
xostream& operator<<(xostream& os, const Number& number) {
  return os << std::int64_t{number.n};
}

using List = FrontLinkedList<Number, Number, true>;

static_assert(std::is_nothrow_default_constructible_v<List>);
static_assert(std::is_nothrow_move_constructible_v<List>);
static_assert(std::is_nothrow_move_assignable_v<List>);

List ListOf(std::initializer_list<ssize_t> numbers) {
  List list;
  List::Node* last = nullptr;
  for (const ssize_t n : numbers) last = list.InsertAfter(last, Number(n));
  return list;
}

// The numbers front to back; expects every link to have its counterpart.
std::vector<ssize_t> Numbers(const List& list) {
  std::vector<ssize_t> numbers;
  const List::Node* previous = nullptr;
  for (const List::Node* node = list.m_first; node != nullptr; node = node->m_next) {
    EXPECT_EQ(node->m_prev, previous);
    numbers.push_back(node->n);
    previous = node;
  }
  return numbers;
}

List::Node* NodeAt(List& list, int i) {
  List::Node* node = list.m_first;
  while (i-- > 0) node = node->m_next;
  return node;
}

class FrontLinkedListTest : public testing::Test {
 protected:
  void TearDown() override { EXPECT_EQ(test::LiveAllocations(), m_liveBefore); }

 private:
  const std::int64_t m_liveBefore = test::LiveAllocations();
};

TEST_F(FrontLinkedListTest, StartsEmpty) {
  const List list;
  EXPECT_EQ(list.m_first, nullptr);
  EXPECT_EQ(list.size(), 0);
}

TEST_F(FrontLinkedListTest, CountsItsNodes) {
  EXPECT_EQ(ListOf({1, 2, 3}).size(), 3);
}

TEST_F(FrontLinkedListTest, InsertsAtTheFrontInTheMiddleAndAtTheBack) {
  List list;
  List::Node* b = list.InsertAfter(nullptr, Number(2));
  EXPECT_EQ(b->n, 2);
  EXPECT_EQ(list.m_first, b);
  list.InsertAfter(nullptr, Number(1));
  list.InsertAfter(b, Number(4));
  list.InsertAfter(b, Number(3));
  EXPECT_EQ(Numbers(list), (std::vector<ssize_t>{1, 2, 3, 4}));
}

TEST_F(FrontLinkedListTest, InsertsACopyOfARecordOfItsOwn) {
  List list = ListOf({1});
  list.InsertAfter(list.m_first, *list.m_first);
  EXPECT_EQ(Numbers(list), (std::vector<ssize_t>{1, 1}));
}

TEST_F(FrontLinkedListTest, RemovesTheFrontTheMiddleTheBackAndTheLastNode) {
  List list = ListOf({1, 2, 3, 4});
  list.Remove(NodeAt(list, 1));
  EXPECT_EQ(Numbers(list), (std::vector<ssize_t>{1, 3, 4}));
  list.Remove(NodeAt(list, 0));
  EXPECT_EQ(Numbers(list), (std::vector<ssize_t>{3, 4}));
  list.Remove(NodeAt(list, 1));
  EXPECT_EQ(Numbers(list), (std::vector<ssize_t>{3}));
  list.Remove(NodeAt(list, 0));
  EXPECT_EQ(list.m_first, nullptr);
}

TEST_F(FrontLinkedListTest, AFailedInsertionLeavesTheListAsItWas) {
  List list = ListOf({1, 2});
  {
    const test::FailingAllocation fail(1);
    EXPECT_THROW(list.InsertAfter(list.m_first, Number(9)), std::bad_alloc);
  }
  EXPECT_EQ(Numbers(list), (std::vector<ssize_t>{1, 2}));
}

TEST_F(FrontLinkedListTest, ClearEmptiesIt) {
  List list = ListOf({1, 2, 3});
  list.Clear();
  EXPECT_EQ(list.m_first, nullptr);
  list.Clear();
  EXPECT_EQ(list.m_first, nullptr);
}

TEST_F(FrontLinkedListTest, ALongListIsFreedWithoutRecursion) {
  List list;
  for (ssize_t i = 0; i < 200000; ++i) list.InsertAfter(nullptr, Number(i));
  EXPECT_EQ(list.size(), 200000);
}

TEST_F(FrontLinkedListTest, EqualityWalksBothLists) {
  EXPECT_EQ(List(), List());
  EXPECT_EQ(ListOf({1, 2}), ListOf({1, 2}));
  EXPECT_NE(ListOf({1, 2}), ListOf({1, 2, 2}));
  EXPECT_NE(ListOf({1, 2, 2}), ListOf({1, 2}));
  EXPECT_NE(ListOf({1, 2}), ListOf({1, 3}));
  EXPECT_NE(List(), ListOf({1}));
}

TEST_F(FrontLinkedListTest, AssignmentReplacesALongerAndAShorterList) {
  List list = ListOf({1, 2, 3, 4, 5});
  list = ListOf({7, 8, 9});
  const List source = ListOf({7, 8, 9});
  List five = ListOf({1, 2, 3, 4, 5});
  five = source;
  EXPECT_EQ(Numbers(five), (std::vector<ssize_t>{7, 8, 9}));
  EXPECT_EQ(five.m_first->m_prev, nullptr);
  EXPECT_EQ(NodeAt(five, 2)->m_next, nullptr);
  List one = ListOf({1});
  one = source;
  EXPECT_EQ(Numbers(one), (std::vector<ssize_t>{7, 8, 9}));
  EXPECT_EQ(Numbers(source), (std::vector<ssize_t>{7, 8, 9}));
}

TEST_F(FrontLinkedListTest, AssigningAListToItselfLeavesItUnchanged) {
  List list = ListOf({1, 2});
  const List::Node* first = list.m_first;
  List& same = list;
  list = same;
  list = std::move(same);
  EXPECT_EQ(list.m_first, first);
  EXPECT_EQ(Numbers(list), (std::vector<ssize_t>{1, 2}));
}

TEST_F(FrontLinkedListTest, ACopyHasNodesOfItsOwn) {
  List original = ListOf({1, 2});
  const List copy = original;
  original.m_first->n = 9;
  EXPECT_EQ(Numbers(copy), (std::vector<ssize_t>{1, 2}));
}

TEST_F(FrontLinkedListTest, MovingTakesTheNodes) {
  List source = ListOf({1, 2});
  const List::Node* first = source.m_first;
  const List target = std::move(source);
  EXPECT_EQ(target.m_first, first);
  EXPECT_EQ(source.m_first, nullptr);
}

TEST_F(FrontLinkedListTest, ACopiedNodeIsLinkedToNothing) {
  List list = ListOf({1, 2, 3});
  const List::Node copy = *NodeAt(list, 1);
  EXPECT_EQ(copy.n, 2);
  EXPECT_EQ(copy.m_prev, nullptr);
  EXPECT_EQ(copy.m_next, nullptr);
}

TEST_F(FrontLinkedListTest, AnAssignedNodeStaysWhereItIs) {
  List list = ListOf({1, 2, 3});
  *NodeAt(list, 1) = *NodeAt(list, 2);
  EXPECT_EQ(Numbers(list), (std::vector<ssize_t>{1, 3, 3}));
}

TEST_F(FrontLinkedListTest, AFailedAssignmentLeavesAWellFormedListAndNoHalfMadeNode) {
  const List source = ListOf({1, 2, 3});
  List list = ListOf({7, 8});
  Number::copiesUntilThrow = 3;
  EXPECT_THROW(list = source, std::runtime_error);
  EXPECT_EQ(Numbers(list), (std::vector<ssize_t>{1, 2}));
  {
    const test::FailingAllocation fail(2);
    EXPECT_THROW(list = source, std::bad_alloc);
  }
  EXPECT_EQ(Numbers(list), (std::vector<ssize_t>{1}));
  const test::FailingAllocation fail(3);
  EXPECT_THROW(List copy(source), std::bad_alloc);
}

struct NeverEqual {
  friend bool operator==(const NeverEqual&, const NeverEqual&) { return false; }
};

TEST_F(FrontLinkedListTest, AssignmentAssertsItsResult) {
  FrontLinkedList<NeverEqual, NeverEqual, true> source, target;
  target = source;
  source.InsertAfter(nullptr, NeverEqual());
  EXPECT_ASSERTION(target = source, "*this == rhs");
}

TEST_F(FrontLinkedListTest, BytesAreTheCountAndTheRecords) {
  const List list = ListOf({1, 300});
  const List empty;
  EXPECT_TRUE(ToBytes(list) == (Bytes{2, 1, 0x81, 0x2C}));
  EXPECT_TRUE(ToBytes(empty) == Bytes{0});
}

TEST_F(FrontLinkedListTest, ReadsItsBytesBackOverWhatItHeld) {
  List list = ListOf({7, 8, 9});
  FromBytes(Bytes{2, 1, 0x81, 0x2C}, list);
  EXPECT_EQ(Numbers(list), (std::vector<ssize_t>{1, 300}));
  FromBytes(Bytes{0}, list);
  EXPECT_EQ(list.m_first, nullptr);
}

TEST_F(FrontLinkedListTest, AFailedReadLeavesAWellFormedList) {
  const std::uint8_t bytes[] = {3, 1, 2, 3};
  List list = ListOf({7});
  InputArchive ar(bytes);
  {
    const test::FailingAllocation fail(3);
    EXPECT_THROW(ar >> list, std::bad_alloc);
  }
  EXPECT_EQ(Numbers(list), (std::vector<ssize_t>{1, 2}));
}

TEST_F(FrontLinkedListTest, TextSeparatesRecordsByCommas) {
  EXPECT_EQ(ToText(List()), "[]");
  EXPECT_EQ(ToText(ListOf({1})), "[1]");
  EXPECT_EQ(ToText(ListOf({1, 2, 3})), "[1,2,3]");
}

}  // namespace
}  // namespace vemo
