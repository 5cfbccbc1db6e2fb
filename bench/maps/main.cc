// map_bench: the maps in memory, one row a process.
#include "bench/common/bench_program.h"
#include "bench/maps/map_row.h"

namespace {

using namespace vemo::bench;

std::vector<std::string> List() {
  std::vector<std::string> lines;
  for (const MapRow& row : AllMapRows()) lines.push_back(row.name + "/" + row.peer);
  return lines;
}

std::optional<std::vector<Measurement>> Run(const RowName& job, const std::filesystem::path&) {
  for (const MapRow& row : AllMapRows()) {
    if (row.name != job.workload || row.peer != job.peer) continue;
    Measurement measurement = row.run(job.size);
    measurement.row = row.name;
    return std::vector{measurement};
  }
  return std::nullopt;
}

}  // namespace

int main(int argc, char** argv) {
  return RunBenchProgram({.name = "map_bench",
                          .purpose = "Measures maps in memory",
                          .exampleJob = "map.insert.clustered.P1/1000000/vemo",
                          .list = List,
                          .run = Run},
                         argc, argv);
}
