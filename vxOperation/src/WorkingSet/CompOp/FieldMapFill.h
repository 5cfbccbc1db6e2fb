// Changing a payload in place and loading sorted entries: bodies of the functions of FieldMap.h that are templates themselves.
#pragma once

#include <algorithm>
#include <string>
#include <utility>
#include <vector>

#include "platform/error.h"
#include "vxOperation/src/WorkingSet/CompOp/FieldMap.h"

namespace vemo {

template <class Traits>
template <class Change>
bool TFieldMap<Traits>::Edit(const FieldId& key, Change&& change) {
  if (m_height == -1) return false;  // wFind would make a root leaf
  MutationScope scope(this->GetThisAsFinalClass());
  wFindRet ret;
  wFind(ret, key, false);
  if (ret.m_leaf != nullptr) {
    ret.m_leaf->MarkAsDirtyWithoutTrace();
    std::forward<Change>(change)(*ret.m_payload);
  }
  scope.Complete();
  return ret.m_leaf != nullptr;
}

// Bottom up: a chain of leaves, then level above level until one node is left.
template <class Traits>
template <class Iterator>
void TFieldMap<Traits>::BulkLoad(Iterator first, Iterator last, double fill) {
  if (!(0.5 <= fill && fill <= 1.0)) throw UsageError("nodes can be filled by 0.5 to 1 of their capacity");
  if (m_size != 0) throw UsageError("only an empty map can be loaded at once; this one has " + std::to_string(m_size) + " entries");
  const auto perNode = std::clamp(static_cast<ssize_t>(fill * static_cast<double>(kCapacity)), kHalf, kCapacity);
  MutationScope scope(this->GetThisAsFinalClass());
  if (m_height >= 0) clear();
  std::vector<LoadedNode> level = LoadLeaves(first, last, perNode);
  if (!level.empty()) {
    FillLastLeaf(level);
    m_firstLeaf = AsLeafNode(level.front().node.Get());
    m_lastLeaf = AsLeafNode(level.back().node.Get());
    ssize_t height = 0;
    for (; level.size() > 1; ++height) level = LoadLevel(level, perNode);
    m_root = level.front().node;
    m_height = height;
    this->MarkAsDirtyWithoutTrace();
    DeclareReachable(this->GetThisAsFinalClass(), level.front().node.m_ptr, true);
  }
  scope.Complete();
}

template <class Traits>
template <class Iterator>
std::vector<typename TFieldMap<Traits>::LoadedNode> TFieldMap<Traits>::LoadLeaves(Iterator first, Iterator last,
                                                                                 ssize_t perLeaf) {
  std::vector<LoadedNode> leaves;
  LeafNode* leaf = nullptr;
  for (; first != last; ++first) {
    const auto& entry = *first;
    if (leaf != nullptr && CompareKeys(leaf->GetEntry(leaf->m_numKeyEntrys - 1).first, entry.first) >= 0) {
      throw UsageError("the keys to be loaded do not ascend at " + FieldIdText(entry.first));
    }
    if (leaf == nullptr || leaf->m_numKeyEntrys == perLeaf) {
      LeafNode* right = DollarNew(::new LeafNode);
      if (leaf != nullptr) {
        right->m_prev = leaf;
        leaf->m_next = right;
        DeclareReachable(leaf, right, true);
      }
      leaf = right;
      leaves.push_back({entry.first, {}});
      leaves.back().node = leaf;
    }
    PendingValue<FieldId> key(entry.first);
    PlaceNewEntry(leaf, leaf->m_numKeyEntrys, key);
    ++leaf->m_numKeyEntrys;
    leaf->GetEntry(leaf->m_numKeyEntrys - 1).second = entry.second;
    ++m_size;
  }
  return leaves;
}

// The last leaf may have too few entries: it takes some from the one before it, or gives it its own.
template <class Traits>
void TFieldMap<Traits>::FillLastLeaf(std::vector<LoadedNode>& leaves) {
  if (leaves.size() < 2) return;
  LeafNode* right = AsLeafNode(leaves.back().node.Get());
  LeafNode* left = AsLeafNode(leaves[leaves.size() - 2].node.Get());
  const ssize_t total = left->m_numKeyEntrys + right->m_numKeyEntrys;
  if (right->m_numKeyEntrys >= kHalf) return;
  if (total <= kCapacity) {
    MoveLeafEntries(right, 0, left, left->m_numKeyEntrys, right->m_numKeyEntrys);
    left->m_numKeyEntrys = total;
    right->m_numKeyEntrys = 0;
    left->m_next = nullptr;
    leaves.pop_back();
    AsyncPermanentlyDeleteObject(right);
    return;
  }
  const ssize_t moved = total / 2 - right->m_numKeyEntrys;
  ShiftLeafEntries(right, 0, moved, right->m_numKeyEntrys);
  MoveLeafEntries(left, left->m_numKeyEntrys - moved, right, 0, moved);
  left->m_numKeyEntrys -= moved;
  right->m_numKeyEntrys += moved;
  leaves.back().firstKey = right->GetEntry(0).first;
}

// Hangs all `children` below new internal nodes, as evenly as the fill allows. A node of n children has n - 1 entries; there
// are never so many nodes that one would be less than half full.
template <class Traits>
std::vector<typename TFieldMap<Traits>::LoadedNode> TFieldMap<Traits>::LoadLevel(std::vector<LoadedNode>& children,
                                                                                ssize_t perNode) {
  const auto numChildren = static_cast<ssize_t>(children.size());
  const ssize_t wanted = (numChildren + perNode) / (perNode + 1);
  const ssize_t numNodes = std::max<ssize_t>(1, std::min(wanted, numChildren / (kHalf + 1)));
  std::vector<LoadedNode> nodes;
  nodes.reserve(static_cast<std::size_t>(numNodes));
  ssize_t next = 0;
  for (ssize_t i = 0; i < numNodes; ++i) {
    const ssize_t end = numChildren * (i + 1) / numNodes;
    InternalNode* node = DollarNew(::new InternalNode);
    nodes.push_back({std::move(children[static_cast<std::size_t>(next)].firstKey), {}});
    nodes.back().node = node;
    node->m_ptr = children[static_cast<std::size_t>(next)].node;
    DeclareReachable(node, node->m_ptr.m_ptr, true);
    for (++next; next < end; ++next) {
      LoadedNode& child = children[static_cast<std::size_t>(next)];
      InternalKeyEntry entry{std::move(child.firstKey), child.node};
      ::new (static_cast<void*>(node->m_entrys.Slot(node->m_numKeyEntrys))) InternalKeyEntry;
      node->GetEntry(node->m_numKeyEntrys).swap(entry);
      ++node->m_numKeyEntrys;
      DeclareReachable(node, child.node.m_ptr, true);
    }
  }
  return nodes;
}

}  // namespace vemo
