#include <map>

#include "bench/maps/map_workloads.h"
#include "bench/maps/standard_map.h"

namespace vemo::bench {

template <class Payload>
using StdMap = StandardMap<std::map<FieldId, Payload>>;

void AddStdMapRows(std::vector<MapRow>& rows) {
  AddAllMapRows<StdMap>(rows, "std::map");
}

}  // namespace vemo::bench
