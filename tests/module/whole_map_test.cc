// Maps as values: copies, assignment, exchange, equality, counting, validation, the text dump.
#include "tests/module/map_fixture.h"
#include "tests/support/production_payloads.h"
#include "tests/support/small_map.h"
#include "vxUtils/ByteForms.h"

namespace vemo::test {
namespace {

class WholeMap : public MapFixture<SmallMap> {
 protected:
  std::string ValidateTextOf(const char* tree) {
    Build(tree);
    map.Validate();
    return TreeFaults();
  }
};

TEST_F(WholeMap, ANewOneIsEmptyInEveryWay) {
  EXPECT_EQ(map.m_size, 0);
  EXPECT_FALSE(map.m_firstLeaf);
  EXPECT_FALSE(map.m_lastLeaf);
  EXPECT_FALSE(map.m_root);
  EXPECT_EQ(map.m_height, -1);
  EXPECT_EQ(map.GetNumNodes(), 0);
  map.Validate();
  EXPECT_EQ(ToText(map), "Height = -1\n");
  Hosted<SmallMap> other(host, "other");
  EXPECT_TRUE(map == *other);
  EXPECT_EQ(host.log().FullText(), "");
}

TEST_F(WholeMap, EmptiedByDeletionEqualsANewOneThoughTheShapesDiffer) {
  map.Insert(Key(1), MakePayload(1), false);
  map.Delete(Key(1));
  Hosted<SmallMap> other(host, "other");
  EXPECT_TRUE(map == *other);
  EXPECT_TRUE(*other == map);
  EXPECT_EQ(map.m_height, 0);
  EXPECT_EQ(other->m_height, -1);
  EXPECT_EQ(map.GetNumNodes(), 1);
  EXPECT_EQ(other->GetNumNodes(), 0);
}

TEST_F(WholeMap, EqualityIgnoresTheShape) {
  Build("([1 2] 3 [3 4] 5 [5 6])");
  Hosted<SmallMap> other(host, "other");
  TreeBuilder<SmallMap>::Build(*other, "([1 2 3] 4 [4 5 6])");
  EXPECT_TRUE(map == *other);
}

TEST_F(WholeMap, EqualityTakesSizesKeysAndPayloads) {
  Build("[1 2 3]");
  Hosted<SmallMap> other(host, "other");
  TreeBuilder<SmallMap>::Build(*other, "[1 2]");
  EXPECT_FALSE(map == *other);
  other->Insert(Key(4), MakePayload(3), false);
  EXPECT_FALSE(map == *other);
  other->Delete(Key(4));
  other->Insert(Key(3), MakePayload(4), false);
  EXPECT_FALSE(map == *other);
  other->Insert(Key(3), MakePayload(3), true);
  EXPECT_TRUE(map == *other);
}

TEST_F(WholeMap, ACopyHasTheShapeOfAscendingInsertionAndNodesOfItsOwn) {
  Build("([1 2 3 4] 10 [10 11 12 13])");
  const SmallMap copy(map);
  EXPECT_EQ(TreeText(copy), "([1 2] 3 [3 4] 10 [10 11 12 13])");
  EXPECT_EQ(CheckTree(copy), "");
  EXPECT_TRUE(copy == map);
  EXPECT_EQ(Tree(), "([1 2 3 4] 10 [10 11 12 13])");
  EXPECT_NE(copy.m_firstLeaf.Get(), map.m_firstLeaf.Get());
  EXPECT_FALSE(copy.IsDirty());
  EXPECT_TRUE(copy.m_persistObjState.m_oid.IsNull());
}

TEST_F(WholeMap, ACopyOfAnEmptyMapHasNoNode) {
  Build("[]");
  const SmallMap copy(map);
  EXPECT_EQ(TreeText(copy), "-");
}

TEST_F(WholeMap, AssignmentReplacesTheContentsAndKeepsTheIdentity) {
  Build("[1 2 3]");
  Hosted<SmallMap> other(host, "other");
  TreeBuilder<SmallMap>::Build(*other, "([1 2] 10 [10 11])");
  const OID id = other->m_persistObjState.m_oid;
  host.CleanAll();
  SmallMap& result = *other = map;
  EXPECT_EQ(&result, &*other);
  EXPECT_EQ(TreeText(*other), "[1 2 3]");
  EXPECT_EQ(other->m_persistObjState.m_oid, id);
  EXPECT_TRUE(other->IsDirty());
  EXPECT_FALSE(map.IsDirty());
  EXPECT_EQ(host.log().Count(HostCall::kDelete) + host.log().Count(HostCall::kDeleteTree), 0);
}

TEST_F(WholeMap, AssignmentToItselfKeepsTheContents) {
  Build("([1 2] 10 [10 11 12])");
  const SmallMap& same = map;
  map = same;
  EXPECT_EQ(Tree(), "([1 2] 10 [10 11 12])");
  EXPECT_EQ(TreeFaults(), "");
  EXPECT_FALSE(host.IsDeleted("leaf1"));
  EXPECT_NE(map.m_firstLeaf.Get(), Leaf(1));
}

TEST_F(WholeMap, SwapExchangesAllFiveFields) {
  Build("([1 2] 10 [10 11])");
  Hosted<SmallMap> other(host, "other");
  TreeBuilder<SmallMap>::Build(*other, "[7]");
  map.swap(*other);
  EXPECT_EQ(Tree(), "[7]");
  EXPECT_EQ(map.size(), 1);
  EXPECT_EQ(TreeFaults(), "");
  EXPECT_EQ(TreeText(*other), "([1 2] 10 [10 11])");
  EXPECT_EQ(other->size(), 4);
  EXPECT_EQ(CheckTree(*other), "");
  map.swap(map);
  EXPECT_EQ(Tree(), "[7]");
}

TEST_F(WholeMap, SwapOfMapsOutOfMemoryLoadsNothing) {
  Build("[1 2]");
  Hosted<SmallMap> other(host, "other");
  host.UnloadAll();
  host.log().Clear();
  map.swap(*other);
  EXPECT_EQ(host.log().FullText(), "dirty map\ndirty other\n");
  EXPECT_EQ(TreeText(*other), "[1 2]");
}

TEST_F(WholeMap, ClearReturnsToTheStateOfANewMapAndInsertionStartsAfresh) {
  Build("([1 2] 10 [10 11])");
  map.clear();
  EXPECT_EQ(Tree(), "-");
  EXPECT_EQ(TreeFaults(), "");
  EXPECT_EQ(host.DirtyNames(), "map");
  EXPECT_TRUE(host.IsDeleted("node1"));
  EXPECT_TRUE(map.Insert(Key(5), MakePayload(5), false));
  EXPECT_EQ(Tree(), "[5]");
}

TEST_F(WholeMap, NodesAreCounted) {
  Build("(([1 2] 3 [3 4] 5 [5 6]) 10 ([10 11] 12 [12 13] 14 [14 15 16]))");
  EXPECT_EQ(map.GetNumNodes(), 9);
  Hosted<SmallMap> other(host, "other");
  TreeBuilder<SmallMap>::Build(*other, "[]");
  EXPECT_EQ(other->GetNumNodes(), 1);
}

TEST_F(WholeMap, DestructionCallsNothing) {
  SmallMap* const other = new SmallMap;
  TreeBuilder<SmallMap>::Build(*other, "[1 2]");
  host.log().Clear();
  delete other;
  EXPECT_EQ(host.log().FullText(), "");
}

TEST_F(WholeMap, TheDumpShowsHeightBracesKeysAndPayloads) {
  Build("[]");
  EXPECT_EQ(ToText(map), "Height = 0\n{\n}\n");

  Hosted<SmallMap> tree(host, "tree");
  TreeBuilder<SmallMap>::Build(*tree, "([1 2] 10 [10 11])");
  EXPECT_EQ(ToText(*tree),
            "Height = 1\n"
            "{\n"
            "    {\n"
            "        1: --> 1\n"
            "        2: --> 2\n"
            "    }\n"
            "    10:\n"
            "    {\n"
            "        10: --> 10\n"
            "        11: --> 11\n"
            "    }\n"
            "}\n");
}

TEST_F(WholeMap, TheDumpOfHeightTwoIndentsThreeLevels) {
  Build("(([1 2] 3 [3 4] 5 [5 6]) 7 ([7 8] 9 [9 10] 11 [11 12]))");
  EXPECT_EQ(ToText(map),
            "Height = 2\n"
            "{\n"
            "    {\n"
            "        {\n"
            "            1: --> 1\n"
            "            2: --> 2\n"
            "        }\n"
            "        3:\n"
            "        {\n"
            "            3: --> 3\n"
            "            4: --> 4\n"
            "        }\n"
            "        5:\n"
            "        {\n"
            "            5: --> 5\n"
            "            6: --> 6\n"
            "        }\n"
            "    }\n"
            "    7:\n"
            "    {\n"
            "        {\n"
            "            7: --> 7\n"
            "            8: --> 8\n"
            "        }\n"
            "        9:\n"
            "        {\n"
            "            9: --> 9\n"
            "            10: --> 10\n"
            "        }\n"
            "        11:\n"
            "        {\n"
            "            11: --> 11\n"
            "            12: --> 12\n"
            "        }\n"
            "    }\n"
            "}\n");
  EXPECT_EQ(host.log().FullText(), "");
}

TEST_F(WholeMap, TheDumpOfAKeyShowsItsPath) {
  map.Insert(FieldId{OID(1), {0, 3}}, MakePayload(4), false);
  EXPECT_EQ(ToText(map), "Height = 0\n{\n    1:0.3 --> 4\n}\n");
}

TEST_F(WholeMap, ValidationAcceptsSoundTrees) {
  for (const char* tree : {"-", "[]", "[1]", "([1 2] 3 [3 4])", "([1 2] 10 [10 11] 20 [20 21 22 23])"}) {
    Hosted<SmallMap> other(host, "other");
    TreeBuilder<SmallMap>::Build(*other, tree);
    other->Validate();
    EXPECT_EQ(CheckTree(*other), "");
  }
}

TEST_F(WholeMap, ValidationChecksTheFillOfEveryNodeButTheRoot) {
  Build("([1 2] 10 [10])");
  EXPECT_ASSERTION(map.Validate(), "50 <= nk");
  Hosted<SmallMap> internal(host, "internal");
  TreeBuilder<SmallMap>::Build(*internal, "(([1 2] 3 [3 4]) 10 ([10 11] 12 [12 13] 14 [14 15]))");
  EXPECT_ASSERTION(internal->Validate(), "50 <= nk");
  Hosted<SmallMap> root(host, "root");
  TreeBuilder<SmallMap>::Build(*root, "([1 2])");
  EXPECT_ASSERTION(root->Validate(), "1 <= nk && nk <= 100");
}

TEST_F(WholeMap, ValidationChecksOrderAndBounds) {
  const struct {
    const char* m_tree;
    const char* m_text;
  } kRows[] = {
      {"[2 1]", "CompareKeys(leaf->GetEntry(i-1).first, leaf->GetEntry(i).first) < 0"},
      {"[1 1]", "CompareKeys(leaf->GetEntry(i-1).first, leaf->GetEntry(i).first) < 0"},
      {"([1 2] 10 [9 11])", "CompareKeys(*k1, leaf->GetEntry(0).first) <= 0"},
      {"([1 10] 10 [10 11])", "CompareKeys(leaf->GetEntry(nk-1).first, *k2) < 0"},
      {"([1 2] 20 [20 21] 10 [10 11])",
       "CompareKeys(inode->GetEntry(i-1).m_key, inode->GetEntry(i).m_key) < 0"},
      {"(([1 2] 3 [3 4] 5 [5 6]) 13 ([10 11] 12 [12 13] 14 [14 15]))",
       "CompareKeys(*k1,inode->GetEntry(0).m_key) <= 0"},
      {"(([1 2] 3 [3 4] 5 [5 6]) 5 ([10 11] 12 [12 13] 14 [14 15]))",
       "CompareKeys(inode->GetEntry(nk-1).m_key, *k2) < 0"},
  };
  for (const auto& row : kRows) {
    Hosted<SmallMap> other(host, "other");
    TreeBuilder<SmallMap>::Build(*other, row.m_tree);
    EXPECT_ASSERTION(other->Validate(), row.m_text) << row.m_tree;
    EXPECT_NE(CheckTree(*other), "") << row.m_tree;
  }
}

TEST_F(WholeMap, ValidationComparesEachLevelWithItsOwnParentOnly) {
  // The last leaf of the left node reaches beyond the root's separator, which only its grandparent knows.
  EXPECT_EQ(ValidateTextOf("(([1 2] 3 [3 4] 5 [5 15]) 10 ([10 11] 12 [12 13] 14 [14 15]))"),
            "root.-1.1: key 15: is above its range\n");
}

TEST_F(WholeMap, ValidationIgnoresSizeAndChain) {
  Build("([1 2] 10 [10 11])");
  map.m_size = 7;
  Leaf(2)->m_prev.Clear();
  map.m_lastLeaf = Leaf(1);
  map.Validate();
  EXPECT_EQ(TreeFaults(),
            "map: its last leaf is not the tree's\n"
            "leaf 1: its left neighbour is not the tree's\n"
            "map: the size is 7, but there are 4 entries\n");
}

class ProductionWholeMap : public MapFixture<FieldIdToVectorInsertionsMap> {};

TEST_F(ProductionWholeMap, ACopyOfTenThousandEntriesHasTheSamePairs) {
  for (std::uint64_t i = 0; i < 10000; ++i) map.Insert(Key(i * 7919 % 10007), MakePayload(i), false);
  ASSERT_EQ(map.size(), 10000);
  const FieldIdToVectorInsertionsMap copy(map);
  copy.Validate();
  EXPECT_EQ(CheckTree(copy), "");
  EXPECT_EQ(copy.size(), 10000);
  auto j = copy.begin();
  for (const auto& entry : std::as_const(map)) {
    ASSERT_EQ(j->first, entry.first);
    ASSERT_EQ(PayloadOf(j->second), PayloadOf(entry.second));
    ++j;
  }
  EXPECT_EQ(j, copy.end());
}

TEST_F(ProductionWholeMap, BuiltInDifferentOrdersAreEqual) {
  Hosted<FieldIdToVectorInsertionsMap> other(host, "other");
  for (std::uint64_t i = 1; i <= 500; ++i) {
    map.Insert(Key(i), MakePayload(i), false);
    other->Insert(Key(501 - i), MakePayload(501 - i), false);
  }
  EXPECT_NE(Tree(), TreeText(*other));
  EXPECT_TRUE(map == *other);
}

TEST_F(ProductionWholeMap, ClearAtHeightTwoHandsOverTheRootAlone) {
  for (std::uint64_t i = 1; i <= 5200; ++i) map.Insert(Key(i), MakePayload(i), false);
  ASSERT_EQ(map.m_height, 2);
  const std::string root = host.NameOf(map.m_root.m_oid);
  host.CleanAll();
  host.log().Clear();
  map.clear();
  EXPECT_EQ(Calls(), "delete-tree " + root + "\ndirty map\n");
  EXPECT_EQ(Tree(), "-");
}

TEST_F(ProductionWholeMap, ValidationRefusesANodeOf49) {
  Build("([1..50] 100 [100..148])");
  EXPECT_ASSERTION(map.Validate(), "50 <= nk");
  Hosted<FieldIdToVectorInsertionsMap> other(host, "other");
  TreeBuilder<FieldIdToVectorInsertionsMap>::Build(*other, "([1..50])");
  EXPECT_ASSERTION(other->Validate(), "1 <= nk && nk <= 100");
}

}  // namespace
}  // namespace vemo::test
