// A checker of whole trees that shares nothing with the map's own Validate: it walks the references by hand,
// hands the bounds of every node down to its outermost children too, and goes on after a fault.
#pragma once

#include <string>
#include <vector>

#include "platform/field_id.h"
#include "platform/types.h"
#include "vxPersistStore/pref.h"

namespace vemo::test {

template <class Map>
class TreeChecker {
 public:
  // Every departure from the invariants of FieldMap.h, one a line; empty for a sound tree. Loads every node.
  static std::string Check(const Map& map) {
    TreeChecker checker(map);
    checker.CheckAll();
    return checker.m_findings;
  }

 private:
  using LeafNode = typename Map::LeafNode;
  using InternalNode = typename Map::InternalNode;
  static constexpr ssize_t kCapacity = sizeof(LeafNode::m_entrys) / sizeof(typename LeafNode::KeyEntry);

  explicit TreeChecker(const Map& map) : m_map(map) {}

  void Find(const std::string& finding) { m_findings += finding + '\n'; }
  void Expect(bool sound, const std::string& finding) {
    if (!sound) Find(finding);
  }

  void CheckAll() {
    if (m_map.m_height < 0) {
      Expect(m_map.m_height == -1, "the height is below -1");
      Expect(m_map.m_size == 0, "an empty map has a size");
      Expect(!m_map.m_root && !m_map.m_firstLeaf && !m_map.m_lastLeaf, "an empty map has references");
      return;
    }
    CheckNode(m_map.m_height, m_map.m_root, nullptr, nullptr, true, "root");
    CheckChain();
    ssize_t entries = 0;
    for (const LeafNode* leaf : m_leaves) entries += leaf->m_numKeyEntrys;
    Expect(entries == m_map.m_size,
           "size " + std::to_string(m_map.m_size) + ", but " + std::to_string(entries) + " entries");
  }

  // Keys below must be in [low, high).
  void CheckNode(ssize_t height, const prefbase& reference, const FieldId* low, const FieldId* high,
                 bool isRoot, const std::string& where) {
    const ptr<IPersistable> object = reference.Get();
    if (object.m_self == nullptr) return Find(where + ": no node");
    Expect(object.Table()->GetPersistObjState(object.m_self)->m_oid == reference.m_oid,
           where + ": another id");
    const auto* expected = height > 0 ? IPersistable::Stubs<InternalNode>::GetTable()
                                      : IPersistable::Stubs<LeafNode>::GetTable();
    if (object.Table() != expected)
      return Find(where + ": a node of the wrong class at height " + std::to_string(height));
    if (height == 0) {
      CheckLeaf(static_cast<const LeafNode*>(object.m_self), low, high, isRoot, where);
    } else {
      CheckInternalNode(height, static_cast<const InternalNode*>(object.m_self), low, high, isRoot, where);
    }
  }

  void CheckFill(ssize_t n, ssize_t least, const std::string& where) {
    Expect(least <= n && n <= kCapacity, where + ": " + std::to_string(n) + " entries");
  }
  void CheckKey(const FieldId* previous, const FieldId& key, const FieldId* low, const FieldId* high,
                const std::string& where) {
    Expect(previous == nullptr || *previous < key, where + ": keys do not ascend at " + FieldIdText(key));
    Expect(low == nullptr || !(key < *low), where + ": below its range: " + FieldIdText(key));
    Expect(high == nullptr || key < *high, where + ": above its range: " + FieldIdText(key));
  }

  void CheckLeaf(const LeafNode* leaf, const FieldId* low, const FieldId* high, bool isRoot,
                 const std::string& where) {
    CheckFill(leaf->m_numKeyEntrys, isRoot ? 0 : kCapacity / 2, where);
    const FieldId* previous = nullptr;
    for (ssize_t i = 0; i < leaf->m_numKeyEntrys; ++i) {
      CheckKey(previous, leaf->GetEntry(i).first, low, high, where);
      previous = &leaf->GetEntry(i).first;
    }
    m_leaves.push_back(leaf);
  }

  void CheckInternalNode(ssize_t height, const InternalNode* node, const FieldId* low, const FieldId* high,
                         bool isRoot, const std::string& where) {
    const ssize_t n = node->m_numKeyEntrys;
    CheckFill(n, isRoot ? 1 : kCapacity / 2, where);
    for (ssize_t i = -1; i < n; ++i) {
      const FieldId* lower = i < 0 ? low : &node->GetEntry(i).m_key;
      const FieldId* upper = i + 1 < n ? &node->GetEntry(i + 1).m_key : high;
      if (i >= 0) CheckKey(i == 0 ? nullptr : &node->GetEntry(i - 1).m_key, *lower, low, high, where);
      const prefbase& child = i < 0 ? node->m_ptr : node->GetEntry(i).m_ptr;
      CheckNode(height - 1, child, lower, upper, false, where + "." + std::to_string(i));
    }
  }

  void CheckChain() {
    const LeafNode* previous = nullptr;
    const LeafNode* leaf = m_map.m_firstLeaf.Get();
    for (std::size_t i = 0; i < m_leaves.size(); ++i) {
      const std::string where = "chain at leaf " + std::to_string(i);
      if (leaf != m_leaves[i]) return Find(where + ": another leaf than in the tree");
      Expect(leaf->m_prev.Get() == previous, where + ": wrong predecessor");
      previous = leaf;
      leaf = leaf->m_next.Get();
    }
    Expect(leaf == nullptr, "the chain goes on behind the last leaf");
    Expect(m_map.m_lastLeaf.Get() == previous, "wrong last leaf");
  }

  const Map& m_map;
  std::vector<const LeafNode*> m_leaves;
  std::string m_findings;
};

template <class Map>
std::string CheckTree(const Map& map) {
  return TreeChecker<Map>::Check(map);
}

}  // namespace vemo::test
