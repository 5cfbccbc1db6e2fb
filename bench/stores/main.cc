// store_bench: stores on disk, one job a process, each phase of it in a process of its own.
#include <fmt/core.h>

#include "bench/common/bench_program.h"
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

std::vector<std::string> List() {
  std::vector<std::string> lines;
  for (const Workload& workload : Workloads()) {
    for (const StoreKind& kind : AllStoreKinds()) {
      std::string& line = lines.emplace_back(fmt::format("store.{}/{}", workload.suffix, kind.peer));
      for (const std::string& operation : StoreJob::Operations(kind))
        line += fmt::format(" store.{}.{}", operation, workload.suffix);
    }
  }
  return lines;
}

std::optional<std::vector<Measurement>> Run(const RowName& job, const std::filesystem::path& folder) {
  for (const Workload& workload : Workloads()) {
    for (const StoreKind& kind : AllStoreKinds()) {
      if (job.workload != "store." + workload.suffix || job.peer != kind.peer) continue;
      std::vector<Measurement> measured = StoreJob(kind, workload.keys, workload.payload, job.size, folder).Run();
      for (Measurement& measurement : measured) measurement.row = "store." + measurement.row + "." + workload.suffix;
      return measured;
    }
  }
  return std::nullopt;
}

}  // namespace

int main(int argc, char** argv) {
  return RunBenchProgram({.name = "store_bench",
                          .purpose = "Measures stores on disk",
                          .exampleJob = "store.clustered.P1/1000000/vemo",
                          .needsFolder = true,
                          .list = List,
                          .run = Run},
                         argc, argv);
}
