// A loss of power at every point of a process's work on a space: what was reported as committed is there, the rest as a whole
// or not at all, and the space can be worked on; also when the power fails again while the space is opened after the first loss.
#pragma once

#include <cstdint>
#include <string>

#include "tests/campaigns/verdict.h"

namespace vemo::campaign {

struct PowerLossOptions {
  std::uint64_t seed = 1;
  std::uint64_t images = 20'000;  // folders as a loss of power may leave them
  std::uint64_t keys = 300;       // of each map
  std::uint64_t commits = 12;     // of one recorded process
  bool sync = true;               // false: a space that is opened with sync=none_risking_loss, which must be found out
  std::uint64_t maxFaults = 5;    // ends the campaign
};

// Forks: to be called while the process has one thread.
Verdict RunPowerLoss(const PowerLossOptions& options);

// What the recorded process does: takes the workload of `seed` up in the folder and makes `commits` commits, marking each in
// the trace of the recorder that is preloaded.
struct RecordedWork {
  std::string uri;
  std::uint64_t seed = 1;
  std::uint64_t keys = 300;
  std::uint64_t commits = 12;
};
void WorkUnderRecorder(const RecordedWork& work);

}  // namespace vemo::campaign
