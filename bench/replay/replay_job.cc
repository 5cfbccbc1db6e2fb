#include "bench/replay/replay_job.h"

#include <algorithm>

#include "bench/common/own_process.h"
#include "history/replay.h"
#include "store/space.h"

namespace vemo::bench {

namespace {

std::vector<Measurement> RunReplay(EditSource& source, const std::string& name, const std::string& uri,
                                   std::uint64_t batchEdits) {
  const std::uint64_t before = ResetPeakResident();
  const auto space = CSpace::Open(uri, {.create = true});
  ReplayOptions options;
  options.batchEdits = batchEdits;
  const double start = WallNanoseconds();
  const ReplayReport report = Replay(*space, source, options);
  const double nanoseconds = WallNanoseconds() - start;
  const double peak = static_cast<double>(PeakResidentBytes() - before) / (1'024.0 * 1'024.0);
  const std::uint64_t answers = report.elementsInserted * 31 + report.elementsDeleted;
  return {{name, "ns/edit", nanoseconds / static_cast<double>(report.editsApplied), answers},
          {name + "-memory", "MiB", peak, answers}};
}

}  // namespace

std::vector<std::string> ReplayOperations() {
  return {"durable", "durable-memory", "one-commit", "one-commit-memory"};
}

std::vector<Measurement> RunReplays(EditSource& source, const std::filesystem::path& folder) {
  const std::string onDisk = "lmdb:" + (folder / "space").string();
  std::vector<Measurement> all =
      RunInOwnProcess([&] { return RunReplay(source, "durable", onDisk, 10'000); });
  const std::uint64_t edits = source.CountEdits();
  const std::vector<Measurement> inMemory =
      RunInOwnProcess([&] { return RunReplay(source, "one-commit", "memory:", edits + 1); });
  all.insert(all.end(), inMemory.begin(), inMemory.end());
  return all;
}

}  // namespace vemo::bench
