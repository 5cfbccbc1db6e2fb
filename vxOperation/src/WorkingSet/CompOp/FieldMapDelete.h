// Deletion from a field map: bodies of the functions that FieldMap.h declares.
//
// A node other than the root that falls under half full borrows from the fuller neighbour that can lend (more than half
// full; the right one on a tie), else it merges with a sibling (the left one if there is one). The anchor of two neighbours
// is the lowest internal node above both; one of its separators divides them:
//
//            [ .. K .. ]   <- anchor of A and B, which are cousins: borrowing replaces K here,
//            /         \      in neither parent
//      [ .. P ]       [ Q .. ]
//       /    \         /    \.
//          [ A ]    [ B ]
//
//   borrow (leaf):      [ a a a ] K=b0 [ b0 b1 b2 b3 b4 ]   =>   [ a a a b0 ] K=b1 [ b1 b2 b3 b4 ]
//   borrow (internal):  [ a a ] K [ b0 b1 b2 ]              =>   [ a a K ] b0 [ b1 b2 ]      (a rotation through K)
//   merge (leaf):       [ a a ] K [ b b ]                   =>   [ a a b b ]                  (K goes with B's entry)
//   merge (internal):   [ a a ] K [ b b ]                   =>   [ a a K b b ]                (K is copied down)
//   root collapse:      root [ ] with one child             =>   that child is the root, one level less
//
// In the names, RightToLeft means that entries travel from the right node into the left one.
#pragma once

#include <algorithm>

#include "vxOperation/src/WorkingSet/CompOp/FieldMap.h"
#include "platform/assertion.h"

namespace vemo {

template <class Traits>
bool TFieldMap<Traits>::Delete(const FieldId& key) {
  if (m_height == -1) return false;
  MutationScope scope(this->GetThisAsFinalClass());
  void* nextNode = nullptr;
  const bool deleted = RecursiveDelete(m_height, m_root.GetAs(TableAt(m_height)), nullptr, nullptr, nullptr, nullptr,
                                       nullptr, nextNode, key);
  scope.Complete();
  return deleted;
}

template <class Traits>
typename TFieldMap<Traits>::iterator TFieldMap<Traits>::erase(const_iterator position) {
  MutationScope scope(this->GetThisAsFinalClass());
  const FieldId key = position->first;  // a copy: the entry is about to go
  Delete(key);
  const const_iterator following = lower_bound(key);
  scope.Complete();
  return iterator(static_cast<const IteratorPolicy&>(following));
}

template <class Traits>
typename TFieldMap<Traits>::iterator TFieldMap<Traits>::erase(const_iterator first, const_iterator last) {
  MutationScope scope(this->GetThisAsFinalClass());
  if (last == cend()) {
    while (first != cend()) first = erase(first);
  } else {
    const FieldId bound = last->first;
    while (first->first < bound) first = erase(first);
  }
  scope.Complete();
  return iterator(static_cast<const IteratorPolicy&>(first));
}

template <class Traits>
bool TFieldMap<Traits>::RecursiveDelete(ssize_t height, void* thisNode, void* lNode, void* rNode, InternalNode* lAnchor,
                                        InternalNode* rAnchor, InternalNode* parent, void*& nextNode,
                                        const FieldId& key) {
  VEMO_ASSERT(height >= 0);
  VEMO_ASSERT(thisNode);
  VEMO_ASSERT((lNode == nullptr) == (lAnchor == nullptr));
  VEMO_ASSERT((rNode == nullptr) == (rAnchor == nullptr));
  if (height == 0) {
    return DeleteInLeaf(AsLeafNode(thisNode), AsLeafNode(lNode), AsLeafNode(rNode), lAnchor, rAnchor, parent, nextNode,
                        key);
  }
  return DeleteBelow(height, AsInternalNode(thisNode), AsInternalNode(lNode), AsInternalNode(rNode), lAnchor, rAnchor,
                     parent, nextNode, key);
}

template <class Traits>
bool TFieldMap<Traits>::DeleteInLeaf(LeafNode* leaf, LeafNode* lLeaf, LeafNode* rLeaf, InternalNode* lAnchor,
                                     InternalNode* rAnchor, InternalNode* parent, void*& nextNode, const FieldId& key) {
  const ssize_t nk = leaf->m_numKeyEntrys;
  VEMO_ASSERT_TEXT(0 <= nk && nk <= kCapacity, "0 <= nk && nk <= 100");
  const ssize_t deletePos = SearchLeaf(key, leaf);
  if (deletePos == -1) return false;
  VEMO_ASSERT(0 <= deletePos && deletePos < leaf->m_numKeyEntrys);
  DestructLeafEntry(leaf, deletePos);
  ShiftLeafEntries(leaf, deletePos + 1, deletePos, nk - deletePos - 1);
  --leaf->m_numKeyEntrys;
  --m_size;
  leaf->MarkAsDirtyWithoutTrace();
  this->MarkAsDirtyWithoutTrace();
  if (m_height == 0) VEMO_ASSERT(!parent);
  if (m_height >= 1 && leaf->m_numKeyEntrys < kHalf) {
    RepairLeaf(leaf, lLeaf, rLeaf, lAnchor, rAnchor, parent, nextNode);
  } else {
    nextNode = nullptr;
  }
  return true;
}

template <class Traits>
void TFieldMap<Traits>::RepairLeaf(LeafNode* leaf, LeafNode* lLeaf, LeafNode* rLeaf, InternalNode* lAnchor,
                                   InternalNode* rAnchor, InternalNode* parent, void*& nextNode) {
  VEMO_ASSERT(parent);
  const ssize_t nL = lLeaf != nullptr ? lLeaf->m_numKeyEntrys : 0;
  const ssize_t nR = rLeaf != nullptr ? rLeaf->m_numKeyEntrys : 0;
  if (std::max(nL, nR) > kHalf) {
    if (nL > nR) {
      VEMO_ASSERT(leaf->m_numKeyEntrys > 0);
      BalanceLeafLeftToRight(lLeaf, leaf, lAnchor);
    } else {
      BalanceLeafRightToLeft(leaf, rLeaf, rAnchor);
    }
    nextNode = nullptr;
  } else if (parent == lAnchor) {
    MergeLeafRightToLeft(lLeaf, leaf);
    nextNode = leaf;
  } else {
    VEMO_ASSERT(parent == rAnchor);
    MergeLeafRightToLeft(leaf, rLeaf);
    nextNode = rLeaf;
  }
}

template <class Traits>
bool TFieldMap<Traits>::DeleteBelow(ssize_t height, InternalNode* iThisNode, InternalNode* ilNode, InternalNode* irNode,
                                    InternalNode* lAnchor, InternalNode* rAnchor, InternalNode* parent, void*& nextNode,
                                    const FieldId& key) {
  const IPersistable::FnTable* const childTable = TableAt(height - 1);
  const auto [child, i] = iThisNode->FindChildGivenKey2(key, childTable);
  VEMO_ASSERT_TEXT(-1 <= i && i < iThisNode->m_numKeyEntrys, "-1 <= r.second && r.second < iThisNode->m_numKeyEntrys");
  VEMO_ASSERT_TEXT(child, "nextNode");

  void* childLeft = nullptr;
  InternalNode* childLAnchor = iThisNode;
  if (i >= 0) {
    // By id, so that the check does not load the leftmost child.
    VEMO_ASSERT_TEXT(!(iThisNode->m_ptr.m_oid == iThisNode->GetEntry(i).m_ptr.m_oid),
                     "iThisNode->m_ptr.Get() != nextNode");
    VEMO_ASSERT_TEXT(iThisNode->GetEntry(i).m_ptr.Get() == child,
                     "iThisNode->GetEntry(r.second).m_ptr.Get() == nextNode");
    childLeft = iThisNode->ChildReference(i - 1).GetAs(childTable);
  } else {
    VEMO_ASSERT_TEXT(iThisNode->m_ptr.Get() == child, "iThisNode->m_ptr.Get() == nextNode");
    if (ilNode != nullptr) {
      VEMO_ASSERT(ilNode->m_numKeyEntrys > 0);
      childLeft = ilNode->ChildReference(ilNode->m_numKeyEntrys - 1).GetAs(childTable);
    } else {
      VEMO_ASSERT(!lAnchor);
    }
    childLAnchor = lAnchor;
  }

  void* childRight = nullptr;
  InternalNode* childRAnchor = iThisNode;
  if (i < iThisNode->m_numKeyEntrys - 1) {
    childRight = iThisNode->ChildReference(i + 1).GetAs(childTable);
  } else {
    if (irNode != nullptr) {
      childRight = irNode->m_ptr.GetAs(childTable);
    } else {
      VEMO_ASSERT(!rAnchor);
    }
    childRAnchor = rAnchor;
  }

  void* childNext = nullptr;
  if (!RecursiveDelete(height - 1, child, childLeft, childRight, childLAnchor, childRAnchor, iThisNode, childNext, key)) {
    return false;
  }
  if (childNext == nullptr) return true;

  const ssize_t deletePos = childNext == child ? i : i + 1;
  VEMO_ASSERT(deletePos != -1);
  VEMO_ASSERT(0 <= deletePos && deletePos < iThisNode->m_numKeyEntrys);
  DestructInternalEntry(iThisNode, deletePos);
  ShiftInternalEntries(iThisNode, deletePos + 1, deletePos, iThisNode->m_numKeyEntrys - deletePos - 1);
  --iThisNode->m_numKeyEntrys;
  iThisNode->MarkAsDirtyWithoutTrace();
  if (parent != nullptr) {
    VEMO_ASSERT(height < m_height);
    if (iThisNode->m_numKeyEntrys < kHalf) {
      RepairInternalNode(iThisNode, ilNode, irNode, lAnchor, rAnchor, parent, nextNode);
    }
  } else {
    VEMO_ASSERT(height == m_height);
    VEMO_ASSERT_TEXT(m_root.Get() == iThisNode, "m_root.Get() == thisNode");
    if (iThisNode->m_numKeyEntrys == 0) CollapseRoot(iThisNode);
  }
  return true;
}

template <class Traits>
void TFieldMap<Traits>::RepairInternalNode(InternalNode* node, InternalNode* lNode, InternalNode* rNode,
                                           InternalNode* lAnchor, InternalNode* rAnchor, InternalNode* parent,
                                           void*& nextNode) {
  const ssize_t nL = lNode != nullptr ? lNode->m_numKeyEntrys : 0;
  const ssize_t nR = rNode != nullptr ? rNode->m_numKeyEntrys : 0;
  if (std::max(nL, nR) > kHalf) {
    if (nL > nR) {
      BalanceInternalLeftToRight(lNode, node, lAnchor);
    } else {
      BalanceInternalRightToLeft(node, rNode, rAnchor);
    }
    nextNode = nullptr;
  } else if (parent == lAnchor) {
    MergeInternalRightToLeft(lNode, node, lAnchor);
    nextNode = node;
  } else {
    VEMO_ASSERT(parent == rAnchor);
    MergeInternalRightToLeft(node, rNode, rAnchor);
    nextNode = rNode;
  }
}

template <class Traits>
void TFieldMap<Traits>::CollapseRoot(InternalNode* root) {
  m_root = root->m_ptr;
  AsyncPermanentlyDeleteObject(root);
  --m_height;
  this->MarkAsDirtyWithoutTrace();
}

// The two checks are assignments and part of the operation, so they run in every configuration.
template <class Traits>
void TFieldMap<Traits>::LinkNeighbours(LeafNode* left, LeafNode* right) {
  VEMO_VERIFY_TEXT((left->m_next = right), "left->m_next = right");
  VEMO_VERIFY_TEXT((right->m_prev = left), "right->m_prev = left");
}

template <class Traits>
void TFieldMap<Traits>::MergeLeafRightToLeft(LeafNode* left, LeafNode* right) {
  VEMO_ASSERT(left);
  VEMO_ASSERT(right);
  LinkNeighbours(left, right);
  const ssize_t nL = left->m_numKeyEntrys;
  const ssize_t nR = right->m_numKeyEntrys;
  VEMO_ASSERT_TEXT(0 <= nL && nL <= kCapacity, "0 <= nL && nL <= 100");
  VEMO_ASSERT_TEXT(0 <= nR && nR <= kCapacity, "0 <= nR && nR <= 100");
  const ssize_t nTot = nL + nR;
  VEMO_ASSERT_TEXT(kHalf <= nTot && nTot <= kCapacity, "50 <= nTot && nTot <= 100");
  MoveLeafEntries(right, 0, left, nL, nR);
  left->m_numKeyEntrys = nTot;
  right->m_numKeyEntrys = 0;  // with the move: a mark below may throw, and the entries have one owner (N2)
  left->m_next = right->m_next;
  left->MarkAsDirtyWithoutTrace();
  if (right->m_next) {
    VEMO_ASSERT(m_lastLeaf != right);
    VEMO_ASSERT(right->m_next->m_prev == right);
    LeafNode* next = right->m_next.Get();
    next->m_prev = left;
    next->MarkAsDirtyWithoutTrace();
  } else {
    VEMO_ASSERT(m_lastLeaf == right);
    m_lastLeaf = left;
    this->MarkAsDirtyWithoutTrace();
  }
  AsyncPermanentlyDeleteObject(right);
}

// The index of the separator between `left` and `right`, found by a key of the right subtree, with its order checked.
template <class Traits>
ssize_t TFieldMap<Traits>::AnchorIndex(InternalNode* left, InternalNode* right, InternalNode* anchor, bool checkLeft) {
  const ssize_t ai = anchor->FindChildIndexGivenKey(right->GetEntry(0).m_key);
  VEMO_ASSERT(0 <= ai && ai < anchor->m_numKeyEntrys);
  const FieldId& anchorKey = anchor->GetEntry(ai).m_key;
  if (checkLeft) {
    VEMO_ASSERT_TEXT(CompareKeys(left->GetEntry(left->m_numKeyEntrys - 1).m_key, anchorKey) < 0,
                     "CompareKeys(left->GetEntry(nL-1).m_key, anchorKey) < 0");
  }
  VEMO_ASSERT(CompareKeys(anchorKey, right->GetEntry(0).m_key) < 0);
  return ai;
}

template <class Traits>
void TFieldMap<Traits>::MergeInternalRightToLeft(InternalNode* left, InternalNode* right, InternalNode* anchor) {
  VEMO_ASSERT(left);
  VEMO_ASSERT(right);
  VEMO_ASSERT(anchor);
  const ssize_t nL = left->m_numKeyEntrys;
  VEMO_ASSERT_TEXT(0 <= nL && nL < kCapacity, "0 <= nL && nL < 100");
  const ssize_t nR = right->m_numKeyEntrys;
  VEMO_ASSERT_TEXT(1 <= nR && nR < kCapacity, "1 <= nR && nR < 100");
  const ssize_t nTot = nL + nR + 1;
  VEMO_ASSERT_TEXT(kHalf <= nTot && nTot <= kCapacity, "50 <= nTot && nTot <= 100");
  const ssize_t ai = AnchorIndex(left, right, anchor, nL >= 1);
  InternalKeyEntry* pulledDown = left->m_entrys.Slot(nL);
  Traits::CopyConstructKey(&pulledDown->m_key, anchor->GetEntry(ai).m_key);
  Relocate(&pulledDown->m_ptr, &right->m_ptr, 1);
  MoveInternalEntries(right, 0, left, nL + 1, nR);
  left->m_numKeyEntrys = nTot;
  right->m_numKeyEntrys = 0;
  left->MarkAsDirtyWithoutTrace();
  AsyncPermanentlyDeleteObject(right);
}

template <class Traits>
void TFieldMap<Traits>::BalanceLeafRightToLeft(LeafNode* left, LeafNode* right, InternalNode* anchor) {
  VEMO_ASSERT(left);
  VEMO_ASSERT(right);
  VEMO_ASSERT(anchor);
  LinkNeighbours(left, right);
  const ssize_t nL = left->m_numKeyEntrys;
  VEMO_ASSERT_TEXT(0 <= nL && nL < kHalf, "0 <= nL && nL < 50");
  const ssize_t nR = right->m_numKeyEntrys;
  VEMO_ASSERT_TEXT(kHalf < nR && nR <= kCapacity, "50 < nR && nR <= 100");
  const ssize_t newNumLeft = (nL + nR) / 2;
  VEMO_ASSERT_TEXT(kHalf <= newNumLeft && newNumLeft <= kCapacity, "50 <= newNumLeft && newNumLeft <= 100");
  const ssize_t ns = newNumLeft - nL;
  VEMO_ASSERT(ns > 0);
  const ssize_t newNumRight = nR - ns;
  VEMO_ASSERT_TEXT(kHalf <= newNumRight && newNumRight <= kCapacity, "50 <= newNumRight && newNumRight <= 100");
  MoveLeafEntries(right, 0, left, nL, ns);
  ShiftLeafEntries(right, ns, 0, newNumRight);
  left->m_numKeyEntrys = newNumLeft;
  right->m_numKeyEntrys = newNumRight;
  left->MarkAsDirtyWithoutTrace();
  right->MarkAsDirtyWithoutTrace();
  ReplaceKeyInAnchor(anchor, left->GetEntry(nL).first, right->GetEntry(0).first);
}

template <class Traits>
void TFieldMap<Traits>::BalanceLeafLeftToRight(LeafNode* left, LeafNode* right, InternalNode* anchor) {
  VEMO_ASSERT(left);
  VEMO_ASSERT(right);
  VEMO_ASSERT(anchor);
  LinkNeighbours(left, right);
  const ssize_t nL = left->m_numKeyEntrys;
  VEMO_ASSERT_TEXT(kHalf < nL && nL <= kCapacity, "50 < nL && nL <= 100");
  const ssize_t nR = right->m_numKeyEntrys;
  VEMO_ASSERT_TEXT(0 <= nR && nR < kHalf, "0 <= nR && nR < 50");
  const ssize_t newNumRight = (nL + nR) / 2;
  VEMO_ASSERT_TEXT(kHalf <= newNumRight && newNumRight <= kCapacity, "50 <= newNumRight && newNumRight <= 100");
  const ssize_t ns = newNumRight - nR;
  VEMO_ASSERT(ns > 0);
  const ssize_t newNumLeft = nL - ns;
  VEMO_ASSERT_TEXT(kHalf <= newNumLeft && newNumLeft <= kCapacity, "50 <= newNumLeft && newNumLeft <= 100");
  ShiftLeafEntries(right, 0, ns, nR);
  MoveLeafEntries(left, newNumLeft, right, 0, ns);
  left->m_numKeyEntrys = newNumLeft;
  right->m_numKeyEntrys = newNumRight;
  left->MarkAsDirtyWithoutTrace();
  right->MarkAsDirtyWithoutTrace();
  ReplaceKeyInAnchor(anchor, right->GetEntry(ns).first, right->GetEntry(0).first);
}

template <class Traits>
void TFieldMap<Traits>::BalanceInternalLeftToRight(InternalNode* left, InternalNode* right, InternalNode* anchor) {
  VEMO_ASSERT(left);
  VEMO_ASSERT(right);
  VEMO_ASSERT(anchor);
  const ssize_t nL = left->m_numKeyEntrys;
  VEMO_ASSERT_TEXT(kHalf < nL && nL <= kCapacity, "50 < nL && nL <= 100");
  const ssize_t nR = right->m_numKeyEntrys;
  VEMO_ASSERT_TEXT(1 <= nR && nR < kHalf, "1 <= nR && nR < 50");
  const ssize_t newNumRight = (nL + nR) / 2;
  VEMO_ASSERT_TEXT(kHalf <= newNumRight && newNumRight <= kCapacity, "50 <= newNumRight && newNumRight <= 100");
  const ssize_t ns = newNumRight - nR;
  VEMO_ASSERT(ns > 0);
  const ssize_t newNumLeft = nL - ns;
  VEMO_ASSERT_TEXT(kHalf <= newNumLeft && newNumLeft <= kCapacity, "50 <= newNumLeft && newNumLeft <= 100");
  FieldId* const anchorKey = &anchor->GetEntry(AnchorIndex(left, right, anchor, true)).m_key;
  ShiftInternalEntries(right, 0, ns, nR);
  InternalKeyEntry* const rotated = right->m_entrys.Slot(ns - 1);
  Traits::MoveKey(&rotated->m_key, anchorKey);
  Relocate(&rotated->m_ptr, &right->m_ptr, 1);
  MoveInternalEntries(left, newNumLeft + 1, right, 0, ns - 1);
  InternalKeyEntry* const lent = left->m_entrys.Slot(newNumLeft);
  Traits::MoveKey(anchorKey, &lent->m_key);
  Relocate(&right->m_ptr, &lent->m_ptr, 1);
  left->m_numKeyEntrys = newNumLeft;
  right->m_numKeyEntrys = newNumRight;
  anchor->MarkAsDirtyWithoutTrace();
  left->MarkAsDirtyWithoutTrace();
  right->MarkAsDirtyWithoutTrace();
}

template <class Traits>
void TFieldMap<Traits>::BalanceInternalRightToLeft(InternalNode* left, InternalNode* right, InternalNode* anchor) {
  VEMO_ASSERT(left);
  VEMO_ASSERT(right);
  VEMO_ASSERT(anchor);
  const ssize_t nL = left->m_numKeyEntrys;
  VEMO_ASSERT_TEXT(0 <= nL && nL < kHalf, "0 <= nL && nL < 50");
  const ssize_t nR = right->m_numKeyEntrys;
  VEMO_ASSERT_TEXT(kHalf < nR && nR <= kCapacity, "50 < nR && nR <= 100");
  const ssize_t newNumLeft = (nL + nR) / 2;
  VEMO_ASSERT_TEXT(kHalf <= newNumLeft && newNumLeft <= kCapacity, "50 <= newNumLeft && newNumLeft <= 100");
  const ssize_t ns = newNumLeft - nL;
  VEMO_ASSERT(ns > 0);
  const ssize_t newNumRight = nR - ns;
  VEMO_ASSERT_TEXT(kHalf <= newNumRight && newNumRight <= kCapacity, "50 <= newNumRight && newNumRight <= 100");
  FieldId* const anchorKey = &anchor->GetEntry(AnchorIndex(left, right, anchor, nL > 0)).m_key;
  InternalKeyEntry* const rotated = left->m_entrys.Slot(nL);
  Traits::MoveKey(&rotated->m_key, anchorKey);
  Relocate(&rotated->m_ptr, &right->m_ptr, 1);
  MoveInternalEntries(right, 0, left, nL + 1, ns - 1);
  InternalKeyEntry* const lent = right->m_entrys.Slot(ns - 1);
  Traits::MoveKey(anchorKey, &lent->m_key);
  Relocate(&right->m_ptr, &lent->m_ptr, 1);
  ShiftInternalEntries(right, ns, 0, newNumRight);
  left->m_numKeyEntrys = newNumLeft;
  right->m_numKeyEntrys = newNumRight;
  anchor->MarkAsDirtyWithoutTrace();
  left->MarkAsDirtyWithoutTrace();
  right->MarkAsDirtyWithoutTrace();
}

template <class Traits>
void TFieldMap<Traits>::ReplaceKeyInAnchor(InternalNode* node, const FieldId& oldKey, const FieldId& newKey) {
  VEMO_ASSERT(node);
  VEMO_ASSERT_TEXT(CompareKeys(oldKey, newKey) != 0, "CompareKeys(oldKey,newKey) != 0");
  const ssize_t i = node->FindChildIndexGivenKey(oldKey);
  VEMO_ASSERT(0 <= i && i < node->m_numKeyEntrys);
  node->GetEntry(i).m_key = newKey;
  node->MarkAsDirtyWithoutTrace();
  if (i > 0) VEMO_ASSERT_TEXT(CompareKeys(node->GetEntry(i - 1).m_key, newKey) < 0,
                              "CompareKeys(node->GetEntry(i-1).m_key, newKey) < 0");
  if (i + 1 < node->m_numKeyEntrys) VEMO_ASSERT_TEXT(CompareKeys(node->GetEntry(i + 1).m_key, newKey) > 0,
                                                     "CompareKeys(node->GetEntry(i+1).m_key, newKey) > 0");
}

}  // namespace vemo
