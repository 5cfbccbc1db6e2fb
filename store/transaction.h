// The one transaction that may change a space.
#pragma once

#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <unordered_set>
#include <vector>

#include "store/meta.h"
#include "store/names.h"
#include "store/object_changes.h"
#include "store/root_changes.h"
#include "store/space.h"
#include "vxPersistStore/pref.h"

namespace vemo {

class CommitBuilder;

// Holds the writer lock of its space, in this process and across processes, from the constructor until Commit or the
// destructor, which aborts. Used by the thread that opened it, which a UsageError reminds another one of; a thread has at most
// one open.
//
// Lifetimes: a root map keeps its address as long as the space is open; iterators and payload pointers end with the
// transaction. Nodes of a map on the stack belong to the transaction that was open when they were made: what no root
// reaches by the end is dropped, and the map must not be used any longer.
class WriteTransaction {
 public:
  // Throws SpaceBusy when another transaction, of this process or another, does not end within the writer time-out, and
  // UsageError when this thread has a transaction open.
  explicit WriteTransaction(CSpace& space);
  // Aborts unless committed: memory and disk are as after the last commit. Never throws.
  ~WriteTransaction();
  WriteTransaction(const WriteTransaction&) = delete;
  WriteTransaction& operator=(const WriteTransaction&) = delete;

  // The root map of that name (1 to 400 bytes, not starting with a zero byte), made empty if the space has none. Throws
  // UsageError when it is of another class.
  template <class Map>
  Map& Root(std::string_view name) {
    return *static_cast<Map*>(FindOrMakeRoot(name, IPersistable::Stubs<Map>::GetTable()));
  }

  // The same for reading alone: a constant map, so that nothing is marked. Throws UsageError when there is none.
  template <class Map>
  const Map& View(std::string_view name) {
    return *static_cast<const Map*>(FindExistingRoot(name, IPersistable::Stubs<Map>::GetTable()));
  }

  // Named roots, those of this transaction included, in order.
  std::vector<std::string> RootNames() const;
  // The map keeps its address, and every reference to it stays good. Throws UsageError when there is no root `from`, or one
  // of the name `to`.
  void RenameRoot(std::string_view from, std::string_view to);
  // Deletes the map with all it holds, as clear() does, and its name. Throws UsageError when there is none.
  void DeleteRoot(std::string_view name);

  // A root map without a name, known by its id: for maps that live longer than a transaction and are not to be found by
  // name. Disown deletes it with all it holds.
  template <class Map>
  Map& Own() {
    return *static_cast<Map*>(MakeOwnedRoot(IPersistable::Stubs<Map>::GetTable()));
  }
  template <class Map>
  Map& Owned(OID oid) {
    return *static_cast<Map*>(FindExistingRoot(OwnedRootName(oid), IPersistable::Stubs<Map>::GetTable()));
  }
  template <class Map>
  void Disown(Map& map) {
    DeleteRootObject(OwnedRootName(RequireOwnedRoot(ptr<const IPersistable>(&map))));
  }

  // Small named values of the user's own, committed with everything else. Names have 1 to 400 bytes.
  void SetMeta(std::string_view name, std::string_view value);
  void EraseMeta(std::string_view name);
  std::optional<std::string> Meta(std::string_view name) const;
  // Calls `visit` with each name that starts with `prefix`, in order, and its value, until it returns false.
  void ScanMeta(std::string_view prefix,
                const std::function<bool(std::string_view name, std::string_view value)>& visit) const;

  // Writes what changed as one atomic, durable commit, and ends the transaction. Throws PoisonedTransaction when a change
  // was interrupted half-way, UsageError when an object refers to a deleted one or into another space, and StoreError
  // when the engine fails; the transaction then stays open, to be tried again or aborted. Throws UnknownOutcome where
  // even reading the space back does not tell whether the commit was made; the transaction can then only be ended, and
  // the next one shows the truth. Costs a record per changed object.
  void Commit();

  // The objects that a commit would write now, and the size of their records as they would be: for a look before committing.
  // Costs encoding them.
  struct DirtySize {
    std::uint64_t objects = 0;
    std::uint64_t bytes = 0;
  };
  DirtySize Dirty() const;

  // Has loaded nodes leave memory where those that the transaction has not changed take more than its share of
  // SpaceOptions::cacheBytes, as its beginning and its end do too. Ends iterators and payload pointers where it returns true,
  // and maps on the stack that have taken over nodes of the space; root maps keep their address. Changed and new nodes stay
  // until the commit. Costs a visit of all nodes in memory where it does anything, at most once for each tenth of the share
  // that was loaded. Without a budget it does nothing.
  bool Trim() { return TrimTo(m_space.Allowance()); }
  // The same, down to `bytes` instead; 0 has all unchanged nodes leave.
  bool TrimTo(std::size_t bytes);
  // Whether Trim would do anything. Cheap.
  bool IsOverAllowance() const noexcept { return m_space.m_writerView.EvictableBytes() > m_space.Allowance(); }

  bool IsPoisoned() const noexcept { return m_poisoned; }

  // The objects that the transaction reads and changes.
  vemo::View& Objects() noexcept { return m_space.m_writerView; }

  // Of the host's side:
  static bool IsOpenOnThisThread(const CSpace& space) noexcept;
  static WriteTransaction* OnThisThread() noexcept;
  void TakeNewObject(ptr<IPersistable> object);
  void MarkDirty(ptr<const IPersistable> object);
  void DeleteObject(ptr<IPersistable> object);
  void DeleteSubTree(ptr<IPersistable> root);
  void CheckReachable(ptr<const IPersistable> from, ptr<const IPersistable> to) const;
  void Poison() noexcept { m_poisoned = true; }

  // Of collection's side (store/collect.h):
  // The commit that the transaction began with.
  const EngineSnapshot& BaseState() const;
  // The commit removes the record of an object that nothing reaches, and the object itself where it is in memory.
  void DropUnreachable(OID oid);
  // How many entries of the queue of deletions the commit works off at most.
  void SetQueueSlice(std::size_t limit) noexcept { m_queueSlice = limit; }

  // Of salvage's side (store/salvage.h): ids given out from now on are higher than `last`, and an owned map is made that has
  // the id which it had in another space. Throws UsageError when there is an object of that id.
  void ReserveIdsUpTo(OID last);
  template <class Map>
  Map& RestoreOwned(OID oid) {
    return *static_cast<Map*>(RestoreOwnedRoot(oid, IPersistable::Stubs<Map>::GetTable()));
  }

 private:
  void* FindOrMakeRoot(std::string_view name, const IPersistable::FnTable* table);
  void* FindExistingRoot(std::string_view name, const IPersistable::FnTable* table);
  void* MakeOwnedRoot(const IPersistable::FnTable* table);
  void* RestoreOwnedRoot(OID oid, const IPersistable::FnTable* table);
  OID RequireOwnedRoot(ptr<const IPersistable> map);
  void DeleteRootObject(const std::string& name);

  bool HasChanges() const noexcept;
  void AddChanged(CommitBuilder& builder) const;
  void Reattach() noexcept;
  void AfterCommit(std::uint64_t generation, const std::unordered_map<OID, std::size_t>& written) noexcept;
  void Finish() noexcept;
  void RequireOpen() const;
  void RequireThisProcess() const;

  CSpace& m_space;
  UseCheck m_use;
  std::unique_lock<std::timed_mutex> m_processLock;
  std::unique_ptr<WriterLock> m_engineLock;
  bool m_open = false;
  bool m_poisoned = false;

  // No commit shall pay for a large map that was cleared before it.
  std::size_t m_queueSlice = 256;
  ObjectChanges m_objects;
  RootChanges m_roots;
  MetaChanges m_meta;
};

}  // namespace vemo
