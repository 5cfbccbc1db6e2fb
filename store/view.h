// The objects of one state of a space that are in memory.
//
//                    Adopt                 (commit)
//        [made] ------------> new --------------------+
//                              |                      v       MarkDirty
//   [stored] -- Resolve ---------------------------> clean <------------> dirty
//        ^                     |                      |    (commit)         |
//        |                     |    Release           |                     |
//        +--- Trim (clean)     +-----------+----------+---------------------+
//                                          v
//                                    on the way out -- DestroyObject --> [gone]
//
// Invariants:
//   V1. An object of the view is in the residents under its id, or is the map of a root, or is on the way out.
//   V2. A reference that was read in the view and is not bound carries the view's address, so that it resolves here
//       whatever else its thread has open.
//   V3. Nothing in the view is newer than its commit, unless it is the writer's view inside a transaction.
//
// Threads: one at a time, and the writer's inside a transaction by its thread alone. Resolve refuses anything else that it
// finds out; Holds is for any thread.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "platform/error.h"
#include "store/class_numbers.h"
#include "store/class_registry.h"
#include "store/engine.h"
#include "store/object_state.h"
#include "store/residents.h"
#include "store/root_maps.h"
#include "store/use_check.h"
#include "vxPersistStore/pref.h"

namespace vemo {

class View {
 public:
  enum class Kind : std::uint8_t { kWriter, kSnapshot };

  // Counts for `counters`, and takes the random choice of what leaves memory from `seed` on.
  View(CSpace& space, std::string spaceName, Kind kind, CacheCounters& counters, std::uint64_t seed);
  ~View();
  View(const View&) = delete;
  View& operator=(const View&) = delete;

  // Shows the commit of `state` from now on. Objects of another commit are forgotten and root maps read anew in place.
  void Attach(std::unique_ptr<EngineSnapshot> state);
  // Shows the commit of `state` from now on and keeps the objects that it has unchanged. For views that nobody writes in.
  // Costs a look at the record of each object in memory.
  void MoveTo(std::unique_ptr<EngineSnapshot> state);
  // From now on, a read for which `isExpired` is true lets go of the state and throws SnapshotExpired.
  void SetExpiry(std::function<bool()> isExpired) { m_expiry = std::move(isExpired); }
  // Goes on with a state of the commit that the view shows already.
  void Resume(std::unique_ptr<EngineSnapshot> state) noexcept { m_state = std::move(state); }
  // Lets go of the engine's state; objects stay, loading is refused.
  void Detach() noexcept { m_state.reset(); }
  bool IsAttached() const noexcept { return m_state != nullptr; }
  const EngineSnapshot& State() const;
  std::uint64_t Generation() const noexcept { return m_generation; }
  // The view's objects are now those of that commit, which this process has just made.
  void Advance(std::uint64_t generation) noexcept { m_generation = generation; }

  // The object `oid`, read if it is not in memory. Throws CorruptRecord when there is no sound record of it, or when its
  // table is not `expected` (null: any of the nine classes).
  ptr<IPersistable> Resolve(OID oid, const IPersistable::FnTable* expected);

  // The record of the object `oid`, which should be of the table `expected`. Throws DanglingReference where there is none.
  ByteView RequireRecord(OID oid, const IPersistable::FnTable* expected) const;
  // The body of the stored object `oid`, which must be of the table `expected`: for whoever reads it without having the object made.
  // Valid until the view reads again. Throws as Resolve, but looks at what stands around the body alone.
  ByteView ReadStored(OID oid, const IPersistable::FnTable* expected);
  // Throws CorruptRecord: what ReadStored returned is not the form of such an object.
  [[noreturn]] void RefuseForm(OID oid, const IPersistable::FnTable* expected, const MalformedBytes& fault) const;

  // Throws CorruptRecord: the object's table is `found`, which is not `expected`.
  [[noreturn]] void RefuseClass(OID oid, const IPersistable::FnTable* found, const IPersistable::FnTable* expected) const;

  // Checks a record and reads it into a fresh object that belongs to nobody yet; its references carry this view. Throws
  // CorruptRecord, which names the class of the record or, where the record cannot tell it, `expected`'s. An object of another class
  // than `expected` is returned all the same.
  ptr<IPersistable> Decode(OID oid, ByteView record, const IPersistable::FnTable* expected = nullptr);

  // Reads a record that Decode has accepted into an object of its class that is in the default state: that cannot fail.
  void DecodeInto(ptr<IPersistable> object, OID oid, ByteView record);

  // The class that a record's head names, read without checking anything; empty where it names none.
  std::string_view ClassInHead(ByteView record) const noexcept;

  // The resident `oid`, or null.
  ptr<IPersistable> Find(OID oid) const noexcept;
  // The object behind a reference that is not empty where it is in memory, or null: for whoever looks at it and goes. Throws
  // CorruptRecord where it is of another table than `expected`, and UsageError where the reference was read in another view.
  ptr<IPersistable> InMemory(const prefbase& reference, const IPersistable::FnTable* expected);
  // Whether the object of that id and address is a resident or a root map. Unlike the rest, for any thread.
  bool Holds(OID oid, const void* self) const;
  // Takes an object in; `commit` is the one that wrote its record, 0 for a new one.
  void Adopt(OID oid, ptr<IPersistable> object, std::uint64_t commit = 0);
  // Marks an object as the view's own, under that id.
  void Own(ptr<IPersistable> object, OID oid) noexcept;
  // Removes a resident without ending it.
  void Release(OID oid) noexcept;
  // A resident was marked, or was written by that commit.
  void MarkedDirty(OID oid) noexcept { m_residents.MarkedDirty(oid); }
  void Written(OID oid, std::uint64_t commit, std::size_t bytes) noexcept { m_residents.Written(oid, commit, bytes); }

  // What the residents take that nothing pins.
  std::size_t EvictableBytes() const noexcept { return m_residents.EvictableBytes(); }
  // Ends clean residents until they take no more than `allowance` bytes. Nobody may hold a pointer to one of them, nor a
  // reference outside the view's objects that is bound to one. Costs a visit of all residents where there is something to
  // do; throws std::bad_alloc, which leaves everything as it was. Returns whether it did anything.
  bool Trim(std::size_t allowance);

  // Who may use the view.
  UseCheck& Use() noexcept { return m_use; }
  const UseCheck& Use() const noexcept { return m_use; }
  const char* UseName() const noexcept { return m_kind == Kind::kSnapshot ? "the snapshot" : "the transaction"; }

  RootMaps& Roots() noexcept { return m_roots; }

  // Ends all residents and sets root maps back to the default state, in place.
  void ForgetResidents() noexcept;

  // The numbers of classes in the view's commit, and those that the open transaction has given out.
  ClassNumbers& Classes() noexcept { return m_classes; }

  const std::string& SpaceName() const noexcept { return m_spaceName; }
  // The message of an exception about object `oid`.
  std::string Describe(OID oid, std::string_view className, std::string_view reason) const;
  ErrorPlace Place(OID oid, std::string_view className = "", std::string_view root = "") const;

 private:
  [[noreturn]] void RefuseForm(OID oid, std::string_view className, const MalformedBytes& fault) const;
  const ClassEntry& ClassOf(OID oid, std::uint32_t number, const IPersistable::FnTable* expected) const;
  void ReadBody(ptr<IPersistable> object, ByteView body);
  // Takes all references of the view to these objects back to the unbound state.
  void Unbind(const IdSet& ids) const;

  CSpace& m_space;
  std::string m_spaceName;
  Kind m_kind;
  mutable std::unique_ptr<EngineSnapshot> m_state;  // an expired state is let go of when it is asked for
  std::function<bool()> m_expiry;
  std::uint64_t m_generation = 0;
  ClassNumbers m_classes;
  mutable std::mutex m_residentsMutex;  // held where the residents change, for Holds
  Residents m_residents;
  UseCheck m_use;
  CacheCounters& m_counters;
  RootMaps m_roots;
};

// The view in which references are being read on this thread; null outside of View::Decode.
View* ReadingView() noexcept;

}  // namespace vemo
