#include "store/salvage_source.h"

#include <utility>

#include "store/tolerant_scan.h"

namespace vemo {

void SalvageSource::Survey() {
  ScanReadableRecords(
      m_state,
      [this](OID oid, ByteView bytes) {
        m_largestId = oid;
        try {
          const SoundRecord record = Open(oid, bytes);
          if (record.rawClass.kind == RawKind::kMap) m_maps.push_back(oid);
          if (record.rawClass.kind == RawKind::kLeaf) m_soundLeaves.Insert(oid);
        } catch (const RawFault& fault) {
          m_damaged.push_back({oid, fault.what()});
        }
      },
      [this](OID oid, const std::string& fault) {
        m_damaged.push_back({OID(), "the records from object " + std::to_string(oid.m_value) + " on: " + fault});
      });
  m_leaves = m_soundLeaves.size();
  ReadQueue();
  FindBreaks();
}

// A leaf in use names leaves in use alone, so whatever is chained to one that awaits deletion awaits it too. That finds the leaves
// below a queued node that cannot be read, where a leaf beside them hangs below another.
void SalvageSource::ReadQueue() {
  std::vector<OID> pending;
  try {
    pending = m_state.QueuedDeletions(SIZE_MAX);
  } catch (const StoreError& error) {
    m_damaged.push_back({OID(), std::string("the queue of deletions: ") + error.what()});
    m_knowsAllDeletions = false;
  }
  while (!pending.empty()) {
    const OID oid = pending.back();
    pending.pop_back();
    if (!m_awaitingDeletion.Insert(oid)) continue;
    std::string fault;
    if (!ReadOrFault(m_state, oid, fault) && fault.empty()) continue;  // it has left already
    const std::optional<SoundRecord> record = Read(oid);
    if (!record) {
      m_knowsAllDeletions = false;
      continue;
    }
    pending.insert(pending.end(), record->body.children.begin(), record->body.children.end());
    if (!record->body.root.IsNull()) pending.push_back(record->body.root);
    for (const OID neighbour : {record->body.previous, record->body.next}) {
      if (IsLeaf(neighbour) && IsChained(neighbour, oid)) pending.push_back(neighbour);
    }
  }
}

// A leaf that was merged away names neighbours that have forgotten it.
bool SalvageSource::IsChained(OID leaf, OID neighbour) const {
  const std::optional<SoundRecord> record = Read(leaf);
  return record && (record->body.previous == neighbour || record->body.next == neighbour);
}

void SalvageSource::FindBreaks() {
  ScanReadableRecords(
      m_state,
      [this](OID oid, ByteView) {
        if (!IsLeaf(oid) || m_awaitingDeletion.Contains(oid)) return;
        const std::optional<SoundRecord> leaf = Read(oid);
        if (!leaf) return;
        const auto [previous, next] = std::pair(leaf->body.previous, leaf->body.next);
        if (!previous.IsNull() && !IsLeaf(previous)) m_leafAfter.emplace(previous, oid);
        if (!next.IsNull() && !IsLeaf(next)) m_leafBefore.emplace(next, oid);
        if (previous.IsNull() || !IsLeaf(previous)) m_heads.push_back(oid);
      },
      [](OID, const std::string&) {});
}

std::optional<SoundRecord> SalvageSource::Read(OID oid, std::string* fault) const {
  std::string ignored;
  std::string& why = fault == nullptr ? ignored : *fault;
  why = "there is no record of it";
  const std::optional<ByteView> bytes = ReadOrFault(m_state, oid, why);
  if (!bytes) return std::nullopt;
  try {
    Bytes own(bytes->begin(), bytes->end());
    SoundRecord record = Open(oid, own);
    record.bytes = std::move(own);
    return record;
  } catch (const RawFault& malformed) {
    why = malformed.what();
    return std::nullopt;
  }
}

std::optional<RawBody> SalvageSource::RemainsOfMap(OID oid, RawFamily family) const {
  std::string ignored;
  const std::optional<ByteView> bytes = ReadOrFault(m_state, oid, ignored);
  if (!bytes) return std::nullopt;
  for (OID other(1); !(m_largestId < other); other = OID(other.m_value + 1)) {
    if (IsSealedFor(*bytes, other)) return std::nullopt;
  }
  try {
    const RawEnvelope envelope = ReadRemainsOfRecord(*bytes);
    const RawClass wanted{family, RawKind::kMap};
    if (m_classes.Find(envelope.classNumber).value_or(wanted) != wanted) return std::nullopt;
    return ReadRawBody(envelope.body, wanted);
  } catch (const RawFault&) {
    return std::nullopt;
  }
}

std::optional<SoundRecord> SalvageSource::ReadAs(OID oid, const RawClass& rawClass, std::string* fault) const {
  std::optional<SoundRecord> record = Read(oid, fault);
  if (!record || record->rawClass == rawClass) return record;
  if (fault != nullptr) *fault = "it is a " + RawClassName(record->rawClass) + ", not a " + RawClassName(rawClass);
  return std::nullopt;
}

SoundRecord SalvageSource::Open(OID oid, ByteView bytes) const {
  const RawEnvelope envelope = OpenRawRecord(bytes, oid);
  const std::optional<RawClass> rawClass = m_classes.Find(envelope.classNumber);
  if (!rawClass) return OpenLeafOfUnknownClass(envelope);
  return {*rawClass, envelope.commit, ReadRawBody(envelope.body, *rawClass), {}};
}

// Where the table of classes is damaged: the payloads of the three maps differ, so a leaf is mostly of the one class as which it
// can be read.
SoundRecord SalvageSource::OpenLeafOfUnknownClass(const RawEnvelope& envelope) const {
  std::vector<SoundRecord> readings;
  for (const RawFamily family : {RawFamily::kInsertions, RawFamily::kTombstones, RawFamily::kInsertionsAndDeletions}) {
    try {
      const RawClass rawClass{family, RawKind::kLeaf};
      readings.push_back({rawClass, envelope.commit, ReadRawBody(envelope.body, rawClass), {}});
    } catch (const RawFault&) {
      continue;
    }
  }
  if (readings.size() != 1) throw RawFault(1, "no class of the number " + std::to_string(envelope.classNumber) + " is known");
  return std::move(readings.front());
}

}  // namespace vemo
