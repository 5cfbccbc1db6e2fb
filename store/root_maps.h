// The root maps of one view.
//
// Invariants:
//   M1. A map keeps its address as long as the view lives: it is read, reset and read anew in place. One whose name now stands
//       for a map of another class is retired, not ended.
//   M2. A root that is not (or no longer) in the space has a null id.
//   M3. While the maps are stale they are in the default state, and Find reads them first.
//
// Threads: as the view; Holds is for any thread.
#pragma once

#include <functional>
#include <map>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "store/class_registry.h"
#include "store/object_state.h"

namespace vemo {

class View;

class RootMaps {
 public:
  struct Root {
    const ClassEntry* classEntry = nullptr;
    OID oid;
    ptr<IPersistable> map;
    bool committed = false;
  };
  using Table = std::map<std::string, Root, std::less<>>;

  // Of `view`, which owns this.
  explicit RootMaps(View& view) noexcept : m_view(view) {}
  ~RootMaps();
  RootMaps(const RootMaps&) = delete;
  RootMaps& operator=(const RootMaps&) = delete;

  // The root of that name, its map read if need be; null when the space has none. Throws CorruptRecord, IncompatibleSpace
  // for a class that this program does not know, and what the engine throws.
  Root* Find(std::string_view name);
  // Enters a root that the open transaction makes.
  Root& Add(std::string_view name, const ClassEntry& classEntry, OID oid);
  // Gives a root in memory another name, under which no root of the space stands.
  Root& Rename(std::string_view from, std::string_view to);
  // Sets the map of a root to the default state.
  void ResetInPlace(Root& root) noexcept;

  // All roots that were asked for, those without an id included.
  Table& All() noexcept { return m_roots; }
  // Has every map visit what it refers to, the retired ones included.
  void VisitObjects(IObjectVisitor& visitor) const;
  // Whether the map of a root is at that address. Unlike the rest, for any thread.
  bool Holds(const void* self) const;

  // Sets all maps back to the default state; they are stale until Reload has succeeded. Roots that were never committed
  // are none any longer.
  void Forget() noexcept;
  bool AreStale() const noexcept { return m_areStale; }
  // Reads all maps anew after Forget. Throws as Find does.
  void Reload();

 private:
  void Read(std::string_view name, Root& root);

  View& m_view;
  bool m_areStale = false;
  mutable std::mutex m_mutex;  // held where maps come and go, for Holds
  Table m_roots;
  std::vector<Root> m_retired;
};

}  // namespace vemo
