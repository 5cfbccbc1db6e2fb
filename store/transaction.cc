#include "store/transaction.h"

#include <utility>

#include "platform/assertion.h"
#include "platform/error.h"
#include "store/commit_builder.h"
#include "store/commit_outcome.h"
#include "store/names.h"
#include "store/root_value.h"
#include "store/subtree_deletion.h"

namespace vemo {

namespace {

thread_local WriteTransaction* t_transaction = nullptr;

const ClassEntry& MapClass(const IPersistable::FnTable* table) {
  const ClassEntry* entry = FindClass(table);
  if (entry == nullptr || !entry->isMap) throw UsageError("only the three maps can be roots of a space");
  return *entry;
}

}  // namespace

WriteTransaction* WriteTransaction::OnThisThread() noexcept { return t_transaction; }

bool WriteTransaction::IsOpenOnThisThread(const CSpace& space) noexcept {
  return t_transaction != nullptr && &t_transaction->m_space == &space;
}

WriteTransaction::WriteTransaction(CSpace& space)
    : m_space(space), m_objects(space, space.m_writerView), m_roots(space.m_writerView, space.Name()) {
  space.RequireThisProcess();
  if (t_transaction != nullptr) {
    throw UsageError(space.Name() + ": this thread has a transaction open; commit or end it before opening another");
  }
  m_processLock = std::unique_lock(space.m_writerMutex, space.m_options.writerTimeout);
  if (!m_processLock.owns_lock()) {
    throw SpaceBusy(space.Name() + ": another thread's transaction is still open; try again");
  }
  m_engineLock = space.m_engine->LockWriter(space.m_options.writerTimeout);
  vemo::View& view = space.m_writerView;
  m_use.BindToThisThread();
  view.Use().BindToThisThread();
  try {
    if (space.m_disturbed.exchange(false)) view.ForgetResidents();
    view.Attach(space.m_engine->OpenSnapshot());
  } catch (...) {
    view.Detach();  // an open state would keep the engine from growing
    view.Use().Unbind();
    throw;
  }
  space.TrimWriter();
  m_open = true;
  t_transaction = this;
}

WriteTransaction::~WriteTransaction() {
  if (!m_open) return;
  vemo::View& view = m_space.m_writerView;
  if (!m_use.IsOfThisProcess()) {
    view.ForgetResidents();  // the copy in this process; the transaction goes on in the parent
    Finish();
    return;
  }
  VEMO_ASSERT_TEXT(t_transaction == this, "a transaction ends on the thread that opened it");
  if (HasChanges()) {
    view.ForgetResidents();
    try {
      m_roots.UndoRenames();
      view.Roots().Reload();
    } catch (const std::exception&) {
      // The roots stay stale, and the next transaction reads them or throws.
    }
  }
  Finish();
}

bool WriteTransaction::HasChanges() const noexcept {
  if (m_space.m_disturbed.exchange(false)) return true;
  if (m_poisoned || !m_objects.IsEmpty() || m_roots.HasRemoved()) return true;
  for (const auto& [name, root] : m_space.m_writerView.Roots().All()) {
    if (!root.committed && !root.oid.IsNull()) return true;
  }
  return false;
}

// Ends what is on the way out and lets go of the locks.
void WriteTransaction::Finish() noexcept {
  m_objects.EndDeleted();
  m_space.TrimWriter();
  m_space.m_writerView.Detach();
  m_space.m_writerView.Use().Unbind();
  m_open = false;
  t_transaction = nullptr;
  m_engineLock.reset();
  m_processLock.unlock();
}

bool WriteTransaction::TrimTo(std::size_t bytes) {
  RequireOpen();
  return m_space.m_writerView.Trim(bytes);
}

void WriteTransaction::RequireOpen() const {
  m_use.RequireThisThread(m_space.Name(), "the transaction");
  if (!m_open) throw UsageError(m_space.Name() + ": the transaction has ended; open another");
}

// --- Roots ---

void* WriteTransaction::FindExistingRoot(std::string_view name, const IPersistable::FnTable* table) {
  RequireOpen();
  return m_roots.RequireOfClass(name, MapClass(table)).map.m_self;
}

void* WriteTransaction::FindOrMakeRoot(std::string_view name, const IPersistable::FnTable* table) {
  RequireOpen();
  CheckRootName(name);
  const ClassEntry& classEntry = MapClass(table);
  if (const RootMaps::Root* root = m_roots.FindOfClass(name, classEntry)) return root->map.m_self;
  return m_space.m_writerView.Roots().Add(name, classEntry, m_space.NextId()).map.m_self;
}

void* WriteTransaction::MakeOwnedRoot(const IPersistable::FnTable* table) {
  RequireOpen();
  const OID oid = m_space.NextId();
  return m_space.m_writerView.Roots().Add(OwnedRootName(oid), MapClass(table), oid).map.m_self;
}

void WriteTransaction::ReserveIdsUpTo(OID last) {
  RequireOpen();
  const OID first = m_space.m_engine->ReserveIds(1);
  if (first < last || first == last) m_space.m_engine->ReserveIds(last.m_value - first.m_value + 1);
  m_space.m_nextId = m_space.m_idLimit;  // the range that is open lies below
}

void* WriteTransaction::RestoreOwnedRoot(OID oid, const IPersistable::FnTable* table) {
  RequireOpen();
  if (m_roots.Find(OwnedRootName(oid)) != nullptr || m_space.m_writerView.State().Read(oid)) {
    throw UsageError(m_space.m_writerView.Describe(oid, "", "the space has an object of that id already"));
  }
  return m_space.m_writerView.Roots().Add(OwnedRootName(oid), MapClass(table), oid).map.m_self;
}

OID WriteTransaction::RequireOwnedRoot(ptr<const IPersistable> map) {
  RequireOpen();
  m_objects.RequireOwn(map);
  const OID oid = PersistStateOf(map).m_oid;
  if (m_space.m_writerView.Roots().Find(OwnedRootName(oid)) == nullptr) {
    throw UsageError(m_space.m_writerView.Describe(oid, "", "it is a root with a name, not a map that was made by Own"));
  }
  return oid;
}

std::vector<std::string> WriteTransaction::RootNames() const {
  RequireOpen();
  return m_roots.Names();
}

void WriteTransaction::RenameRoot(std::string_view from, std::string_view to) {
  RequireOpen();
  CheckRootName(to);
  m_roots.Rename(from, to);
}

void WriteTransaction::DeleteRoot(std::string_view name) {
  RequireOpen();
  CheckRootName(name);
  DeleteRootObject(std::string(name));
}

void WriteTransaction::DeleteRootObject(const std::string& name) {
  RootMaps::Root& root = m_roots.Require(name);
  const OID oid = root.oid;
  try {
    for (const prefbase& child : OwnedReferences(root.map)) DeleteSubTree(child.Get());
    m_roots.Remove(name, root);
  } catch (...) {
    m_poisoned = true;
    throw;
  }
  m_objects.Unmark(oid);
}

// --- Meta ---

void WriteTransaction::SetMeta(std::string_view name, std::string_view value) {
  RequireOpen();
  CheckMetaName(name);
  m_meta.Set(name, value);
}

void WriteTransaction::EraseMeta(std::string_view name) {
  RequireOpen();
  CheckMetaName(name);
  m_meta.Erase(name);
}

std::optional<std::string> WriteTransaction::Meta(std::string_view name) const {
  RequireOpen();
  if (const std::optional<std::string>* changed = m_meta.Find(name)) return *changed;
  return ReadMeta(m_space.m_writerView.State(), m_space.Name(), name);
}

void WriteTransaction::ScanMeta(std::string_view prefix,
                                const std::function<bool(std::string_view, std::string_view)>& visit) const {
  RequireOpen();
  m_meta.Scan(m_space.m_writerView.State(), m_space.Name(), prefix, visit);
}

// --- What the module tells the store ---

void WriteTransaction::RequireThisProcess() const { m_use.RequireThisProcess(m_space.Name(), "the transaction"); }

void WriteTransaction::TakeNewObject(ptr<IPersistable> object) {
  try {
    RequireThisProcess();
    m_objects.TakeNew(m_space.NextId(), object);
  } catch (...) {
    DestroyObject(object);
    throw;
  }
}

void WriteTransaction::MarkDirty(ptr<const IPersistable> object) {
  RequireThisProcess();
  m_objects.MarkDirty(object);
}

void WriteTransaction::CheckReachable(ptr<const IPersistable> from, ptr<const IPersistable> to) const {
  RequireThisProcess();
  if (SysStateOf(from).m_cspace != nullptr) m_objects.RequireOwn(from);
  m_objects.RequireOwn(to);
}

void WriteTransaction::DeleteObject(ptr<IPersistable> object) {
  RequireThisProcess();
  m_objects.Delete(object);
}

void WriteTransaction::DeleteSubTree(ptr<IPersistable> root) {
  RequireThisProcess();
  vemo::DeleteSubTree(m_space.m_writerView, m_objects, root);
}

// --- Collection ---

const EngineSnapshot& WriteTransaction::BaseState() const {
  RequireOpen();
  return m_space.m_writerView.State();
}

void WriteTransaction::DropUnreachable(OID oid) {
  RequireOpen();
  if (const ptr<IPersistable> resident = m_space.m_writerView.Find(oid); resident.m_self != nullptr) {
    m_objects.Delete(resident);
  } else {
    m_objects.DropRecord(oid);
  }
}

// --- Commit ---

void WriteTransaction::Commit() {
  RequireOpen();
  if (m_space.m_disturbed.load()) m_poisoned = true;
  if (m_poisoned) {
    throw PoisonedTransaction(m_space.Name() +
                              ": a change was interrupted half-way by an exception; abort this transaction and begin again");
  }
  vemo::View& view = m_space.m_writerView;
  const std::size_t classesBefore = view.Classes().Size();
  CommitBuilder builder(view, m_space, m_objects.NewIds(), m_objects.DeletedIds());
  CommitBatch& batch = builder.Batch();
  try {
    AddChanged(builder);
    builder.SweepQueue(m_queueSlice);
    m_objects.AddRemovedTo(batch);
    m_meta.AddTo(batch);
    m_roots.AddRemovedTo(batch);
    builder.Finish();
    std::uint64_t generation = view.Generation();
    if (!batch.records.empty() || !batch.removedRecords.empty() || !batch.queuedDeletions.empty() ||
        !batch.finishedDeletions.empty() || !batch.namedValues.empty()) {
      view.Detach();  // an open state would keep the engine from growing
      generation = CommitAndSettle(*m_space.m_engine, batch);
    }
    AfterCommit(generation, builder.Written());
  } catch (const UnknownOutcome&) {
    m_poisoned = true;
    view.Classes().Truncate(classesBefore);
    throw;
  } catch (...) {
    view.Classes().Truncate(classesBefore);
    Reattach();
    throw;
  }
  m_space.WarnOfOldReaders();
}

// Every dirty object that has a record, every root without one, and what is new below them.
void WriteTransaction::AddChanged(CommitBuilder& builder) const {
  builder.Reserve(m_objects.CountWritten());
  for (auto& [name, root] : m_space.m_writerView.Roots().All()) {
    if (root.committed || root.oid.IsNull()) continue;
    builder.Add(root.oid, root.map);
    builder.Batch().namedValues.push_back(
        {NamedTable::kRoots, name, EncodeRootValue(name, {std::string(root.classEntry->Name()), root.oid})});
  }
  m_objects.AddDirtyTo(builder);
}

WriteTransaction::DirtySize WriteTransaction::Dirty() const {
  RequireOpen();
  vemo::View& view = m_space.m_writerView;
  const std::size_t classesBefore = view.Classes().Size();
  DirtySize dirty;
  try {
    CommitBuilder builder(view, m_space, m_objects.NewIds(), m_objects.DeletedIds());
    AddChanged(builder);
    for (const CommitBatch::Record& record : builder.Finish().records) {
      ++dirty.objects;
      dirty.bytes += record.bytes.size();
    }
  } catch (...) {
    view.Classes().Truncate(classesBefore);
    throw;
  }
  view.Classes().Truncate(classesBefore);
  return dirty;
}

// After a commit that failed: the transaction goes on where it was, unless the engine has moved under it.
void WriteTransaction::Reattach() noexcept {
  vemo::View& view = m_space.m_writerView;
  if (view.IsAttached()) return;
  try {
    auto state = m_space.m_engine->OpenSnapshot();
    if (state->Generation() == view.Generation()) {
      view.Resume(std::move(state));
      return;
    }
  } catch (const std::exception&) {
    // Without a state to read from the transaction can only be aborted.
  }
  m_poisoned = true;
}

void WriteTransaction::AfterCommit(std::uint64_t generation, const std::unordered_map<OID, std::size_t>& written) noexcept {
  vemo::View& view = m_space.m_writerView;
  m_objects.Committed(generation, written);
  for (auto& [name, root] : view.Roots().All()) root.committed = !root.oid.IsNull();
  view.Advance(generation);
  Finish();
}

}  // namespace vemo
