// What the programs that run campaigns have in common: options in, a verdict out.
#pragma once

#include <functional>

#include "tests/campaigns/numbers.h"
#include "tests/campaigns/verdict.h"

namespace vemo::campaign {

// A campaign with the options of a command line.
using Campaign = std::function<Verdict(Numbers&)>;

// The campaign that `run` is. Takes "seed"; `take` takes its other options.
template <class Options>
Campaign MakeCampaign(Verdict (*run)(const Options&), void (*take)(Numbers&, Options&)) {
  return [run, take](Numbers& numbers) {
    Options options;
    numbers.Take("seed", options.seed);
    take(numbers, options);
    numbers.RequireAllTaken();
    return run(options);
  };
}

// Runs a campaign with the options behind its name. Prints faults, and the verdict as the last line. Returns 0 where all was
// sound and 1 where not.
int RunCampaign(const Campaign& campaign, int argc, char** argv);

// Returns what `program` returns, and 2 where it throws, having printed why.
int RunProgram(const std::function<int()>& program);

}  // namespace vemo::campaign
