// What the programs of bench/run have in common: their command line, and how they report.
#pragma once

#include <filesystem>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "bench/common/measure.h"
#include "bench/common/row_name.h"

namespace vemo::bench {

struct BenchProgram {
  std::string name;              // "store_bench"
  std::string purpose;           // one line
  std::string exampleJob;        // "store.clustered.P1/1000000/vemo"
  bool needsFolder = false;      // takes --folder, an empty one
  // The jobs there are, a line each: WORKLOAD/PEER, and the rows that it reports where they are named otherwise.
  std::function<std::vector<std::string>()> list;
  // Runs one job and returns its rows under their full names; nothing where there is no such job.
  std::function<std::optional<std::vector<Measurement>>(const RowName& job, const std::filesystem::path& folder)> run;
};

// --list prints the jobs, --row WORKLOAD/SIZE/PEER runs one and prints a line of JSON a row. Returns the program's exit status.
int RunBenchProgram(const BenchProgram& program, int argc, char** argv);

}  // namespace vemo::bench
