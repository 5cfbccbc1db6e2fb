// Insertion into a field map: bodies of the functions that FieldMap.h declares.
//
// A full leaf of 100 that gains an entry becomes 50 and 51; a full internal node becomes 50 and 50, and its median moves up:
//
//        [ .. 30 | 60 .. ]                     [ .. 30 | r0 | 60 .. ]
//               |                                     |    |
//        [ a0 .......... a99 ] + x    =>    [ a0 .. a49 ] [ r0 .. r50 ]
//
// The order of store calls is fixed: a new node is registered, linked, its holder marked dirty, and then declared reachable
// from the node that was split (or from the map), never from the parent that receives the separator.
#pragma once

#include "vxOperation/src/WorkingSet/CompOp/FieldMap.h"
#include "platform/assertion.h"

namespace vemo {

template <class Traits>
void TFieldMap<Traits>::wFind(wFindRet& ret, const FieldId& key, bool create, PayloadArgument<Payload>* argument) {
  MutationScope scope(this->GetThisAsFinalClass());
  if (m_height == -1) MakeRootLeaf();
  VEMO_ASSERT(m_height >= 0);
  VEMO_ASSERT(m_root);
  if (LeafNode* last = create ? LeafToAppendTo(key) : nullptr) {
    AppendToLeaf(ret, last, key);
  } else {
    InternalKeyEntry splitEntry;
    wFindInNode(ret, m_root.GetAs(TableAt(m_height)), m_height, key, splitEntry, create, argument);
    if (splitEntry.m_ptr) GrowRoot(splitEntry);
  }
  scope.Complete();
}

// Keys often come in ascending order. One behind all others, where the last leaf is in memory and has room, is inserted
// without the way down and the search; the changes and the calls are the same.
template <class Traits>
inline typename Traits::LeafNode* TFieldMap<Traits>::LeafToAppendTo(const FieldId& key) const noexcept {
  LeafNode* const last = AsLeafNode(m_lastLeaf.m_ptr.m_self);
  if (last == nullptr || last->m_next) return nullptr;
  const ssize_t nk = last->m_numKeyEntrys;
  return 0 < nk && nk < kCapacity && CompareKeys(key, last->GetEntry(nk - 1).first) > 0 ? last : nullptr;
}

// No entry moves, so that a payload which is to be assigned may lie in any.
template <class Traits>
void TFieldMap<Traits>::AppendToLeaf(wFindRet& ret, LeafNode* last, const FieldId& key) {
  PendingValue<FieldId> newKey(key);
  CountNewEntry(ret);
  FillSlot(ret, last, last->m_numKeyEntrys, newKey);
}

template <class Traits>
void TFieldMap<Traits>::MakeRootLeaf() {
  VEMO_ASSERT(!m_root);
  LeafNode* leaf = DollarNew(::new LeafNode);
  m_lastLeaf = leaf;
  m_firstLeaf = m_lastLeaf;
  m_root = leaf;
  m_height = 0;
  this->MarkAsDirtyWithoutTrace();
  DeclareReachable(this->GetThisAsFinalClass(), leaf, true);
}

template <class Traits>
void TFieldMap<Traits>::GrowRoot(InternalKeyEntry& splitEntry) {
  InternalNode* root = DollarNew(::new InternalNode);
  root->m_ptr = m_root;
  ::new (static_cast<void*>(root->m_entrys.Slot(0))) InternalKeyEntry;
  root->GetEntry(0).swap(splitEntry);
  root->m_numKeyEntrys = 1;
  m_root = root;
  ++m_height;
  this->MarkAsDirtyWithoutTrace();
  DeclareReachable(this->GetThisAsFinalClass(), root, true);
}

template <class Traits>
void TFieldMap<Traits>::wFindInNode(wFindRet& ret, void* node, ssize_t height, const FieldId& key,
                                    InternalKeyEntry& splitEntry, bool create, PayloadArgument<Payload>* argument) {
  if (height >= 1) {
    wRecursiveFind(ret, AsInternalNode(node), height, key, splitEntry, create, argument);
  } else if (LeafNode* right = wFindInLeaf(ret, AsLeafNode(node), key, create, argument)) {
    splitEntry.m_key = right->GetEntry(0).first;
    splitEntry.m_ptr = right;
  }
}

template <class Traits>
void TFieldMap<Traits>::wRecursiveFind(wFindRet& ret, InternalNode* left, ssize_t height, const FieldId& key,
                                       InternalKeyEntry& splitEntry, bool create, PayloadArgument<Payload>* argument) {
  VEMO_ASSERT(height >= 0);
  VEMO_ASSERT(left);
  void* childLeft = left->FindChildGivenKey(key, TableAt(height - 1));
  VEMO_ASSERT(childLeft);
  InternalKeyEntry childSplit;
  wFindInNode(ret, childLeft, height - 1, key, childSplit, create, argument);
  if (childSplit.m_ptr) InsertIntoInternalNode(left, childSplit, splitEntry);
}

template <class Traits>
typename Traits::LeafNode* TFieldMap<Traits>::wFindInLeaf(wFindRet& ret, LeafNode* left, const FieldId& key, bool create,
                                                          PayloadArgument<Payload>* argument) {
  VEMO_ASSERT(left);
  const ssize_t nk = left->m_numKeyEntrys;
  VEMO_ASSERT_TEXT(0 <= nk && nk <= kCapacity, "0 <= nk && nk <= 100");
  ssize_t lo = 0, hi = nk - 1;  // keys below lo are < key, keys above hi are > key
  while (lo <= hi) {
    const ssize_t mid = (lo + hi) / 2;
    VEMO_ASSERT(0 <= mid && mid < nk);
    const int c = CompareKeys(key, left->GetEntry(mid).first);
    if (c == 0) {
      ret = {left, &left->GetEntry(mid).second, left, mid, false};
      return nullptr;
    }
    if (c < 0) {
      hi = mid - 1;
    } else {
      lo = mid + 1;
    }
  }
  const ssize_t insertPos = lo;
  if (!create) {
    ret = {null, nullptr, nullptr, -1, false};
    return nullptr;
  }
  if (argument != nullptr) argument->HoldIfWithin(left->m_entrys.Slot(0), left->m_entrys.Slot(nk));
  PendingValue<FieldId> newKey(key);
  CountNewEntry(ret);
  VEMO_ASSERT(0 <= insertPos && insertPos <= nk);
  if (nk != kCapacity) {
    ShiftLeafEntries(left, insertPos, insertPos + 1, nk - insertPos);
    FillSlot(ret, left, insertPos, newKey);
    return nullptr;
  }
  LeafNode* right = LinkRightLeaf(left);
  SplitLeaf(ret, left, right, insertPos, newKey);
  return right;
}

template <class Traits>
void TFieldMap<Traits>::CountNewEntry(wFindRet& ret) {
  ret.m_created = true;
  ++m_size;
  this->MarkAsDirtyWithoutTrace();
}

// Makes the new entry in a slot that was freed for it.
template <class Traits>
void TFieldMap<Traits>::FillSlot(wFindRet& ret, LeafNode* leaf, ssize_t slot, PendingValue<FieldId>& key) {
  PlaceNewEntry(leaf, slot, key);
  ++leaf->m_numKeyEntrys;
  ret = {leaf, &leaf->GetEntry(slot).second, leaf, slot, true};
  leaf->MarkAsDirtyWithoutTrace();
}

// Puts the key and a default payload into a raw slot; cannot throw.
template <class Traits>
void TFieldMap<Traits>::PlaceNewEntry(LeafNode* leaf, ssize_t slot, PendingValue<FieldId>& key) {
  auto* raw = reinterpret_cast<std::byte*>(leaf->m_entrys.Slot(slot));
  Traits::MoveKey(raw, key.Release());
  static_assert(std::is_nothrow_default_constructible_v<Payload>);
  Traits::ConstructPayload(raw + GetPayloadOffset());
}

// Makes a new leaf and puts it into the chain behind `left`.
template <class Traits>
typename Traits::LeafNode* TFieldMap<Traits>::LinkRightLeaf(LeafNode* left) {
  LeafNode* next = left->m_next.Get();
  LeafNode* right = DollarNew(::new LeafNode);
  right->m_prev = left;
  right->m_next = next;
  if (next != nullptr) {
    VEMO_ASSERT(next->m_prev == left);
    next->m_prev = right;
    next->MarkAsDirtyWithoutTrace();
  } else {
    VEMO_ASSERT(m_lastLeaf == left);
    m_lastLeaf = right;
  }
  left->m_next = right;
  left->MarkAsDirtyWithoutTrace();
  DeclareReachable(left, right, true);
  return right;
}

// Divides the entries of a full leaf and the new one; cannot throw.
template <class Traits>
void TFieldMap<Traits>::SplitLeaf(wFindRet& ret, LeafNode* left, LeafNode* right, ssize_t insertPos,
                                  PendingValue<FieldId>& key) {
  constexpr ssize_t nk = kCapacity;
  if (insertPos < kHalf) {
    MoveLeafEntries(left, kHalf - 1, right, 0, nk - (kHalf - 1));
    ShiftLeafEntries(left, insertPos, insertPos + 1, kHalf - 1 - insertPos);
    PlaceNewEntry(left, insertPos, key);
    ret = {left, &left->GetEntry(insertPos).second, left, insertPos, true};
  } else {
    const ssize_t rightInsertPos = insertPos - kHalf;
    VEMO_ASSERT(rightInsertPos >= 0);
    MoveLeafEntries(left, kHalf, right, 0, rightInsertPos);
    PlaceNewEntry(right, rightInsertPos, key);
    ret = {right, &right->GetEntry(rightInsertPos).second, right, rightInsertPos, true};
    MoveLeafEntries(left, insertPos, right, rightInsertPos + 1, nk - insertPos);
  }
  left->m_numKeyEntrys = kHalf;
  right->m_numKeyEntrys = kHalf + 1;
}

template <class Traits>
void TFieldMap<Traits>::InsertIntoInternalNode(InternalNode* left, const InternalKeyEntry& entry,
                                               InternalKeyEntry& splitEntry) {
  VEMO_ASSERT(left);
  const ssize_t nk = left->m_numKeyEntrys;
  VEMO_ASSERT_TEXT(1 <= nk && nk <= kCapacity, "1 <= nk && nk <= 100");
  ssize_t lo = 0, hi = nk - 1;  // separators below lo are < the key, separators above hi are > it
  while (lo <= hi) {
    const ssize_t mid = (lo + hi) / 2;
    VEMO_ASSERT(0 <= mid && mid < nk);
    const int c = CompareKeys(entry.m_key, left->GetEntry(mid).m_key);
    VEMO_ASSERT(c != 0);
    if (c < 0) {
      hi = mid - 1;
    } else {
      lo = mid + 1;
    }
  }
  VEMO_ASSERT_TEXT(lo == hi + 1, "lo == hi+1");
  const ssize_t insertPos = lo;
  VEMO_ASSERT(0 <= insertPos && insertPos <= nk);
  if (nk != kCapacity) {
    PendingValue<InternalKeyEntry> pending(entry);
    ShiftInternalEntries(left, insertPos, insertPos + 1, nk - insertPos);
    Relocate(left->m_entrys.Slot(insertPos), pending.Release(), 1);
    ++left->m_numKeyEntrys;
    splitEntry.m_ptr = nullptr;
  } else {
    SplitInternalNode(left, entry, insertPos, splitEntry);
  }
  left->MarkAsDirtyWithoutTrace();
}

template <class Traits>
void TFieldMap<Traits>::SplitInternalNode(InternalNode* left, const InternalKeyEntry& entry, ssize_t insertPos,
                                          InternalKeyEntry& splitEntry) {
  constexpr ssize_t nk = kCapacity;
  InternalNode* right = DollarNew(::new InternalNode);
  left->MarkAsDirtyWithoutTrace();
  DeclareReachable(left, right, true);
  splitEntry.m_ptr = right;

  PendingValue<InternalKeyEntry> pending(entry);  // the last step that can throw
  if (insertPos > kHalf) {
    const ssize_t rightInsertPos = insertPos - (kHalf + 1);
    VEMO_ASSERT(rightInsertPos >= 0);
    MoveInternalEntries(left, kHalf + 1, right, 0, rightInsertPos);
    Relocate(right->m_entrys.Slot(rightInsertPos), pending.Release(), 1);
    MoveInternalEntries(left, insertPos, right, rightInsertPos + 1, nk - insertPos);
  } else {
    MoveInternalEntries(left, kHalf, right, 0, nk - kHalf);
    ShiftInternalEntries(left, insertPos, insertPos + 1, kHalf - insertPos);
    Relocate(left->m_entrys.Slot(insertPos), pending.Release(), 1);
  }
  // Slot kHalf holds the median: its child becomes the right node's leftmost, its key goes up, the slot is raw again.
  InternalKeyEntry& median = left->GetEntry(kHalf);
  Relocate(&right->m_ptr, &median.m_ptr, 1);
  std::destroy_at(&splitEntry.m_key);
  Traits::MoveKey(&splitEntry.m_key, &median.m_key);
  left->m_numKeyEntrys = kHalf;
  right->m_numKeyEntrys = kHalf;
}

template <class Traits>
std::pair<typename TFieldMap<Traits>::iterator, bool> TFieldMap<Traits>::insert(const value_type& value) {
  PayloadArgument<Payload> argument(value.second);
  return InsertArgument(value.first, argument);
}

template <class Traits>
std::pair<typename TFieldMap<Traits>::iterator, bool> TFieldMap<Traits>::insert(value_type&& value) {
  PayloadArgument<Payload> argument(std::move(value.second));
  return InsertArgument(value.first, argument);
}

template <class Traits>
std::pair<typename TFieldMap<Traits>::iterator, bool> TFieldMap<Traits>::InsertArgument(
    const FieldId& key, PayloadArgument<Payload>& argument) {
  MutationScope scope(this->GetThisAsFinalClass());
  wFindRet ret;
  wFind(ret, key, true, &argument);
  VEMO_ASSERT(ret.m_leaf);
  if (ret.m_created) AssignPayload(ret, argument);
  scope.Complete();
  return {iterator(IteratorPolicy(ret.m_leaf, ret.m_index)), ret.m_created};
}

template <class Traits>
void TFieldMap<Traits>::AssignPayload(wFindRet& ret, PayloadArgument<Payload>& argument) {
  VEMO_ASSERT(ret.m_payload);
  argument.AssignTo(*ret.m_payload);
  VEMO_ASSERT_TEXT(ret.m_containingNode.m_self != nullptr, "ret.m_containingNode");
  MarkPersistentAsDirtyWithoutTrace(ret.m_containingNode);
}

template <class Traits>
bool TFieldMap<Traits>::Insert(const FieldId& key, const Payload& payload, bool replace) {
  PayloadArgument<Payload> argument(payload);
  return InsertArgument(key, argument, replace);
}

template <class Traits>
bool TFieldMap<Traits>::Insert(const FieldId& key, Payload&& payload, bool replace) {
  PayloadArgument<Payload> argument(std::move(payload));
  return InsertArgument(key, argument, replace);
}

template <class Traits>
bool TFieldMap<Traits>::InsertArgument(const FieldId& key, PayloadArgument<Payload>& argument, bool replace) {
  MutationScope scope(this->GetThisAsFinalClass());
  wFindRet ret;
  wFind(ret, key, true, &argument);
  VEMO_ASSERT(ret.m_payload);
  if (replace || ret.m_created) AssignPayload(ret, argument);
  scope.Complete();
  return ret.m_created;
}

template <class Traits>
typename Traits::Payload& TFieldMap<Traits>::operator[](const FieldId& key) {
  MutationScope scope(this->GetThisAsFinalClass());
  wFindRet ret;
  wFind(ret, key, true);
  if (!ret.m_created) ret.m_leaf->MarkAsDirtyWithoutTrace();
  scope.Complete();
  return *ret.m_payload;
}

}  // namespace vemo
