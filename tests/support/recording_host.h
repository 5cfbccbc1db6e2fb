// The object store of the module's tests: it does what platform/object_store.h and prefbase leave to the
// host, in memory, and writes down every call. It can be told to throw at any of them.
//
// One host exists at a time; while it does, the module's store calls are its. It owns every registered object
// and destroys them all, deleted ones included, in its destructor: clear the dirty flag, OnGarbageCollect,
// Destroy.
#pragma once

#include <cstdint>
#include <map>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

#include "platform/object_store.h"
#include "platform/types.h"
#include "tests/support/call_log.h"
#include "vxPersistStore/IPersistable.h"
#include "vxPersistStore/pref.h"

namespace vemo::test {

class HostFailure : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

class RecordingHost {
 public:
  RecordingHost();
  ~RecordingHost();
  RecordingHost(const RecordingHost&) = delete;
  RecordingHost& operator=(const RecordingHost&) = delete;

  static RecordingHost& Current();

  // --- Objects. Their names are "map", "node1", "leaf1" ... by class in the order of registration. ---

  // Gives an object that the test owns, such as a map on the stack, an id and a space, so that it can become
  // dirty. Forget it before it dies.
  void Adopt(ptr<IPersistable> object, const std::string& name);
  void Forget(ptr<IPersistable> object);

  // The object of that name, null for one that is out of memory. A name that was never given fails the
  // program.
  void* Find(const std::string& name) const;
  template <class T>
  T* Find(const std::string& name) const {
    return static_cast<T*>(Find(name));
  }
  std::string NameOf(OID id) const;
  bool IsDeleted(const std::string& name) const;
  std::size_t NumObjects() const { return m_objects.size(); }

  // Writes every new and every dirty object and clears the dirty flags, as a store does at a commit. An
  // object that changed since it was last written without being marked is a fault (while flags are set at
  // all).
  void CleanAll();
  // The names of the dirty objects, in the order of their ids, with blanks between.
  std::string DirtyNames() const;
  // As CleanAll; then drops all that the host owns from memory and unbinds the references of adopted objects:
  // whatever is used next is made anew from its record. Pointers to nodes end here.
  void UnloadAll();

  // --- Calls ---

  CallLog& log() { return m_log; }
  // With false, marking an object is logged but leaves its flag clear, so that the log shows each mark that
  // is asked for.
  void SetFlagging(bool on) { m_flagging = on; }
  // The nth call from now on (1 is the next) throws HostFailure before it does anything; a registration
  // destroys the object first, since it owns it. Interruptions and class registrations do not count. 0 never
  // throws.
  void ThrowAtCall(int n) {
    m_untilThrow = n;
    m_thrown = false;
  }
  bool HasThrown() const { return m_thrown; }
  void SetRegistrationResult(ENameSpaceError result) { m_registrationResult = result; }

  // Misuse that the host saw, one a line: something deleted or registered twice, a reference without an id.
  const std::string& Faults() const { return m_faults; }

  // --- What the functions of the seam do ---

  void Register(ptr<IObject> object);
  void Reach(ptr<const IPersistable> from, ptr<const IPersistable> to, bool subTree);
  void MarkDirty(ptr<const IPersistable> object);
  void Delete(HostCall operation, ptr<IPersistable> object);
  void Collect(ptr<IPersistable> object);
  void Interrupted(ptr<const IPersistable> map);
  void SetReference(prefbase& reference, ptr<IPersistable> object);
  void ClearReference(prefbase& reference);
  void Bind(const prefbase& reference, const IPersistable::FnTable* expected);
  XTarget& Target();
  ENameSpaceError RegisterClass(const ReflectedClass* reflectedClass);
  void Fault(const std::string& text) { m_faults += text + '\n'; }

 private:
  struct Object {
    ptr<IPersistable> m_object;  // m_self is null while it is out of memory
    const ReflectedClass* m_class = nullptr;
    std::string m_name;
    bool m_adopted = false;
    bool m_deleted = false;
    Bytes m_record;  // empty until it is first written
  };

  static ObjSysState& SysState(ptr<IPersistable> object);
  std::string DescribeObject(ptr<const IPersistable> object) const;
  void Log(HostCall operation, const std::string& text, OID object = OID(), OID other = OID());
  void CountCall(const std::string& text);
  static void DestroyObject(Object& object);
  void Load(OID id, Object& object);
  void Write(Object& object);

  CallLog m_log;
  std::map<OID, Object> m_objects;
  std::map<std::string, int> m_namesGiven;
  std::uint64_t m_lastId = 0;
  bool m_flagging = true;
  int m_untilThrow = 0;
  bool m_thrown = false;
  ENameSpaceError m_registrationResult = NSE_OK;
  std::string m_faults;
};

// A map that the host has adopted for as long as it lives.
template <class Map>
class Hosted {
 public:
  explicit Hosted(RecordingHost& host, const std::string& name = "map") : m_host(host) {
    host.Adopt(ptr<IPersistable>(&m_map), name);
  }
  ~Hosted() { m_host.Forget(ptr<IPersistable>(&m_map)); }
  Hosted(const Hosted&) = delete;
  Hosted& operator=(const Hosted&) = delete;

  Map& operator*() { return m_map; }
  Map* operator->() { return &m_map; }

 private:
  RecordingHost& m_host;
  Map m_map;
};

// The bytes of an object's record.
Bytes RecordOf(ptr<const IPersistable> object);

}  // namespace vemo::test
