// Every scenario with one thing going wrong, at each place where it can: a call of the engine, a write of the disk, or an
// allocation.
//
// Whatever goes wrong, the space holds what was committed by those commits that have returned, and of one whose outcome nobody
// knows all or nothing; the same handle goes on, sees that in memory as on disk, and commits; the checker finds nothing; all
// memory is given back.
#pragma once

#include <cstdint>

#include "tests/campaigns/verdict.h"

namespace vemo::campaign {

struct FaultSweepOptions {
  std::uint64_t seed = 1;     // chooses where to begin and which fault comes where
  std::uint64_t stride = 1;   // every how many-th place is tried
  bool allFaults = true;      // every fault at each place, else one of them
};

Verdict RunEngineFaults(const FaultSweepOptions& options);
// Over LMDB: each write and each sync of the disk below it.
Verdict RunDiskFaults(const FaultSweepOptions& options);
// Needs a program that tests/support/failing_allocator.cc is linked into.
Verdict RunAllocationFailures(const FaultSweepOptions& options);

}  // namespace vemo::campaign
