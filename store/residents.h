// The nodes of one view that are in memory, by id, and the choice of those that leave.
//
//             Add             Written              Choose
//   [made] ---------> new ----------------> clean ----------> cooling ---- Choose ----> leaves
//                                           |   ^  <---------
//                               MarkedDirty |   | Written   Use
//   [read] --- Add ---> clean               v   |
//                                           dirty
//
// Eviction is by cooling, after Leis, Haubenschild, Kemper and Neumann, "LeanStore: In-Memory Data Management Beyond Main
// Memory" (ICDE 2018). What is in use is not written down anywhere, since following a bound reference must cost nothing.
// Instead a random sample of the clean objects is unbound: what of it is asked for again is in use and is bound anew, what is
// still cooling at the next choice leaves. References are moved as raw bytes, so that nobody knows where those to one
// object lie; whoever chooses has to visit all objects once (View::Trim), which is why a choice takes many.
//
// Invariants:
//   R1. bytes() is what the residents took when each was last measured, with what the table keeps about them.
//   R2. No reference in an object of the view is bound to a cooling resident.
//   R3. New and dirty residents stay.
#pragma once

#include <cstddef>
#include <cstdint>
#include <random>
#include <unordered_map>
#include <vector>

#include "store/cache_statistics.h"
#include "store/id_set.h"
#include "vxPersistStore/pref.h"

namespace vemo {

class Residents {
 public:
  enum class State : std::uint8_t { kNew, kDirty, kClean, kCooling };
  struct Resident {
    ptr<IPersistable> object;
    std::uint64_t commit;
    std::size_t bytes;
    State state;
  };
  using Table = std::unordered_map<OID, Resident>;

  // `seed` is where the random choice starts from.
  Residents(CacheCounters& counters, std::uint64_t seed);
  ~Residents();
  Residents(const Residents&) = delete;
  Residents& operator=(const Residents&) = delete;

  std::size_t bytes() const noexcept { return m_bytes; }
  // Without what the open transaction pins: what a choice can take.
  std::size_t EvictableBytes() const noexcept { return m_bytes - m_pinnedBytes; }

  // What an object takes in memory, with what this table keeps about it. Linear in its entries and their records.
  static std::size_t Measure(ptr<IPersistable> object) noexcept;

  // Null when it is not here.
  ptr<IPersistable> Find(OID oid) const noexcept;
  // The same for a reference that is about to be bound: a cooling object stays.
  ptr<IPersistable> Use(OID oid) noexcept;

  // `commit` is the one that wrote the object's record, 0 for a new one.
  void Add(OID oid, ptr<IPersistable> object, std::uint64_t commit);
  // A clean or cooling one is dirty from now on. One that is not here (a root map) is no concern of this table's.
  void MarkedDirty(OID oid) noexcept;
  // A new or dirty one is clean from now on, as `commit` wrote it; it takes `bytes`, as Measure says.
  void Written(OID oid, std::uint64_t commit, std::size_t bytes) noexcept;
  // Lets go of one without ending it.
  void Remove(OID oid) noexcept;
  // Lets go of all; the caller ends the objects.
  Table TakeAll() noexcept;

  // What is to leave, and what is to be unbound: that, and the next cooling sample.
  struct Choice {
    std::vector<OID> leaving;
    IdSet unbound;
  };
  // Chooses until what can be taken is below nine tenths of `allowance` bytes: all that is still cooling, then others at
  // random, and a tenth of the rest for cooling. The caller unbinds the references at once. Linear in the number of residents;
  // throws std::bad_alloc, which leaves everything as it was.
  Choice Choose(std::size_t allowance);

  const Table& All() const noexcept { return m_table; }

 private:
  static bool IsPinned(State state) noexcept { return state == State::kNew || state == State::kDirty; }
  void Count(const Resident& resident) noexcept;
  void Uncount(const Resident& resident) noexcept;
  std::size_t Draw(std::size_t below) { return std::uniform_int_distribution<std::size_t>(0, below - 1)(m_random); }

  CacheCounters& m_counters;
  std::minstd_rand m_random;
  Table m_table;
  std::size_t m_bytes = 0;
  std::size_t m_pinnedBytes = 0;
};

}  // namespace vemo
