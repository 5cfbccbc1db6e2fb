// replay_bench: histories replayed into the maps.
#include <fmt/core.h>

#include <CLI/CLI.hpp>
#include <cstdlib>
#include <exception>
#include <filesystem>
#include <string>

#include "bench/common/row_name.h"
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

void PrintList() {
  std::vector<std::string> workloads{kGit};
  if (fs::exists(RecordingFile())) {
    workloads.insert(workloads.begin(), kRecording);
  } else {
    fmt::print(stderr, "{} is not there: the rows of {} are skipped\n", RecordingFile().string(), kRecording);
  }
  for (const std::string& workload : workloads) {
    fmt::print("{}/vemo", workload);
    for (const std::string& operation : ReplayOperations()) fmt::print(" {}.{}", workload, operation);
    fmt::print("\n");
  }
}

std::unique_ptr<EditSource> OpenSource(const RowName& name, const fs::path& folder) {
  if (name.workload == kRecording)
    return OpenTrace(RecordingFile(), FieldId{OID(1), Path{0}}, "recorded author");
  // A commit has a dozen edits or more.
  MakeRepository(folder / "repository", 20 + name.size / 10);
  return OpenGitHistory(folder / "repository");
}

int RunRow(const std::string& wanted, const fs::path& folder) {
  const std::optional<RowName> name = ParseRowName(wanted);
  if (!name || (name->workload != kRecording && name->workload != kGit) || name->peer != "vemo") {
    fmt::print(stderr, "replay_bench: there is no job {}; --list prints those there are\n", wanted);
    return EXIT_FAILURE;
  }
  HeldSource source(*OpenSource(*name, folder), name->size);
  for (Measurement& measurement : RunReplays(source, folder)) {
    measurement.row = name->workload + "." + measurement.row;
    fmt::print("{}\n", ToJsonLine(measurement, name->size, name->peer));
  }
  return EXIT_SUCCESS;
}

}  // namespace

int main(int argc, char** argv) {
  CLI::App app("Measures the replay of histories");
  bool list = false;
  std::string wanted;
  std::string folder;
  app.add_flag("--list", list, "Print the jobs, each as WORKLOAD/PEER and the rows that it reports");
  app.add_option("--row", wanted, "Run one: WORKLOAD/EDITS/PEER, such as replay.git/10000/vemo");
  app.add_option("--folder", folder, "An empty folder for the store")->check(CLI::ExistingDirectory);
  CLI11_PARSE(app, argc, argv);
  if (list) {
    PrintList();
    return EXIT_SUCCESS;
  }
  try {
    return RunRow(wanted, folder);
  } catch (const std::exception& error) {
    fmt::print(stderr, "replay_bench: {}: {}\n", wanted, error.what());
    return EXIT_FAILURE;
  }
}
