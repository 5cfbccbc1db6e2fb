// What the roots of a commit reach.
#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "store/id_set.h"
#include "store/snapshot.h"

namespace vemo {

// Walks from every root map, owned ones too, and from the queue of deletions. Each record is decoded once and not kept; memory is
// a bit for each id, and the ids of the nodes that are still to be visited.
class Reach {
 public:
  // `goOn` is told now and then how many records were reached; the walk ends when it returns false.
  Reach(Snapshot& snapshot, std::function<bool(std::uint64_t done)> goOn)
      : m_snapshot(snapshot), m_goOn(std::move(goOn)) {}

  // False when `goOn` ended the walk. Throws CorruptRecord or DanglingReference at the first object that cannot be read, is of
  // another class than its place in the tree asks for, hangs in the trees twice, has other neighbours than the tree gives it, or
  // is in use and awaits deletion.
  bool Run();

  // The ids that were reached, those awaiting deletion among them.
  IdSet TakeReached() noexcept { return std::move(m_reached); }
  std::uint64_t NumAwaitingDeletion() const noexcept { return m_awaiting; }

 private:
  bool WalkRoot(const std::string& name);
  template <class Map>
  bool WalkMap(const std::string& name, ptr<IPersistable> object);
  bool WalkQueue();
  ptr<IPersistable> Decode(const std::string& root, OID oid, const IPersistable::FnTable* expected);
  [[noreturn]] void Refuse(const std::string& root, OID oid, std::string_view className, const std::string& reason) const;
  const EngineSnapshot& State() { return m_snapshot.Objects().State(); }
  bool Count() { return ++m_visited % 256 != 0 || !m_goOn || m_goOn(m_visited); }

  Snapshot& m_snapshot;
  std::function<bool(std::uint64_t)> m_goOn;
  IdSet m_reached;
  std::uint64_t m_visited = 0;
  std::uint64_t m_awaiting = 0;
};

}  // namespace vemo
