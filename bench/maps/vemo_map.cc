#include <memory>

#include "bench/maps/map_workloads.h"
#include "vemo/store.h"

namespace vemo::bench {

namespace {

template <class Payload>
struct MapOf;
template <>
struct MapOf<VectorTombstones> {
  using Type = FieldIdToVectorTombstonesMap;
};
template <>
struct MapOf<VectorInsertions> {
  using Type = FieldIdToVectorInsertionsMap;
};

// A root map of a space in memory, inside one transaction: all of a map's work, and of the store's that which
// goes on beside it.
template <class P>
class VemoMap {
 public:
  using Payload = P;
  using Map = typename MapOf<Payload>::Type;
  static constexpr bool kGrows = true;

  VemoMap(const std::vector<FieldId>&, const PayloadPool<Payload>&)
      : m_space(CSpace::Open("memory:", {.create = true})),
        m_transaction(std::make_unique<WriteTransaction>(*m_space)),
        m_map(&m_transaction->Root<Map>("measured")) {}

  bool Insert(const FieldId& key, const Payload& payload) { return m_map->Insert(key, payload, false); }
  bool Erase(const FieldId& key) { return m_map->Delete(key); }
  const Payload* Find(const FieldId& key) const { return m_map->rFind(key); }
  const FieldId* LowerBound(const FieldId& key) const {
    const Map& map = *m_map;
    const auto found = map.lower_bound(key);
    return found == map.end() ? nullptr : &(*found).first;
  }
  template <class Visit>
  void Scan(const Visit& visit) const {
    for (const auto& entry : std::as_const(*m_map)) visit(entry.second);
  }
  std::unique_ptr<Map> Copy() { return std::make_unique<Map>(std::as_const(*m_map)); }

 private:
  std::unique_ptr<CSpace> m_space;
  std::unique_ptr<WriteTransaction> m_transaction;
  Map* m_map;
};

}  // namespace

void AddVemoRows(std::vector<MapRow>& rows) {
  AddAllMapRows<VemoMap>(rows, "vemo");
}

}  // namespace vemo::bench
