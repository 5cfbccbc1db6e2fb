#include "tests/support/recording_host.h"

#include <cstdio>
#include <cstdlib>

#include "tests/support/failing_allocator.h"
#include "vxPersistStore/Reflection.h"
#include "vxUtils/Archive.h"

namespace vemo {

class CSpace {};
class XTarget {};

}  // namespace vemo

namespace vemo::test {
namespace {

RecordingHost* g_host = nullptr;
CSpace g_space;
XTarget g_target;
const ReflectedInterface kObjectInterface{"vemo::IObject"};
const ReflectedInterface kPersistableInterface{"vemo::IPersistable"};

[[noreturn]] void Die(const std::string& reason) {
  std::fprintf(stderr, "recording host: %s\n", reason.c_str());
  std::abort();
}

OID IdOf(ptr<const IPersistable> object) {
  return object.Table()->GetPersistObjState(object.m_self)->m_oid;
}

// An object known as IObject only, asked for its other interface in the way of a store.
ptr<IPersistable> AsPersistable(ptr<const IObject> object) {
  const AnyInterface found = object.Table()->QueryInterface(object.m_self, kPersistableInterface);
  if (found.m_self == nullptr) Die("an object that is not persistable");
  return {found.m_self, static_cast<const IPersistable::FnTable*>(found.m_table)};
}

const ReflectedClass* ClassOf(ptr<const IPersistable> object) {
  return object.Table()->_IObject.GetReflectedClass(object.m_self);
}

// "leaf" for ...LeafNode, "node" for ...InternalNode, else "map".
std::string KindOf(ptr<const IPersistable> object) {
  const std::string name = ClassOf(object)->m_name;
  if (name.ends_with("LeafNode")) return "leaf";
  if (name.ends_with("InternalNode")) return "node";
  return "map";
}

class BytesStream final : public IOutputStream {
 public:
  void WriteStream(const void* bytes, ssize_t count) override {
    const auto* first = static_cast<const std::uint8_t*>(bytes);
    m_bytes.insert(m_bytes.end(), first, first + count);
  }
  Bytes m_bytes;
};

}  // namespace

Bytes RecordOf(ptr<const IPersistable> object) {
  BytesStream stream;
  Archive archive(&stream);
  object.Table()->Serialise(object.m_self, archive);
  archive.Flush();
  return std::move(stream.m_bytes);
}

RecordingHost::RecordingHost() {
  if (g_host != nullptr) Die("a second host");
  g_host = this;
}

RecordingHost::~RecordingHost() {
  m_untilThrow = 0;
  for (auto& [id, object] : m_objects) {
    if (object.m_adopted) Die(object.m_name + " was not forgotten");
    if (object.m_object.m_self != nullptr) DestroyObject(object);
  }
  g_host = nullptr;
}

RecordingHost& RecordingHost::Current() {
  if (g_host == nullptr) Die("the module called without a host");
  return *g_host;
}

ObjSysState& RecordingHost::SysState(ptr<IPersistable> object) {
  return *object.Table()->_IObject.GetSysState(object.m_self);
}

void RecordingHost::Adopt(ptr<IPersistable> object, const std::string& name) {
  const ExemptAllocations exempt;
  const OID id(++m_lastId);
  object.Table()->GetPersistObjState(object.m_self)->m_oid = id;
  SysState(object).m_cspace = &g_space;
  m_objects[id] = Object{object, ClassOf(object), name, true, false, {}};
}

void RecordingHost::Forget(ptr<IPersistable> object) {
  SysState(object).ClearFlag(ObjSysState::kDirtyFlag);
  m_objects.erase(IdOf(object));
}

void* RecordingHost::Find(const std::string& name) const {
  for (const auto& [id, object] : m_objects) {
    if (object.m_name == name) return object.m_object.m_self;
  }
  Die("no object is called " + name);
}

std::string RecordingHost::NameOf(OID id) const {
  const auto found = m_objects.find(id);
  return found == m_objects.end() ? "unknown" : found->second.m_name;
}

bool RecordingHost::IsDeleted(const std::string& name) const {
  for (const auto& [id, object] : m_objects) {
    if (object.m_name == name) return object.m_deleted;
  }
  Die("no object is called " + name);
}

void RecordingHost::Write(Object& object) {
  const bool known = !object.m_record.empty();
  const bool clean = m_flagging && !SysState(object.m_object).GetFlag(ObjSysState::kDirtyFlag);
  Bytes record = RecordOf(object.m_object);
  if (known && clean && record != object.m_record) Fault(object.m_name + " changed without being marked");
  object.m_record = std::move(record);
  SysState(object.m_object).ClearFlag(ObjSysState::kDirtyFlag);
}

void RecordingHost::CleanAll() {
  const ExemptAllocations exempt;
  for (auto& [id, object] : m_objects) {
    if (object.m_object.m_self != nullptr && !object.m_deleted) Write(object);
  }
}

std::string RecordingHost::DirtyNames() const {
  std::string names;
  for (const auto& [id, object] : m_objects) {
    if (object.m_object.m_self == nullptr) continue;
    if (!SysState(object.m_object).GetFlag(ObjSysState::kDirtyFlag)) continue;
    names += (names.empty() ? "" : " ") + object.m_name;
  }
  return names;
}

void RecordingHost::UnloadAll() {
  const ExemptAllocations exempt;
  CleanAll();
  for (auto& [id, object] : m_objects) {
    if (object.m_object.m_self == nullptr) continue;
    if (object.m_adopted) {
      InputArchive archive(object.m_record.data());
      object.m_object.Table()->Deserialise(object.m_object.m_self, archive);
    } else {
      DestroyObject(object);
    }
  }
}

void RecordingHost::DestroyObject(Object& object) {
  const auto& table = object.m_object.Table()->_IObject;
  void* self = object.m_object.m_self;
  table.GetSysState(self)->ClearFlag(ObjSysState::kDirtyFlag);
  table.OnGarbageCollect(self);
  table.Destroy(self);
  object.m_object.m_self = nullptr;
}

void RecordingHost::Load(OID id, Object& object) {
  const ptr<IPersistable> loaded = AsPersistable(object.m_class->m_createFn());
  InputArchive archive(object.m_record.data());
  loaded.Table()->Deserialise(loaded.m_self, archive);
  if (archive.ptr() != object.m_record.data() + object.m_record.size()) {
    Fault(object.m_name + " was not read to its end");
  }
  loaded.Table()->GetPersistObjState(loaded.m_self)->m_oid = id;
  SysState(loaded).m_cspace = &g_space;
  object.m_object = loaded;
}

std::string RecordingHost::DescribeObject(ptr<const IPersistable> object) const {
  if (object.m_self == nullptr) return "nothing";
  const OID id = IdOf(object);
  return id.IsNull() ? "stack " + KindOf(object) : NameOf(id);
}

void RecordingHost::Log(HostCall operation, const std::string& text, OID object, OID other) {
  m_log.Append(Call{operation, object, other, text});
}

void RecordingHost::CountCall(const std::string& text) {
  if (m_untilThrow > 0 && --m_untilThrow == 0) {
    m_thrown = true;
    throw HostFailure(text + " was refused");
  }
}

void RecordingHost::Register(ptr<IObject> object) {
  const ptr<IPersistable> persistable = AsPersistable(object);
  if (!IdOf(persistable).IsNull()) Fault("registered twice: " + DescribeObject(persistable));
  const std::string kind = KindOf(persistable);
  try {
    CountCall("register " + kind);
  } catch (const HostFailure&) {
    object.Table()->Destroy(object.m_self);
    throw;
  }
  const OID id(++m_lastId);
  persistable.Table()->GetPersistObjState(persistable.m_self)->m_oid = id;
  SysState(persistable).m_cspace = &g_space;
  const std::string name = kind + std::to_string(++m_namesGiven[kind]);
  m_objects[id] = Object{persistable, ClassOf(persistable), name, false, false, {}};
  Log(HostCall::kRegister, "register " + name, id);
}

void RecordingHost::Reach(ptr<const IPersistable> from, ptr<const IPersistable> to, bool subTree) {
  const std::string text =
      "reach " + DescribeObject(from) + " " + DescribeObject(to) + (subTree ? "" : " alone");
  CountCall(text);
  Log(HostCall::kReach, text, IdOf(from), IdOf(to));
}

void RecordingHost::MarkDirty(ptr<const IPersistable> object) {
  const std::string text = "dirty " + DescribeObject(object);
  CountCall(text);
  const OID id = IdOf(object);
  Log(HostCall::kDirty, text, id);
  if (!id.IsNull() && m_flagging) SysState({object.m_self, object.Table()}).SetFlag(ObjSysState::kDirtyFlag);
}

void RecordingHost::Delete(HostCall operation, ptr<IPersistable> object) {
  const std::string text =
      (operation == HostCall::kDelete ? "delete " : "delete-tree ") + DescribeObject(object);
  CountCall(text);
  const OID id = IdOf(object);
  const auto found = m_objects.find(id);
  if (found == m_objects.end()) {
    Fault("deleted without being owned: " + DescribeObject(object));
  } else {
    if (found->second.m_deleted) Fault("deleted twice: " + found->second.m_name);
    found->second.m_deleted = true;
  }
  Log(operation, text, id);
}

void RecordingHost::Collect(ptr<IPersistable> object) {
  const std::string text = "collect " + DescribeObject(object);
  CountCall(text);
  Log(HostCall::kCollect, text, IdOf(object));
}

void RecordingHost::Interrupted(ptr<const IPersistable> map) {
  Log(HostCall::kInterrupted, "interrupted " + DescribeObject(map), IdOf(map));
}

void RecordingHost::SetReference(prefbase& reference, ptr<IPersistable> object) {
  const std::string text = "set " + DescribeObject(object);
  CountCall(text);
  const OID id = IdOf(object);
  if (id.IsNull()) Fault("a reference to an object without an id");
  reference.m_oid = id;
  reference.m_ptr = object;
  Log(HostCall::kSet, text, id);
}

void RecordingHost::ClearReference(prefbase& reference) {
  CountCall("clear");
  reference.m_oid = OID();
  reference.m_ptr = ptr<IPersistable>();
  Log(HostCall::kClear, "clear");
}

void RecordingHost::Bind(const prefbase& reference, const IPersistable::FnTable* expected) {
  if (!reference) return;
  const auto found = m_objects.find(reference.m_oid);
  if (found == m_objects.end() || found->second.m_deleted) Die("a reference to an object that is gone");
  Object& object = found->second;
  if (object.m_object.m_self == nullptr) {
    CountCall("load " + object.m_name);
    Load(reference.m_oid, object);
    Log(HostCall::kLoad, "load " + object.m_name, reference.m_oid);
  }
  if (expected != nullptr && expected != object.m_object.Table()) {
    throw HostFailure(object.m_name + " is of another class than the reference asks for");
  }
  reference.m_ptr = object.m_object;
}

XTarget& RecordingHost::Target() {
  Log(HostCall::kTarget, "target");
  return g_target;
}

ENameSpaceError RecordingHost::RegisterClass(const ReflectedClass* reflectedClass) {
  Log(HostCall::kRegisterClass, std::string("register-class ") + reflectedClass->m_name);
  return m_registrationResult;
}

}  // namespace vemo::test

namespace vemo {

using test::ExemptAllocations;
using test::HostCall;
using test::RecordingHost;

void RegisterGcObject(ptr<IObject> object) {
  const ExemptAllocations exempt;
  RecordingHost::Current().Register(object);
}

void DeclareReachable(ptr<const IPersistable> from, ptr<const IPersistable> to, bool subTree) {
  const ExemptAllocations exempt;
  RecordingHost::Current().Reach(from, to, subTree);
}

void MarkPersistentAsDirtyWithoutTrace(ptr<const IPersistable> object) {
  const ExemptAllocations exempt;
  RecordingHost::Current().MarkDirty(object);
}

void AsyncPermanentlyDeleteObject(ptr<IPersistable> object) {
  const ExemptAllocations exempt;
  RecordingHost::Current().Delete(HostCall::kDelete, object);
}

void AsyncPermanentlyDeleteSubTree(ptr<IPersistable> root) {
  const ExemptAllocations exempt;
  RecordingHost::Current().Delete(HostCall::kDeleteTree, root);
}

void OnGarbageCollectPersistable(ptr<IPersistable> object) {
  const ExemptAllocations exempt;
  RecordingHost::Current().Collect(object);
}

void MutationInterrupted(ptr<const IPersistable> map) noexcept {
  const ExemptAllocations exempt;
  RecordingHost::Current().Interrupted(map);
}

XTarget& Vemo_vxOperation_GetXTarget() {
  return RecordingHost::Current().Target();
}

ENameSpaceError RegisterReflectedClass(const ReflectedClass* reflectedClass, XTarget&) {
  return RecordingHost::Current().RegisterClass(reflectedClass);
}

const ReflectedInterface& _GetReflected(const IObject*) {
  return test::kObjectInterface;
}
const ReflectedInterface& _GetReflected(const IPersistable*) {
  return test::kPersistableInterface;
}

void prefbase::Set(ptr<IPersistable> object) {
  if (object.m_self == nullptr) return Clear();
  const ExemptAllocations exempt;
  RecordingHost::Current().SetReference(*this, object);
}

void prefbase::Clear() {
  const ExemptAllocations exempt;
  RecordingHost::Current().ClearReference(*this);
}

ptr<IPersistable> prefbase::GetUnbound(const IPersistable::FnTable* expected) const {
  const ExemptAllocations exempt;
  RecordingHost::Current().Bind(*this, expected);
  return m_ptr;
}

// A reference is written as its id; the flag means nothing to this host, which sees that the module passes
// false.
void prefbase::Serialise(Archive& ar, bool flag) const {
  if (flag) RecordingHost::Current().Fault("a reference written with the flag true");
  vemo::Serialise(ar, m_oid);
}

void prefbase::Deserialise(InputArchive& ar, bool flag) {
  if (flag) RecordingHost::Current().Fault("a reference read with the flag true");
  vemo::Deserialise(ar, m_oid);
  m_ptr = ptr<IPersistable>();
}

void prefbase::VisitObjects(IObjectVisitor& visitor) const {
  visitor.VisitEvictableObject(*this);
}

bool operator==(const prefbase& reference, ptr<const IObject> object) {
  return reference && object.m_self != nullptr && reference.m_oid == test::IdOf(test::AsPersistable(object));
}

}  // namespace vemo
