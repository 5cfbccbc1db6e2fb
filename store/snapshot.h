// Reading a space as it was after one commit.
#pragma once

#include <chrono>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "store/space.h"

namespace vemo {

// Sees the newest commit at the time of its construction for as long as it lives, whatever is committed meanwhile, and
// blocks nobody. Any number may be open; each is used by one thread at a time. Maps, iterators and payload pointers taken
// from it end with it. Loaded nodes are its own and stay in memory until then, unless the space has a budget and the snapshot
// is trimmed. Two threads that use it at the same time are told so by a UsageError, as far as it is noticed.
class Snapshot {
 public:
  // `owner` names the snapshot in CSpace::Readers().
  explicit Snapshot(CSpace& space, std::string owner = "snapshot");
  ~Snapshot();
  Snapshot(const Snapshot&) = delete;
  Snapshot& operator=(const Snapshot&) = delete;

  // The root map of that name; throws UsageError when there is none or when it is of another class.
  template <class Map>
  const Map& Root(std::string_view name) {
    const ptr<IPersistable> map = RootMap(name);
    if (map.Table() != IPersistable::Stubs<Map>::GetTable()) RefuseRoot(name, IPersistable::Stubs<Map>::GetTable());
    return *static_cast<const Map*>(map.m_self);
  }

  // The root map of that name, whatever its class. Throws UsageError when there is none.
  ptr<IPersistable> RootMap(std::string_view name);
  bool HasRoot(std::string_view name) const;
  // All named roots, in order.
  std::vector<std::string> RootNames() const;

  std::optional<std::string> Meta(std::string_view name) const;
  void ScanMeta(std::string_view prefix,
                const std::function<bool(std::string_view name, std::string_view value)>& visit) const;

  // Moves to the newest commit. Root maps keep their address; nodes that did not change stay in memory, iterators and payload
  // pointers end. Costs a look at the record of each node in memory. Trims.
  void Refresh();

  // Has loaded nodes leave memory where they take more than the snapshot's share of SpaceOptions::cacheBytes. Ends iterators
  // and payload pointers where it returns true; root maps keep their address. Costs a visit of all nodes in memory where it
  // does anything, at most once for each tenth of the share that was loaded. Without a budget it does nothing.
  bool Trim() { return TrimTo(m_space.Allowance()); }
  // The same, down to `bytes` instead; 0 has all nodes leave.
  bool TrimTo(std::size_t bytes);
  // Whether Trim would do anything. Cheap.
  bool IsOverAllowance() const noexcept { return m_view.EvictableBytes() > m_space.Allowance(); }

  // Who reads, since when, and what.
  ReaderInfo Describe(std::chrono::steady_clock::time_point now) const;

  // The number of commits that the space has had.
  std::uint64_t Generation() const noexcept { return m_view.Generation(); }
  View& Objects() noexcept { return m_view; }
  CSpace& Space() const noexcept { return m_space; }

  // Forgets the view's objects if the one of that id and address is among them, and returns whether it was.
  bool ForgetIfHolds(OID oid, const void* self) noexcept;

 private:
  [[noreturn]] void RefuseRoot(std::string_view name, const IPersistable::FnTable* table);

  void Begin();
  void RequireUse() const;

  CSpace& m_space;
  std::string m_owner;
  std::chrono::steady_clock::time_point m_opened;
  View m_view;
};

}  // namespace vemo
