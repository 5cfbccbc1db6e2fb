// A position in the chain of leaves.
#pragma once

#include <cstddef>
#include <utility>

#include "platform/assertion.h"
#include "platform/iterator.h"
#include "platform/types.h"
#include "vxOperation/src/WorkingSet/CompOp/FieldMapPrefetch.h"

namespace vemo {

// m_leaf is null for the empty map only. Valid offsets run from -1, the place before the first entry of the first leaf,
// to the leaf's count, which is the end at the last leaf. Any insertion or deletion in the map invalidates it.
template <class Leaf>
struct FieldMapIteratorPolicy {
  using value_type = typename Leaf::value_type;

  FieldMapIteratorPolicy() = default;
  FieldMapIteratorPolicy(Leaf* leaf, ssize_t offset) : m_leaf(leaf), m_offset(offset) {}

  void next() {
    VEMO_ASSERT_TEXT(m_leaf, "m_leaf");
    VEMO_ASSERT(-1 <= m_offset && m_offset < m_leaf->m_numKeyEntrys);
    ++m_offset;
    if (m_offset == m_leaf->m_numKeyEntrys) [[unlikely]] {
      if (Leaf* following = m_leaf->m_next.Get()) {
        *this = {following, 0};
        PrefetchBehind(following);
        PrefetchFirstLists(*following);
      }
    }
    PrefetchListsAhead(*m_leaf, m_offset);
  }

  // Before the first entry of the map it stops at offset -1 of the first leaf, from where next() comes back.
  void prev() {
    VEMO_ASSERT_TEXT(m_leaf, "m_leaf");
    VEMO_ASSERT(0 <= m_offset && m_offset <= m_leaf->m_numKeyEntrys);
    --m_offset;
    if (m_offset < 0) {
      if (Leaf* preceding = m_leaf->m_prev.Get()) *this = {preceding, preceding->m_numKeyEntrys - 1};
    }
  }

  // The entry, for a caller who may change its payload: marks the leaf dirty.
  value_type& deref() const {
    AssertAtEntry();
    m_leaf->MarkAsDirtyWithoutTrace();
    return m_leaf->GetEntry(m_offset);
  }

  const value_type& const_deref() const {
    AssertAtEntry();
    return m_leaf->GetEntry(m_offset);
  }

  friend bool operator==(const FieldMapIteratorPolicy& a, const FieldMapIteratorPolicy& b) noexcept {
    return a.m_offset == b.m_offset && a.m_leaf == b.m_leaf;
  }

  Leaf* m_leaf = nullptr;
  ssize_t m_offset = 0;

 private:
  void AssertAtEntry() const {
    VEMO_ASSERT_TEXT(m_leaf, "m_leaf");
    VEMO_ASSERT(0 <= m_offset && m_offset < m_leaf->m_numKeyEntrys);
  }

  // Asks for the head of the leaf behind `leaf`, so that it is there when a walk has gone through the entries between. A leaf
  // that is not in memory is not loaded for this.
  static void PrefetchBehind(const Leaf* leaf) noexcept {
    constexpr std::size_t kCacheLine = 64, kBytes = 8 * kCacheLine;
    const auto* behind = static_cast<const std::byte*>(leaf->m_next.m_ptr.m_self);
    if (behind == nullptr) return;
    for (std::size_t i = 0; i < kBytes; i += kCacheLine) __builtin_prefetch(behind + i);
  }
};

}  // namespace vemo
