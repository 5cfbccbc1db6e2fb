// Broken invariants stop the process with the text of the check that saw them. Each row damages a tree in the
// child process in which it dies; the texts name the production capacity at any capacity.
#include <utility>

#include "tests/module/map_fixture.h"
#include "tests/support/small_map.h"
#include "vxUtils/ByteForms.h"

namespace vemo::test {
namespace {

class Assertion : public MapFixture<SmallMap> {
 protected:
  // The deletion step with everything spelt out; what it hands to its parent is not looked at.
  bool DeleteAt(ssize_t height, void* node, void* left, void* right, SmallMapInternalNode* leftAnchor,
                SmallMapInternalNode* rightAnchor, SmallMapInternalNode* parent, std::uint64_t n) {
    void* next = nullptr;
    return map.RecursiveDelete(height, node, left, right, leftAnchor, rightAnchor, parent, next, Key(n));
  }
  // A write look-up that creates.
  void Create(std::uint64_t n) {
    SmallMap::wFindRet ret;
    map.wFind(ret, Key(n), true);
  }
  void Clear(prefbase& reference) {
    reference.m_oid = OID();
    reference.m_ptr = ptr<IPersistable>();
  }
};

constexpr const char* kTwoLeaves = "([1 2 3 4] 10 [10 11 12 13])";
constexpr const char* kTwoParents = "(([1 2] 3 [3 4] 5 [5 6]) 10 ([10 11] 12 [12 13] 14 [14 15]))";
constexpr const char* kLeafCount = "0 <= nk && nk <= 100";
constexpr const char* kInternalCount = "1 <= nk && nk <= 100";

TEST_F(Assertion, SearchesWantALeafWithASoundCount) {
  Build(kTwoLeaves);
  EXPECT_ASSERTION(map.SearchLeaf(Key(1), nullptr), "leaf");
  EXPECT_ASSERTION(map.LowerBoundInLeaf(Key(1), nullptr), "leaf");
  EXPECT_ASSERTION(map.UpperBoundInLeaf(Key(1), nullptr), "leaf");
  for (const ssize_t count : {-1, 5}) {
    const auto damage = [&] { Leaf(1)->m_numKeyEntrys = count; };
    EXPECT_ASSERTION((damage(), map.SearchLeaf(Key(1), Leaf(1))), kLeafCount);
    EXPECT_ASSERTION((damage(), map.LowerBoundInLeaf(Key(1), Leaf(1))), kLeafCount);
    EXPECT_ASSERTION((damage(), map.UpperBoundInLeaf(Key(1), Leaf(1))), kLeafCount);
    EXPECT_ASSERTION((damage(), map.find(Key(1))), kLeafCount);
    EXPECT_ASSERTION((damage(), Create(1)), kLeafCount);
    EXPECT_ASSERTION((damage(), map.Delete(Key(1))), kLeafCount);
    EXPECT_ASSERTION((damage(), map.Validate()), kLeafCount);
    EXPECT_ASSERTION((damage(), ToText(map)), kLeafCount);
  }
  for (const ssize_t count : {0, 5}) {
    const auto damage = [&] { Node(1)->m_numKeyEntrys = count; };
    EXPECT_ASSERTION((damage(), Node(1)->FindChildGivenKey(Key(1))), kInternalCount);
    EXPECT_ASSERTION((damage(), map.rFind(Key(1))), kInternalCount);
    EXPECT_ASSERTION((damage(), map.Validate()), kInternalCount);
    EXPECT_ASSERTION((damage(), map.GetNumNodes()), kInternalCount);
    EXPECT_ASSERTION((damage(), ToText(map)), kInternalCount);
  }
}

TEST_F(Assertion, DescentsWantHeightAndReferencesToAgree) {
  Build(kTwoLeaves);
  EXPECT_ASSERTION((Clear(map.m_root), map.find(Key(1))), "m_height == -1");
  EXPECT_ASSERTION((Clear(Node(1)->m_ptr), map.find(Key(1))), "node");
  EXPECT_ASSERTION((Clear(map.m_lastLeaf), map.end()), "m_lastLeaf");
  Hosted<SmallMap> leaf(host, "leaf");
  TreeBuilder<SmallMap>::Build(*leaf, "[1]");
  EXPECT_ASSERTION((leaf->m_height = -1, leaf->find(Key(1))), "m_height >= 0");
  EXPECT_ASSERTION((leaf->m_height = -1, leaf->Insert(Key(1), MakePayload(1), false)), "!m_root");
  EXPECT_ASSERTION((leaf->m_height = -2, leaf->Insert(Key(1), MakePayload(1), false)), "m_height >= 0");
  EXPECT_ASSERTION((Clear(leaf->m_root), leaf->Insert(Key(1), MakePayload(1), false)), "m_root");
}

TEST_F(Assertion, InsertionStepsWantTheirNodes) {
  Build(kTwoLeaves);
  SmallMap::wFindRet ret;
  SmallMapInternalKeyEntry split;
  EXPECT_ASSERTION(map.wRecursiveFind(ret, Node(1), -1, Key(1), split, true), "height >= 0");
  EXPECT_ASSERTION(map.wRecursiveFind(ret, nullptr, 1, Key(1), split, true), "left");
  EXPECT_ASSERTION(map.wFindInLeaf(ret, nullptr, Key(1), true), "left");
  EXPECT_ASSERTION((Clear(Node(1)->m_ptr), Create(1)), "childLeft");
  EXPECT_ASSERTION(map.InsertIntoInternalNode(nullptr, split, split), "left");
  split.m_key = Key(10);
  EXPECT_ASSERTION(map.InsertIntoInternalNode(Node(1), split, split), "c != 0");
  EXPECT_ASSERTION((Node(1)->m_numKeyEntrys = 0, map.InsertIntoInternalNode(Node(1), split, split)),
                   kInternalCount);
}

TEST_F(Assertion, SplitsWantASoundChainOfLeaves) {
  Build(kTwoLeaves);
  EXPECT_ASSERTION((Clear(Leaf(2)->m_prev), Create(5)), "next->m_prev == left");
  EXPECT_ASSERTION((map.m_lastLeaf = Leaf(1), Create(14)), "m_lastLeaf == left");
}

TEST_F(Assertion, DeletionStepsWantNeighboursWithAnchors) {
  Build(kTwoLeaves);
  EXPECT_ASSERTION(DeleteAt(-1, Leaf(1), nullptr, nullptr, nullptr, nullptr, nullptr, 1), "height >= 0");
  EXPECT_ASSERTION(DeleteAt(0, nullptr, nullptr, nullptr, nullptr, nullptr, nullptr, 1), "thisNode");
  EXPECT_ASSERTION(DeleteAt(0, Leaf(2), Leaf(1), nullptr, nullptr, nullptr, Node(1), 10),
                   "(lNode == nullptr) == (lAnchor == nullptr)");
  EXPECT_ASSERTION(DeleteAt(0, Leaf(1), nullptr, Leaf(2), nullptr, nullptr, Node(1), 1),
                   "(rNode == nullptr) == (rAnchor == nullptr)");
}

TEST_F(Assertion, DeletionInALeafWantsItsParent) {
  Build("([1 2] 10 [10 11])");
  EXPECT_ASSERTION(DeleteAt(0, Leaf(1), nullptr, nullptr, nullptr, nullptr, nullptr, 1), "parent");
  EXPECT_ASSERTION(DeleteAt(0, Leaf(1), nullptr, nullptr, nullptr, nullptr, Node(1), 1), "parent == rAnchor");
  Hosted<SmallMap> leaf(host, "leaf");
  TreeBuilder<SmallMap>::Build(*leaf, "[1]");
  void* next = nullptr;
  EXPECT_ASSERTION(
      leaf->RecursiveDelete(0, leaf->m_root.Get(), nullptr, nullptr, nullptr, nullptr, Node(1), next, Key(1)),
      "!parent");
  Hosted<SmallMap> underfull(host, "underfull");
  TreeBuilder<SmallMap>::Build(*underfull, "([1 2 3] 10 [10])");
  EXPECT_ASSERTION(underfull->Delete(Key(10)), "leaf->m_numKeyEntrys > 0");
}

TEST_F(Assertion, DeletionBelowAnInternalNodeWantsSoundChildren) {
  Build(kTwoParents);
  EXPECT_ASSERTION((Clear(Node(2)->m_ptr), map.Delete(Key(1))), "nextNode");
  EXPECT_ASSERTION((Node(2)->GetEntry(0).m_ptr = Node(2)->m_ptr, map.Delete(Key(3))),
                   "iThisNode->m_ptr.Get() != nextNode");
  EXPECT_ASSERTION((Node(2)->m_numKeyEntrys = 0, map.Delete(Key(10))), "ilNode->m_numKeyEntrys > 0");
}

TEST_F(Assertion, DeletionInAnInternalNodeWantsItsPlaceInTheTree) {
  Build(kTwoParents);
  // Node 2 as if it were its own left anchor: its leftmost leaf would merge away to the left.
  EXPECT_ASSERTION(DeleteAt(1, Node(3), Node(2), nullptr, Node(3), nullptr, nullptr, 10), "deletePos != -1");
  EXPECT_ASSERTION(DeleteAt(1, Node(2), nullptr, nullptr, nullptr, nullptr, nullptr, 3),
                   "height == m_height");
  EXPECT_ASSERTION((map.m_height = 1, DeleteAt(1, Node(2), nullptr, nullptr, nullptr, nullptr, Node(1), 3)),
                   "height < m_height");
  EXPECT_ASSERTION((map.m_height = 1, DeleteAt(1, Node(2), nullptr, nullptr, nullptr, nullptr, nullptr, 3)),
                   "m_root.Get() == thisNode");
  EXPECT_ASSERTION(DeleteAt(1, Node(2), nullptr, nullptr, nullptr, nullptr, Node(1), 3), "parent == rAnchor");
}

TEST_F(Assertion, LeafMergesWantTwoLinkableLeavesThatFitIntoOne) {
  Build("([1 2] 10 [10 11] 20 [20 21])");
  EXPECT_ASSERTION(map.MergeLeafRightToLeft(nullptr, Leaf(2)), "left");
  EXPECT_ASSERTION(map.MergeLeafRightToLeft(Leaf(1), nullptr), "right");
  SmallMapLeafNode withoutId;
  EXPECT_ASSERTION(map.MergeLeafRightToLeft(Leaf(1), &withoutId), "left->m_next = right");
  EXPECT_ASSERTION(map.MergeLeafRightToLeft(&withoutId, Leaf(2)), "right->m_prev = left");
  EXPECT_ASSERTION((Leaf(1)->m_numKeyEntrys = 5, map.MergeLeafRightToLeft(Leaf(1), Leaf(2))),
                   "0 <= nL && nL <= 100");
  EXPECT_ASSERTION((Leaf(2)->m_numKeyEntrys = -1, map.MergeLeafRightToLeft(Leaf(1), Leaf(2))),
                   "0 <= nR && nR <= 100");
  EXPECT_ASSERTION((Leaf(1)->m_numKeyEntrys = 3, map.MergeLeafRightToLeft(Leaf(1), Leaf(2))),
                   "50 <= nTot && nTot <= 100");
  EXPECT_ASSERTION(
      (Leaf(1)->m_numKeyEntrys = 1, Leaf(2)->m_numKeyEntrys = 0, map.MergeLeafRightToLeft(Leaf(1), Leaf(2))),
      "50 <= nTot && nTot <= 100");
  EXPECT_ASSERTION((map.m_lastLeaf = Leaf(2), map.MergeLeafRightToLeft(Leaf(1), Leaf(2))),
                   "m_lastLeaf != right");
  EXPECT_ASSERTION((Leaf(3)->m_prev = Leaf(1), map.MergeLeafRightToLeft(Leaf(1), Leaf(2))),
                   "right->m_next->m_prev == right");
  EXPECT_ASSERTION((map.m_lastLeaf = Leaf(1), map.MergeLeafRightToLeft(Leaf(2), Leaf(3))),
                   "m_lastLeaf == right");
}

TEST_F(Assertion, InternalMergesWantTwoNodesThatFitIntoOne) {
  Build(kTwoParents);
  const auto merge = [&] { map.MergeInternalRightToLeft(Node(2), Node(3), Node(1)); };
  EXPECT_ASSERTION(map.MergeInternalRightToLeft(nullptr, Node(3), Node(1)), "left");
  EXPECT_ASSERTION(map.MergeInternalRightToLeft(Node(2), nullptr, Node(1)), "right");
  EXPECT_ASSERTION(map.MergeInternalRightToLeft(Node(2), Node(3), nullptr), "anchor");
  EXPECT_ASSERTION((Node(2)->m_numKeyEntrys = 4, merge()), "0 <= nL && nL < 100");
  EXPECT_ASSERTION((Node(3)->m_numKeyEntrys = 0, merge()), "1 <= nR && nR < 100");
  EXPECT_ASSERTION(merge(), "50 <= nTot && nTot <= 100");
  const auto shorten = [&] { Node(2)->m_numKeyEntrys = 1; };
  EXPECT_ASSERTION((shorten(), Node(1)->GetEntry(0).m_key = Key(13), merge()),
                   "0 <= ai && ai < anchor->m_numKeyEntrys");
  EXPECT_ASSERTION((shorten(), Node(1)->GetEntry(0).m_key = Key(3), merge()),
                   "CompareKeys(left->GetEntry(nL-1).m_key, anchorKey) < 0");
  EXPECT_ASSERTION((shorten(), Node(1)->GetEntry(0).m_key = Key(12), merge()),
                   "CompareKeys(anchorKey, right->GetEntry(0).m_key) < 0");
}

TEST_F(Assertion, LeafBalancesWantAnUnderfullAndALendingLeaf) {
  Build("([1 2] 10 [10 11 12])");
  EXPECT_ASSERTION(map.BalanceLeafRightToLeft(nullptr, Leaf(2), Node(1)), "left");
  EXPECT_ASSERTION(map.BalanceLeafRightToLeft(Leaf(1), nullptr, Node(1)), "right");
  EXPECT_ASSERTION(map.BalanceLeafRightToLeft(Leaf(1), Leaf(2), nullptr), "anchor");
  EXPECT_ASSERTION(map.BalanceLeafLeftToRight(nullptr, Leaf(2), Node(1)), "left");
  EXPECT_ASSERTION(map.BalanceLeafLeftToRight(Leaf(1), nullptr, Node(1)), "right");
  EXPECT_ASSERTION(map.BalanceLeafLeftToRight(Leaf(1), Leaf(2), nullptr), "anchor");
  SmallMapLeafNode withoutId;
  EXPECT_ASSERTION(map.BalanceLeafRightToLeft(Leaf(1), &withoutId, Node(1)), "left->m_next = right");
  EXPECT_ASSERTION(map.BalanceLeafLeftToRight(&withoutId, Leaf(2), Node(1)), "right->m_prev = left");

  const auto counts = [&](ssize_t left, ssize_t right) {
    Leaf(1)->m_numKeyEntrys = left;
    Leaf(2)->m_numKeyEntrys = right;
  };
  const auto rightToLeft = [&] { map.BalanceLeafRightToLeft(Leaf(1), Leaf(2), Node(1)); };
  EXPECT_ASSERTION((counts(2, 3), rightToLeft()), "0 <= nL && nL < 50");
  EXPECT_ASSERTION((counts(1, 2), rightToLeft()), "50 < nR && nR <= 100");
  EXPECT_ASSERTION((counts(0, 3), rightToLeft()), "50 <= newNumLeft && newNumLeft <= 100");
  const auto leftToRight = [&] { map.BalanceLeafLeftToRight(Leaf(1), Leaf(2), Node(1)); };
  EXPECT_ASSERTION((counts(2, 1), leftToRight()), "50 < nL && nL <= 100");
  EXPECT_ASSERTION((counts(3, 2), leftToRight()), "0 <= nR && nR < 50");
  EXPECT_ASSERTION((counts(3, 0), leftToRight()), "50 <= newNumRight && newNumRight <= 100");
}

TEST_F(Assertion, InternalBalancesWantAnUnderfullAndALendingNode) {
  Build("(([1 2] 3 [3 4] 5 [5 6] 7 [7 8]) 10 ([10 11] 12 [12 13] 14 [14 15] 16 [16 17]))");
  EXPECT_ASSERTION(map.BalanceInternalRightToLeft(nullptr, Node(3), Node(1)), "left");
  EXPECT_ASSERTION(map.BalanceInternalRightToLeft(Node(2), nullptr, Node(1)), "right");
  EXPECT_ASSERTION(map.BalanceInternalRightToLeft(Node(2), Node(3), nullptr), "anchor");
  EXPECT_ASSERTION(map.BalanceInternalLeftToRight(nullptr, Node(3), Node(1)), "left");
  EXPECT_ASSERTION(map.BalanceInternalLeftToRight(Node(2), nullptr, Node(1)), "right");
  EXPECT_ASSERTION(map.BalanceInternalLeftToRight(Node(2), Node(3), nullptr), "anchor");

  const auto counts = [&](ssize_t left, ssize_t right) {
    Node(2)->m_numKeyEntrys = left;
    Node(3)->m_numKeyEntrys = right;
  };
  const auto separator = [&](std::uint64_t n) { Node(1)->GetEntry(0).m_key = Key(n); };
  const auto rightToLeft = [&] { map.BalanceInternalRightToLeft(Node(2), Node(3), Node(1)); };
  EXPECT_ASSERTION((counts(2, 3), rightToLeft()), "0 <= nL && nL < 50");
  EXPECT_ASSERTION((counts(1, 2), rightToLeft()), "50 < nR && nR <= 100");
  EXPECT_ASSERTION((counts(0, 3), rightToLeft()), "50 <= newNumLeft && newNumLeft <= 100");
  EXPECT_ASSERTION((counts(1, 3), separator(13), rightToLeft()), "0 <= ai && ai < anchor->m_numKeyEntrys");
  EXPECT_ASSERTION((counts(1, 3), separator(3), rightToLeft()),
                   "CompareKeys(left->GetEntry(nL-1).m_key, anchorKey) < 0");
  EXPECT_ASSERTION((counts(1, 3), separator(12), rightToLeft()),
                   "CompareKeys(anchorKey, right->GetEntry(0).m_key) < 0");
  const auto leftToRight = [&] { map.BalanceInternalLeftToRight(Node(2), Node(3), Node(1)); };
  EXPECT_ASSERTION((counts(2, 1), leftToRight()), "50 < nL && nL <= 100");
  EXPECT_ASSERTION((counts(3, 0), leftToRight()), "1 <= nR && nR < 50");
  EXPECT_ASSERTION((counts(3, 2), leftToRight()), "1 <= nR && nR < 50");
  EXPECT_ASSERTION((counts(3, 1), separator(13), leftToRight()), "0 <= ai && ai < anchor->m_numKeyEntrys");
  EXPECT_ASSERTION((counts(3, 1), separator(7), leftToRight()),
                   "CompareKeys(left->GetEntry(nL-1).m_key, anchorKey) < 0");
  EXPECT_ASSERTION((counts(3, 1), separator(12), leftToRight()),
                   "CompareKeys(anchorKey, right->GetEntry(0).m_key) < 0");
}

// An empty left node may borrow: unlike the other direction, which needs a key of the right node to find the
// separator.
TEST_F(Assertion, AnEmptyLeftInternalNodeMayBorrow) {
  Build("(([1 2]) 10 ([10 11] 12 [12 13] 14 [14 15] 16 [16 17] 18 [18 19]))");
  map.BalanceInternalRightToLeft(Node(2), Node(3), Node(1));
  EXPECT_EQ(Tree(), "(([1 2] 10 [10 11] 12 [12 13]) 14 ([14 15] 16 [16 17] 18 [18 19]))");
}

TEST_F(Assertion, AReplacedSeparatorStaysBetweenItsNeighbours) {
  Build("([1 2] 10 [10 11] 20 [20 21] 30 [30 31])");
  EXPECT_ASSERTION(map.ReplaceKeyInAnchor(nullptr, Key(1), Key(2)), "node");
  EXPECT_ASSERTION(map.ReplaceKeyInAnchor(Node(1), Key(1), Key(1)), "CompareKeys(oldKey,newKey) != 0");
  EXPECT_ASSERTION(map.ReplaceKeyInAnchor(Node(1), Key(1), Key(2)), "0 <= i && i < node->m_numKeyEntrys");
  EXPECT_ASSERTION(map.ReplaceKeyInAnchor(Node(1), Key(21), Key(10)),
                   "CompareKeys(node->GetEntry(i-1).m_key, newKey) < 0");
  EXPECT_ASSERTION(map.ReplaceKeyInAnchor(Node(1), Key(21), Key(30)),
                   "CompareKeys(node->GetEntry(i+1).m_key, newKey) > 0");
  map.ReplaceKeyInAnchor(Node(1), Key(21), Key(22));
  EXPECT_EQ(Node(1)->GetEntry(1).m_key, Key(22));
}

TEST_F(Assertion, WholeMapOperationsWantTheirNodes) {
  Build(kTwoLeaves);
  EXPECT_ASSERTION((Clear(Node(1)->m_ptr), map.GetNumNodes()), "node");
  EXPECT_ASSERTION((Clear(Node(1)->m_ptr), map.Validate()), "node");
  EXPECT_ASSERTION((Clear(Node(1)->m_ptr), ToText(map)), "node");
  EXPECT_ASSERTION(map.ValidateNode(-1, Leaf(1), true, nullptr, nullptr), "height >= 0");
}

TEST_F(Assertion, EqualityWantsSizesThatAreTrue) {
  Build("[1 2]");
  Hosted<SmallMap> other(host, "other");
  TreeBuilder<SmallMap>::Build(*other, "[1]");
  EXPECT_ASSERTION((other->m_size = 2, static_cast<void>(map == *other)), "j != rhs.end()");
  EXPECT_ASSERTION((map.m_size = 1, static_cast<void>(*other == map)), "j == rhs.end()");
}

}  // namespace
}  // namespace vemo::test
