// Runs one campaign: campaign NAME [--seed N] [--OPTION N]... The last line is the verdict.
#include <functional>
#include <iostream>
#include <map>
#include <optional>
#include <string>
#include <string_view>

#include "tests/campaigns/damage.h"
#include "tests/campaigns/fault_sweep.h"
#include "tests/campaigns/kill_loop.h"
#include "tests/campaigns/numbers.h"
#include "tests/campaigns/power_loss.h"
#include "tests/campaigns/races.h"
#include "tests/campaigns/soak.h"

namespace vemo::campaign {

namespace {

Verdict KillLoop(Numbers& numbers) {
  KillLoopOptions options;
  numbers.Take("seed", options.seed);
  numbers.Take("kills", options.kills);
  numbers.Take("keys", options.keys);
  numbers.RequireAllTaken();
  return RunKillLoop(options);
}

Verdict PowerLoss(Numbers& numbers) {
  PowerLossOptions options;
  numbers.Take("seed", options.seed);
  numbers.Take("images", options.images);
  numbers.Take("keys", options.keys);
  numbers.Take("commits", options.commits);
  numbers.Take("sync", options.sync);
  numbers.RequireAllTaken();
  return RunPowerLoss(options);
}

Verdict DamageSpace(Numbers& numbers) {
  DamageOptions options;
  numbers.Take("seed", options.seed);
  numbers.Take("damages", options.damages);
  numbers.Take("forgeries", options.forgeries);
  numbers.Take("salvage-every", options.salvageEvery);
  numbers.RequireAllTaken();
  return RunDamage(options);
}

Verdict SoakSpace(Numbers& numbers) {
  SoakOptions options;
  numbers.Take("seed", options.seed);
  numbers.Take("operations", options.operations);
  numbers.Take("keys", options.keys);
  numbers.Take("commit", options.operationsPerCommit);
  numbers.Take("cache", options.cacheBytes);
  numbers.RequireAllTaken();
  return RunSoak(options);
}

Verdict Race(Numbers& numbers) {
  RacesOptions options;
  numbers.Take("seed", options.seed);
  numbers.Take("commits", options.commits);
  numbers.Take("reads", options.reads);
  numbers.Take("readers", options.readers);
  numbers.Take("keys", options.keys);
  numbers.RequireAllTaken();
  return RunRaces(options);
}

template <Verdict (&run)(const FaultSweepOptions&)>
Verdict FaultSweep(Numbers& numbers) {
  FaultSweepOptions options;
  numbers.Take("seed", options.seed);
  numbers.Take("stride", options.stride);
  numbers.Take("all", options.allFaults);
  numbers.RequireAllTaken();
  return run(options);
}

const std::map<std::string_view, std::function<Verdict(Numbers&)>>& Campaigns() {
  static const std::map<std::string_view, std::function<Verdict(Numbers&)>> campaigns{
      {"kill_loop", KillLoop},
      {"power_loss", PowerLoss},
      {"engine_faults", FaultSweep<RunEngineFaults>},
      {"disk_faults", FaultSweep<RunDiskFaults>},
      {"allocation_failures", FaultSweep<RunAllocationFailures>},
      {"soak", SoakSpace},
      {"races", Race},
      {"damage", DamageSpace},
  };
  return campaigns;
}

int Run(int argc, char** argv) {
  if (argc == 6 && std::string_view(argv[1]) == "record") {  // a process that the power is cut from
    WorkUnderRecorder({argv[2], std::stoull(argv[3]), std::stoull(argv[4]), std::stoull(argv[5])});
    return 0;
  }
  const auto campaign = argc > 1 ? Campaigns().find(argv[1]) : Campaigns().end();
  if (campaign == Campaigns().end()) {
    std::cerr << "usage: campaign NAME [--seed N] [--OPTION N]...; the names are";
    for (const auto& [name, run] : Campaigns()) std::cerr << ' ' << name;
    std::cerr << std::endl;
    return 2;
  }
  Numbers numbers(argc, argv);
  const Verdict verdict = campaign->second(numbers);
  for (const std::string& fault : verdict.faults()) std::cout << fault << '\n';
  std::cout << verdict.Line() << std::endl;
  return verdict.IsSound() ? 0 : 1;
}

}  // namespace

}  // namespace vemo::campaign

int main(int argc, char** argv) {
  try {
    return vemo::campaign::Run(argc, argv);
  } catch (const std::exception& error) {
    std::cerr << error.what() << std::endl;
    return 2;
  }
}
