// Insertion: what it returns, where entries go, where nodes divide.
#include "tests/module/map_fixture.h"
#include "tests/support/production_payloads.h"
#include "tests/support/small_map.h"

namespace vemo::test {
namespace {

class Insertion : public MapFixture<SmallMap> {};

TEST_F(Insertion, TheFirstOneMakesALeafThatIsRootFirstAndLast) {
  const auto [position, inserted] = map.insert({Key(5), MakePayload(50)});
  EXPECT_TRUE(inserted);
  EXPECT_EQ(position.m_leaf, Leaf(1));
  EXPECT_EQ(position.m_offset, 0);
  EXPECT_EQ(map.m_root.Get(), Leaf(1));
  EXPECT_EQ(map.m_firstLeaf.Get(), Leaf(1));
  EXPECT_EQ(map.m_lastLeaf.Get(), Leaf(1));
  EXPECT_EQ(map.m_height, 0);
  EXPECT_EQ(map.m_size, 1);
  EXPECT_EQ(host.log().Count(HostCall::kRegister), 1);
  EXPECT_EQ(host.log().Count(HostCall::kReach), 1);
}

TEST_F(Insertion, OfAnExistingKeyKeepsThePayloadUnlessItIsToBeReplaced) {
  Build("[1 2]");
  const auto [position, inserted] = map.insert({Key(2), MakePayload(7)});
  EXPECT_FALSE(inserted);
  EXPECT_EQ(position, SmallMap::iterator(SmallMap::IteratorPolicy(Leaf(1), 1)));
  EXPECT_EQ(PayloadOf(*map.rFind(Key(2))), 2u);
  EXPECT_FALSE(map.Insert(Key(2), MakePayload(7), false));
  EXPECT_EQ(PayloadOf(*map.rFind(Key(2))), 2u);
  EXPECT_FALSE(map.Insert(Key(2), MakePayload(7), true));
  EXPECT_EQ(PayloadOf(*map.rFind(Key(2))), 7u);
  EXPECT_TRUE(map.Insert(Key(3), MakePayload(3), true));
  EXPECT_EQ(map.size(), 3);
}

TEST_F(Insertion, SubscriptMakesADefaultPayloadOrMarksTheLeafOfAnExistingOne) {
  Build("[1 2]");
  EXPECT_EQ(map[Key(3)].value(), 0u);
  EXPECT_EQ(map.size(), 3);
  host.CleanAll();
  map[Key(1)] = MakePayload(9);
  EXPECT_EQ(host.DirtyNames(), "leaf1");
  EXPECT_EQ(PayloadOf(*map.rFind(Key(1))), 9u);
}

TEST_F(Insertion, AWriteLookUpDescribesTheEntryItFoundOrMade) {
  Build("[1 3]");
  SmallMap::wFindRet ret;
  EXPECT_EQ(ret.m_containingNode.m_self, nullptr);
  map.wFind(ret, Key(3), true);
  EXPECT_EQ(ret.m_containingNode.m_self, Leaf(1));
  EXPECT_EQ(ret.m_containingNode.m_table, IPersistable::Stubs<SmallMapLeafNode>::GetTable());
  EXPECT_EQ(ret.m_payload, &Leaf(1)->GetEntry(1).second);
  EXPECT_EQ(ret.m_leaf, Leaf(1));
  EXPECT_EQ(ret.m_index, 1);
  EXPECT_FALSE(ret.m_created);
  EXPECT_EQ(host.log().FullText(), "");

  map.wFind(ret, Key(2), true);
  EXPECT_EQ(ret.m_payload, &Leaf(1)->GetEntry(1).second);
  EXPECT_EQ(ret.m_index, 1);
  EXPECT_TRUE(ret.m_created);
  EXPECT_EQ(ret.m_payload->value(), 0u);
}

TEST_F(Insertion, AWriteLookUpWithoutCreationOfAMissingKeyIsEmpty) {
  Build("[1 3]");
  SmallMap::wFindRet ret{Leaf(1), nullptr, Leaf(1), 5, true};
  map.wFind(ret, Key(2), false);
  EXPECT_EQ(ret.m_containingNode.m_self, nullptr);
  EXPECT_EQ(ret.m_containingNode.m_table, nullptr);
  EXPECT_EQ(ret.m_payload, nullptr);
  EXPECT_EQ(ret.m_leaf, nullptr);
  EXPECT_EQ(ret.m_index, -1);
  EXPECT_FALSE(ret.m_created);
  EXPECT_EQ(map.size(), 2);
}

TEST_F(Insertion, AWriteLookUpWithoutCreationGivesAnEmptyMapARootLeaf) {
  SmallMap::wFindRet ret;
  map.wFind(ret, Key(2), false);
  EXPECT_EQ(ret.m_index, -1);
  EXPECT_FALSE(ret.m_created);
  EXPECT_EQ(Tree(), "[]");
  EXPECT_EQ(map.m_size, 0);
  EXPECT_EQ(host.DirtyNames(), "map");
}

TEST_F(Insertion, ReturnsThePositionInWhicheverHalfTheEntryWent) {
  for (std::uint64_t n = 1; n <= 9; n += 2) {
    Hosted<SmallMap> other(host, "other");
    TreeBuilder<SmallMap>::Build(*other, "[2 4 6 8]");
    const auto [position, inserted] = other->insert({Key(n), MakePayload(n)});
    EXPECT_TRUE(inserted);
    EXPECT_EQ(position.const_deref().first, Key(n));
    EXPECT_EQ(PayloadOf(position.const_deref().second), n);
    EXPECT_EQ(CheckTree(*other), "");
    EXPECT_EQ(other->m_firstLeaf->m_numKeyEntrys, 2);
    EXPECT_EQ(other->m_lastLeaf->m_numKeyEntrys, 3);
  }
}

TEST_F(Insertion, ThePayloadMayLieInTheLeafThatShiftsOrSplits) {
  for (const char* tree : {"[2 4 6]", "[2 4 6 8]"}) {
    for (std::uint64_t source = 2; source <= 6; source += 2) {
      for (std::uint64_t n = 1; n <= 9; n += 2) {
        Hosted<SmallMap> byKey(host, "other");
        TreeBuilder<SmallMap>::Build(*byKey, tree);
        EXPECT_TRUE(byKey->Insert(Key(n), byKey->rFind(Key(source))[0], true));
        EXPECT_EQ(PayloadOf(*byKey->rFind(Key(n))), source);

        Hosted<SmallMap> bySubscript(host, "other");
        TreeBuilder<SmallMap>::Build(*bySubscript, tree);
        (*bySubscript)[Key(n)] = CountedPayload(*bySubscript->rFind(Key(source)));
        EXPECT_EQ(PayloadOf(*bySubscript->rFind(Key(n))), source);
      }
    }
  }
}

TEST_F(Insertion, ThePayloadMayLieInAnotherLeaf) {
  Build("([1 2 3 4] 10 [10 11 12 13] 20 [20 21])");
  EXPECT_TRUE(map.Insert(Key(5), *map.rFind(Key(12)), false));
  EXPECT_EQ(PayloadOf(*map.rFind(Key(5))), 12u);
  EXPECT_TRUE(map.Insert(Key(14), *map.rFind(Key(1)), false));
  EXPECT_EQ(PayloadOf(*map.rFind(Key(14))), 1u);
  EXPECT_EQ(TreeFaults(), "");
}

TEST_F(Insertion, ThePayloadMayBeTheOneThatIsReplaced) {
  Build("[1 2]");
  EXPECT_FALSE(map.Insert(Key(1), *map.rFind(Key(1)), true));
  EXPECT_EQ(PayloadOf(*map.rFind(Key(1))), 1u);
}

TEST_F(Insertion, TheKeyMayLieInTheMap) {
  Build("([1 2] 3 [4 5 6 7])");
  const FieldId& separator = Node(1)->GetEntry(0).m_key;  // has no entry, and its node is about to gain one
  EXPECT_TRUE(map.Insert(separator, MakePayload(3), false));
  EXPECT_EQ(Tree(), "([1 2] 3 [3 4] 5 [5 6 7])");
  EXPECT_FALSE(map.Insert(map.find(Key(6))->first, MakePayload(60), true));
  map[map.find(Key(7))->first] = MakePayload(70);
  EXPECT_EQ(PayloadOf(*map.rFind(Key(6))), 60u);
  EXPECT_EQ(PayloadOf(*map.rFind(Key(7))), 70u);
  EXPECT_EQ(map.size(), 7);
}

TEST_F(Insertion, AnInternalNodeSplitsAtEachPosition) {
  // The full root holds 5 leaves; a full leaf at each place splits in turn.
  const struct {
    const char* m_tree;
    std::uint64_t m_key;
    const char* m_expected;
  } kRows[] = {
      {"([1 2 3 4] 10 [10 11] 20 [20 21] 30 [30 31] 40 [40 41])", 5,
       "(([1 2] 3 [3 4 5] 10 [10 11]) 20 ([20 21] 30 [30 31] 40 [40 41]))"},
      {"([1 2] 10 [10 11 12 13] 20 [20 21] 30 [30 31] 40 [40 41])", 14,
       "(([1 2] 10 [10 11] 12 [12 13 14]) 20 ([20 21] 30 [30 31] 40 [40 41]))"},
      {"([1 2] 10 [10 11] 20 [20 21 22 23] 30 [30 31] 40 [40 41])", 24,
       "(([1 2] 10 [10 11] 20 [20 21]) 22 ([22 23 24] 30 [30 31] 40 [40 41]))"},
      {"([1 2] 10 [10 11] 20 [20 21] 30 [30 31 32 33] 40 [40 41])", 34,
       "(([1 2] 10 [10 11] 20 [20 21]) 30 ([30 31] 32 [32 33 34] 40 [40 41]))"},
      {"([1 2] 10 [10 11] 20 [20 21] 30 [30 31] 40 [40 41 42 43])", 44,
       "(([1 2] 10 [10 11] 20 [20 21]) 30 ([30 31] 40 [40 41] 42 [42 43 44]))"},
  };
  for (const auto& row : kRows) {
    Hosted<SmallMap> other(host, "other");
    TreeBuilder<SmallMap>::Build(*other, row.m_tree);
    EXPECT_TRUE(other->Insert(Key(row.m_key), MakePayload(1), false));
    EXPECT_EQ(TreeText(*other), row.m_expected);
    EXPECT_EQ(CheckTree(*other), "");
  }
}

class ProductionInsertion : public MapFixture<FieldIdToVectorInsertionsMap> {
 protected:
  // A full root: 101 leaves of 50 entries, those of leaf i (from 0) starting at 200 * (i + 1). The leaf
  // at `full` has 100 entries instead.
  static std::string FullRoot(int full) {
    std::string text = "(";
    for (int i = 0; i <= 100; ++i) {
      const int first = 200 * (i + 1);
      const std::string from = std::to_string(first);
      if (i > 0) text += " " + from + " ";
      text += "[" + from + ".." + std::to_string(first + (i == full ? 99 : 49)) + "]";
    }
    return text + ")";
  }
};

TEST_F(ProductionInsertion, The101stKeySplitsTheRootLeafInto50And51) {
  Build("[1..100]");
  map.Insert(Key(101), MakePayload(1), false);
  EXPECT_EQ(Tree(), "([1..50] 51 [51..101])");
  EXPECT_EQ(map.m_height, 1);
  EXPECT_EQ(Node(1)->m_numKeyEntrys, 1);
  EXPECT_EQ(Leaf(1)->m_numKeyEntrys, 50);
  EXPECT_EQ(Leaf(2)->m_numKeyEntrys, 51);
}

TEST_F(ProductionInsertion, AtSlot49OfAFullLeafStaysLeft) {
  Build("[1..49 51..101]");
  const auto [position, inserted] = map.insert({Key(50), MakePayload(50)});
  EXPECT_EQ(position.m_leaf, Leaf(1));
  EXPECT_EQ(position.m_offset, 49);
  EXPECT_EQ(Tree(), "([1..50] 51 [51..101])");
  EXPECT_EQ(TreeFaults(), "");
}

TEST_F(ProductionInsertion, AtSlot50OfAFullLeafIsTheFirstOfTheRightLeafAndItsSeparator) {
  Build("[1..50 52..101]");
  const auto [position, inserted] = map.insert({Key(51), MakePayload(51)});
  EXPECT_EQ(position.m_leaf, Leaf(2));
  EXPECT_EQ(position.m_offset, 0);
  EXPECT_EQ(Tree(), "([1..50] 51 [51..101])");
  EXPECT_EQ(TreeFaults(), "");
}

TEST_F(ProductionInsertion, AtTheEndsOfAFullLeaf) {
  Build("[2..101]");
  map.Insert(Key(1), MakePayload(1), false);
  EXPECT_EQ(Tree(), "([1..50] 51 [51..101])");
  EXPECT_EQ(TreeFaults(), "");
}

TEST_F(ProductionInsertion, ASeparatorAtSlot49OfAFullNodeStaysLeft) {
  Build(
      FullRoot(49));  // the leaf that splits is child 49 counted from 0, so its new separator goes to slot 49
  map.Insert(Key(200 * 50 + 100), MakePayload(1), false);
  EXPECT_EQ(map.m_height, 2);
  const auto* left = Node(1);
  const auto* right = Node(2);
  EXPECT_EQ(left->m_numKeyEntrys, 50);
  EXPECT_EQ(right->m_numKeyEntrys, 50);
  EXPECT_EQ(left->GetEntry(49).m_key, Key(200 * 50 + 50));
  EXPECT_EQ(Node(3)->GetEntry(0).m_key, Key(200 * 51));
  EXPECT_EQ(TreeFaults(), "");
}

TEST_F(ProductionInsertion, ASeparatorAtSlot50OfAFullNodeMovesUp) {
  Build(FullRoot(50));
  map.Insert(Key(200 * 51 + 100), MakePayload(1), false);
  EXPECT_EQ(Node(3)->GetEntry(0).m_key, Key(200 * 51 + 50));
  EXPECT_EQ(Node(3)->m_numKeyEntrys, 1);
  EXPECT_EQ(Node(2)->m_ptr.Get(), Leaf(102));
  EXPECT_EQ(Node(1)->m_numKeyEntrys, 50);
  EXPECT_EQ(Node(2)->m_numKeyEntrys, 50);
  EXPECT_EQ(TreeFaults(), "");
}

TEST_F(ProductionInsertion, ASeparatorAtSlot51OfAFullNodeIsSlot0OfTheRightNode) {
  Build(FullRoot(51));
  map.Insert(Key(200 * 52 + 100), MakePayload(1), false);
  EXPECT_EQ(Node(3)->GetEntry(0).m_key, Key(200 * 52));
  EXPECT_EQ(Node(2)->GetEntry(0).m_key, Key(200 * 52 + 50));
  EXPECT_EQ(Node(2)->GetEntry(0).m_ptr.Get(), Leaf(102));
  EXPECT_EQ(Node(1)->m_numKeyEntrys, 50);
  EXPECT_EQ(Node(2)->m_numKeyEntrys, 50);
  EXPECT_EQ(TreeFaults(), "");
}

TEST_F(ProductionInsertion, SplittingTheLastLeafMovesTheLastLeafAndAnyOtherRelinksTheNext) {
  Build("([1..100] 200 [200..299])");
  map.Insert(Key(300), MakePayload(1), false);
  EXPECT_EQ(map.m_lastLeaf.Get(), Leaf(3));
  map.Insert(Key(101), MakePayload(1), false);
  EXPECT_EQ(map.m_lastLeaf.Get(), Leaf(3));
  EXPECT_EQ(Leaf(2)->m_prev.Get(), Leaf(4));
  EXPECT_EQ(Leaf(4)->m_next.Get(), Leaf(2));
  EXPECT_EQ(TreeFaults(), "");
}

}  // namespace
}  // namespace vemo::test
