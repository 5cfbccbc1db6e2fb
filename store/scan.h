// Walking a map that is larger than memory.
#pragma once

#include "platform/field_id.h"

namespace vemo {

// Calls `visit(key, payload)` for each entry of `map` from the key `from` on, in ascending order, until it returns false.
// Returns whether the end of the map was reached.
//
// Between two leaves, `owner`, the Snapshot or WriteTransaction that the map was taken from, is trimmed where it has loaded
// more than its share of SpaceOptions::cacheBytes, and the scan looks its place up by key again: what it takes in memory
// is that share and one path from the root. What Trim ends, a call of this ends too, and references that `visit` was
// given end with that call of it. `visit` may look things up in maps of the same owner; it must neither trim the owner nor scan
// another of its maps, and not change this one.
// Costs a find for the start, a step for each entry, and a find for each time that something has left memory.
template <class Owner, class Map, class Visit>
bool ScanMap(Owner& owner, const Map& map, const FieldId& from, Visit&& visit) {
  auto at = map.lower_bound(from);
  // By the leaf's own count: asking for the end would load the last leaf again whenever it has left memory.
  while (at.m_leaf != nullptr && at.m_offset < at.m_leaf->m_numKeyEntrys) {
    const auto& [key, payload] = *at;
    if (!visit(key, payload)) return false;
    const bool isLastOfLeaf = at.m_offset + 1 == at.m_leaf->m_numKeyEntrys;
    if (isLastOfLeaf && owner.IsOverAllowance()) {
      const FieldId reached = key;
      owner.Trim();
      at = map.upper_bound(reached);
    } else {
      ++at;
    }
  }
  return true;
}

}  // namespace vemo
