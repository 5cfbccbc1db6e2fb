// replay_bench: histories replayed into the maps.
#include <fmt/core.h>

#include <cstdlib>

#include "bench/common/bench_program.h"
#include "bench/replay/generated_repository.h"
#include "bench/replay/held_source.h"
#include "bench/replay/replay_job.h"

namespace {

using namespace vemo;
using namespace vemo::bench;
namespace fs = std::filesystem;

constexpr char kRecording[] = "replay.recording";
constexpr char kGit[] = "replay.git";

// The recorded session; it lies beside the sources, or in VEMO_DATA_DIR, and is not part of them.
fs::path RecordingFile() {
  const char* folder = std::getenv("VEMO_DATA_DIR");
  return fs::path(folder != nullptr ? folder : VEMO_SOURCE_DIR "/../shared/data") / "automerge-paper.json.gz";
}

std::vector<std::string> List() {
  std::vector<std::string> workloads{kGit};
  if (fs::exists(RecordingFile())) {
    workloads.insert(workloads.begin(), kRecording);
  } else {
    fmt::print(stderr, "{} is not there: the rows of {} are skipped\n", RecordingFile().string(), kRecording);
  }
  std::vector<std::string> lines;
  for (const std::string& workload : workloads) {
    std::string& line = lines.emplace_back(workload + "/vemo");
    for (const std::string& operation : ReplayOperations()) line += " " + workload + "." + operation;
  }
  return lines;
}

std::unique_ptr<EditSource> OpenSource(const RowName& name, const fs::path& folder) {
  if (name.workload == kRecording)
    return OpenTrace(RecordingFile(), FieldId{OID(1), Path{0}}, "recorded author");
  // A commit has a dozen edits or more.
  MakeRepository(folder / "repository", 20 + name.size / 10);
  return OpenGitHistory(folder / "repository");
}

std::optional<std::vector<Measurement>> Run(const RowName& job, const fs::path& folder) {
  if ((job.workload != kRecording && job.workload != kGit) || job.peer != "vemo") return std::nullopt;
  HeldSource source(*OpenSource(job, folder), job.size);
  std::vector<Measurement> measured = RunReplays(source, folder);
  for (Measurement& measurement : measured) measurement.row = job.workload + "." + measurement.row;
  return measured;
}

}  // namespace

int main(int argc, char** argv) {
  return RunBenchProgram({.name = "replay_bench",
                          .purpose = "Measures the replay of histories; a job's size is its number of edits",
                          .exampleJob = "replay.git/10000/vemo",
                          .needsFolder = true,
                          .list = List,
                          .run = Run},
                         argc, argv);
}
