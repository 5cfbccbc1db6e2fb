#include "bench/common/bench_program.h"

#include <fmt/core.h>

#include <CLI/CLI.hpp>
#include <cstdlib>
#include <exception>

namespace vemo::bench {

namespace {

int RunJob(const BenchProgram& program, const std::string& wanted, const std::filesystem::path& folder) {
  const std::optional<RowName> job = ParseRowName(wanted);
  const auto measured = job ? program.run(*job, folder) : std::nullopt;
  if (!measured) {
    fmt::print(stderr, "{}: there is no job {}; --list prints those there are\n", program.name, wanted);
    return EXIT_FAILURE;
  }
  for (const Measurement& measurement : *measured) fmt::print("{}\n", ToJsonLine(measurement, job->size, job->peer));
  return EXIT_SUCCESS;
}

}  // namespace

int RunBenchProgram(const BenchProgram& program, int argc, char** argv) {
  CLI::App app(program.purpose);
  bool list = false;
  std::string wanted;
  std::string folder;
  app.add_flag("--list", list, "Print the jobs, each as WORKLOAD/PEER and the rows that it reports");
  app.add_option("--row", wanted, "Run one: WORKLOAD/SIZE/PEER, such as " + program.exampleJob);
  if (program.needsFolder) app.add_option("--folder", folder, "An empty folder for the store")->check(CLI::ExistingDirectory);
  CLI11_PARSE(app, argc, argv);
  if (list) {
    for (const std::string& line : program.list()) fmt::print("{}\n", line);
    return EXIT_SUCCESS;
  }
  try {
    return RunJob(program, wanted, folder);
  } catch (const std::exception& error) {
    fmt::print(stderr, "{}: {}: {}\n", program.name, wanted, error.what());
    return EXIT_FAILURE;
  }
}

}  // namespace vemo::bench
