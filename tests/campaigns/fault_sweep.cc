#include "tests/campaigns/fault_sweep.h"

#include <array>
#include <functional>
#include <new>
#include <random>
#include <string>

#include "store/verify.h"
#include "tests/campaigns/fault_scenarios.h"
#include "tests/campaigns/space_content.h"
#include "tests/support/failing_allocator.h"
#include "tests/support/failing_disk.h"
#include "tests/support/keys.h"
#include "vxOperation/src/WorkingSet/CompOp/VectorOT.h"

namespace vemo::campaign {

namespace {

constexpr std::array<Fault, 5> kFaults{Fault::kNoSpace, Fault::kIoError, Fault::kUnknownApplied, Fault::kUnknownDropped,
                                       Fault::kDeliveredTwice};

// What a commit of a scenario leaves.
struct State {
  std::string content;
  std::uint64_t unreachable = 0;  // what copy assignments left behind

  friend bool operator==(const State&, const State&) = default;
};

State StateOf(Stage& stage, std::string& faults) {
  Snapshot snapshot(stage.space());
  const VerifyReport report = VerifySpace(snapshot);
  for (const Finding& finding : report.findings) faults += finding.root + ": " + finding.fault + "\n";
  return {ContentOf(snapshot), report.unreachable};
}

void Begin(const Scenario& scenario, Stage& stage) {
  if (scenario.isPrepared) Prepare(stage);
}

// The states before the first commit of a scenario and after each, from a run in which nothing goes wrong. A space that is not
// made yet has no state: the first entry is then the same as the second, the space just made.
std::vector<State> Rehearse(const Scenario& scenario, EngineSort sort) {
  std::string faults;
  std::vector<State> states;
  Stage stage(sort);
  Begin(scenario, stage);
  if (stage.IsOpen()) states.push_back(StateOf(stage, faults));
  stage.onAcknowledge = [&] {
    states.push_back(StateOf(stage, faults));
    if (states.size() == 1) states.push_back(states.front());
  };
  scenario.act(stage);
  if (!faults.empty()) throw std::logic_error(scenario.name + " is not sound by itself: " + faults);
  return states;
}

// Runs `act` with something about to go wrong, and ends that; returns whether it went wrong.
using Disturbance = std::function<bool(Stage& stage, const std::function<void()>& act)>;

// What is wrong after a disturbed scenario; empty where all promises hold.
std::string JudgeAfter(Stage& stage, const std::vector<State>& states, bool isUnknown) {
  if (stage.HasMissedPoison()) return "an interrupted change did not poison its transaction\n";
  if (!stage.IsOpen()) stage.Open();
  std::string faults;
  const State state = StateOf(stage, faults);
  const std::size_t commits = stage.acknowledged();
  const bool isNext = isUnknown && commits + 1 < states.size() && state == states[commits + 1];
  if (!isNext && !(state == states.at(commits))) {
    faults += "after " + std::to_string(commits) + " commits that returned: " + state.content.substr(0, 60) + "\n";
  }
  {
    WriteTransaction transaction(stage.space());
    Snapshot snapshot(stage.space());
    if (!SeesTheSame(transaction, snapshot)) faults += "the writer sees something else than what is committed\n";
  }
  {
    WriteTransaction transaction(stage.space());
    auto& map = transaction.Root<FieldIdToVectorTombstonesMap>("t");
    for (std::uint64_t n = 350; n < 480; ++n) map.Delete(test::Key(n));
    for (std::uint64_t n = 2'000; n < 2'120; ++n) map.Insert(test::Key(n), {}, true);
    transaction.Commit();
  }
  for (const bool reopened : {false, true}) {
    if (reopened) {
      stage.Close();
      stage.Open();
    }
    if (StateOf(stage, faults).unreachable != state.unreachable) faults += "a later commit leaks\n";
  }
  return faults;
}

class Sweep {
 public:
  Sweep(std::string campaign, const FaultSweepOptions& options)
      : m_options(options), m_verdict(std::move(campaign), options.seed), m_random(options.seed) {}

  // Disturbs a scenario at place 1, 2 ... until nothing is left to go wrong.
  void Run(const Scenario& scenario, EngineSort sort, const std::string& what,
           const std::function<Disturbance(std::uint64_t place)>& disturbanceAt) {
    const std::vector<State> states = Rehearse(scenario, sort);
    bool goesWrong = true;
    for (std::uint64_t place = 1 + m_random() % m_options.stride; goesWrong; place += m_options.stride) {
      const std::string where = scenario.name + (sort == EngineSort::kLmdb ? ", lmdb, " : ", memory, ") + what + " " +
                                std::to_string(place) + ": ";
      try {
        goesWrong = RunOnce(scenario, sort, states, disturbanceAt(place), where);
      } catch (const std::exception& error) {
        m_verdict.AddFault(where + error.what());
      }
      if (m_verdict.faults().size() > 20) return;
    }
    m_verdict.Count("sweeps");
  }

  std::uint64_t Draw(std::uint64_t n) { return m_random() % n; }
  Verdict& verdict() { return m_verdict; }

 private:
  bool RunOnce(const Scenario& scenario, EngineSort sort, const std::vector<State>& states, const Disturbance& disturbance,
               const std::string& where) {
    const std::int64_t allocations = test::LiveAllocations();
    bool wentWrong = false;
    bool isUnknown = false;
    std::string faults;
    {
      Stage stage(sort);
      Begin(scenario, stage);
      wentWrong = disturbance(stage, [&] {
        try {
          scenario.act(stage);
        } catch (const UnknownOutcome&) {
          isUnknown = true;
        } catch (const Error&) {
        } catch (const std::bad_alloc&) {
        }
      });
      faults = JudgeAfter(stage, states, isUnknown);
    }
    const std::int64_t kept = test::LiveAllocations() - allocations;
    if (faults.empty() && kept != 0) faults = std::to_string(kept) + " allocations are not given back";
    if (!faults.empty()) m_verdict.AddFault(where + faults);
    if (wentWrong) m_verdict.Count("faults injected");
    if (isUnknown) m_verdict.Count("unknown outcomes");
    return wentWrong;
  }

  FaultSweepOptions m_options;
  Verdict m_verdict;
  std::mt19937_64 m_random;
};

Disturbance WithFault(Fault fault, std::uint64_t place, bool persists) {
  return [=](Stage& stage, const std::function<void()>& act) {
    stage.plan.Set(fault, place, std::nullopt, persists);
    act();
    stage.plan.Clear();
    return stage.plan.HasFired();
  };
}

Disturbance WithFailingDisk(std::uint64_t place, bool staysBroken, bool writesAllTheSame) {
  return [=](Stage&, const std::function<void()>& act) {
    const test::FailingDisk failing(static_cast<int>(place), staysBroken, writesAllTheSame);
    act();
    return failing.HasFailed();
  };
}

Disturbance WithoutAllocation(std::uint64_t place) {
  return [=](Stage&, const std::function<void()>& act) {
    const test::FailingAllocation failing(static_cast<std::int64_t>(place));
    act();
    return failing.HasFailed();
  };
}

}  // namespace

Verdict RunEngineFaults(const FaultSweepOptions& options) {
  Sweep sweep("engine_faults", options);
  for (const EngineSort sort : {EngineSort::kMemory, EngineSort::kLmdb}) {
    for (const Scenario& scenario : FaultScenarios()) {
      if (!options.allFaults) {
        sweep.Run(scenario, sort, "one of the faults at call", [&](std::uint64_t place) {
          return WithFault(kFaults[sweep.Draw(kFaults.size())], place, sweep.Draw(2) == 0);
        });
        continue;
      }
      for (const Fault fault : kFaults) {
        for (const bool persists : {false, true}) {
          const std::string what = "fault " + std::to_string(static_cast<int>(fault)) + (persists ? " from call" : " at call");
          sweep.Run(scenario, sort, what, [&](std::uint64_t place) { return WithFault(fault, place, persists); });
        }
      }
    }
  }
  return sweep.verdict();
}

Verdict RunDiskFaults(const FaultSweepOptions& options) {
  Sweep sweep("disk_faults", options);
  for (const Scenario& scenario : FaultScenarios()) {
    for (const bool staysBroken : {false, true}) {
      for (const bool writesAllTheSame : {false, true}) {
        const std::string what = std::string("write or sync ") + (staysBroken ? "from " : "") + (writesAllTheSame ? "(answer lost) " : "");
        sweep.Run(scenario, EngineSort::kLmdb, what, [&](std::uint64_t place) {
          return WithFailingDisk(place, staysBroken, writesAllTheSame);
        });
      }
    }
  }
  return sweep.verdict();
}

Verdict RunAllocationFailures(const FaultSweepOptions& options) {
  Sweep sweep("allocation_failures", options);
  for (const EngineSort sort : {EngineSort::kMemory, EngineSort::kLmdb}) {
    for (const Scenario& scenario : FaultScenarios()) sweep.Run(scenario, sort, "allocation", WithoutAllocation);
  }
  return sweep.verdict();
}

}  // namespace vemo::campaign
