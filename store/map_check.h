// Checking a whole map without stopping at the first fault.
//
// Unlike the map's own Validate, which asserts, this walks on after a fault and reports each with the node's id; it hands the
// bounds of every node down to its outermost children, follows the chain of leaves in both directions and counts the
// entries. A node that cannot be read is a finding, and its siblings are still checked.
#pragma once

#include <string>
#include <unordered_set>
#include <vector>

#include "platform/error.h"
#include "platform/field_id.h"
#include "platform/types.h"
#include "vxPersistStore/pref.h"

namespace vemo {

struct MapFinding {
  OID oid;            // the node at fault; null where the fault is the map's own
  std::string where;  // the way from the root by child numbers, such as "root.-1.7"
  std::string fault;
};

template <class Map>
class MapCheck {
 public:
  explicit MapCheck(const Map& map) : m_map(map) {}

  // Loads every node. Linear in the size of the map.
  std::vector<MapFinding> Run() {
    if (m_map.m_height < 0) {
      CheckEmptyMap();
      return std::move(m_findings);
    }
    CheckNode(m_map.m_height, m_map.m_root, {nullptr, nullptr}, true, "root");
    CheckChain();
    ssize_t entries = 0;
    for (const LeafNode* leaf : m_leaves) entries += leaf->m_numKeyEntrys;
    if (!m_incomplete) {
      Expect(entries == m_map.m_size, OID(), "map",
             "the size is " + std::to_string(m_map.m_size) + ", but there are " + std::to_string(entries) + " entries");
    }
    return std::move(m_findings);
  }

  // The nodes that Run has visited.
  const std::unordered_set<OID>& Visited() const noexcept { return m_visited; }

 private:
  using LeafNode = typename Map::LeafNode;
  using InternalNode = typename Map::InternalNode;
  static constexpr ssize_t kCapacity = sizeof(LeafNode::m_entrys) / sizeof(typename LeafNode::KeyEntry);

  // Keys below a node are in [low, high); null is unbounded.
  struct Bounds {
    const FieldId* low;
    const FieldId* high;
  };

  void Find(OID oid, const std::string& where, const std::string& fault) { m_findings.push_back({oid, where, fault}); }
  void Expect(bool sound, OID oid, const std::string& where, const std::string& fault) {
    if (!sound) Find(oid, where, fault);
  }

  void CheckEmptyMap() {
    Expect(m_map.m_height == -1, OID(), "map", "the height is below -1");
    Expect(m_map.m_size == 0, OID(), "map", "a map without nodes has a size");
    Expect(!m_map.m_root && !m_map.m_firstLeaf && !m_map.m_lastLeaf, OID(), "map", "a map without nodes has references");
  }

  // The node behind a reference, or null after a finding.
  void* Load(const prefbase& reference, ssize_t height, const std::string& where) {
    if (!reference) {
      m_incomplete = true;
      Find(OID(), where, "the reference is empty");
      return nullptr;
    }
    if (!m_visited.insert(reference.m_oid).second) {
      m_incomplete = true;
      Find(reference.m_oid, where, "the node hangs in the tree twice");
      return nullptr;
    }
    const auto* expected =
        height > 0 ? IPersistable::Stubs<InternalNode>::GetTable() : IPersistable::Stubs<LeafNode>::GetTable();
    try {
      const ptr<IPersistable> node = reference.GetAs(expected);
      if (node.Table() == expected) return node.m_self;
      Find(reference.m_oid, where, "a node of the wrong class at height " + std::to_string(height));
    } catch (const Error& error) {
      Find(reference.m_oid, where, error.what());
    }
    m_incomplete = true;
    return nullptr;
  }

  void CheckNode(ssize_t height, const prefbase& reference, Bounds bounds, bool isRoot, const std::string& where) {
    void* node = Load(reference, height, where);
    if (node == nullptr) return;
    if (height > 0) {
      CheckInternalNode(height, reference.m_oid, *static_cast<const InternalNode*>(node), bounds, isRoot, where);
    } else {
      CheckLeaf(reference.m_oid, *static_cast<const LeafNode*>(node), bounds, isRoot, where);
    }
  }

  void CheckFill(OID oid, ssize_t n, ssize_t least, const std::string& where) {
    Expect(least <= n && n <= kCapacity, oid, where, "it has " + std::to_string(n) + " entries");
  }

  void CheckKey(OID oid, const FieldId* previous, const FieldId& key, Bounds bounds, const std::string& where) {
    Expect(previous == nullptr || *previous < key, oid, where, "keys do not ascend at " + FieldIdText(key));
    Expect(bounds.low == nullptr || !(key < *bounds.low), oid, where, "key " + FieldIdText(key) + " is below its range");
    Expect(bounds.high == nullptr || key < *bounds.high, oid, where, "key " + FieldIdText(key) + " is above its range");
  }

  void CheckLeaf(OID oid, const LeafNode& leaf, Bounds bounds, bool isRoot, const std::string& where) {
    CheckFill(oid, leaf.m_numKeyEntrys, isRoot ? 0 : kCapacity / 2, where);
    const FieldId* previous = nullptr;
    for (ssize_t i = 0; i < leaf.m_numKeyEntrys; ++i) {
      CheckKey(oid, previous, leaf.GetEntry(i).first, bounds, where);
      previous = &leaf.GetEntry(i).first;
    }
    m_leaves.push_back(&leaf);
    m_leafIds.push_back(oid);
  }

  void CheckInternalNode(ssize_t height, OID oid, const InternalNode& node, Bounds bounds, bool isRoot,
                         const std::string& where) {
    const ssize_t n = node.m_numKeyEntrys;
    CheckFill(oid, n, isRoot ? 1 : kCapacity / 2, where);
    for (ssize_t i = -1; i < n; ++i) {
      if (i >= 0) CheckKey(oid, i == 0 ? nullptr : &node.GetEntry(i - 1).m_key, node.GetEntry(i).m_key, bounds, where);
      const Bounds childBounds{i < 0 ? bounds.low : &node.GetEntry(i).m_key,
                               i + 1 < n ? &node.GetEntry(i + 1).m_key : bounds.high};
      CheckNode(height - 1, node.ChildReference(i), childBounds, false, where + "." + std::to_string(i));
    }
  }

  // By ids: every leaf's neighbours must be those that the tree gives it. Where a node could not be read, a broken chain
  // cannot be told apart from the hole, and the finding about that node stands for it.
  void CheckChain() {
    if (m_incomplete) return;
    const std::size_t n = m_leaves.size();
    Expect(m_map.m_firstLeaf.m_oid == m_leafIds.front(), OID(), "map", "its first leaf is not the tree's");
    Expect(m_map.m_lastLeaf.m_oid == m_leafIds.back(), OID(), "map", "its last leaf is not the tree's");
    for (std::size_t i = 0; i < n; ++i) {
      const OID before = i > 0 ? m_leafIds[i - 1] : OID();
      const OID behind = i + 1 < n ? m_leafIds[i + 1] : OID();
      const std::string where = "leaf " + std::to_string(i);
      Expect(m_leaves[i]->m_prev.m_oid == before, m_leafIds[i], where, "its left neighbour is not the tree's");
      Expect(m_leaves[i]->m_next.m_oid == behind, m_leafIds[i], where, "its right neighbour is not the tree's");
    }
  }

  const Map& m_map;
  std::vector<MapFinding> m_findings;
  std::unordered_set<OID> m_visited;
  std::vector<const LeafNode*> m_leaves;
  std::vector<OID> m_leafIds;
  bool m_incomplete = false;  // part of the tree could not be read
};

}  // namespace vemo
