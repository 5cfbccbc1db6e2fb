// Which splits and repairs a run of operations has reached, told from the calls that the host saw.
//
// The host must not set dirty flags (SetFlagging(false)), so that each mark is a call of its own: the order
// of marks and deletions differs between any two repairs.
#pragma once

#include <array>
#include <cstddef>
#include <string>
#include <vector>

#include "tests/support/recording_host.h"

namespace vemo::test {

enum class Repair {
  kLeafSplitLeftHalf,
  kLeafSplitRightHalf,
  kLastLeafSplit,
  kInternalSplitBelowTheMedian,
  kInternalSplitAtTheMedian,
  kInternalSplitAboveTheMedian,
  kRootGrowthToHeight1,
  kRootGrowthToHeight2,
  kRootGrowthToHeight3,
  kLeafBorrowsFromLeftSibling,
  kLeafBorrowsFromLeftCousin,
  kLeafBorrowsFromRightSibling,
  kLeafBorrowsFromRightCousin,
  kLeafMergesIntoLeftSibling,
  kLeafMergesWithRightSibling,
  kLastLeafMerges,
  kInternalBorrowsFromLeftSibling,
  kInternalBorrowsFromLeftCousin,
  kInternalBorrowsFromRightSibling,
  kInternalBorrowsFromRightCousin,
  kInternalMergesIntoLeftSibling,
  kInternalMergesWithRightSibling,
  kRootCollapse,
  kCount,
};

inline const char* NameOf(Repair repair) {
  static constexpr std::array<const char*, static_cast<std::size_t>(Repair::kCount)> kNames = {
      "leaf split, new entry left",
      "leaf split, new entry right",
      "split of the last leaf",
      "internal split below the median",
      "internal split at the median",
      "internal split above the median",
      "root growth to height 1",
      "root growth to height 2",
      "root growth to height 3",
      "leaf borrows from its left sibling",
      "leaf borrows from its left cousin",
      "leaf borrows from its right sibling",
      "leaf borrows from its right cousin",
      "leaf merges into its left sibling",
      "leaf merges with its right sibling",
      "the last leaf merges",
      "internal node borrows from its left sibling",
      "internal node borrows from its left cousin",
      "internal node borrows from its right sibling",
      "internal node borrows from its right cousin",
      "internal node merges into its left sibling",
      "internal node merges with its right sibling",
      "root collapse",
  };
  return kNames[static_cast<std::size_t>(repair)];
}

class RepairCounts {
 public:
  void Note(Repair repair) { ++m_counts[static_cast<std::size_t>(repair)]; }
  int Count(Repair repair) const { return m_counts[static_cast<std::size_t>(repair)]; }

  // The names of what was never reached, one a line.
  std::string Missing() const {
    std::string names;
    for (std::size_t i = 0; i < m_counts.size(); ++i) {
      if (m_counts[i] == 0) names += std::string(NameOf(static_cast<Repair>(i))) + '\n';
    }
    return names;
  }

 private:
  std::array<int, static_cast<std::size_t>(Repair::kCount)> m_counts{};
};

template <class Map>
class RepairCensus {
 public:
  RepairCensus(RecordingHost& host, const Map& map, RepairCounts& counts)
      : m_host(host), m_map(map), m_counts(counts) {}

  // Call after each operation that did something, with only its calls in the host's log.
  void AfterInsertion(const FieldId& key) {
    OID below;  // the last new node, whose separator goes up
    OID created;
    for (const Call& call : m_host.log().calls()) {
      if (call.m_operation == HostCall::kRegister) {
        below = created;
        created = call.m_object;
      } else if (call.m_operation == HostCall::kReach) {
        NoteNewNode(key, call.m_object, call.m_other, below);
      }
    }
  }

  void AfterDeletion() {
    std::vector<Call> calls;
    for (const Call& call : m_host.log().calls()) {
      if (call.m_operation <= HostCall::kInterrupted) calls.push_back(call);
    }
    if (calls.size() > 2) NoteLeafRepair(calls);
  }

 private:
  using InternalNode = typename Map::InternalNode;

  void Note(Repair repair) { m_counts.Note(repair); }
  void NoteIf(bool condition, Repair yes, Repair no) { Note(condition ? yes : no); }
  bool IsMap(OID id) const { return m_host.NameOf(id) == "map"; }
  bool IsLeaf(OID id) const { return m_host.NameOf(id).starts_with("leaf"); }
  const InternalNode* Internal(OID id) const { return m_host.template Find<InternalNode>(m_host.NameOf(id)); }

  static bool HasChild(const InternalNode* node, OID child) {
    for (ssize_t i = -1; i < node->m_numKeyEntrys; ++i) {
      if (node->ChildReference(i).m_oid == child) return true;
    }
    return false;
  }

  // `created` was declared reachable from `holder`; `below` is the node that was made just before it, if any.
  void NoteNewNode(const FieldId& key, OID holder, OID created, OID below) {
    if (IsMap(holder)) {
      if (IsLeaf(created)) return;  // the first leaf of the map
      if (m_map.m_height <= 3) {
        Note(static_cast<Repair>(static_cast<int>(Repair::kRootGrowthToHeight1) +
                                 static_cast<int>(m_map.m_height) - 1));
      }
    } else if (IsLeaf(created)) {
      const auto* leaf = m_map.find(key).m_leaf;
      NoteIf(leaf->m_persistObjState.m_oid == created, Repair::kLeafSplitRightHalf,
             Repair::kLeafSplitLeftHalf);
      if (m_map.m_lastLeaf.m_oid == created) Note(Repair::kLastLeafSplit);
    } else if (HasChild(Internal(holder), below)) {
      Note(Repair::kInternalSplitBelowTheMedian);
    } else {
      NoteIf(Internal(created)->m_ptr.m_oid == below, Repair::kInternalSplitAtTheMedian,
             Repair::kInternalSplitAboveTheMedian);
    }
  }

  // Calls 0 and 1 mark the leaf that lost its entry and the map.
  void NoteLeafRepair(const std::vector<Call>& calls) {
    const OID leaf = calls[0].m_object;
    if (calls[4].m_operation != HostCall::kDelete) {  // left, right, anchor
      const bool siblings = HasChild(Internal(calls[4].m_object), calls[2].m_object);
      if (calls[2].m_object == leaf) {
        NoteIf(siblings, Repair::kLeafBorrowsFromRightSibling, Repair::kLeafBorrowsFromRightCousin);
      } else {
        NoteIf(siblings, Repair::kLeafBorrowsFromLeftSibling, Repair::kLeafBorrowsFromLeftCousin);
      }
      return;
    }
    // The left leaf, the leaf or map behind the right one, the deletion of the right one.
    NoteIf(calls[4].m_object == leaf, Repair::kLeafMergesIntoLeftSibling,
           Repair::kLeafMergesWithRightSibling);
    if (IsMap(calls[3].m_object)) Note(Repair::kLastLeafMerges);
    NoteInternalRepairs(calls, 5);
  }

  // Call `i` marks an internal node that lost an entry.
  void NoteInternalRepairs(const std::vector<Call>& calls, std::size_t i) {
    while (i + 2 < calls.size()) {
      const OID node = calls[i].m_object;
      if (calls[i + 1].m_operation == HostCall::kDelete) {
        Note(Repair::kRootCollapse);
        return;
      }
      if (calls[i + 2].m_operation != HostCall::kDelete) {  // anchor, left, right
        const bool siblings = HasChild(Internal(calls[i + 1].m_object), calls[i + 2].m_object);
        if (calls[i + 2].m_object == node) {
          NoteIf(siblings, Repair::kInternalBorrowsFromRightSibling, Repair::kInternalBorrowsFromRightCousin);
        } else {
          NoteIf(siblings, Repair::kInternalBorrowsFromLeftSibling, Repair::kInternalBorrowsFromLeftCousin);
        }
        return;
      }
      NoteIf(calls[i + 2].m_object == node, Repair::kInternalMergesIntoLeftSibling,
             Repair::kInternalMergesWithRightSibling);
      i += 3;
    }
  }

  RecordingHost& m_host;
  const Map& m_map;
  RepairCounts& m_counts;
};

}  // namespace vemo::test
