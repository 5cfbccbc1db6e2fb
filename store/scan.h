// Walking a map that is larger than memory.
#pragma once

#include <utility>

#include "store/decoded_object.h"
#include "store/stored_leaf.h"
#include "vxOperation/src/WorkingSet/CompOp/FieldMapPrefetch.h"

namespace vemo {

// The walk of a ScanMap. It holds on to nodes that are in memory, which therefore must not leave while it goes through them.
template <class Owner, class Traits, class Visit>
class MapScan {
 public:
  MapScan(Owner& owner, const TFieldMap<Traits>& map, Visit& visit)
      : m_owner(owner), m_view(owner.Objects()), m_map(map), m_visit(visit) {}

  bool Run(const FieldId& from) {
    if (m_map.m_height < 0) return true;
    m_from = from;
    LeafReferenceFor(m_map, from);  // loads the way, for the next scan that begins near by
    for (;;) {
      m_isOnTheWay = true;
      switch (Walk(m_map.m_root, m_map.m_height)) {
        case Outcome::kEnd: return true;
        case Outcome::kStopped: return false;
        case Outcome::kOverAllowance: m_owner.Trim();
      }
    }
  }

 private:
  using InternalNode = typename Traits::InternalNode;
  using LeafNode = typename Traits::LeafNode;
  enum class Outcome { kEnd, kStopped, kOverAllowance };

  Outcome Walk(const prefbase& reference, ssize_t height) {
    return height > 0 ? WalkInternalNode(reference, height) : WalkLeaf(reference);
  }

  Outcome WalkInternalNode(const prefbase& reference, ssize_t height) {
    const auto* const table = IPersistable::Stubs<InternalNode>::GetTable();
    DecodedObject read;
    ptr<IPersistable> object = m_view.InMemory(reference, table);
    if (object.m_self == nullptr) {
      read = NodeReader(m_view).Read(reference, table);
      object = read.Get();
    }
    const auto& node = *static_cast<const InternalNode*>(object.m_self);
    for (ssize_t i = m_isOnTheWay ? node.FindChildIndexGivenKey(m_from) : -1; i < node.m_numKeyEntrys; ++i) {
      if (const Outcome outcome = Walk(node.ChildReference(i), height - 1); outcome != Outcome::kEnd) return outcome;
    }
    return Outcome::kEnd;
  }

  Outcome WalkLeaf(const prefbase& reference) {
    const bool isFirst = std::exchange(m_isOnTheWay, false);
    const ptr<IPersistable> object = m_view.InMemory(reference, StoredLeaf<Traits>::Table());
    const bool goesOn = object.m_self != nullptr ? VisitLeaf(*static_cast<const LeafNode*>(object.m_self), isFirst)
                                                 : VisitStoredLeaf(reference.m_oid, isFirst);
    if (!goesOn) return Outcome::kStopped;
    return m_owner.IsOverAllowance() ? Outcome::kOverAllowance : Outcome::kEnd;
  }

  bool VisitLeaf(const LeafNode& leaf, bool isFirst) {
    ssize_t i = 0;
    if (isFirst) i = m_isBehind ? m_map.UpperBoundInLeaf(m_from, &leaf) : m_map.LowerBoundInLeaf(m_from, &leaf);
    PrefetchFirstLists(leaf);
    for (; i < leaf.m_numKeyEntrys; ++i) {
      PrefetchListsAhead(leaf, i);
      const auto& [key, payload] = leaf.GetEntry(i);
      if (!m_visit(key, payload)) return false;
      if (i + 1 == leaf.m_numKeyEntrys) GoOnBehind(key);
    }
    return true;
  }

  bool VisitStoredLeaf(OID oid, bool isFirst) {
    const ByteView body = m_view.ReadStored(oid, StoredLeaf<Traits>::Table());
    m_body.assign(body.begin(), body.end());  // the visitor may have other records read
    StoredLeaf<Traits> entries(m_view, oid, m_body);
    bool isAny = false;
    while (entries.NextKey()) {
      if (isFirst && IsBeforeStart(entries)) {
        entries.SkipPayload();
        continue;
      }
      isFirst = false;
      isAny = true;
      entries.Read(m_key, m_payload);
      if (!m_visit(std::as_const(m_key), std::as_const(m_payload))) return false;
    }
    if (isAny) GoOnBehind(m_key);
    return true;
  }

  bool IsBeforeStart(const StoredLeaf<Traits>& entries) const {
    const int order = entries.CompareKeyWith(m_from);
    return order < 0 || (order == 0 && m_isBehind);
  }

  void GoOnBehind(const FieldId& key) {
    m_from = key;
    m_isBehind = true;
  }

  Owner& m_owner;
  View& m_view;
  const TFieldMap<Traits>& m_map;
  Visit& m_visit;
  FieldId m_from;           // where the walk begins, or goes on after a trim
  bool m_isBehind = false;  // with the key behind it
  bool m_isOnTheWay = true;  // to the leaf where the walk begins
  Bytes m_body;  // of the leaf that is read
  FieldId m_key;
  typename Traits::Payload m_payload;
};

// Calls `visit(key, payload)` for each entry of `map` from the key `from` on, in ascending order, until it returns false.
// Returns whether the end of the map was reached. `owner` is the Snapshot or WriteTransaction that the map was taken from.
//
// Nodes that are in memory are used, others are read and not kept, but for the internal ones on the way to `from`: what it takes
// is two paths from the root, however large the map and whatever SpaceOptions::cacheBytes says. References that `visit` was
// given end with that call of it. `visit` may look things up in maps of the same owner; where the owner has more in memory than
// its share of cacheBytes, it is trimmed between two leaves, and what Trim ends, a call of this ends too. So a map on the stack
// that has taken over nodes of the space must not be scanned where there is a budget. `visit` must neither trim, refresh nor end
// the owner, nor scan another of its maps, and not change this one.
// Throws UsageError where the map is not the owner's, and what following references throws; of a damaged leaf that its checksum
// vouches for, entries before the damage are visited.
// Costs reading each leaf that is not in memory, and a step for each entry: a map that fits into memory and is walked again and
// again is walked faster by its iterators, which load it.
template <class Owner, class Traits, class Visit>
bool ScanMap(Owner& owner, const TFieldMap<Traits>& map, const FieldId& from, Visit&& visit) {
  return MapScan<Owner, Traits, Visit>(owner, map, visit).Run(from);
}

}  // namespace vemo
