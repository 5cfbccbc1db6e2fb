// Field maps as values: bodies of the functions that FieldMap.h declares.
#pragma once

#include <string>
#include <utility>

#include "vxOperation/src/WorkingSet/CompOp/FieldMap.h"
#include "platform/assertion.h"

namespace vemo {

template <class Traits>
TFieldMap<Traits>::TFieldMap(const TFieldMap& other) : TFieldMap() {
  for (const value_type& entry : other) {
    LeafNode* const last = LeafToAppendTo(entry.first);
    if (last == nullptr) {
      insert(entry);
      continue;
    }
    MutationScope scope(this->GetThisAsFinalClass());
    wFindRet ret;
    AppendToLeaf(ret, last, entry.first);
    *ret.m_payload = entry.second;
    MarkPersistentAsDirtyWithoutTrace(ret.m_containingNode);
    scope.Complete();
  }
}

template <class Traits>
typename Traits::Map& TFieldMap<Traits>::operator=(const TFieldMap& other) {
  MutationScope scope(this->GetThisAsFinalClass());
  TFieldMap copy(other);
  swap(copy);
  scope.Complete();
  return *this->GetThisAsFinalClass();
}

template <class Traits>
TFieldMap<Traits>::TFieldMap(TFieldMap&& other) : TFieldMap() {
  swap(other);
}

template <class Traits>
typename Traits::Map& TFieldMap<Traits>::operator=(TFieldMap&& other) {
  if (this != &other) {
    clear();
    swap(other);
  }
  return *this->GetThisAsFinalClass();
}

template <class Traits>
void TFieldMap<Traits>::swap(TFieldMap& other) {
  using std::swap;
  MutationScope scope(this->GetThisAsFinalClass());
  MutationScope otherScope(other.GetThisAsFinalClass());
  swap(m_size, other.m_size);
  swap(m_height, other.m_height);
  swap(m_root, other.m_root);
  swap(m_firstLeaf, other.m_firstLeaf);
  swap(m_lastLeaf, other.m_lastLeaf);
  this->MarkAsDirtyWithoutTrace();
  other.MarkAsDirtyWithoutTrace();
  otherScope.Complete();
  scope.Complete();
}

template <class Traits>
void TFieldMap<Traits>::clear() {
  MutationScope scope(this->GetThisAsFinalClass());
  if (m_height == 0) {
    AsyncPermanentlyDeleteSubTree(AsLeafNode(m_root.GetAs(TableAt(0))));
  } else if (m_height >= 1) {
    AsyncPermanentlyDeleteSubTree(AsInternalNode(m_root.GetAs(TableAt(m_height))));
  }
  m_root = nullptr;
  m_firstLeaf.Clear();
  m_lastLeaf.Clear();
  this->MarkAsDirtyWithoutTrace();
  m_size = 0;
  m_height = -1;
  scope.Complete();
}

template <class Traits>
bool TFieldMap<Traits>::operator==(const TFieldMap& rhs) const {
  if (m_size != rhs.m_size) return false;
  const_iterator j = rhs.begin();
  for (const_iterator i = begin(); i != end(); ++i, ++j) {
    VEMO_ASSERT(j != rhs.end());
    if (!(i->first == j->first) || !(i->second == j->second)) return false;
  }
  VEMO_ASSERT(j == rhs.end());
  return true;
}

template <class Traits>
ssize_t TFieldMap<Traits>::GetNumNodes() const {
  return m_height < 0 ? 0 : GetNumNodes(m_height, m_root.GetAs(TableAt(m_height)));
}

template <class Traits>
ssize_t TFieldMap<Traits>::GetNumNodes(ssize_t height, void* node) const {
  VEMO_ASSERT(node);
  if (height < 1) return 1;
  const InternalNode* inode = AsInternalNode(node);
  ssize_t nodes = 1 + GetNumNodes(height - 1, inode->m_ptr.GetAs(TableAt(height - 1)));
  const ssize_t nk = inode->m_numKeyEntrys;
  VEMO_ASSERT_TEXT(1 <= nk && nk <= kCapacity, "1 <= nk && nk <= 100");
  for (ssize_t i = 0; i < nk; ++i) nodes += GetNumNodes(height - 1, inode->GetEntry(i).m_ptr.GetAs(TableAt(height - 1)));
  return nodes;
}

template <class Traits>
void TFieldMap<Traits>::Validate() const {
  if (m_height >= 0) ValidateNode(m_height, m_root.GetAs(TableAt(m_height)), true, nullptr, nullptr);
}

template <class Traits>
void TFieldMap<Traits>::ValidateNode(ssize_t height, void* node, bool isRoot, const FieldId* k1, const FieldId* k2) const {
  VEMO_ASSERT(node);
  VEMO_ASSERT(height >= 0);
  if (height == 0) {
    const LeafNode* leaf = AsLeafNode(node);
    const ssize_t nk = leaf->m_numKeyEntrys;
    VEMO_ASSERT_TEXT(0 <= nk && nk <= kCapacity, "0 <= nk && nk <= 100");
    if (!isRoot) VEMO_ASSERT_TEXT(kHalf <= nk, "50 <= nk");
    for (ssize_t i = 1; i < nk; ++i) {
      VEMO_ASSERT_TEXT(CompareKeys(leaf->GetEntry(i - 1).first, leaf->GetEntry(i).first) < 0,
                       "CompareKeys(leaf->GetEntry(i-1).first, leaf->GetEntry(i).first) < 0");
    }
    if (nk > 0 && k1 != nullptr) VEMO_ASSERT(CompareKeys(*k1, leaf->GetEntry(0).first) <= 0);
    if (nk > 0 && k2 != nullptr) {
      VEMO_ASSERT_TEXT(CompareKeys(leaf->GetEntry(nk - 1).first, *k2) < 0,
                       "CompareKeys(leaf->GetEntry(nk-1).first, *k2) < 0");
    }
    return;
  }
  const InternalNode* inode = AsInternalNode(node);
  const ssize_t nk = inode->m_numKeyEntrys;
  VEMO_ASSERT_TEXT(1 <= nk && nk <= kCapacity, "1 <= nk && nk <= 100");
  if (!isRoot) VEMO_ASSERT_TEXT(kHalf <= nk, "50 <= nk");
  for (ssize_t i = 1; i < nk; ++i) {
    VEMO_ASSERT_TEXT(CompareKeys(inode->GetEntry(i - 1).m_key, inode->GetEntry(i).m_key) < 0,
                     "CompareKeys(inode->GetEntry(i-1).m_key, inode->GetEntry(i).m_key) < 0");
  }
  if (k1 != nullptr) {
    VEMO_ASSERT_TEXT(CompareKeys(*k1, inode->GetEntry(0).m_key) <= 0, "CompareKeys(*k1,inode->GetEntry(0).m_key) <= 0");
  }
  if (k2 != nullptr) {
    VEMO_ASSERT_TEXT(CompareKeys(inode->GetEntry(nk - 1).m_key, *k2) < 0,
                     "CompareKeys(inode->GetEntry(nk-1).m_key, *k2) < 0");
  }
  const auto childTable = TableAt(height - 1);
  ValidateNode(height - 1, inode->m_ptr.GetAs(childTable), false, nullptr, &inode->GetEntry(0).m_key);
  for (ssize_t i = 0; i < nk; ++i) {
    const FieldId* upper = i + 1 < nk ? &inode->GetEntry(i + 1).m_key : nullptr;
    ValidateNode(height - 1, inode->GetEntry(i).m_ptr.GetAs(childTable), false, &inode->GetEntry(i).m_key, upper);
  }
}

template <class Traits>
void TFieldMap<Traits>::Write(xostream& os) const {
  os << "Height = " << m_height << '\n';
  if (m_height >= 0) WriteNode(os, m_height, m_root.GetAs(TableAt(m_height)));
}

template <class Traits>
void TFieldMap<Traits>::WriteNode(xostream& os, ssize_t height, void* node) const {
  VEMO_ASSERT(node);
  os << '{' << '\n';
  {
    const Indenter indenter(os, 4);
    if (height >= 1) {
      const InternalNode* inode = AsInternalNode(node);
      const auto childTable = TableAt(height - 1);
      WriteNode(os, height - 1, inode->m_ptr.GetAs(childTable));
      const ssize_t nk = inode->m_numKeyEntrys;
      VEMO_ASSERT_TEXT(1 <= nk && nk <= kCapacity, "1 <= nk && nk <= 100");
      for (ssize_t i = 0; i < nk; ++i) {
        os << inode->GetEntry(i).m_key << '\n';
        WriteNode(os, height - 1, inode->GetEntry(i).m_ptr.GetAs(childTable));
      }
    } else {
      const LeafNode* leaf = AsLeafNode(node);
      const ssize_t nk = leaf->m_numKeyEntrys;
      VEMO_ASSERT_TEXT(0 <= nk && nk <= kCapacity, "0 <= nk && nk <= 100");
      for (ssize_t i = 0; i < nk; ++i) {
        os << leaf->GetEntry(i).first << " --> " << leaf->GetEntry(i).second << '\n';
      }
    }
  }
  os << '}' << '\n';
}

}  // namespace vemo
