// Deletion: what it returns, whom an underfull node borrows from or merges with. The calls it makes and the
// shapes after each repair are in call_order_test.cc.
#include "tests/module/map_fixture.h"
#include "tests/support/production_payloads.h"
#include "tests/support/small_map.h"

namespace vemo::test {
namespace {

class Deletion : public MapFixture<SmallMap> {
 protected:
  // The tree after a deletion, which must be sound.
  std::string AfterDeleting(const std::string& tree, std::uint64_t n) {
    Hosted<SmallMap> other(host, "other");
    TreeBuilder<SmallMap>::Build(*other, tree);
    const ssize_t size = other->size();
    EXPECT_TRUE(other->Delete(Key(n)));
    EXPECT_EQ(other->size(), size - 1);
    EXPECT_FALSE(other->contains(Key(n)));
    other->Validate();
    EXPECT_EQ(CheckTree(*other), "");
    return TreeText(*other);
  }
};

TEST_F(Deletion, FromAnEmptyMapSaysFalseAndTouchesNothing) {
  EXPECT_FALSE(map.Delete(Key(1)));
  EXPECT_EQ(host.log().FullText(), "");
  EXPECT_EQ(Tree(), "-");
}

TEST_F(Deletion, OfTheOnlyKeyLeavesAnEmptyRootLeaf) {
  Build("[1]");
  EXPECT_TRUE(map.Delete(Key(1)));
  EXPECT_EQ(Tree(), "[]");
  EXPECT_EQ(map.m_size, 0);
  EXPECT_EQ(map.m_height, 0);
  EXPECT_FALSE(host.IsDeleted("leaf1"));
  EXPECT_FALSE(map.Delete(Key(1)));
}

TEST_F(Deletion, OfAMissingKeyChangesNothing) {
  Build("([1 2] 10 [10 11])");
  for (const std::uint64_t n : {0, 3, 9, 12}) EXPECT_FALSE(map.Delete(Key(n)));
  EXPECT_EQ(Tree(), "([1 2] 10 [10 11])");
  EXPECT_EQ(host.DirtyNames(), "");
}

TEST_F(Deletion, BorrowsFromTheRightOnATie) {
  EXPECT_EQ(AfterDeleting("([1 2 3] 10 [10 11] 20 [20 21 22])", 10), "([1 2 3] 10 [11 20] 21 [21 22])");
}

TEST_F(Deletion, BorrowsFromTheLeftWhenThatIsFuller) {
  EXPECT_EQ(AfterDeleting("([1 2 3 4] 10 [10 11] 20 [20 21 22])", 10), "([1 2 3] 4 [4 11] 20 [20 21 22])");
}

TEST_F(Deletion, BorrowsFromTheOnlyNeighbourThatCanLend) {
  EXPECT_EQ(AfterDeleting("([1 2 3] 10 [10 11] 20 [20 21])", 11), "([1 2] 3 [3 10] 20 [20 21])");
  EXPECT_EQ(AfterDeleting("([1 2] 10 [10 11] 20 [20 21 22])", 11), "([1 2] 10 [10 20] 21 [21 22])");
}

TEST_F(Deletion, MergesWithTheLeftSiblingOrElseTheRightOne) {
  EXPECT_EQ(AfterDeleting("([1 2] 10 [10 11] 20 [20 21])", 11), "([1 2 10] 20 [20 21])");
  EXPECT_EQ(AfterDeleting("([1 2] 10 [10 11] 20 [20 21])", 1), "([2 10 11] 20 [20 21])");
}

TEST_F(Deletion, TheLenderKeepsTheLargerHalf) {
  EXPECT_EQ(AfterDeleting("([1 2] 10 [10 11 12 13])", 1), "([2 10] 11 [11 12 13])");
  EXPECT_EQ(AfterDeleting("([1 2 3 4] 10 [10 11])", 10), "([1 2 3] 4 [4 11])");
}

TEST_F(Deletion, ARootWithOneSeparatorIsLeftAlone) {
  EXPECT_EQ(AfterDeleting("([1 2 3] 10 [10 11])", 1), "([2 3] 10 [10 11])");
}

TEST_F(Deletion, OfAKeyThatIsASeparatorKeepsTheSeparator) {
  EXPECT_EQ(AfterDeleting("([1 2] 10 [10 11 12])", 10), "([1 2] 10 [11 12])");
}

TEST_F(Deletion, FindsTheSeparatorToReplaceThoughItsKeyIsGone) {
  EXPECT_EQ(AfterDeleting("([1 2] 9 [10 11 12])", 1), "([2 10] 11 [11 12])");
}

TEST_F(Deletion, InternalNodesBorrowFromTheRightOnATie) {
  const std::string left = "([1 2] 3 [3 4] 5 [5 6] 7 [7 8])";
  const std::string middle = "([20 21] 22 [22 23] 24 [24 25])";
  const std::string right = "([40 41] 42 [42 43] 44 [44 45] 46 [46 47])";
  EXPECT_EQ(AfterDeleting("(" + left + " 20 " + middle + " 40 " + right + ")", 22),
            "(" + left + " 20 ([20 21 23] 24 [24 25] 40 [40 41]) 42 ([42 43] 44 [44 45] 46 [46 47]))");
}

TEST_F(Deletion, InternalNodesBorrowFromTheLeftWhenThatIsFuller) {
  EXPECT_EQ(AfterDeleting("(([1 2] 3 [3 4] 5 [5 6] 7 [7 8] 9 [9 10]) 20 ([20 21] 22 [22 23] 24 [24 25])"
                          " 40 ([40 41] 42 [42 43] 44 [44 45] 46 [46 47]))",
                          22),
            "(([1 2] 3 [3 4] 5 [5 6] 7 [7 8]) 9 ([9 10] 20 [20 21 23] 24 [24 25])"
            " 40 ([40 41] 42 [42 43] 44 [44 45] 46 [46 47]))");
}

TEST_F(Deletion, TheLenderOfAnInternalNodeKeepsTheLargerHalf) {
  EXPECT_EQ(
      AfterDeleting("(([1 2] 3 [3 4] 5 [5 6]) 10 ([10 11] 12 [12 13] 14 [14 15] 16 [16 17] 18 [18 19]))", 1),
      "(([2 3 4] 5 [5 6] 10 [10 11]) 12 ([12 13] 14 [14 15] 16 [16 17] 18 [18 19]))");
}

TEST_F(Deletion, MergesTravelUpThroughThreeLevels) {
  EXPECT_EQ(AfterDeleting(
                "((([1 2] 3 [3 4] 5 [5 6]) 7 ([7 8] 9 [9 10] 11 [11 12]) 13 ([13 14] 15 [15 16] 17 [17 18]))"
                " 30 "
                "(([30 31] 32 [32 33] 34 [34 35]) 36 ([36 37] 38 [38 39] 40 [40 41])"
                " 42 ([42 43] 44 [44 45] 46 [46 47])))",
                47),
            "(([1 2] 3 [3 4] 5 [5 6]) 7 ([7 8] 9 [9 10] 11 [11 12]) 13 ([13 14] 15 [15 16] 17 [17 18])"
            " 30 ([30 31] 32 [32 33] 34 [34 35])"
            " 36 ([36 37] 38 [38 39] 40 [40 41] 42 [42 43] 44 [44 45 46]))");
}

TEST_F(Deletion, TheKeyMayLieInTheLeafOrInAnInternalNode) {
  Build("([1 2] 10 [10 11] 20 [20 21])");
  EXPECT_TRUE(map.Delete(map.find(Key(11))->first));
  EXPECT_EQ(Tree(), "([1 2 10] 20 [20 21])");
  EXPECT_TRUE(map.Delete(Node(1)->GetEntry(0).m_key));  // the leaf merges, and this separator goes with it
  EXPECT_EQ(Tree(), "([1 2] 10 [10 21])");
}

TEST_F(Deletion, ASeparatorMayBeTheKeyAndGoesWithAMerge) {
  Build("([1 2] 10 [10 11] 20 [20 21])");
  EXPECT_TRUE(map.Delete(Node(1)->GetEntry(0).m_key));
  EXPECT_EQ(Tree(), "([1 2 11] 20 [20 21])");
  EXPECT_EQ(TreeFaults(), "");
}

class ProductionDeletion : public MapFixture<FieldIdToVectorInsertionsMap> {
 protected:
  // The tree after a deletion; every row's tree is a root over leaves.
  std::string AfterDeleting(const std::string& tree, std::uint64_t n) {
    Hosted<FieldIdToVectorInsertionsMap> other(host, "other");
    TreeBuilder<FieldIdToVectorInsertionsMap>::Build(*other, tree);
    EXPECT_TRUE(other->Delete(Key(n)));
    other->Validate();
    EXPECT_EQ(CheckTree(*other), "");
    return TreeText(*other);
  }
};

TEST_F(ProductionDeletion, ALeafOf50BorrowsFromTheRightOnATieOf51) {
  EXPECT_EQ(AfterDeleting("([1..51] 100 [100..149] 200 [200..250])", 149),
            "([1..51] 100 [100..148 200] 201 [201..250])");
}

TEST_F(ProductionDeletion, ALeafOf50BorrowsFromALeftOneOf52) {
  EXPECT_EQ(AfterDeleting("([1..52] 100 [100..149] 200 [200..250])", 149),
            "([1..51] 52 [52 100..148] 200 [200..250])");
}

TEST_F(ProductionDeletion, LeavesOf50Merge) {
  EXPECT_EQ(AfterDeleting("([1..50] 100 [100..149] 200 [200..249])", 149),
            "([1..50 100..148] 200 [200..249])");
  EXPECT_EQ(AfterDeleting("([1..50] 100 [100..149] 200 [200..249])", 50),
            "([1..49 100..149] 200 [200..249])");
}

TEST_F(ProductionDeletion, ALenderOf51Gives1) {
  EXPECT_EQ(AfterDeleting("([1..50] 100 [100..150])", 50), "([1..49 100] 101 [101..150])");
  EXPECT_EQ(AfterDeleting("([1..51] 100 [100..149])", 100), "([1..50] 51 [51 101..149])");
}

TEST_F(ProductionDeletion, ALenderOf60Gives5) {
  EXPECT_EQ(AfterDeleting("([1..50] 100 [100..159])", 50), "([1..49 100..104] 105 [105..159])");
  EXPECT_EQ(AfterDeleting("([1..60] 100 [100..149])", 100), "([1..55] 56 [56..60 101..149])");
}

TEST_F(ProductionDeletion, ALenderOf100Gives25) {
  EXPECT_EQ(AfterDeleting("([1..50] 200 [200..299])", 50), "([1..49 200..224] 225 [225..299])");
  EXPECT_EQ(AfterDeleting("([1..100] 200 [200..249])", 200), "([1..75] 76 [76..100 201..249])");
}

TEST_F(ProductionDeletion, InternalNodesOf50BorrowAndMerge) {
  // A root over nodes with 51 leaves of 50 entries each, 200 numbers apart; the second node may have more.
  const auto node = [](int first, int leaves) {
    std::string text = "(";
    for (int i = 0; i < leaves; ++i) {
      const int from = first + 200 * i;
      if (i > 0) text += " " + std::to_string(from) + " ";
      text += "[" + std::to_string(from) + ".." + std::to_string(from + 49) + "]";
    }
    return text + ")";
  };
  Build("(" + node(1000, 51) + " 100000 " + node(100000, 52) + ")");
  EXPECT_TRUE(map.Delete(Key(1000)));
  EXPECT_EQ(Node(2)->m_numKeyEntrys, 50);
  EXPECT_EQ(Node(3)->m_numKeyEntrys, 50);
  EXPECT_EQ(Node(1)->GetEntry(0).m_key, Key(100200));
  EXPECT_EQ(TreeFaults(), "");
  EXPECT_TRUE(map.Delete(Key(100249)));  // the first leaf of the right node: now both nodes are at 50
  EXPECT_EQ(map.m_height, 1);
  EXPECT_EQ(Node(2)->m_numKeyEntrys, 100);
  EXPECT_TRUE(host.IsDeleted("node1"));
  EXPECT_TRUE(host.IsDeleted("node3"));
  EXPECT_EQ(TreeFaults(), "");
}

}  // namespace
}  // namespace vemo::test
