#include "bench/maps/map_row.h"

namespace vemo::bench {

std::vector<MapRow> AllMapRows() {
  std::vector<MapRow> rows;
  AddVemoRows(rows);
  AddStdMapRows(rows);
#ifdef VEMO_BENCH_ABSL
  AddAbslRows(rows);
#endif
#ifdef VEMO_BENCH_FLAT_MAP
  AddFlatMapRows(rows);
#endif
  return rows;
}

}  // namespace vemo::bench
