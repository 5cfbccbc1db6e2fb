#include "store/object_changes.h"

#include <algorithm>

#include "store/commit_builder.h"
#include "store/space.h"

namespace vemo {

void ObjectChanges::RequireOwn(ptr<const IPersistable> object) const {
  const ObjSysState& state = SysStateOf(object);
  const OID oid = PersistStateOf(object).m_oid;
  const char* reason = nullptr;
  if (state.m_cspace != &m_space || state.GetFlag(kSnapshotFlag)) {
    reason = "it belongs to another space or to a snapshot";
  } else if (state.GetFlag(kDeletedFlag)) {
    reason = "it was deleted in this transaction and cannot be changed any more";
  } else if (oid.IsNull()) {
    reason = "this root was never committed or is gone; ask the transaction for it by name again";
  }
  if (reason != nullptr) throw UsageError(m_view.Describe(oid, "", reason));
}

void ObjectChanges::TakeNew(OID oid, ptr<IPersistable> object) {
  m_new.insert(oid);
  try {
    m_view.Adopt(oid, object);
  } catch (...) {
    m_new.erase(oid);
    throw;
  }
}

void ObjectChanges::MarkDirty(ptr<const IPersistable> object) {
  RequireOwn(object);
  m_dirty.emplace(PersistStateOf(object).m_oid, ptr<IPersistable>(object.m_self, object.Table()));
  SysStateOf(object).SetFlag(ObjSysState::kDirtyFlag);
  m_view.MarkedDirty(PersistStateOf(object).m_oid);
}

void ObjectChanges::Delete(ptr<IPersistable> object) {
  RequireOwn(object);
  const OID oid = PersistStateOf(object).m_oid;
  m_deletedIds.insert(oid);
  m_deleted.push_back({oid, object, !m_new.contains(oid)});  // the last step that can throw
  m_new.erase(oid);
  m_dirty.erase(oid);
  m_view.Release(oid);
  ObjSysState& state = SysStateOf(object);
  state.ClearFlag(ObjSysState::kDirtyFlag);
  state.SetFlag(kDeletedFlag);
}

bool ObjectChanges::HasDirtyNodes() const noexcept {
  return std::any_of(m_dirty.begin(), m_dirty.end(), [](const auto& entry) { return !FindClass(entry.second.Table())->isMap; });
}

void ObjectChanges::AddDirtyTo(CommitBuilder& builder) const {
  for (const auto& [oid, object] : m_dirty) {
    if (!m_new.contains(oid)) builder.Add(oid, object);
  }
}

void ObjectChanges::AddRemovedTo(CommitBatch& batch) const {
  for (const Deleted& deleted : m_deleted) {
    if (deleted.hasRecord) batch.removedRecords.push_back(deleted.oid);
  }
  batch.removedRecords.insert(batch.removedRecords.end(), m_droppedRecords.begin(), m_droppedRecords.end());
  batch.queuedDeletions.insert(batch.queuedDeletions.end(), m_queuedDeletions.begin(), m_queuedDeletions.end());
}

void ObjectChanges::Committed(std::uint64_t generation, const std::unordered_map<OID, std::size_t>& written) noexcept {
  for (const auto& [oid, object] : m_dirty) SysStateOf(object).ClearFlag(ObjSysState::kDirtyFlag);
  for (const OID oid : m_new) {
    if (written.contains(oid)) continue;
    const ptr<IPersistable> unreached = m_view.Find(oid);
    m_view.Release(oid);
    DestroyObject(unreached);
  }
  for (const auto& [oid, bytes] : written) m_view.Written(oid, generation, bytes);
  m_dirty.clear();
  m_new.clear();
}

void ObjectChanges::EndDeleted() noexcept {
  for (const Deleted& deleted : m_deleted) DestroyObject(deleted.object);
  m_deleted.clear();
}

}  // namespace vemo
