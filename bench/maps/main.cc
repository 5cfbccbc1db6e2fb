// map_bench: the maps in memory, one row a process.
#include <fmt/core.h>

#include <CLI/CLI.hpp>
#include <cstdlib>
#include <string>

#include "bench/common/row_name.h"
#include "bench/maps/map_row.h"

int main(int argc, char** argv) {
  using namespace vemo::bench;
  CLI::App app("Measures maps in memory");
  bool list = false;
  std::string wanted;
  app.add_flag("--list", list, "Print the rows, each as WORKLOAD/PEER");
  app.add_option("--row", wanted,
                 "Run one: WORKLOAD/SIZE/PEER, such as map.insert.clustered.P1/1000000/vemo");
  CLI11_PARSE(app, argc, argv);

  const std::vector<MapRow> rows = AllMapRows();
  if (list) {
    for (const MapRow& row : rows) fmt::print("{}/{}\n", row.name, row.peer);
    return EXIT_SUCCESS;
  }
  const std::optional<RowName> name = ParseRowName(wanted);
  for (const MapRow& row : rows) {
    if (!name || row.name != name->workload || row.peer != name->peer) continue;
    Measurement measurement = row.run(name->size);
    measurement.row = row.name;
    fmt::print("{}\n", ToJsonLine(measurement, name->size, row.peer));
    return EXIT_SUCCESS;
  }
  fmt::print(stderr, "map_bench: there is no row {}; --list prints those there are\n", wanted);
  return EXIT_FAILURE;
}
