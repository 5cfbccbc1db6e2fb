#include <absl/container/btree_map.h>

#include "bench/maps/map_workloads.h"
#include "bench/maps/standard_map.h"

namespace vemo::bench {

template <class Payload>
using AbslMap = StandardMap<absl::btree_map<FieldId, Payload>>;

void AddAbslRows(std::vector<MapRow>& rows) {
  AddAllMapRows<AbslMap>(rows, "absl::btree_map");
}

}  // namespace vemo::bench
