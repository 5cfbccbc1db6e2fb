// The objects that the open transaction has made, marked and deleted.
#pragma once

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <unordered_map>
#include <unordered_set>
#include <vector>

#include "store/view.h"

namespace vemo {

class CommitBuilder;

// The objects are those of the writer's view. Throws UsageError for an object that this transaction may not change.
class ObjectChanges {
 public:
  ObjectChanges(const CSpace& space, View& view) noexcept : m_space(space), m_view(view) {}

  void RequireOwn(ptr<const IPersistable> object) const;

  // Takes an object in that was just made. Where it throws, the object is still the caller's.
  void TakeNew(OID oid, ptr<IPersistable> object);
  void MarkDirty(ptr<const IPersistable> object);
  // A root map is gone, and so is what was to be written of it.
  void Unmark(OID oid) noexcept { m_dirty.erase(oid); }
  // Takes an object out of the space: at once out of what a commit writes, out of memory when the transaction ends.
  void Delete(ptr<IPersistable> object);
  // Has the commit queue a subtree of which nothing is in memory; later ones delete it a slice at a time.
  void QueueDeletion(OID oid) { m_queuedDeletions.push_back(oid); }
  // The commit removes the record of an object that is not in memory.
  void DropRecord(OID oid) { m_droppedRecords.push_back(oid); }

  bool IsDeleted(OID oid) const noexcept { return m_deletedIds.contains(oid); }
  // Whether a node, and not only a root map, has changed. Linear in what has changed.
  bool HasDirtyNodes() const noexcept;
  // Whether what is in memory may differ from what is stored.
  bool IsEmpty() const noexcept { return m_dirty.empty() && m_new.empty() && m_deletedIds.empty(); }

  // Have no record yet.
  const std::unordered_set<OID>& NewIds() const noexcept { return m_new; }
  const std::unordered_set<OID>& DeletedIds() const noexcept { return m_deletedIds; }

  // How many objects a commit writes, to within a factor of two: new ones may be marked as well.
  std::size_t CountWritten() const noexcept { return std::max(m_dirty.size(), m_new.size()); }
  // Every dirty object that has a record, and what is new below it.
  void AddDirtyTo(CommitBuilder& builder) const;
  void AddRemovedTo(CommitBatch& batch) const;

  // The engine has said yes: what was written is clean, and what no root reaches is dropped.
  void Committed(std::uint64_t generation, const std::unordered_map<OID, std::size_t>& written) noexcept;
  // Ends what was deleted.
  void EndDeleted() noexcept;

 private:
  struct Deleted {
    OID oid;
    ptr<IPersistable> object;
    bool hasRecord;
  };

  const CSpace& m_space;
  View& m_view;
  std::unordered_map<OID, ptr<IPersistable>> m_dirty;  // flagged; new objects among them
  std::unordered_set<OID> m_new;
  std::vector<Deleted> m_deleted;                      // in memory until the transaction ends
  std::unordered_set<OID> m_deletedIds;
  std::vector<OID> m_queuedDeletions;
  std::vector<OID> m_droppedRecords;
};

}  // namespace vemo
