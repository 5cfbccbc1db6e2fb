// The face of a standard ordered map towards the workloads.
#pragma once

#include <memory>
#include <vector>

#include "bench/common/entries.h"

namespace vemo::bench {

template <class Map>
class StandardMap {
 public:
  using Payload = typename Map::mapped_type;
  static constexpr bool kGrows = true;

  StandardMap(const std::vector<FieldId>&, const PayloadPool<Payload>&) {}

  bool Insert(const FieldId& key, const Payload& payload) { return m_map.try_emplace(key, payload).second; }
  bool Erase(const FieldId& key) { return m_map.erase(key) != 0; }
  const Payload* Find(const FieldId& key) const {
    const auto found = m_map.find(key);
    return found == m_map.end() ? nullptr : &found->second;
  }
  const FieldId* LowerBound(const FieldId& key) const {
    const auto found = m_map.lower_bound(key);
    return found == m_map.end() ? nullptr : &found->first;
  }
  template <class Visit>
  void Scan(const Visit& visit) const {
    for (const auto& entry : m_map) visit(entry.second);
  }
  std::unique_ptr<Map> Copy() { return std::make_unique<Map>(m_map); }

 protected:
  Map m_map;
};

}  // namespace vemo::bench
