#include "platform/iterator.h"

#include <gtest/gtest.h>

#include <iterator>
#include <type_traits>
#include <vector>

namespace vemo {
namespace {

// Steps through an array; counts how often an element was asked for to be changed.
struct ArrayPolicy {
  using value_type = int;

  void next() { ++at; }
  void prev() { --at; }
  int& deref() const {
    ++*writes;
    return *at;
  }
  const int& const_deref() const { return *at; }
  friend bool operator==(const ArrayPolicy& a, const ArrayPolicy& b) { return a.at == b.at; }

  int* at = nullptr;
  int* writes = nullptr;
};

using Iterator = make_iterator<ArrayPolicy>;
using ConstIterator = make_const_iterator<ArrayPolicy>;
static_assert(std::bidirectional_iterator<Iterator>);
static_assert(std::bidirectional_iterator<ConstIterator>);
static_assert(std::is_convertible_v<Iterator, ConstIterator>);
static_assert(!std::is_convertible_v<ConstIterator, Iterator>);

class MadeIterator : public testing::Test {
 protected:
  Iterator At(int i) { return Iterator(ArrayPolicy{numbers + i, &writes}); }
  ConstIterator ConstAt(int i) { return ConstIterator(ArrayPolicy{numbers + i, &writes}); }

  int numbers[4] = {10, 20, 30, 40};
  int writes = 0;
};

TEST_F(MadeIterator, StepsBothWaysBeforeAndAfterReturningAPosition) {
  Iterator i = At(0);
  EXPECT_EQ(*++i, 20);
  EXPECT_EQ(*i++, 20);
  EXPECT_EQ(*i, 30);
  EXPECT_EQ(*--i, 20);
  EXPECT_EQ(*i--, 20);
  EXPECT_EQ(i, At(0));
  ConstIterator c = ConstAt(0);
  EXPECT_EQ(*++c, 20);
  EXPECT_EQ(*c++, 20);
  EXPECT_EQ(*--c, 20);
  EXPECT_EQ(*c--, 20);
  EXPECT_EQ(c, ConstAt(0));
}

TEST_F(MadeIterator, OnlyTheMutableOneAsksForAnElementToChange) {
  EXPECT_EQ(*ConstAt(1), 20);
  EXPECT_EQ(*ConstAt(1).operator->(), 20);
  EXPECT_EQ(writes, 0);
  *At(1) = 21;
  EXPECT_EQ(*At(1).operator->(), 21);
  EXPECT_EQ(writes, 2);
}

TEST_F(MadeIterator, ServesStandardAlgorithms) {
  EXPECT_EQ(std::distance(ConstAt(0), ConstAt(4)), 4);
  EXPECT_EQ(std::vector<int>(std::make_reverse_iterator(At(4)), std::make_reverse_iterator(At(0))),
            (std::vector<int>{40, 30, 20, 10}));
}

}  // namespace
}  // namespace vemo
