// Telling the host that a change was left half-way.
#pragma once

#include "platform/object_store.h"
#include "vxPersistStore/IPersistable.h"

namespace vemo {

// Stands at the head of an operation that changes a map. An operation that is left by an exception does not reach
// Complete(), and the host learns that the map may be in any state.
template <class Map>
class MutationScope {
 public:
  explicit MutationScope(const Map* map) noexcept : m_map(map) {}
  ~MutationScope() {
    if (m_map != nullptr) MutationInterrupted(ptr<const IPersistable>(m_map));
  }
  MutationScope(const MutationScope&) = delete;
  MutationScope& operator=(const MutationScope&) = delete;

  void Complete() noexcept { m_map = nullptr; }

 private:
  const Map* m_map;
};

}  // namespace vemo
