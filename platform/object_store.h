// The operations that the module asks of the object store which hosts it. They are declared here and defined by the host:
// by store/ in the product, by a recording host in the module's tests. The out-of-line members of `prefbase`
// (vxPersistStore/pref.h) belong to the same contract; README.md beside this file tells it whole.
#pragma once

// Objects are told apart by the addresses of their function tables. A program that hides its symbols must still share those
// of a shared library, so the tables' types and the objects' classes are visible from their first declaration on.
namespace [[gnu::visibility("default")]] vemo {

template <class I>
class ptr;
struct IObject;
struct IPersistable;
struct ReflectedClass;

// One space of the store: an object knows it by address only.
class CSpace;

// Makes a new object known to the collector and gives it its id. The host owns the object from the call on, also when
// the call throws.
void RegisterGcObject(ptr<IObject> object);

// `to` is now reachable from the persistent object `from`. `subTree` is true: the object stands for all below it.
void DeclareReachable(ptr<const IPersistable> from, ptr<const IPersistable> to, bool subTree);

// `object` was, or is about to be, changed and must be written again. The host sets the object's dirty flag here and
// clears it when it has written the object. An object that the host does not own stays as it is.
void MarkPersistentAsDirtyWithoutTrace(ptr<const IPersistable> object);

// Deletes one persistent object for good, later.
void AsyncPermanentlyDeleteObject(ptr<IPersistable> object);

// Deletes an object and everything reachable below it by VisitPrefs for good, later.
void AsyncPermanentlyDeleteSubTree(ptr<IPersistable> root);

// The host's part of collecting an object, called from the object's OnGarbageCollect.
void OnGarbageCollectPersistable(ptr<IPersistable> object);

// An exception left an operation that changes `map` half-way: what it had changed must not be committed.
void MutationInterrupted(ptr<const IPersistable> map) noexcept;

// The result of registering a class by name.
enum ENameSpaceError {
  NSE_OK = 0,
  NSE_COLON_EXPECTED = 1,
  NSE_IDENTIFIER_EXPECTED = 2,
  NSE_NAME_ALREADY_IN_USE = 3,
  NSE_NAME_NOT_FOUND = 4,
  NSE_NOT_A_NAMESPACE = 5,
};

// Where a library registers its classes; the module only passes it on.
class XTarget;
XTarget& Vemo_vxOperation_GetXTarget();
ENameSpaceError RegisterReflectedClass(const ReflectedClass* reflectedClass, XTarget& target);

// Names an interface; identity is the record's address, not its name.
struct ReflectedInterface {
  const char* m_name;
};
const ReflectedInterface& _GetReflected(const IObject*);
const ReflectedInterface& _GetReflected(const IPersistable*);

}  // namespace vemo
