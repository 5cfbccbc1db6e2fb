#include "store/commit_builder.h"

#include <algorithm>

#include "platform/error.h"
#include "store/decoded_object.h"
#include "store/envelope.h"
#include "vxUtils/Archive.h"

namespace vemo {

namespace {

class AppendingStream : public IOutputStream {
 public:
  explicit AppendingStream(Bytes& bytes) : m_bytes(bytes) {}
  void WriteStream(const void* bytes, ssize_t count) override {
    const auto* first = static_cast<const std::uint8_t*>(bytes);
    m_bytes.insert(m_bytes.end(), first, first + count);
  }

 private:
  Bytes& m_bytes;
};

class PrefCollector : public IPrefVisitor {
 public:
  void VisitPref(const prefbase& reference) override {
    if (reference) m_references.push_back(reference);
  }
  void VisitParentPref(const prefbase&) override {}
  std::vector<prefbase> m_references;
};

// Refuses references that must not be written.
class ReferenceCheck : public IObjectVisitor {
 public:
  ReferenceCheck(const View& view, const CSpace& space, const std::unordered_set<OID>& deletedIds, OID holder)
      : m_view(view), m_space(space), m_deletedIds(deletedIds), m_holder(holder) {}

  void VisitObject(ptr<const IObject>) override {}
  void VisitEvictableObject(const prefbase& reference) override {
    if (m_deletedIds.contains(reference.m_oid)) Refuse(reference, "which this transaction has deleted");
    if (reference.m_ptr.m_self == nullptr) {
      if (reference.m_ptr.m_table != &m_view) Refuse(reference, "read in another space or snapshot");
      return;
    }
    const ObjSysState& state = SysStateOf(reference.m_ptr);
    if (state.m_cspace != &m_space || state.GetFlag(kSnapshotFlag)) Refuse(reference, "of another space or snapshot");
  }

 private:
  [[noreturn]] void Refuse(const prefbase& reference, const std::string& reason) const {
    throw UsageError(m_view.Describe(m_holder, "",
                                     "it refers to object " + std::to_string(reference.m_oid.m_value) + ", " + reason +
                                         "; the commit is refused, abort the transaction"));
  }

  const View& m_view;
  const CSpace& m_space;
  const std::unordered_set<OID>& m_deletedIds;
  OID m_holder;
};

}  // namespace

std::vector<prefbase> OwnedReferences(ptr<const IPersistable> object) {
  PrefCollector collector;
  object.Table()->VisitPrefs(object.m_self, collector);
  return std::move(collector.m_references);
}

CommitBuilder::CommitBuilder(View& view, const CSpace& space, const std::unordered_set<OID>& newIds,
                             const std::unordered_set<OID>& deletedIds)
    : m_view(view), m_space(space), m_newIds(newIds), m_deletedIds(deletedIds) {
  m_batch.expectedGeneration = view.Generation();
}

void CommitBuilder::Reserve(std::size_t objects) {
  // Leaves take one kilobyte with short payloads and four with longer ones. What is not written to costs next to nothing.
  constexpr std::size_t kUsualRecordBytes = 2'048, kMostBytes = std::size_t{64} << 20;
  m_written.reserve(m_written.size() + objects);
  m_extents.reserve(m_extents.size() + objects);
  m_bytes.reserve(m_bytes.size() + std::min(objects * kUsualRecordBytes, kMostBytes));
}

void CommitBuilder::Add(OID oid, ptr<IPersistable> object) {
  std::vector<std::pair<OID, ptr<IPersistable>>> pending{{oid, object}};
  while (!pending.empty()) {
    const auto [id, current] = pending.back();
    pending.pop_back();
    const auto [written, isNew] = m_written.emplace(id, 0);
    if (!isNew) continue;
    ReferenceCheck check(m_view, m_space, m_deletedIds, id);
    current.Table()->_IObject.VisitObjects(current.m_self, check);
    Encode(id, current);
    written->second = Residents::Measure(current);  // now, while it is in the processor's cache
    for (const prefbase& reference : OwnedReferences(current)) {
      if (m_newIds.contains(reference.m_oid)) pending.emplace_back(reference.m_oid, m_view.Find(reference.m_oid));
    }
  }
}

void CommitBuilder::Encode(OID oid, ptr<IPersistable> object) {
  const std::size_t begin = m_bytes.size();
  BeginRecord(m_bytes, ClassNumber(*FindClass(object.Table())), m_batch.expectedGeneration + 1);
  AppendingStream stream(m_bytes);
  Archive archive(&stream);
  object.Table()->Serialise(object.m_self, archive);
  archive.Flush();
  SealRecord(m_bytes, begin, oid);
  m_extents.push_back({oid, begin, m_bytes.size()});
}

std::uint32_t CommitBuilder::ClassNumber(const ClassEntry& classEntry) {
  if (const std::uint32_t known = m_view.Classes().NumberOf(classEntry)) return known;
  const std::uint32_t added = m_view.Classes().Add(classEntry);
  m_batch.namedValues.push_back(m_view.Classes().StoredValue(added));
  return added;
}

void CommitBuilder::SweepQueue(std::size_t limit) {
  const EngineSnapshot& state = m_view.State();
  for (const OID oid : state.QueuedDeletions(limit)) {
    m_batch.finishedDeletions.push_back(oid);
    const std::optional<ByteView> record = state.Read(oid);
    if (!record) continue;
    m_batch.removedRecords.push_back(oid);
    try {
      const DecodedObject decoded(m_view.Decode(oid, *record));
      for (const prefbase& child : OwnedReferences(decoded.Get())) m_batch.queuedDeletions.push_back(child.m_oid);
    } catch (const CorruptRecord&) {
      continue;
    }
  }
}

CommitBatch& CommitBuilder::Finish() {
  m_batch.records.reserve(m_extents.size());
  for (const Extent& extent : m_extents) {
    m_batch.records.push_back({extent.oid, ByteView(m_bytes).subspan(extent.begin, extent.end - extent.begin)});
  }
  return m_batch;
}

}  // namespace vemo
