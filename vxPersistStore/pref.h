// Persistent references: how objects of the store name one another.
#pragma once

#include <memory>
#include <type_traits>
#include <utility>

#include "platform/assertion.h"
#include "platform/object_store.h"
#include "platform/oid.h"
#include "platform/relocate.h"
#include "vxPersistStore/IPersistable.h"
#include "vxPersistStore/ptr.h"

namespace vemo {

class prefbase;

// Walks every reference that an object holds.
class IObjectVisitor {
 public:
  virtual ~IObjectVisitor() = default;
  // An object that is held in memory.
  virtual void VisitObject(ptr<const IObject> object) = 0;
  // An object that is held through a reference, so that it may leave memory and come back.
  virtual void VisitEvictableObject(const prefbase& reference) = 0;
};

// Walks the references through which an object owns others.
class IPrefVisitor {
 public:
  virtual ~IPrefVisitor() = default;
  virtual void VisitPref(const prefbase& reference) = 0;
  virtual void VisitParentPref(const prefbase& reference) = 0;
};

// An untyped reference in one of three states: empty (null id), bound (id and object), unbound (id alone; the host may
// keep a word of its own in m_ptr.m_table, such as the view in which the reference was read). Copies are copies of the
// words, made without a store call; so is relocation. Destroying a reference never calls the store.
//
// Get() of a bound reference is one load and one branch; the rest is the host's.
class prefbase {
 public:
  prefbase() noexcept = default;

  // The object in memory, loaded if need be; null for an empty reference. The host's exceptions pass through.
  ptr<IPersistable> Get() const { return GetAs(nullptr); }

  // As Get, for a caller who knows the class: an object that is loaded for the reference and has another table than
  // `expected` is an error of the stored data, and the host throws.
  ptr<IPersistable> GetAs(const IPersistable::FnTable* expected) const {
    if (m_ptr.m_self != nullptr) [[likely]] return m_ptr;
    return GetUnbound(expected);
  }

  // As Get; the reference must not be empty.
  ptr<IPersistable> GetNotNull() const { return GetNotNullAs(nullptr); }
  ptr<IPersistable> GetNotNullAs(const IPersistable::FnTable* expected) const {
    const ptr<IPersistable> object = GetAs(expected);
    VEMO_ASSERT_TEXT(object.m_self != nullptr, "m_ptr");
    return object;
  }

  explicit operator bool() const noexcept { return !m_oid.IsNull(); }

  // Defined by the host:
  void Set(ptr<IPersistable> object);  // binds to the object and records its id; of a null object it is Clear
  void Clear();
  void Serialise(Archive& ar, bool flag) const;
  void Deserialise(InputArchive& ar, bool flag);
  void VisitObjects(IObjectVisitor& visitor) const;

  OID m_oid;
  mutable ptr<IPersistable> m_ptr;

 private:
  ptr<IPersistable> GetUnbound(const IPersistable::FnTable* expected) const;  // the host's; binds the reference
};

template <>
inline constexpr bool kIsRelocatable<prefbase> = true;

// True when the reference names that object, by id. An empty reference names none. Defined by the host.
bool operator==(const prefbase& reference, ptr<const IObject> object);
inline bool operator!=(const prefbase& reference, ptr<const IObject> object) { return !(reference == object); }

inline void Serialise(Archive& ar, const prefbase& reference) { reference.Serialise(ar, false); }
inline void Deserialise(InputArchive& ar, prefbase& reference) { reference.Deserialise(ar, false); }

inline IObjectVisitor& operator<<(IObjectVisitor& visitor, const prefbase& reference) {
  reference.VisitObjects(visitor);
  return visitor;
}
inline IPrefVisitor& operator<<(IPrefVisitor& visitor, const prefbase& reference) {
  visitor.VisitPref(reference);
  return visitor;
}

// A reference to an object of class T.
template <class T>
class cref : public prefbase {
 public:
  T* Get() const { return static_cast<T*>(GetAs(Table()).m_self); }
  T* GetNotNull() const { return static_cast<T*>(GetNotNullAs(Table()).m_self); }
  T* operator->() const { return GetNotNull(); }

  cref& operator=(T* object) {
    Set(object);
    return *this;
  }
  void Set(T* object) { prefbase::Set(ptr<IPersistable>(object)); }

  friend void swap(cref& a, cref& b) noexcept {
    cref held(std::move(a));
    a = std::move(b);
    b = std::move(held);
  }

  cref() noexcept = default;
  cref(const cref&) noexcept = default;
  cref& operator=(const cref&) noexcept = default;

 private:
  static const IPersistable::FnTable* Table() noexcept { return IPersistable::Stubs<T>::GetTable(); }
};

// A reference to either kind of node.
template <>
class cref<void> : public prefbase {
 public:
  void* Get() const { return prefbase::Get().m_self; }
  void* GetNotNull() const { return prefbase::GetNotNull().m_self; }
  void* GetAs(const IPersistable::FnTable* expected) const { return prefbase::GetAs(expected).m_self; }

  template <class U>
    requires(!std::is_void_v<U>)
  cref& operator=(U* object) {
    Set<U>(object);
    return *this;
  }
  // Only null can be assigned untyped.
  cref& operator=(void* p) {
    VEMO_ASSERT(!p);
    prefbase::Clear();
    return *this;
  }
  cref& operator=(std::nullptr_t) { return *this = static_cast<void*>(nullptr); }

  template <class U>
  void Set(U* object) {
    prefbase::Set(ptr<IPersistable>(object));
  }

  friend void swap(cref& a, cref& b) noexcept {
    cref held(std::move(a));
    a = std::move(b);
    b = std::move(held);
  }

  cref() noexcept = default;
  cref(const cref&) noexcept = default;
  cref& operator=(const cref&) noexcept = default;
};

template <class T>
inline constexpr bool kIsRelocatable<cref<T>> = true;

// Hands a freshly built object to the collector, which owns it from then on.
template <class T>
T* DollarNew(T* p) {
  RegisterGcObject(ptr<IObject>(p));
  return p;
}

}  // namespace vemo
