// Asking for the lists of payloads before they are read.
//
// The nodes of a list lie apart in memory, each known by the one before alone, so that going through a leaf would wait for each
// in turn. Whoever goes through the entries asks for those ahead: at entry i for the first nodes of the lists furthest ahead,
// for the second ones, to which these lead, of those nearer by, and so on (Chen, Gibbons and Mowry, "Improving Index Performance
// through Prefetching", SIGMOD 2001).
//
// The functions are inlined always, for the reason that FrontLinkedList::PrefetchNode has.
#pragma once

#include "platform/types.h"

namespace vemo {

inline constexpr int kPrefetchedNodes = 3;       // of each list
inline constexpr ssize_t kPrefetchDistance = 4;  // entries from those of which the one node is asked for to those of the next

// Called at entry `i` of a walk through `leaf`.
template <class Leaf>
[[gnu::always_inline]] inline void PrefetchListsAhead(const Leaf& leaf, ssize_t i) noexcept {
  if constexpr (requires { leaf.GetEntry(0).second.PrefetchNode(0); }) {
    for (int n = 0; n < kPrefetchedNodes; ++n) {
      const ssize_t ahead = i + (kPrefetchedNodes - n) * kPrefetchDistance;
      if (0 <= ahead && ahead < leaf.m_numKeyEntrys) leaf.GetEntry(ahead).second.PrefetchNode(n);
    }
  }
}

// Called before the walk: for the entries that it comes to first.
template <class Leaf>
[[gnu::always_inline]] inline void PrefetchFirstLists(const Leaf& leaf) noexcept {
  for (ssize_t i = -kPrefetchedNodes * kPrefetchDistance; i < 0; ++i) PrefetchListsAhead(leaf, i);
}

}  // namespace vemo
