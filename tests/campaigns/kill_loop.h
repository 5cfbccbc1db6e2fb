// A process that works on a space is killed, again and again: no commit that it has reported is lost, none is half there, and
// nothing leaks.
#pragma once

#include <cstdint>

#include "tests/campaigns/verdict.h"

namespace vemo::campaign {

struct KillLoopOptions {
  std::uint64_t seed = 1;
  std::uint64_t kills = 2'000;
  std::uint64_t keys = 3'000;  // of each map
};

// Forks: to be called while the process has one thread.
Verdict RunKillLoop(const KillLoopOptions& options);

}  // namespace vemo::campaign
