// store_bench: stores on disk, one job a process, each phase of it in a process of its own.
#include <fmt/core.h>

#include <CLI/CLI.hpp>
#include <cstdlib>
#include <exception>
#include <string>

#include "bench/common/row_name.h"
#include "bench/stores/store_job.h"

namespace {

using namespace vemo::bench;

struct Workload {
  KeyKind keys;
  StorePayload payload;
  std::string suffix;  // "clustered.P1"
};

const std::vector<Workload>& Workloads() {
  static const std::vector<Workload> all{{KeyKind::kClustered, StorePayload::kTombstones, "clustered.P1"},
                                         {KeyKind::kClustered, StorePayload::kInsertions, "clustered.P2"},
                                         {KeyKind::kRandom, StorePayload::kTombstones, "random.P1"}};
  return all;
}

void PrintList() {
  for (const Workload& workload : Workloads()) {
    for (const StoreKind& kind : AllStoreKinds()) {
      fmt::print("store.{}/{}", workload.suffix, kind.peer);
      for (const std::string& operation : StoreJob::Operations(kind))
        fmt::print(" store.{}.{}", operation, workload.suffix);
      fmt::print("\n");
    }
  }
}

int RunRow(const std::string& wanted, const std::string& folder) {
  const std::optional<RowName> name = ParseRowName(wanted);
  for (const Workload& workload : Workloads()) {
    for (const StoreKind& kind : AllStoreKinds()) {
      if (!name || name->workload != "store." + workload.suffix || name->peer != kind.peer) continue;
      StoreJob job(kind, workload.keys, workload.payload, name->size, folder);
      for (Measurement& measurement : job.Run()) {
        measurement.row = "store." + measurement.row + "." + workload.suffix;
        fmt::print("{}\n", ToJsonLine(measurement, name->size, kind.peer));
      }
      return EXIT_SUCCESS;
    }
  }
  fmt::print(stderr, "store_bench: there is no job {}; --list prints those there are\n", wanted);
  return EXIT_FAILURE;
}

}  // namespace

int main(int argc, char** argv) {
  CLI::App app("Measures stores on disk");
  bool list = false;
  std::string wanted;
  std::string folder;
  app.add_flag("--list", list, "Print the jobs, each as WORKLOAD/PEER and the rows that it reports");
  app.add_option("--row", wanted, "Run one: WORKLOAD/SIZE/PEER, such as store.clustered.P1/1000000/vemo");
  app.add_option("--folder", folder, "An empty folder for the store")->check(CLI::ExistingDirectory);
  CLI11_PARSE(app, argc, argv);
  if (list) {
    PrintList();
    return EXIT_SUCCESS;
  }
  try {
    return RunRow(wanted, folder);
  } catch (const std::exception& error) {
    fmt::print(stderr, "store_bench: {}: {}\n", wanted, error.what());
    return EXIT_FAILURE;
  }
}
