// What the module leaves to its host, defined for the object store. platform/README.md tells the contract.
#include "platform/error.h"
#include "platform/object_store.h"
#include "store/transaction.h"
#include "store/view.h"
#include "vxPersistStore/pref.h"
#include "vxUtils/Archive.h"

namespace vemo {

namespace {

ptr<IPersistable> AsPersistable(ptr<const IObject> object) {
  const AnyInterface found = object.Table()->QueryInterface(object.m_self, GetReflectedInterface<IPersistable>());
  return {found.m_self, static_cast<const IPersistable::FnTable*>(found.m_table)};
}

// The transaction that may change `object`; a refusal where there is none.
WriteTransaction& TransactionFor(ptr<const IPersistable> object) {
  WriteTransaction* transaction = WriteTransaction::OnThisThread();
  if (transaction == nullptr) {
    throw UsageError("object " + std::to_string(PersistStateOf(object).m_oid.m_value) +
                     " was to be deleted or linked outside a transaction of this thread; open a WriteTransaction first");
  }
  return *transaction;
}

}  // namespace

void RegisterGcObject(ptr<IObject> object) {
  const ptr<IPersistable> made = AsPersistable(object);
  WriteTransaction* transaction = WriteTransaction::OnThisThread();
  if (transaction == nullptr) {
    DestroyObject(made);
    throw UsageError("a map was to grow outside a transaction of this thread; open a WriteTransaction first");
  }
  transaction->TakeNewObject(made);
}

void DeclareReachable(ptr<const IPersistable> from, ptr<const IPersistable> to, bool) {
  TransactionFor(to).CheckReachable(from, to);
}

// A map on the stack has no space and stays as it is: it must be clean when it dies.
void MarkPersistentAsDirtyWithoutTrace(ptr<const IPersistable> object) {
  const ObjSysState& state = SysStateOf(object);
  if (state.m_cspace == nullptr || state.GetFlag(ObjSysState::kDirtyFlag)) return;
  if (state.GetFlag(kSnapshotFlag) || !WriteTransaction::IsOpenOnThisThread(*state.m_cspace)) {
    state.m_cspace->RefuseMark(object);
  }
  WriteTransaction::OnThisThread()->MarkDirty(object);
}

void AsyncPermanentlyDeleteObject(ptr<IPersistable> object) { TransactionFor(object).DeleteObject(object); }

void AsyncPermanentlyDeleteSubTree(ptr<IPersistable> root) { TransactionFor(root).DeleteSubTree(root); }

void OnGarbageCollectPersistable(ptr<IPersistable> object) { SysStateOf(object).m_cspace = nullptr; }

void MutationInterrupted(ptr<const IPersistable> map) noexcept {
  CSpace* space = SysStateOf(map).m_cspace;
  WriteTransaction* transaction = WriteTransaction::OnThisThread();
  if (transaction != nullptr && (space == nullptr || WriteTransaction::IsOpenOnThisThread(*space))) {
    transaction->Poison();
  } else if (space != nullptr && !SysStateOf(map).GetFlag(kSnapshotFlag)) {
    space->m_disturbed = true;  // by a thread that had no business there
  }
}

// --- References ---

ptr<IPersistable> prefbase::GetUnbound(const IPersistable::FnTable* expected) const {
  if (m_oid.IsNull()) return {};
  if (m_ptr.m_table == nullptr) {
    throw UsageError("a reference to object " + std::to_string(m_oid.m_value) +
                     " was read from bytes outside a space and cannot be followed");
  }
  m_ptr = static_cast<View*>(const_cast<void*>(m_ptr.m_table))->Resolve(m_oid, expected);
  return m_ptr;
}

void prefbase::Set(ptr<IPersistable> object) {
  if (object.m_self == nullptr) return Clear();
  const OID oid = PersistStateOf(object).m_oid;
  if (oid.IsNull()) throw UsageError("a reference cannot name an object that has no id yet");
  m_oid = oid;
  m_ptr = object;
}

void prefbase::Clear() {
  m_oid = OID();
  m_ptr = {};
}

void prefbase::Serialise(Archive& ar, bool) const { vemo::Serialise(ar, m_oid); }

void prefbase::Deserialise(InputArchive& ar, bool) {
  vemo::Deserialise(ar, m_oid);
  m_ptr.m_self = nullptr;
  m_ptr.m_table = m_oid.IsNull() ? nullptr : ReadingView();
}

void prefbase::VisitObjects(IObjectVisitor& visitor) const {
  if (!m_oid.IsNull()) visitor.VisitEvictableObject(*this);
}

bool operator==(const prefbase& reference, ptr<const IObject> object) {
  if (object.m_self == nullptr || !reference) return false;
  return reference.m_oid == PersistStateOf(AsPersistable(object)).m_oid;
}

}  // namespace vemo
