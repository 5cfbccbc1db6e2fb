// Checking a whole map without stopping at the first fault.
//
// Unlike the map's own Validate, which asserts, this walks on after a fault and reports each with the node's id; it hands the
// bounds of every node down to its outermost children, follows the chain of leaves in both directions and counts the
// entries. A node that cannot be read is a finding, and its siblings are still checked.
//
// It holds on to one path from the root and a bit for each node, whatever the size of the map; what a node that was read
// leaves in memory is its reader's affair.
#pragma once

#include <functional>
#include <string>
#include <utility>
#include <vector>

#include "platform/field_id.h"
#include "platform/types.h"
#include "store/error.h"
#include "store/id_set.h"
#include "vxPersistStore/pref.h"

namespace vemo {

struct MapFinding {
  OID oid;            // the node at fault; null where the fault is the map's own
  std::string where;  // the way from the root by child numbers, such as "root.-1.7"
  std::string fault;
  // Of a node that cannot be read: the class that the exception names, if it does, and the table of the one that should stand there.
  std::string className = {};
  const IPersistable::FnTable* expected = nullptr;
};

// Reads nodes by following references, so that they are loaded and stay as the map's own operations leave them.
class BoundNodeReader {
 public:
  struct Node {
    ptr<IPersistable> Get() const noexcept { return object; }
    ptr<IPersistable> object;
  };
  // The node behind a reference that is not empty; throws a StoreError where there is none.
  Node Read(const prefbase& reference, const IPersistable::FnTable* expected) const { return {reference.GetAs(expected)}; }
};

// A reader returns holders: each keeps its node readable as long as it lives.
template <class Map, class Reader = BoundNodeReader>
class MapCheck {
 public:
  // `onNode` is called with the id of each node that is reached, and the way to it.
  explicit MapCheck(const Map& map, Reader reader = {}, std::function<void(OID, const std::string& where)> onNode = {})
      : m_map(map), m_reader(std::move(reader)), m_onNode(std::move(onNode)) {}

  // Reads every node. Linear in the size of the map.
  std::vector<MapFinding> Run() {
    if (m_map.m_height < 0) {
      CheckEmptyMap();
      return std::move(m_findings);
    }
    CheckNode(m_map.m_height, m_map.m_root, {nullptr, nullptr}, true, "root");
    if (m_incomplete) return std::move(m_findings);
    // Where a node could not be read, a broken chain or another size cannot be told apart from the hole, and the finding about
    // that node stands for it.
    CheckEndsOfChain();
    m_findings.insert(m_findings.end(), m_chainFindings.begin(), m_chainFindings.end());
    Expect(m_numEntries == m_map.m_size, OID(), "map",
           "the size is " + std::to_string(m_map.m_size) + ", but there are " + std::to_string(m_numEntries) + " entries");
    return std::move(m_findings);
  }

  // How many nodes Run has reached.
  std::size_t NumVisited() const noexcept { return m_visited.size(); }

 private:
  using Holder = decltype(std::declval<const Reader&>().Read(std::declval<const prefbase&>(), nullptr));
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

  // The node behind a reference, or nothing after a finding.
  Holder Load(const prefbase& reference, ssize_t height, const std::string& where) {
    if (!reference) {
      m_incomplete = true;
      Find(OID(), where, "the reference is empty");
      return {};
    }
    if (!m_visited.Insert(reference.m_oid)) {
      m_incomplete = true;
      Find(reference.m_oid, where, "the node hangs in the tree twice");
      return {};
    }
    if (m_onNode) m_onNode(reference.m_oid, where);
    const auto* expected =
        height > 0 ? IPersistable::Stubs<InternalNode>::GetTable() : IPersistable::Stubs<LeafNode>::GetTable();
    try {
      Holder node = m_reader.Read(reference, expected);
      if (node.Get().Table() == expected) return node;
      Find(reference.m_oid, where, "a node of the wrong class at height " + std::to_string(height));
    } catch (const StoreError& error) {
      m_findings.push_back({reference.m_oid, where, error.what(), error.place().className, expected});
    }
    m_incomplete = true;
    return {};
  }

  void CheckNode(ssize_t height, const prefbase& reference, Bounds bounds, bool isRoot, const std::string& where) {
    const Holder holder = Load(reference, height, where);
    const void* node = holder.Get().m_self;
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
    m_numEntries += leaf.m_numKeyEntrys;
    CheckLink(oid, leaf);
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

  // By ids: a leaf's left neighbour must be the leaf that came before it in the tree, whose right neighbour it must be.
  void CheckLink(OID oid, const LeafNode& leaf) {
    if (m_numLeaves == 0) m_firstLeaf = oid;
    ExpectLink(m_lastNext, oid, m_lastLeaf, m_numLeaves - 1, "right");
    ExpectLink(leaf.m_prev.m_oid, m_lastLeaf, oid, m_numLeaves, "left");
    m_lastLeaf = oid;
    m_lastNext = leaf.m_next.m_oid;
    ++m_numLeaves;
  }

  void ExpectLink(OID found, OID expected, OID leaf, ssize_t number, const std::string& side) {
    if (found == expected || number < 0) return;
    m_chainFindings.push_back({leaf, "leaf " + std::to_string(number), "its " + side + " neighbour is not the tree's"});
  }

  void CheckEndsOfChain() {
    ExpectLink(m_lastNext, OID(), m_lastLeaf, m_numLeaves - 1, "right");
    Expect(m_map.m_firstLeaf.m_oid == m_firstLeaf, OID(), "map", "its first leaf is not the tree's");
    Expect(m_map.m_lastLeaf.m_oid == m_lastLeaf, OID(), "map", "its last leaf is not the tree's");
  }

  const Map& m_map;
  const Reader m_reader;
  const std::function<void(OID, const std::string&)> m_onNode;
  std::vector<MapFinding> m_findings;
  std::vector<MapFinding> m_chainFindings;
  IdSet m_visited;
  ssize_t m_numEntries = 0;
  ssize_t m_numLeaves = 0;
  OID m_firstLeaf;
  OID m_lastLeaf;  // of those so far
  OID m_lastNext;  // its right neighbour
  bool m_incomplete = false;  // part of the tree could not be read
};

}  // namespace vemo
