// Looking one key up in a map that is larger than memory.
#pragma once

#include <optional>

#include "store/stored_leaf.h"

namespace vemo {

// A copy of the payload under `key`, or nothing. `owner` is the Snapshot or WriteTransaction that the map was taken from.
//
// For look-ups that will hardly meet the same leaf again: a leaf that is in memory is used, another one is read as far as the key
// and not kept. The internal nodes on the way, one for some seventy leaves, are loaded as rFind does, and leave memory with
// Trim. Ends nothing. Throws UsageError where the map is not the owner's, and what rFind throws, but of a damaged leaf that its
// checksum vouches for only what stands before the key.
// Costs reading the entries before the key where the leaf is not in memory, without making them: less than loading the leaf, more
// than rFind in a leaf that is there.
template <class Owner, class Traits>
std::optional<typename Traits::Payload> PeekMap(Owner& owner, const TFieldMap<Traits>& map, const FieldId& key) {
  using LeafNode = typename Traits::LeafNode;
  if (map.m_height < 0) return std::nullopt;
  const prefbase& reference = LeafReferenceFor(map, key);
  View& view = owner.Objects();
  if (const ptr<IPersistable> object = view.InMemory(reference, StoredLeaf<Traits>::Table()); object.m_self != nullptr) {
    const auto& leaf = *static_cast<const LeafNode*>(object.m_self);
    const ssize_t i = map.SearchLeaf(key, &leaf);
    return i < 0 ? std::nullopt : std::optional(leaf.GetEntry(i).second);
  }
  StoredLeaf<Traits> entries(view, reference.m_oid, view.ReadStored(reference.m_oid, StoredLeaf<Traits>::Table()));
  while (entries.NextKey()) {
    const int order = entries.CompareKeyWith(key);
    if (order > 0) break;
    if (order < 0) {
      entries.SkipPayload();
      continue;
    }
    FieldId found;
    std::optional<typename Traits::Payload> payload(std::in_place);
    entries.Read(found, *payload);
    return payload;
  }
  return std::nullopt;
}

}  // namespace vemo
