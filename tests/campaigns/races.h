// One writer, readers and collection on threads of their own, with a cache that holds a part of the maps: every reader sees one
// commit, as a whole.
#pragma once

#include <cstdint>

#include "tests/campaigns/verdict.h"

namespace vemo::campaign {

struct RacesOptions {
  std::uint64_t seed = 1;
  std::uint64_t commits = 2'000;  // of the writer, on each engine
  std::uint64_t reads = 2'000;    // of each reader: of a snapshot's maps as a whole
  std::uint64_t readers = 4;
  std::uint64_t collections = 200;
  std::uint64_t cacheBytes = 200'000;
  std::uint64_t keys = 2'000;
};

// To be run under ThreadSanitizer too. The amount of work is fixed, whatever the order in which threads do it.
Verdict RunRaces(const RacesOptions& options);

}  // namespace vemo::campaign
