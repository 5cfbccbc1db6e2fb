// The order of the map's calls to its host, compared literally. The host leaves dirty flags clear, so that
// the log shows every mark that the map asks for; DirtyFlags tests see that a set flag suppresses the later
// ones.
#include "tests/module/map_fixture.h"
#include "tests/support/small_map.h"

namespace vemo::test {
namespace {

class CallOrder : public MapFixture<SmallMap> {
 protected:
  CallOrder() { host.SetFlagging(false); }

  // The calls of one insertion or deletion.
  std::string CallsOfInsert(std::uint64_t n) {
    host.log().Clear();
    EXPECT_TRUE(map.Insert(Key(n), MakePayload(n), false));
    EXPECT_EQ(TreeFaults(), "");
    return Calls();
  }
  std::string CallsOfDelete(std::uint64_t n) {
    host.log().Clear();
    EXPECT_TRUE(map.Delete(Key(n)));
    EXPECT_EQ(TreeFaults(), "");
    return Calls();
  }
};

TEST_F(CallOrder, FirstInsertionRegistersLinksMarksAndDeclaresTheRootLeaf) {
  map.Insert(Key(1), MakePayload(1), false);
  EXPECT_EQ(host.log().FullText(),
            "register leaf1\n"
            "set leaf1\n"  // the last leaf, from which the first is copied
            "set leaf1\n"  // the root
            "dirty map\n"
            "reach map leaf1\n"
            "dirty map\n"  // the size
            "dirty leaf1\n"
            "dirty leaf1\n");  // the payload, marked without a look at the flag
}

TEST_F(CallOrder, InsertionIntoALeafWithRoomMarksMapAndLeaf) {
  Build("[1 3]");
  EXPECT_EQ(CallsOfInsert(2), "dirty map\ndirty leaf1\ndirty leaf1\n");
  EXPECT_EQ(Tree(), "[1 2 3]");
}

TEST_F(CallOrder, InsertionBehindAllOthersMarksMapAndLeaf) {
  Build("([1 2] 10 [10 11])");
  EXPECT_EQ(CallsOfInsert(12), "dirty map\ndirty leaf2\ndirty leaf2\n");
  EXPECT_EQ(Tree(), "([1 2] 10 [10 11 12])");
  map[Key(13)] = MakePayload(13);
  EXPECT_EQ(Calls(), "dirty map\ndirty leaf2\n");
  EXPECT_EQ(Tree(), "([1 2] 10 [10 11 12 13])");
}

TEST_F(CallOrder, CopyingMakesTheCallsOfInsertingInOrder) {
  Build("[1 2]");
  host.log().Clear();
  const SmallMap copy(map);
  EXPECT_EQ(host.log().FullText(),
            "register leaf2\n"
            "set leaf2\n"
            "set leaf2\n"
            "dirty stack map\n"
            "reach stack map leaf2\n"
            "dirty stack map\n"
            "dirty leaf2\n"
            "dirty leaf2\n"
            "dirty stack map\n"
            "dirty leaf2\n"
            "dirty leaf2\n");
}

TEST_F(CallOrder, InsertAndSubscriptOfAnExistingKey) {
  Build("[1 3]");
  EXPECT_FALSE(map.Insert(Key(1), MakePayload(7), false));
  EXPECT_FALSE(map.insert({Key(1), MakePayload(7)}).second);
  EXPECT_EQ(Calls(), "");
  EXPECT_FALSE(map.Insert(Key(1), MakePayload(7), true));
  EXPECT_EQ(Calls(), "dirty leaf1\n");
  map[Key(3)] = MakePayload(8);
  EXPECT_EQ(Calls(), "dirty leaf1\n");
}

TEST_F(CallOrder, SplitOfALeafInTheMiddleRelinksTheNextLeaf) {
  Build("([1 2 3 4] 10 [10 11])");
  EXPECT_EQ(CallsOfInsert(5),
            "dirty map\n"
            "register leaf3\n"
            "dirty leaf2\n"  // its predecessor changed
            "dirty leaf1\n"
            "reach leaf1 leaf3\n"
            "dirty node1\n"
            "dirty leaf3\n");
  EXPECT_EQ(Tree(), "([1 2] 3 [3 4 5] 10 [10 11])");
}

TEST_F(CallOrder, SplitOfALeafSetsItsReferencesInOrder) {
  Build("([1 2 3 4] 10 [10 11])");
  map.Insert(Key(5), MakePayload(5), false);
  EXPECT_EQ(host.log().FullText(),
            "dirty map\n"
            "register leaf3\n"
            "set leaf1\n"  // the new leaf's predecessor
            "set leaf2\n"  // the new leaf's successor
            "set leaf3\n"  // the successor's predecessor
            "dirty leaf2\n"
            "set leaf3\n"  // the old leaf's successor
            "dirty leaf1\n"
            "reach leaf1 leaf3\n"
            "set leaf3\n"  // the split entry
            "clear\n"      // no split above
            "dirty node1\n"
            "dirty leaf3\n");
}

TEST_F(CallOrder, SplitOfTheLastLeafMovesTheLastLeafReference) {
  Build("([1 2] 10 [10 11 12 13])");
  EXPECT_EQ(CallsOfInsert(14),
            "dirty map\n"
            "register leaf3\n"
            "dirty leaf2\n"
            "reach leaf2 leaf3\n"
            "dirty node1\n"
            "dirty leaf3\n");
  EXPECT_EQ(Tree(), "([1 2] 10 [10 11] 12 [12 13 14])");
  EXPECT_EQ(map.m_lastLeaf.Get(), Leaf(3));
}

TEST_F(CallOrder, SplitThatKeepsTheNewEntryOnTheLeftMarksTheLeftLeafAgain) {
  Build("([1 3 4 5] 10 [10 11])");
  EXPECT_EQ(CallsOfInsert(2),
            "dirty map\n"
            "register leaf3\n"
            "dirty leaf2\n"
            "dirty leaf1\n"
            "reach leaf1 leaf3\n"
            "dirty node1\n"
            "dirty leaf1\n");  // the payload
  EXPECT_EQ(Tree(), "([1 2] 3 [3 4 5] 10 [10 11])");
}

TEST_F(CallOrder, SplitOfARootLeafGrowsARoot) {
  Build("[1 2 3 4]");
  EXPECT_EQ(CallsOfInsert(5),
            "dirty map\n"
            "register leaf2\n"
            "dirty leaf1\n"
            "reach leaf1 leaf2\n"
            "register node1\n"
            "dirty map\n"
            "reach map node1\n"
            "dirty leaf2\n");
  EXPECT_EQ(Tree(), "([1 2] 3 [3 4 5])");
}

TEST_F(CallOrder, SplitOfAFullLeafUnderAFullRoot) {
  Build("([1 2] 3 [3 4] 5 [5 6 7 8] 10 [10 11] 12 [12 13])");
  EXPECT_EQ(CallsOfInsert(9),
            "dirty map\n"
            "register leaf6\n"
            "dirty leaf4\n"
            "dirty leaf3\n"
            "reach leaf3 leaf6\n"
            "register node2\n"
            "dirty node1\n"
            "reach node1 node2\n"
            "dirty node1\n"
            "register node3\n"
            "dirty map\n"
            "reach map node3\n"
            "dirty leaf6\n");
  EXPECT_EQ(Tree(), "(([1 2] 3 [3 4] 5 [5 6]) 7 ([7 8 9] 10 [10 11] 12 [12 13]))");
}

TEST_F(CallOrder, SplitUnderAFullInternalNodeBelowTheRoot) {
  Build(
      "(([1 2] 3 [3 4] 5 [5 6] 7 [7 8] 9 [9 10 11 12])"
      " 20 ([20 21] 22 [22 23] 24 [24 25]))");
  EXPECT_EQ(CallsOfInsert(13),
            "dirty map\n"
            "register leaf9\n"
            "dirty leaf6\n"
            "dirty leaf5\n"
            "reach leaf5 leaf9\n"
            "register node4\n"
            "dirty node2\n"
            "reach node2 node4\n"
            "dirty node2\n"
            "dirty node1\n"
            "dirty leaf9\n");
  EXPECT_EQ(Tree(),
            "(([1 2] 3 [3 4] 5 [5 6]) 7 ([7 8] 9 [9 10] 11 [11 12 13])"
            " 20 ([20 21] 22 [22 23] 24 [24 25]))");
}

TEST_F(CallOrder, DeletionWithoutRepairMarksLeafAndMap) {
  Build("([1 2 3] 4 [4 5])");
  EXPECT_EQ(CallsOfDelete(2), "dirty leaf1\ndirty map\n");
}

TEST_F(CallOrder, DeletionOfAMissingKeyCallsNothing) {
  Build("([1 2 3] 4 [4 5])");
  EXPECT_FALSE(map.Delete(Key(9)));
  EXPECT_EQ(host.log().FullText(), "");
}

TEST_F(CallOrder, LeafBorrowsFromItsRightSibling) {
  Build("([1 2] 3 [3 4 5])");
  EXPECT_EQ(CallsOfDelete(1), "dirty leaf1\ndirty map\ndirty leaf1\ndirty leaf2\ndirty node1\n");
  EXPECT_EQ(Tree(), "([2 3] 4 [4 5])");
}

TEST_F(CallOrder, LeafBorrowsFromItsLeftSibling) {
  Build("([1 2 3] 4 [4 5])");
  EXPECT_EQ(CallsOfDelete(5), "dirty leaf2\ndirty map\ndirty leaf1\ndirty leaf2\ndirty node1\n");
  EXPECT_EQ(Tree(), "([1 2] 3 [3 4])");
}

TEST_F(CallOrder, BalancingLinksTheTwoLeavesAgain) {
  Build("([1 2] 3 [3 4 5])");
  map.Delete(Key(1));
  EXPECT_EQ(host.log().FullText(),
            "dirty leaf1\ndirty map\nset leaf2\nset leaf1\ndirty leaf1\ndirty leaf2\ndirty node1\n");
}

constexpr const char* kTwoParents = "(([1 2] 3 [3 4] 5 [5 6 7]) 10 ([10 11] 12 [12 13] 14 [14 15 16]))";

TEST_F(CallOrder, LeafBorrowsFromItsLeftCousinThroughTheCommonAncestor) {
  Build(kTwoParents);
  EXPECT_EQ(CallsOfDelete(10), "dirty leaf4\ndirty map\ndirty leaf3\ndirty leaf4\ndirty node1\n");
  EXPECT_EQ(Tree(), "(([1 2] 3 [3 4] 5 [5 6]) 7 ([7 11] 12 [12 13] 14 [14 15 16]))");
}

TEST_F(CallOrder, LeafBorrowsFromItsRightCousinThroughTheCommonAncestor) {
  Build("(([1 2] 3 [3 4] 5 [5 6]) 10 ([10 11 12] 13 [13 14] 15 [15 16]))");
  EXPECT_EQ(CallsOfDelete(6), "dirty leaf3\ndirty map\ndirty leaf3\ndirty leaf4\ndirty node1\n");
  EXPECT_EQ(Tree(), "(([1 2] 3 [3 4] 5 [5 10]) 11 ([11 12] 13 [13 14] 15 [15 16]))");
}

TEST_F(CallOrder, LeafMergesIntoItsLeftSibling) {
  Build("([1 2] 3 [3 4] 5 [5 6])");
  EXPECT_EQ(CallsOfDelete(3),
            "dirty leaf2\ndirty map\n"
            "dirty leaf1\n"
            "dirty leaf3\n"  // its predecessor changed
            "delete leaf2\n"
            "dirty node1\n");
  EXPECT_EQ(Tree(), "([1 2 4] 5 [5 6])");
}

TEST_F(CallOrder, LeftmostLeafMergesWithItsRightSibling) {
  Build("([1 2] 3 [3 4] 5 [5 6])");
  EXPECT_EQ(CallsOfDelete(1),
            "dirty leaf1\ndirty map\n"
            "dirty leaf1\n"
            "dirty leaf3\n"
            "delete leaf2\n"
            "dirty node1\n");
  EXPECT_EQ(Tree(), "([2 3 4] 5 [5 6])");
}

TEST_F(CallOrder, MergeOfTheLastLeafMarksTheMapInsteadOfANextLeaf) {
  Build("([1 2] 3 [3 4] 5 [5 6])");
  map.Delete(Key(6));
  EXPECT_EQ(host.log().FullText(),
            "dirty leaf3\ndirty map\n"
            "set leaf3\nset leaf2\n"  // the two are linked again first
            "dirty leaf2\n"
            "set leaf2\n"  // the last leaf
            "dirty map\n"
            "delete leaf3\n"
            "dirty node1\n");
  EXPECT_EQ(Tree(), "([1 2] 3 [3 4 5])");
}

TEST_F(CallOrder, RootCollapseDeletesTheRootThenMarksTheMap) {
  Build("([1 2] 3 [3 4])");
  EXPECT_EQ(CallsOfDelete(4),
            "dirty leaf2\ndirty map\n"
            "dirty leaf1\ndirty map\ndelete leaf2\n"
            "dirty node1\n"
            "delete node1\n"
            "dirty map\n");
  EXPECT_EQ(Tree(), "[1 2 3]");
}

TEST_F(CallOrder, InternalNodeBorrowsFromItsRightNeighbour) {
  Build("(([1 2] 3 [3 4] 5 [5 6]) 10 ([10 11] 12 [12 13] 14 [14 15] 16 [16 17]))");
  EXPECT_EQ(CallsOfDelete(1),
            "dirty leaf1\ndirty map\n"
            "dirty leaf1\ndirty leaf3\ndelete leaf2\n"
            "dirty node2\n"
            "dirty node1\ndirty node2\ndirty node3\n");
  EXPECT_EQ(Tree(), "(([2 3 4] 5 [5 6] 10 [10 11]) 12 ([12 13] 14 [14 15] 16 [16 17]))");
}

TEST_F(CallOrder, InternalNodeBorrowsFromItsLeftNeighbour) {
  Build("(([1 2] 3 [3 4] 5 [5 6] 7 [7 8]) 10 ([10 11] 12 [12 13] 14 [14 15]))");
  EXPECT_EQ(CallsOfDelete(15),
            "dirty leaf7\ndirty map\n"
            "dirty leaf6\ndirty map\ndelete leaf7\n"
            "dirty node3\n"
            "dirty node1\ndirty node2\ndirty node3\n");
  EXPECT_EQ(Tree(), "(([1 2] 3 [3 4] 5 [5 6]) 7 ([7 8] 10 [10 11] 12 [12 13 14]))");
}

TEST_F(CallOrder, InternalNodeBorrowsFromItsCousinThroughTheRoot) {
  Build(
      "((([1 2] 3 [3 4] 5 [5 6]) 7 ([7 8] 9 [9 10] 11 [11 12]) 13 ([13 14] 15 [15 16] 17 [17 18] 19 [19 20]))"
      " 30 "
      "(([30 31] 32 [32 33] 34 [34 35]) 36 ([36 37] 38 [38 39] 40 [40 41]) 42 ([42 43] 44 [44 45] 46 [46 "
      "47])))");
  host.log().Clear();
  EXPECT_EQ(CallsOfDelete(34),
            "dirty leaf13\ndirty map\n"
            "dirty leaf12\ndirty leaf14\ndelete leaf13\n"
            "dirty node7\n"
            "dirty node1\ndirty node5\ndirty node7\n");
  EXPECT_EQ(Tree(),
            "((([1 2] 3 [3 4] 5 [5 6]) 7 ([7 8] 9 [9 10] 11 [11 12]) 13 ([13 14] 15 [15 16] 17 [17 18]))"
            " 19 "
            "(([19 20] 30 [30 31] 32 [32 33 35]) 36 ([36 37] 38 [38 39] 40 [40 41]) 42 ([42 43] 44 [44 45] "
            "46 [46 47])))");
}

TEST_F(CallOrder, InternalNodeMergesWithItsRightSiblingAndTheRootCollapses) {
  Build("(([1 2] 3 [3 4] 5 [5 6]) 10 ([10 11] 12 [12 13] 14 [14 15]))");
  EXPECT_EQ(CallsOfDelete(1),
            "dirty leaf1\ndirty map\n"
            "dirty leaf1\ndirty leaf3\ndelete leaf2\n"
            "dirty node2\n"
            "dirty node2\ndelete node3\n"
            "dirty node1\n"
            "delete node1\ndirty map\n");
  EXPECT_EQ(Tree(), "([2 3 4] 5 [5 6] 10 [10 11] 12 [12 13] 14 [14 15])");
}

TEST_F(CallOrder, InternalNodeMergesIntoItsLeftSibling) {
  Build(
      "(([1 2] 3 [3 4] 5 [5 6]) 10 ([10 11] 12 [12 13] 14 [14 15])"
      " 20 ([20 21] 22 [22 23] 24 [24 25]))");
  EXPECT_EQ(CallsOfDelete(12),
            "dirty leaf5\ndirty map\n"
            "dirty leaf4\ndirty leaf6\ndelete leaf5\n"
            "dirty node3\n"
            "dirty node2\ndelete node3\n"
            "dirty node1\n");
  EXPECT_EQ(Tree(),
            "(([1 2] 3 [3 4] 5 [5 6] 10 [10 11 13] 14 [14 15])"
            " 20 ([20 21] 22 [22 23] 24 [24 25]))");
}

TEST_F(CallOrder, NodesAreHandedToDeletionWithoutEntries) {
  Build("(([1 2] 3 [3 4] 5 [5 6]) 10 ([10 11] 12 [12 13] 14 [14 15]))");
  map.Delete(Key(1));
  EXPECT_EQ(Leaf(2)->m_numKeyEntrys, 0);
  EXPECT_EQ(Node(3)->m_numKeyEntrys, 0);
  EXPECT_EQ(Node(1)->m_numKeyEntrys, 0);
}

TEST_F(CallOrder, ClearOfAnEmptyMapDeletesNothingAndMarksTheMap) {
  map.clear();
  EXPECT_EQ(host.log().FullText(), "clear\nclear\nclear\ndirty map\n");
}

TEST_F(CallOrder, ClearOfASingleLeafDeletesItAsASubTree) {
  Build("[1 2]");
  map.clear();
  EXPECT_EQ(host.log().FullText(), "delete-tree leaf1\nclear\nclear\nclear\ndirty map\n");
  EXPECT_EQ(Tree(), "-");
}

TEST_F(CallOrder, ClearAtHeightTwoHandsOverTheRootAlone) {
  Build(kTwoParents);
  map.clear();
  EXPECT_EQ(host.log().FullText(), "delete-tree node1\nclear\nclear\nclear\ndirty map\n");
  EXPECT_EQ(Tree(), "-");
  EXPECT_EQ(map.size(), 0);
}

TEST_F(CallOrder, SwapMarksThisMapThenTheOther) {
  Build("[1 2]");
  Hosted<SmallMap> other(host, "other");
  map.swap(*other);
  EXPECT_EQ(host.log().FullText(), "dirty map\ndirty other\n");
  EXPECT_EQ(Tree(), "-");
  EXPECT_EQ(TreeText(*other), "[1 2]");
}

TEST_F(CallOrder, AssignmentInsertsIntoATemporarySwapsAndDeletesNothing) {
  Build("[1 2]");
  Hosted<SmallMap> other(host, "other");
  TreeBuilder<SmallMap>::Build(*other, "[7]");
  host.log().Clear();
  *other = map;
  EXPECT_EQ(Calls(),
            "register leaf3\n"
            "dirty stack map\n"
            "reach stack map leaf3\n"
            "dirty stack map\n"
            "dirty leaf3\n"
            "dirty leaf3\n"
            "dirty stack map\n"
            "dirty leaf3\n"
            "dirty leaf3\n"
            "dirty other\n"
            "dirty stack map\n");
  EXPECT_EQ(TreeText(*other), "[1 2]");
  EXPECT_FALSE(host.IsDeleted("leaf2"));
}

TEST_F(CallOrder, ReadingCallsNothing) {
  Build(kTwoParents);
  const SmallMap& constant = map;
  for (const auto& entry : constant) EXPECT_NE(constant.rFind(entry.first), nullptr);
  EXPECT_TRUE(constant.contains(Key(14)));
  EXPECT_EQ(constant.find(Key(99)), constant.end());
  EXPECT_EQ(constant.lower_bound(Key(8))->first, Key(10));
  EXPECT_EQ(constant.upper_bound(Key(7))->first, Key(10));
  EXPECT_TRUE(constant == constant);
  EXPECT_EQ(constant.GetNumNodes(), 9);
  constant.Validate();
  EXPECT_EQ(host.log().FullText(), "");
}

TEST_F(CallOrder, ReadingAMapOutOfMemoryLoadsThePathAndNoMore) {
  Build(kTwoParents);
  host.UnloadAll();
  host.log().Clear();
  EXPECT_NE(map.rFind(Key(13)), nullptr);
  EXPECT_EQ(host.log().FullText(), "load node1\nload node3\nload leaf5\n");
}

TEST_F(CallOrder, DeletionLoadsTheNeighboursOfThePath) {
  Build(kTwoParents);
  host.UnloadAll();
  host.log().Clear();
  EXPECT_TRUE(map.Delete(Key(16)));
  EXPECT_EQ(host.log().FullText(),
            "load node1\nload node3\nload node2\nload leaf6\nload leaf5\ndirty leaf6\ndirty map\n");
}

TEST(DirtyFlags, ASetFlagSuppressesFurtherMarks) {
  RecordingHost host;
  Hosted<SmallMap> map(host);
  map->Insert(Key(1), PayloadNumber<CountedPayload>::Make(1), false);
  EXPECT_EQ(host.log().LifecycleText(),
            "register leaf1\n"
            "dirty map\n"
            "reach map leaf1\n"
            "dirty leaf1\n"
            "dirty leaf1\n");  // the payload's mark never looks at the flag
  host.log().Clear();
  map->MarkAsDirtyWithoutTrace();
  EXPECT_EQ(host.log().LifecycleText(), "");
  host.CleanAll();
  map->MarkAsDirtyWithoutTrace();
  map->MarkAsDirtyWithoutTrace();
  EXPECT_EQ(host.log().LifecycleText(), "dirty map\n");
  EXPECT_EQ(host.DirtyNames(), "map");
}

TEST(DirtyFlags, AMapThatTheHostDoesNotOwnStaysUnflagged) {
  RecordingHost host;
  SmallMap map;
  map.Insert(Key(1), CountedPayload(1), false);
  EXPECT_FALSE(map.IsDirty());
  EXPECT_EQ(host.DirtyNames(), "leaf1");
}

}  // namespace
}  // namespace vemo::test
