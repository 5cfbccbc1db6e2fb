// Iterators: standard behaviour, the ends, what they mark.
#include <algorithm>
#include <iterator>
#include <vector>

#include "tests/module/map_fixture.h"
#include "tests/support/small_map.h"

namespace vemo::test {
namespace {

static_assert(std::bidirectional_iterator<SmallMap::iterator>);
static_assert(std::bidirectional_iterator<SmallMap::const_iterator>);
static_assert(std::bidirectional_iterator<SmallMap::reverse_iterator>);
static_assert(std::is_convertible_v<SmallMap::iterator, SmallMap::const_iterator>);
static_assert(!std::is_convertible_v<SmallMap::const_iterator, SmallMap::iterator>);
static_assert(std::is_same_v<decltype(*std::declval<SmallMap::iterator>()), SmallMap::value_type&>);
static_assert(
    std::is_same_v<decltype(*std::declval<SmallMap::const_iterator>()), const SmallMap::value_type&>);

class Iterator : public MapFixture<SmallMap> {
 protected:
  Iterator() { Build("([1 2] 10 [10 11 12] 20 [20 21])"); }

  std::vector<std::uint64_t> Keys() const {
    std::vector<std::uint64_t> keys;
    for (const auto& entry : std::as_const(map)) keys.push_back(NumberOf(entry.first));
    return keys;
  }
};

TEST_F(Iterator, AConstantRangeForVisitsAllInOrderAndMarksNothing) {
  EXPECT_EQ(Keys(), (std::vector<std::uint64_t>{1, 2, 10, 11, 12, 20, 21}));
  EXPECT_EQ(host.log().FullText(), "");
}

TEST_F(Iterator, ANonConstantRangeForMarksEveryLeafOnce) {
  for (auto& entry : map) entry.second = MakePayload(99);
  EXPECT_EQ(Calls(), "dirty leaf1\ndirty leaf2\ndirty leaf3\n");
  EXPECT_EQ(PayloadOf(*map.rFind(Key(12))), 99u);
}

TEST_F(Iterator, DereferencingMarksAndConstantDereferencingDoesNot) {
  const SmallMap::iterator first = map.begin();
  const SmallMap::const_iterator constant = first;
  EXPECT_EQ(constant->first, Key(1));
  EXPECT_EQ((*constant).first, Key(1));
  EXPECT_EQ(first.const_deref().first, Key(1));
  EXPECT_FALSE(Leaf(1)->IsDirty());
  EXPECT_EQ(first->first, Key(1));
  EXPECT_TRUE(Leaf(1)->IsDirty());
  EXPECT_EQ(host.DirtyNames(), "leaf1");
  host.CleanAll();
  EXPECT_EQ((*std::next(map.begin(), 2)).first, Key(10));
  EXPECT_EQ(host.DirtyNames(), "leaf2");
}

TEST_F(Iterator, StepsBothWaysInBothForms) {
  SmallMap::const_iterator i = map.cbegin();
  EXPECT_EQ((i++)->first, Key(1));
  EXPECT_EQ((++i)->first, Key(10));
  EXPECT_EQ((i--)->first, Key(10));
  EXPECT_EQ((--i)->first, Key(1));
  SmallMap::iterator j = map.begin();
  EXPECT_EQ((j++).const_deref().first, Key(1));
  EXPECT_EQ((++j).const_deref().first, Key(10));
  EXPECT_EQ((j--).const_deref().first, Key(10));
  EXPECT_EQ((--j).const_deref().first, Key(1));
}

TEST_F(Iterator, BeforeTheBeginningIsAPositionFromWhichItComesBack) {
  SmallMap::const_iterator i = map.cbegin();
  --i;
  EXPECT_EQ(i.m_leaf, Leaf(1));
  EXPECT_EQ(i.m_offset, -1);
  ++i;
  EXPECT_EQ(i, map.cbegin());
}

TEST_F(Iterator, TheStepFromTheLastEntryIsTheEndAndComesBack) {
  SmallMap::const_iterator i = map.find(Key(21));
  ++i;
  EXPECT_EQ(i, map.cend());
  EXPECT_EQ(i.m_leaf, Leaf(3));
  EXPECT_EQ(i.m_offset, 2);
  --i;
  EXPECT_EQ(i->first, Key(21));
}

TEST_F(Iterator, StepsBeyondTheEndsAreAssertions) {
  const char* const nextText = "-1 <= m_offset && m_offset < m_leaf->m_numKeyEntrys";
  const char* const prevText = "0 <= m_offset && m_offset <= m_leaf->m_numKeyEntrys";
  const char* const derefText = "0 <= m_offset && m_offset < m_leaf->m_numKeyEntrys";
  EXPECT_ASSERTION(++map.cend(), nextText);
  EXPECT_ASSERTION(--(--map.cbegin()), prevText);
  EXPECT_ASSERTION(*map.cend(), derefText);
  EXPECT_ASSERTION(*map.end(), derefText);
  EXPECT_ASSERTION(*--map.cbegin(), derefText);
  SmallMap empty;
  EXPECT_ASSERTION(++empty.cend(), "m_leaf");
  EXPECT_ASSERTION(--empty.cbegin(), "m_leaf");
  EXPECT_ASSERTION(*empty.cbegin(), "m_leaf");
  EXPECT_ASSERTION(*empty.begin(), "m_leaf");
}

TEST_F(Iterator, ReverseIteratorsRunBackwards) {
  std::vector<std::uint64_t> keys;
  const SmallMap& constant = map;
  for (auto i = constant.rbegin(); i != constant.rend(); ++i) keys.push_back(NumberOf(i->first));
  EXPECT_EQ(keys, (std::vector<std::uint64_t>{21, 20, 12, 11, 10, 2, 1}));
  EXPECT_TRUE(std::equal(keys.rbegin(), keys.rend(), constant.begin(), constant.end(),
                         [](std::uint64_t n, const auto& entry) { return Key(n) == entry.first; }));
  EXPECT_EQ(constant.crbegin(), constant.rbegin());
  EXPECT_EQ(constant.crend(), constant.rend());
  EXPECT_EQ(host.log().FullText(), "");
  EXPECT_EQ(map.rbegin()->first, Key(21));
  EXPECT_EQ(std::prev(map.rend())->first, Key(1));
  EXPECT_EQ(host.DirtyNames(), "leaf1 leaf3");
}

TEST_F(Iterator, StandardAlgorithmsWork) {
  const SmallMap& constant = map;
  const auto isTen = [](const auto& entry) { return entry.first == Key(10); };
  EXPECT_EQ(std::find_if(constant.begin(), constant.end(), isTen), constant.find(Key(10)));
  EXPECT_EQ(
      std::count_if(constant.begin(), constant.end(), [](const auto& e) { return e.second.value() >= 11; }),
      4);
  EXPECT_EQ(std::distance(constant.begin(), constant.end()), constant.size());
  EXPECT_EQ(std::prev(constant.end())->first, Key(21));
  EXPECT_EQ(std::max_element(constant.begin(), constant.end(),
                             [](const auto& a, const auto& b) { return a.second.value() < b.second.value(); })
                ->first,
            Key(21));
}

TEST_F(Iterator, EqualityTakesLeafAndOffset) {
  EXPECT_EQ(map.find(Key(2)), std::next(map.cbegin()));
  EXPECT_NE(map.find(Key(1)), map.find(Key(10)));  // the same offset in another leaf
  EXPECT_NE(map.find(Key(1)), map.find(Key(2)));
  EXPECT_TRUE(map.begin() == map.cbegin());
}

TEST_F(Iterator, EraseReturnsTheEntryBehind) {
  SmallMap::iterator i = map.erase(map.find(Key(2)));
  EXPECT_EQ(i.const_deref().first, Key(10));
  i = map.erase(map.find(Key(11)));
  EXPECT_EQ(i.const_deref().first, Key(12));
  i = map.erase(map.find(Key(21)));
  EXPECT_EQ(i, map.end());
  EXPECT_EQ(Keys(), (std::vector<std::uint64_t>{1, 10, 12, 20}));
  EXPECT_EQ(TreeFaults(), "");
}

TEST_F(Iterator, ErasingEverythingOneByOneEndsAtTheEndOfAnEmptyRootLeaf) {
  SmallMap::const_iterator i = map.cbegin();
  while (i != map.cend()) i = map.erase(i);
  EXPECT_EQ(Tree(), "[]");
  EXPECT_EQ(map.size(), 0);
}

TEST_F(Iterator, EraseOfARangeReturnsItsEnd) {
  const SmallMap::iterator i = map.erase(map.find(Key(2)), map.find(Key(20)));
  EXPECT_EQ(i.const_deref().first, Key(20));
  EXPECT_EQ(Keys(), (std::vector<std::uint64_t>{1, 20, 21}));
  EXPECT_EQ(TreeFaults(), "");
}

TEST_F(Iterator, EraseOfARangeToTheEndAndOfAnEmptyRange) {
  SmallMap::iterator i = map.erase(map.find(Key(11)), map.cend());
  EXPECT_EQ(i, map.end());
  EXPECT_EQ(Keys(), (std::vector<std::uint64_t>{1, 2, 10}));
  i = map.erase(map.find(Key(2)), map.find(Key(2)));
  EXPECT_EQ(i.const_deref().first, Key(2));
  i = map.erase(map.cend(), map.cend());
  EXPECT_EQ(i, map.end());
  EXPECT_EQ(map.size(), 3);
  i = map.erase(map.cbegin(), map.cend());
  EXPECT_EQ(i, map.end());
  EXPECT_EQ(Tree(), "[]");
}

TEST_F(Iterator, EraseOfAnEmptyRangeOfAnEmptyMap) {
  Hosted<SmallMap> empty(host, "empty");
  const SmallMap::iterator i = empty->erase(empty->cbegin(), empty->cend());
  EXPECT_EQ(i, empty->end());
  EXPECT_EQ(Calls(), "");
}

TEST_F(Iterator, EraseByKeySaysHowManyWent) {
  EXPECT_EQ(map.erase(Key(11)), 1);
  EXPECT_EQ(map.erase(Key(11)), 0);
}

TEST_F(Iterator, WalksAMapThatIsOutOfMemory) {
  host.UnloadAll();
  EXPECT_EQ(Keys(), (std::vector<std::uint64_t>{1, 2, 10, 11, 12, 20, 21}));
  EXPECT_EQ(host.log().Count(HostCall::kLoad), 3);  // the leaves; the root is not on the way
}

}  // namespace
}  // namespace vemo::test
