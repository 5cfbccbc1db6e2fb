// Searching a field map: bodies of the functions that FieldMap.h and FieldMapNodes.h declare.
#pragma once

#include <limits>

#include "vxOperation/src/WorkingSet/CompOp/FieldMap.h"
#include "platform/assertion.h"

namespace vemo {

template <class Traits>
ssize_t TFieldMapInternalNode<Traits>::FindChildIndexGivenKey(const FieldId& key) const {
  const ssize_t nk = m_numKeyEntrys;
  VEMO_ASSERT_TEXT(1 <= nk && nk <= Traits::kCapacity, "1 <= nk && nk <= 100");
  if (CompareKeys(key, GetEntry(0).m_key) < 0) return -1;
  // Entries below lo have keys <= key, entries from hi on have keys > key.
  ssize_t lo = 1, hi = nk;
  while (lo < hi) {
    const ssize_t mid = (lo + hi) / 2;
    VEMO_ASSERT(1 <= mid && mid < nk);
    if (CompareKeys(key, GetEntry(mid).m_key) < 0) {
      hi = mid;
    } else {
      lo = mid + 1;
    }
  }
  VEMO_ASSERT(lo == hi);
  VEMO_ASSERT(1 <= lo && lo <= nk);
  return lo - 1;
}

template <class Traits>
std::pair<void*, ssize_t> TFieldMapInternalNode<Traits>::FindChildGivenKey2(const FieldId& key,
                                                                           const IPersistable::FnTable* expected) const {
  const ssize_t i = FindChildIndexGivenKey(key);
  return {ChildReference(i).GetAs(expected), i};
}

template <class Traits>
void* TFieldMapInternalNode<Traits>::FindChildGivenKey(const FieldId& key, const IPersistable::FnTable* expected) const {
  return FindChildGivenKey2(key, expected).first;
}

template <class Traits>
ssize_t TFieldMap<Traits>::SearchLeaf(const FieldId& key, const LeafNode* leaf) const {
  VEMO_ASSERT(leaf);
  const ssize_t nk = leaf->m_numKeyEntrys;
  VEMO_ASSERT_TEXT(0 <= nk && nk <= kCapacity, "0 <= nk && nk <= 100");
  ssize_t lo = 0, hi = nk - 1;  // the key is in [lo, hi] or nowhere
  while (lo <= hi) {
    const ssize_t mid = (lo + hi) / 2;
    const int c = CompareKeys(key, leaf->GetEntry(mid).first);
    if (c > 0) {
      lo = mid + 1;
    } else if (c < 0) {
      hi = mid - 1;
    } else {
      return mid;
    }
  }
  return -1;
}

template <class Traits>
ssize_t TFieldMap<Traits>::LowerBoundInLeaf(const FieldId& key, const LeafNode* leaf) const {
  VEMO_ASSERT(leaf);
  const ssize_t nk = leaf->m_numKeyEntrys;
  VEMO_ASSERT_TEXT(0 <= nk && nk <= kCapacity, "0 <= nk && nk <= 100");
  ssize_t lo = 0, hi = nk;  // keys below lo are < key, keys from hi on are >= key
  while (lo < hi) {
    const ssize_t mid = (lo + hi) / 2;
    VEMO_ASSERT(0 <= mid && mid < nk);
    if (CompareKeys(key, leaf->GetEntry(mid).first) <= 0) {
      hi = mid;
    } else {
      lo = mid + 1;
    }
  }
  VEMO_ASSERT(lo == hi);
  VEMO_ASSERT(0 <= hi && hi <= nk);
  return hi;
}

template <class Traits>
ssize_t TFieldMap<Traits>::UpperBoundInLeaf(const FieldId& key, const LeafNode* leaf) const {
  VEMO_ASSERT(leaf);
  const ssize_t nk = leaf->m_numKeyEntrys;
  VEMO_ASSERT_TEXT(0 <= nk && nk <= kCapacity, "0 <= nk && nk <= 100");
  ssize_t lo = 0, hi = nk;  // keys below lo are <= key, keys from hi on are > key
  while (lo < hi) {
    const ssize_t mid = (lo + hi) / 2;
    VEMO_ASSERT(0 <= mid && mid < nk);
    if (CompareKeys(key, leaf->GetEntry(mid).first) < 0) {
      hi = mid;
    } else {
      lo = mid + 1;
    }
  }
  VEMO_ASSERT(lo == hi);
  VEMO_ASSERT(0 <= hi && hi <= nk);
  return hi;
}

// The leaf whose range contains `key`, or null for an empty map.
template <class Traits>
typename Traits::LeafNode* TFieldMap<Traits>::DescendToLeaf(const FieldId& key) const {
  void* node = m_root.GetAs(TableAt(m_height));
  if (node == nullptr) {
    VEMO_ASSERT(m_height == -1);
    return nullptr;
  }
  VEMO_ASSERT(m_height >= 0);
  for (ssize_t height = m_height; height > 0; --height) {
    node = AsInternalNode(node)->FindChildGivenKey(key, TableAt(height - 1));
    VEMO_ASSERT(node);
  }
  return AsLeafNode(node);
}

template <class Traits>
typename TFieldMap<Traits>::const_iterator TFieldMap<Traits>::find(const FieldId& key) const {
  LeafNode* leaf = DescendToLeaf(key);
  if (leaf == nullptr) return const_iterator(IteratorPolicy(nullptr, 0));
  const ssize_t j = SearchLeaf(key, leaf);
  return j >= 0 ? const_iterator(IteratorPolicy(leaf, j)) : end();
}

template <class Traits>
const typename Traits::Payload* TFieldMap<Traits>::rFind(const FieldId& key) const {
  const LeafNode* leaf = DescendToLeaf(key);
  if (leaf == nullptr) return nullptr;
  const ssize_t j = SearchLeaf(key, leaf);
  return j >= 0 ? &leaf->GetEntry(j).second : nullptr;
}

// A key greater than all of its leaf is answered by the first entry of the next leaf: every key there is at least the
// separator that bounds this leaf's subtree on the right, and the key is below that separator.
template <class Traits>
typename TFieldMap<Traits>::IteratorPolicy TFieldMap<Traits>::BoundPosition(LeafNode* leaf, ssize_t j) const {
  VEMO_ASSERT_TEXT(0 <= j && j <= leaf->m_numKeyEntrys, Traits::kBoundInLeafText);
  if (j == leaf->m_numKeyEntrys) {
    if (LeafNode* following = leaf->m_next.Get()) return {following, 0};
  }
  return {leaf, j};
}

template <class Traits>
typename TFieldMap<Traits>::const_iterator TFieldMap<Traits>::lower_bound(const FieldId& key) const {
  LeafNode* leaf = DescendToLeaf(key);
  if (leaf == nullptr) return const_iterator(IteratorPolicy(nullptr, 0));
  return const_iterator(BoundPosition(leaf, LowerBoundInLeaf(key, leaf)));
}

template <class Traits>
typename TFieldMap<Traits>::const_iterator TFieldMap<Traits>::upper_bound(const FieldId& key) const {
  LeafNode* leaf = DescendToLeaf(key);
  if (leaf == nullptr) return const_iterator(IteratorPolicy(nullptr, 0));
  return const_iterator(BoundPosition(leaf, UpperBoundInLeaf(key, leaf)));
}

// The range ends where the prefix with its last number one higher would stand; a number that cannot grow drops out, and then
// it is the number before it, or the object, that grows.
template <class Traits>
FieldMapRange<typename TFieldMap<Traits>::const_iterator> TFieldMap<Traits>::FieldsBelow(const FieldId& prefix) const {
  FieldId bound = prefix;
  const auto elements = prefix.path.elements();
  auto size = static_cast<std::uint32_t>(elements.size());
  while (size > 0 && elements[size - 1] == std::numeric_limits<Path::Element>::max()) --size;
  bound.path = Path(elements.first(size));
  if (size > 0) {
    ++bound.path.Resize(size)[size - 1];
  } else if (++bound.oid.m_value == 0) {
    return {lower_bound(prefix), end()};
  }
  return {lower_bound(prefix), lower_bound(bound)};
}

template <class Traits>
typename TFieldMap<Traits>::IteratorPolicy TFieldMap<Traits>::EndPosition() const {
  if (m_height < 0) return {nullptr, 0};
  VEMO_ASSERT(m_lastLeaf);
  LeafNode* leaf = m_lastLeaf.Get();
  return {leaf, leaf->m_numKeyEntrys};
}

}  // namespace vemo
