// Looking up keys: the order of keys, the searches within nodes, the descents.
#include <algorithm>

#include "tests/module/map_fixture.h"
#include "tests/support/production_payloads.h"
#include "tests/support/small_map.h"

namespace vemo::test {
namespace {

class Search : public MapFixture<SmallMap> {};
class ProductionSearch : public MapFixture<FieldIdToVectorInsertionsMap> {};

TEST(KeyOrder, ObjectsComeBeforePaths) {
  const FieldId early{OID(1), Path{9, 9}};
  const FieldId late{OID(2), Path{}};
  EXPECT_EQ(CompareKeys(early, late), -1);
  EXPECT_EQ(CompareKeys(late, early), 1);
  EXPECT_EQ(CompareKeys(early, early), 0);
}

TEST(KeyOrder, FieldsOfOneObjectAreOrderedByPath) {
  const OID object(7);
  const FieldId ordered[] = {
      {object, {}}, {object, {0}}, {object, {0, 5}}, {object, {1}}, {object, {1, 0, 0, 0, 0, 0}}};
  for (int i = 0; i < 5; ++i) {
    for (int j = 0; j < 5; ++j) EXPECT_EQ(CompareKeys(ordered[i], ordered[j]), i < j ? -1 : i == j ? 0 : 1);
  }
}

TEST(KeyOrder, ObjectIdsAreUnsigned) {
  EXPECT_EQ(CompareKeys(Key(1), Key(0xFFFFFFFFFFFFFFFFu)), -1);
}

TEST_F(Search, AnEmptyMapHasNothing) {
  const SmallMap& constant = map;
  const SmallMap::const_iterator nowhere(SmallMap::IteratorPolicy(nullptr, 0));
  EXPECT_EQ(constant.find(Key(1)), nowhere);
  EXPECT_EQ(constant.lower_bound(Key(1)), nowhere);
  EXPECT_EQ(constant.upper_bound(Key(1)), nowhere);
  EXPECT_EQ(constant.begin(), nowhere);
  EXPECT_EQ(constant.end(), nowhere);
  EXPECT_EQ(SmallMap::const_iterator(map.begin()), nowhere);
  EXPECT_EQ(SmallMap::const_iterator(map.end()), nowhere);
  EXPECT_EQ(map.rFind(Key(1)), nullptr);
  EXPECT_FALSE(map.contains(Key(1)));
  EXPECT_EQ(map.count(Key(1)), 0);
  EXPECT_EQ(map.size(), 0);
  EXPECT_TRUE(map.empty());
  EXPECT_EQ(map.m_height, -1);
}

TEST_F(Search, AnEmptyRootLeafHasNothingEither) {
  Build("[]");
  EXPECT_EQ(map.begin(), map.end());
  EXPECT_EQ(map.find(Key(1)), map.cend());
  EXPECT_EQ(map.lower_bound(Key(1)), map.cend());
  EXPECT_EQ(map.upper_bound(Key(1)), map.cend());
  EXPECT_EQ(map.rFind(Key(1)), nullptr);
  EXPECT_TRUE(map.empty());
}

TEST_F(Search, InternalNodesChooseTheLastSeparatorThatIsNotGreater) {
  Build("([1 2] 10 [10 11] 20 [20 21] 30 [30 31] 40 [40 41])");
  const auto* root = Node(1);
  for (std::uint64_t n = 0; n <= 45; ++n) {
    const auto index = static_cast<ssize_t>(n / 10) - 1;
    EXPECT_EQ(root->FindChildIndexGivenKey(Key(n)), index) << n;
    EXPECT_EQ(root->FindChildGivenKey(Key(n)), Leaf(static_cast<int>(index) + 2)) << n;
    EXPECT_EQ(root->FindChildGivenKey2(Key(n)),
              (std::pair<void*, ssize_t>(Leaf(static_cast<int>(index) + 2), index)));
  }
}

TEST_F(Search, AKeyBelowAllSeparatorsDescendsToTheLeftmostChildAndOneEqualToASeparatorToItsRight) {
  Build("([1 2] 10 [10 11])");
  EXPECT_EQ(Node(1)->FindChildIndexGivenKey(Key(9)), -1);
  EXPECT_EQ(Node(1)->FindChildIndexGivenKey(Key(10)), 0);
  EXPECT_EQ(map.find(Key(10)).m_leaf, Leaf(2));
}

TEST_F(Search, LeafSearchesAgreeWithTheStandardOnesAtEveryFill) {
  for (const char* tree : {"[]", "[2]", "[2 4]", "[2 4 6]", "[2 4 6 8]"}) {
    Hosted<SmallMap> other(host, "other");
    TreeBuilder<SmallMap>::Build(*other, tree);
    const SmallMap::LeafNode* leaf = other->m_firstLeaf.Get();
    std::vector<FieldId> keys;
    for (ssize_t i = 0; i < leaf->m_numKeyEntrys; ++i) keys.push_back(leaf->GetEntry(i).first);
    for (std::uint64_t n = 1; n <= 9; ++n) {
      const FieldId key = Key(n);
      const auto lower = std::lower_bound(keys.begin(), keys.end(), key) - keys.begin();
      const auto upper = std::upper_bound(keys.begin(), keys.end(), key) - keys.begin();
      EXPECT_EQ(other->LowerBoundInLeaf(key, leaf), lower);
      EXPECT_EQ(other->UpperBoundInLeaf(key, leaf), upper);
      EXPECT_EQ(other->SearchLeaf(key, leaf), lower == upper ? -1 : lower);
    }
  }
}

TEST_F(Search, FindsEachEntryAndNothingElse) {
  Build("(([2 4] 6 [6 8] 10 [10 12]) 14 ([14 16] 18 [18 20] 22 [22 24 26]))");
  for (std::uint64_t n = 1; n <= 27; ++n) {
    const bool present = n % 2 == 0;
    EXPECT_EQ(map.contains(Key(n)), present) << n;
    EXPECT_EQ(map.count(Key(n)), present ? 1 : 0) << n;
    EXPECT_EQ(map.find(Key(n)) != map.cend(), present) << n;
    if (present) {
      EXPECT_EQ(map.find(Key(n))->first, Key(n));
      EXPECT_EQ(PayloadOf(*map.rFind(Key(n))), n);
      EXPECT_EQ(map.rFind(Key(n)), &map.find(Key(n))->second);
    } else {
      EXPECT_EQ(map.rFind(Key(n)), nullptr);
    }
  }
}

TEST_F(Search, ASeparatorThatHasNoEntryAnyMoreStillDivides) {
  Build("([1 2] 10 [11 12] 20 [21 22])");
  EXPECT_FALSE(map.contains(Key(10)));
  EXPECT_EQ(map.lower_bound(Key(10))->first, Key(11));
  EXPECT_EQ(map.lower_bound(Key(9))->first, Key(11));
  EXPECT_TRUE(map.contains(Key(11)));
}

TEST_F(Search, LowerBoundOfAKeyBehindItsLeafIsTheFirstEntryOfTheNextLeaf) {
  Build("([1 2] 10 [10 11])");
  const auto position = map.lower_bound(Key(5));
  EXPECT_EQ(position.m_leaf, Leaf(2));
  EXPECT_EQ(position.m_offset, 0);
  EXPECT_EQ(map.lower_bound(Key(12)), map.cend());
  EXPECT_EQ(map.lower_bound(Key(12)).m_leaf, Leaf(2));
  EXPECT_EQ(map.lower_bound(Key(12)).m_offset, 2);
}

TEST_F(Search, UpperBoundOfAPresentKeyIsTheEntryBehindIt) {
  Build("([1 2] 10 [10 11])");
  EXPECT_EQ(map.upper_bound(Key(1))->first, Key(2));
  EXPECT_EQ(map.upper_bound(Key(2)).m_leaf, Leaf(2));
  EXPECT_EQ(map.upper_bound(Key(2))->first, Key(10));
  EXPECT_EQ(map.upper_bound(Key(10))->first, Key(11));
  EXPECT_EQ(map.upper_bound(Key(11)), map.cend());
}

TEST_F(Search, KeysOfOneObjectAreFoundByPath) {
  const FieldId first{OID(1), {0}}, second{OID(1), {0, 1}}, third{OID(1), {2}}, other{OID(2), {}};
  for (const FieldId& key : {third, other, first, second})
    map.Insert(key, MakePayload(key.path.size() + 1), false);
  std::vector<FieldId> order;
  for (const auto& entry : std::as_const(map)) order.push_back(entry.first);
  EXPECT_EQ(order, (std::vector<FieldId>{first, second, third, other}));
  EXPECT_EQ(PayloadOf(*map.rFind(second)), 3u);
  EXPECT_EQ(map.lower_bound(FieldId{OID(1), {1}})->first, third);
}

TEST_F(ProductionSearch, LookUpsCrossLeavesOfFiftyToAHundredEntries) {
  Build("(([1..50] 100 [100..199] 300 [300..350]) 1000 ([1000..1099] 1200 [1201..1260]))");
  for (const std::uint64_t n : {1, 50, 100, 199, 300, 350, 1000, 1099, 1201, 1260}) {
    EXPECT_EQ(PayloadOf(*map.rFind(Key(n))), n);
  }
  for (const std::uint64_t n : {0, 51, 99, 200, 299, 351, 999, 1100, 1200, 1261})
    EXPECT_FALSE(map.contains(Key(n)));
  EXPECT_EQ(map.lower_bound(Key(51))->first, Key(100));
  EXPECT_EQ(map.upper_bound(Key(199))->first, Key(300));
  EXPECT_EQ(map.lower_bound(Key(400))->first, Key(1000));
  EXPECT_EQ(map.lower_bound(Key(1150))->first, Key(1201));
  EXPECT_EQ(map.upper_bound(Key(1260)), map.cend());
}

}  // namespace
}  // namespace vemo::test
