// How the store sees an object: two constant function tables per class, and the state that every object carries.
//
// The classes have no virtual functions. IObject's table is the prefix of IPersistable's, so that an IPersistable is an
// IObject without another look-up; the slots must keep their order.
#pragma once

#include <cstdint>
#include <new>

#include "platform/assertion.h"
#include "platform/object_store.h"
#include "platform/oid.h"
#include "platform/types.h"
#include "vxPersistStore/ptr.h"

// Visible for the sake of the function tables: see platform/object_store.h.
namespace [[gnu::visibility("default")]] vemo {

class Archive;
class InputArchive;
class IObjectVisitor;
class IPrefVisitor;

// The store's state of an object. Only the store changes it after construction.
struct ObjSysState {
  static constexpr int kDirtyFlag = 1;

  CSpace* m_cspace = nullptr;
  bool marked_ = false;
  std::uint32_t objflags_ = 0;
  ssize_t m_size = 0;
  std::int32_t m_lastTouchedTime = 0;

  bool GetFlag(int i) const noexcept { return (objflags_ >> i & 1u) != 0; }
  void SetFlag(int i) noexcept { objflags_ |= 1u << i; }
  void ClearFlag(int i) noexcept { objflags_ &= ~(1u << i); }
};

// A copy is a new, clean object; an assigned-to object keeps its state.
struct ObjSysState_2 : ObjSysState {
  ObjSysState_2() noexcept = default;
  ObjSysState_2(const ObjSysState_2&) noexcept : ObjSysState() {}
  ObjSysState_2& operator=(const ObjSysState_2&) noexcept { return *this; }
};

struct PersistObjState {
  OID m_oid;
};

// A copy has no identity yet; an assigned-to object keeps its own.
struct PersistObjState_2 : PersistObjState {
  PersistObjState_2() noexcept = default;
  PersistObjState_2(const PersistObjState_2&) noexcept : PersistObjState() {}
  PersistObjState_2& operator=(const PersistObjState_2&) noexcept { return *this; }
};

// {object, table}: any object of the store.
struct IObject {
  struct FnTable {
    AnyInterface (*QueryInterface)(void* self, const ReflectedInterface& ri);
    AnyInterface (*BindInterface)(void* self, const ReflectedInterface& ri);
    const ReflectedClass* (*GetReflectedClass)(const void* self);
    void (*VisitObjects)(const void* self, IObjectVisitor& visitor);
    void (*OnGarbageCollect)(void* self);
    void (*Destroy)(void* self);
    ObjSysState* (*GetSysState)(void* self);
  };

  template <class T>
  struct Stubs {
    static AnyInterface QueryInterface(void* self, const ReflectedInterface& ri) {
      return static_cast<T*>(self)->QueryInterface(ri);
    }
    static AnyInterface BindInterface(void* self, const ReflectedInterface& ri) {
      return static_cast<T*>(self)->BindInterface(ri);
    }
    static const ReflectedClass* GetReflectedClass(const void* self) {
      return static_cast<const T*>(self)->GetReflectedClass();
    }
    static void VisitObjects(const void* self, IObjectVisitor& visitor) {
      static_cast<const T*>(self)->VisitObjects(visitor);
    }
    static void OnGarbageCollect(void* self) { static_cast<T*>(self)->OnGarbageCollect(); }
    static void Destroy(void* self) { T::Destroy(static_cast<T*>(self)); }
    static ObjSysState* GetSysState(void* self) { return &static_cast<T*>(self)->GetSysState(); }

    static constexpr FnTable MakeTable() {
      return {&QueryInterface, &BindInterface, &GetReflectedClass, &VisitObjects, &OnGarbageCollect, &Destroy, &GetSysState};
    }
    static const FnTable* GetTable() noexcept {
      static constexpr FnTable table = MakeTable();
      return &table;
    }
  };

  void* m_self = nullptr;
  const FnTable* m_table = nullptr;

  template <class T>
  void CoerceFrom(T* object) noexcept {
    m_self = object;
    m_table = Stubs<T>::GetTable();
  }
  void AssignFrom(const IObject& other) noexcept { *this = other; }
};

// {object, table}: an object that is written and read back.
struct IPersistable {
  struct FnTable {
    IObject::FnTable _IObject;
    void (*VisitPrefs)(const void* self, IPrefVisitor& visitor);
    bool (*RepresentsSubTree)(const void* self);
    void (*Serialise)(const void* self, Archive& ar);
    void (*Deserialise)(void* self, InputArchive& ar);
    void (*OnCreate)(void* self, bool fresh);
    PersistObjState* (*GetPersistObjState)(const void* self);
  };

  template <class T>
  struct Stubs {
    static void VisitPrefs(const void* self, IPrefVisitor& visitor) { static_cast<const T*>(self)->VisitPrefs(visitor); }
    static bool RepresentsSubTree(const void* self) { return static_cast<const T*>(self)->RepresentsSubTree(); }
    static void Serialise(const void* self, Archive& ar) { static_cast<const T*>(self)->Serialise(ar); }
    static void Deserialise(void* self, InputArchive& ar) { static_cast<T*>(self)->Deserialise(ar); }
    static void OnCreate(void* self, bool fresh) { static_cast<T*>(self)->OnCreate(fresh); }
    static PersistObjState* GetPersistObjState(const void* self) {
      return &static_cast<T*>(const_cast<void*>(self))->GetPersistObjState();
    }

    static const FnTable* GetTable() noexcept {
      static constexpr FnTable table = {IObject::Stubs<T>::MakeTable(), &VisitPrefs,  &RepresentsSubTree, &Serialise,
                                        &Deserialise,                   &OnCreate, &GetPersistObjState};
      return &table;
    }
  };

  void* m_self = nullptr;
  const FnTable* m_table = nullptr;

  template <class T>
  void CoerceFrom(T* object) noexcept {
    m_self = object;
    m_table = Stubs<T>::GetTable();
  }
  void AssignFrom(const IPersistable& other) noexcept { *this = other; }

  operator IObject() const noexcept { return {m_self, m_table == nullptr ? nullptr : &m_table->_IObject}; }
};

// The interface records are the store's.
template <class I>
const ReflectedInterface& GetReflectedInterface() {
  return _GetReflected(static_cast<const I*>(nullptr));
}

struct EmptyBase {};

// Gives the final class FC the IObject half of its tables.
template <class FC, class BC>
class IObjectBaseMixin : public BC {
 public:
  using FinalClass = FC;

  FC* GetThisAsFinalClass() noexcept { return static_cast<FC*>(this); }
  const FC* GetThisAsFinalClass() const noexcept { return static_cast<const FC*>(this); }

  // The object as one of the two interfaces, chosen by the identity of the record, or null.
  AnyInterface QueryInterface(const ReflectedInterface& ri) {
    if (&ri == &GetReflectedInterface<IObject>()) return ptr<IObject>(GetThisAsFinalClass());
    if (&ri == &GetReflectedInterface<IPersistable>()) return ptr<IPersistable>(GetThisAsFinalClass());
    return {};
  }
  AnyInterface BindInterface(const ReflectedInterface& ri) { return GetThisAsFinalClass()->QueryInterface(ri); }

  ObjSysState& GetSysState() noexcept { return m_objSysState; }
  const ObjSysState& GetSysState() const noexcept { return m_objSysState; }

  void OnGarbageCollect() noexcept {}

  // Ends the object's life and releases its memory; a null pointer is ignored.
  static void Destroy(FC* object) {
    if (object == nullptr) return;
    object->~FC();
    ::operator delete(object);
  }

  // A new object, not yet known to the collector.
  static ptr<IObject> sfnCreateInstance() {
    const ptr<IPersistable> created(::new FC);
    return {created.m_self, &created.Table()->_IObject};
  }

  ObjSysState_2 m_objSysState;
};

// Gives the final class the rest of its IPersistable table. An object is destroyed only after the store has written it
// and cleared its dirty flag.
template <class BC>
class PersistableMixin : public BC {
 public:
  PersistableMixin() = default;
  PersistableMixin(const PersistableMixin&) = default;
  PersistableMixin& operator=(const PersistableMixin&) = default;
  ~PersistableMixin() { VEMO_ASSERT(!IsDirty()); }

  bool IsDirty() const noexcept { return this->m_objSysState.GetFlag(ObjSysState::kDirtyFlag); }

  // Tells the store that the object changes, unless it knows already.
  void MarkAsDirtyWithoutTrace() const {
    if (!IsDirty()) MarkPersistentAsDirtyWithoutTrace(ptr<const IPersistable>(this->GetThisAsFinalClass()));
  }

  void OnGarbageCollect() {
    OnGarbageCollectPersistable(ptr<IPersistable>(this->GetThisAsFinalClass()));
    BC::OnGarbageCollect();
  }

  bool RepresentsSubTree() const noexcept { return true; }
  void OnCreate(bool) noexcept {}
  PersistObjState& GetPersistObjState() noexcept { return m_persistObjState; }
  const PersistObjState& GetPersistObjState() const noexcept { return m_persistObjState; }

  PersistObjState_2 m_persistObjState;
};

}  // namespace vemo
