// Runs one campaign: campaign NAME [--seed N] [--OPTION N]... The last line is the verdict.
#include <iostream>
#include <map>
#include <string>
#include <string_view>

#include "tests/campaigns/campaign_program.h"
#include "tests/campaigns/damage.h"
#include "tests/campaigns/fault_sweep.h"
#include "tests/campaigns/kill_loop.h"
#include "tests/campaigns/power_loss.h"
#include "tests/campaigns/races.h"
#include "tests/campaigns/soak.h"

namespace vemo::campaign {

namespace {

void Take(Numbers& numbers, KillLoopOptions& options) {
  numbers.Take("kills", options.kills);
  numbers.Take("keys", options.keys);
}

void Take(Numbers& numbers, PowerLossOptions& options) {
  numbers.Take("images", options.images);
  numbers.Take("keys", options.keys);
  numbers.Take("commits", options.commits);
  numbers.Take("sync", options.sync);
}

void Take(Numbers& numbers, DamageOptions& options) {
  numbers.Take("damages", options.damages);
  numbers.Take("forgeries", options.forgeries);
  numbers.Take("salvage-every", options.salvageEvery);
}

void Take(Numbers& numbers, SoakOptions& options) {
  numbers.Take("operations", options.operations);
  numbers.Take("keys", options.keys);
  numbers.Take("commit", options.operationsPerCommit);
  numbers.Take("cache", options.cacheBytes);
}

void Take(Numbers& numbers, RacesOptions& options) {
  numbers.Take("commits", options.commits);
  numbers.Take("reads", options.reads);
  numbers.Take("readers", options.readers);
  numbers.Take("keys", options.keys);
}

void Take(Numbers& numbers, FaultSweepOptions& options) {
  numbers.Take("stride", options.stride);
  numbers.Take("all", options.allFaults);
}

const std::map<std::string_view, Campaign>& Campaigns() {
  static const std::map<std::string_view, Campaign> campaigns{
      {"kill_loop", MakeCampaign<KillLoopOptions>(RunKillLoop, Take)},
      {"power_loss", MakeCampaign<PowerLossOptions>(RunPowerLoss, Take)},
      {"engine_faults", MakeCampaign<FaultSweepOptions>(RunEngineFaults, Take)},
      {"disk_faults", MakeCampaign<FaultSweepOptions>(RunDiskFaults, Take)},
      {"allocation_failures", MakeCampaign<FaultSweepOptions>(RunAllocationFailures, Take)},
      {"soak", MakeCampaign<SoakOptions>(RunSoak, Take)},
      {"races", MakeCampaign<RacesOptions>(RunRaces, Take)},
      {"damage", MakeCampaign<DamageOptions>(RunDamage, Take)},
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
  return RunCampaign(campaign->second, argc, argv);
}

}  // namespace

}  // namespace vemo::campaign

int main(int argc, char** argv) {
  using namespace vemo::campaign;
  return RunProgram([=] { return Run(argc, argv); });
}
