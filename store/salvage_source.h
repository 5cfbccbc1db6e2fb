// What can still be read of a damaged space, record by record: a part of salvage.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "store/id_set.h"
#include "store/raw_record.h"

namespace vemo {

// A record that is sound by itself.
// To be moved, not copied: `body` has views into `bytes`.
struct SoundRecord {
  RawClass rawClass;
  std::uint64_t commit = 0;
  RawBody body;
  Bytes bytes;  // of the record, since those that the engine shows end with its next answer
};

class SalvageSource {
 public:
  explicit SalvageSource(const EngineSnapshot& state) : m_state(state), m_classes(state) {}

  const EngineSnapshot& state() const noexcept { return m_state; }
  RawClassTable& classes() noexcept { return m_classes; }

  // Reads all records once. Afterwards the functions below can be asked.
  void Survey();

  // Records that are there and cannot be used: id and fault, in order of ids. A null id stands for what the engine said.
  struct Damaged {
    OID oid;
    std::string fault;
  };
  const std::vector<Damaged>& damaged() const noexcept { return m_damaged; }
  // The ids of all sound records of maps, ascending.
  const std::vector<OID>& maps() const noexcept { return m_maps; }
  // The largest id of a record, sound or not.
  OID largestId() const noexcept { return m_largestId; }
  std::uint64_t NumLeaves() const noexcept { return m_leaves; }

  // The record of `oid` if it is sound; else why not.
  std::optional<SoundRecord> Read(OID oid, std::string* fault = nullptr) const;
  // The same for a record of that class.
  std::optional<SoundRecord> ReadAs(OID oid, const RawClass& rawClass, std::string* fault = nullptr) const;

  // What a damaged record of a map says, where it still reads as one: not to be trusted, but to be compared with what was found.
  // A record that is sound under another id tells nothing. Costs a checksum for each id of the space.
  std::optional<RawBody> RemainsOfMap(OID oid, RawFamily family) const;

  // A leaf that names a lost one as its neighbour, left or right, so that a walk along the chain can step over it; null if no
  // leaf does. What awaits deletion has such neighbours by right, and is left out.
  OID LeafAfter(OID lost) const { return Lookup(m_leafAfter, lost); }
  OID LeafBefore(OID lost) const { return Lookup(m_leafBefore, lost); }
  // Whether the object is queued for deletion, hangs below one that is, or is a leaf of the same chain as one that does.
  bool IsAwaitingDeletion(OID oid) const noexcept { return m_awaitingDeletion.Contains(oid); }
  // False where the queue, or a record in or below it, cannot be read: what hangs there is then not known to await deletion.
  bool KnowsAllDeletions() const noexcept { return m_knowsAllDeletions; }

  // The leaves without a readable one before them, ascending: where chains begin.
  const std::vector<OID>& heads() const noexcept { return m_heads; }

 private:
  static OID Lookup(const std::unordered_map<OID, OID>& table, OID oid) {
    const auto found = table.find(oid);
    return found == table.end() ? OID() : found->second;
  }

  SoundRecord Open(OID oid, ByteView record) const;
  SoundRecord OpenLeafOfUnknownClass(const RawEnvelope& envelope) const;
  void ReadQueue();
  bool IsChained(OID leaf, OID neighbour) const;
  void FindBreaks();
  bool IsLeaf(OID oid) const { return m_soundLeaves.Contains(oid); }

  const EngineSnapshot& m_state;
  RawClassTable m_classes;
  std::vector<Damaged> m_damaged;
  std::vector<OID> m_maps;
  std::vector<OID> m_heads;
  IdSet m_soundLeaves;
  IdSet m_awaitingDeletion;
  std::unordered_map<OID, OID> m_leafAfter;  // as many as there are lost leaves
  std::unordered_map<OID, OID> m_leafBefore;
  std::uint64_t m_leaves = 0;
  bool m_knowsAllDeletions = true;
  OID m_largestId;
};

}  // namespace vemo
