// Very many operations on a space beside a std::map that is told the same, with commits, reopenings, snapshots, deletions and
// a cache that is far smaller than the map: every answer is the model's, and memory stays flat.
#pragma once

#include <cstdint>

#include "tests/campaigns/verdict.h"

namespace vemo::campaign {

struct SoakOptions {
  std::uint64_t seed = 1;
  std::uint64_t operations = 100'000'000;
  std::uint64_t keys = 400'000;               // half of them are there at a time
  std::uint64_t operationsPerCommit = 50'000;
  std::uint64_t cacheBytes = 8 << 20;         // of about 30 MB that the map takes in memory
  bool print = true;                          // memory at each twentieth of the way
};

// Memory is judged where there are at least 60 operations a key: the map is then as full as it gets after a quarter of them.
Verdict RunSoak(const SoakOptions& options);

}  // namespace vemo::campaign
