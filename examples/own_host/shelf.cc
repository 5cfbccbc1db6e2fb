// What the maps ask of their host (platform/README.md), for objects in memory.
#include "shelf.h"

#include <stdexcept>
#include <utility>

namespace vemo {

CSpace g_shelf;

namespace {

constexpr ReflectedInterface kObject{"vemo::IObject"};
constexpr ReflectedInterface kPersistable{"vemo::IPersistable"};

ptr<IPersistable> AsPersistable(ptr<const IObject> object) {
  const AnyInterface found = object.Table()->QueryInterface(object.m_self, kPersistable);
  return {found.m_self, static_cast<const IPersistable::FnTable*>(found.m_table)};
}
OID& IdOf(ptr<const IPersistable> object) { return object.Table()->GetPersistObjState(object.m_self)->m_oid; }
ObjSysState& StateOf(ptr<const IPersistable> object) { return *object.Table()->_IObject.GetSysState(object.m_self); }

void End(CSpace::Held& held) {
  if (held.object.m_self == nullptr) return;
  StateOf(held.object).ClearFlag(ObjSysState::kDirtyFlag);
  const IObject::FnTable& table = held.object.Table()->_IObject;
  table.OnGarbageCollect(held.object.m_self);
  table.Destroy(std::exchange(held.object, {}).m_self);
}

struct SubTreeDeletion : IPrefVisitor {
  void VisitPref(const prefbase& child) override { AsyncPermanentlyDeleteSubTree(child.Get()); }
  void VisitParentPref(const prefbase&) override {}
};

}  // namespace

ptr<IPersistable> CSpace::Resolve(OID id, const IPersistable::FnTable* expected) {
  Held& held = m_objects.at(id);
  if (held.object.m_self == nullptr) {
    held.object = AsPersistable(held.reflected->m_createFn());
    InputArchive archive(held.record.data());
    held.object.Table()->Deserialise(held.object.m_self, archive);
    IdOf(held.object) = id;
  }
  if (expected != nullptr && expected != held.object.Table()) throw std::runtime_error("an object of another class");
  return held.object;
}

int CSpace::Save() {
  if (m_interrupted) throw std::runtime_error("a change was left half-way: nothing is saved");
  for (const OID id : std::exchange(m_deleted, {})) {
    End(m_objects.at(id));
    m_objects.erase(id);
  }
  int written = 0;
  for (auto& [id, held] : m_objects) {
    if (held.object.m_self == nullptr) continue;
    // A new object need not be marked: it has no record yet.
    if (!StateOf(held.object).GetFlag(ObjSysState::kDirtyFlag) && !held.record.empty()) continue;
    BytesOutputStream stream;
    Archive archive(&stream);
    held.object.Table()->Serialise(held.object.m_self, archive);
    archive.Flush();
    held.record = std::move(stream.m_bytes);
    StateOf(held.object).ClearFlag(ObjSysState::kDirtyFlag);
    ++written;
  }
  return written;
}

void CSpace::Unload() {
  for (auto& [id, held] : m_objects) End(held);
}

void RegisterGcObject(ptr<IObject> object) {
  static std::uint64_t lastId = 0;
  CSpace::Held held{AsPersistable(object), object.Table()->GetReflectedClass(object.m_self), {}};
  const OID id = IdOf(held.object) = OID(++lastId);
  try {
    g_shelf.m_objects.emplace(id, held);
  } catch (...) {
    End(held);  // the object is the host's also when this fails
    throw;
  }
}
void DeclareReachable(ptr<const IPersistable>, ptr<const IPersistable>, bool) {}
void MarkPersistentAsDirtyWithoutTrace(ptr<const IPersistable> object) {
  if (!IdOf(object).IsNull()) StateOf(object).SetFlag(ObjSysState::kDirtyFlag);  // a map on the stack has no id
}
void AsyncPermanentlyDeleteObject(ptr<IPersistable> object) { g_shelf.m_deleted.push_back(IdOf(object)); }
void AsyncPermanentlyDeleteSubTree(ptr<IPersistable> root) {
  SubTreeDeletion below;
  root.Table()->VisitPrefs(root.m_self, below);
  g_shelf.m_deleted.push_back(IdOf(root));
}
void OnGarbageCollectPersistable(ptr<IPersistable>) {}
void MutationInterrupted(ptr<const IPersistable>) noexcept { g_shelf.m_interrupted = true; }

// Classes are found through their objects, so there is nothing to register them with.
XTarget& Vemo_vxOperation_GetXTarget() { throw std::logic_error("this host takes no classes"); }
ENameSpaceError RegisterReflectedClass(const ReflectedClass*, XTarget&) { return NSE_NAME_NOT_FOUND; }
const ReflectedInterface& _GetReflected(const IObject*) { return kObject; }
const ReflectedInterface& _GetReflected(const IPersistable*) { return kPersistable; }

ptr<IPersistable> prefbase::GetUnbound(const IPersistable::FnTable* expected) const {
  return *this ? m_ptr = g_shelf.Resolve(m_oid, expected) : ptr<IPersistable>();
}
void prefbase::Set(ptr<IPersistable> object) {
  m_oid = object.m_self == nullptr ? OID() : IdOf(object);
  m_ptr = object;
}
void prefbase::Clear() { Set({}); }
void prefbase::Serialise(Archive& ar, bool) const { vemo::Serialise(ar, m_oid); }
void prefbase::Deserialise(InputArchive& ar, bool) {
  m_ptr = {};
  vemo::Deserialise(ar, m_oid);
}
void prefbase::VisitObjects(IObjectVisitor& visitor) const {
  if (*this) visitor.VisitEvictableObject(*this);
}
bool operator==(const prefbase& reference, ptr<const IObject> object) {
  return reference && object.m_self != nullptr && reference.m_oid == IdOf(AsPersistable(object));
}

}  // namespace vemo
