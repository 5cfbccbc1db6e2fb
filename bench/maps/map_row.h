// The rows of one map in memory, and the list of all of them.
#pragma once

#include <cstddef>
#include <functional>
#include <string>
#include <vector>

#include "bench/common/measure.h"

namespace vemo::bench {

// One cell of the matrix: a workload with its keys and payload, and who does it.
struct MapRow {
  std::string name;  // "map.insert.clustered.P1"
  std::string peer;
  std::function<Measurement(std::size_t size)> run;
};

void AddVemoRows(std::vector<MapRow>& rows);
void AddStdMapRows(std::vector<MapRow>& rows);
void AddAbslRows(std::vector<MapRow>& rows);
void AddFlatMapRows(std::vector<MapRow>& rows);

// The rows of every peer that was installed when this was built; vemo's first.
std::vector<MapRow> AllMapRows();

}  // namespace vemo::bench
