// Walking what is left of the maps of a damaged space: a part of salvage.
#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "store/id_set.h"
#include "store/salvage.h"
#include "store/salvage_sink.h"
#include "store/salvage_source.h"

namespace vemo {

// Leaves that name one another, from one without a readable leaf before it on.
struct LeafChain {
  OID head, tail;
  RawFamily family = RawFamily::kInsertions;
  std::uint64_t commit = 0;  // the newest that wrote one of the leaves
  std::optional<FieldId> first, last;  // keys; nothing where there are no entries
  bool hasFirstLeaf = false, hasLastLeaf = false;  // of its tree, which has one of each
  bool isSaved = false;
};

// Every leaf is copied once, whoever leads to it first.
class SalvageMapWalk {
 public:
  SalvageMapWalk(const SalvageSource& source, SalvageSink& sink, SalvageReport& report,
                 std::function<void(std::uint64_t, std::uint64_t)> progress)
      : m_source(source), m_sink(sink), m_report(report), m_progress(std::move(progress)) {}

  // False when the object was claimed before.
  bool Claim(OID oid) { return m_claimed.Insert(oid); }
  void Forget(OID oid) { m_claimed.Erase(oid); }

  // Copies the tree of a map whose own record is sound. The sink has the map open.
  void SaveTree(const std::string& root, OID oid, RawFamily family, const RawBody& map);
  // Looks among the leaves that nothing led to for those that fit into the holes of the trees that were walked, and copies them.
  // Where it is not known which leaves await deletion, they are not copied but returned.
  std::vector<LeafChain> FillGaps();

  // The chains of the leaves that nothing has led to.
  std::vector<LeafChain> FindChains() const;
  // Copies the chains whose ends are those that the remains of a map's record name, and then those that can be parts of the same
  // tree.
  void SaveChains(const std::string& root, RawFamily family, const RawBody& remains, std::vector<LeafChain>& chains);
  void SaveChain(const std::string& root, const LeafChain& chain);

  std::uint64_t NumLeavesLeft() const noexcept { return m_source.NumLeaves() - m_leaves; }

 private:
  using Key = std::optional<FieldId>;
  // Part of a tree that could not be walked: keys in [low, high), nothing is unbounded.
  struct Gap {
    std::string root;
    OID map;
    RawFamily family = RawFamily::kInsertions;
    Key low, high;
  };

  void Walk(OID oid, std::uint32_t height, const Key& low, const Key& high);
  void WalkHole(const Key& low, const Key& high);
  bool FollowRight(const Key& high);
  void FollowLeft(OID from, const Key& low);
  void CloseGap(OID rightNeighbour);
  std::optional<SoundRecord> ClaimLeaf(OID oid, std::string* fault = nullptr);
  void Copy(const SoundRecord& leaf);
  void Lose(OID oid, const Key& low, const Key& high, const std::string& what);

  const SalvageSource& m_source;
  SalvageSink& m_sink;
  SalvageReport& m_report;
  std::function<void(std::uint64_t, std::uint64_t)> m_progress;
  IdSet m_claimed;
  IdSet m_listed;  // lost objects that a loss names
  std::vector<Gap> m_gaps;
  std::uint64_t m_leaves = 0;

  // The map that is being walked.
  std::string m_root;
  OID m_map;
  RawFamily m_family = RawFamily::kInsertions;
  OID m_nextLeaf;          // where the chain goes on behind the last leaf; may be lost, null where that is not known
  Key m_lastKey;
  std::optional<Gap> m_openGap;  // reached from its left side only
};

}  // namespace vemo
