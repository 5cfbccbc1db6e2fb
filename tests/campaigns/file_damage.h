// Damage to the files of the LMDB engine: bits, runs of zeros, truncations, references that lead to other pages. Every answer is right
// or an exception, nothing crashes, and what could be read before a commit can be read after it.
#pragma once

#include <cstdint>

#include "tests/campaigns/verdict.h"

namespace vemo::campaign {

struct FileDamageOptions {
  std::uint64_t seed = 1;
  std::uint64_t damages = 10'000;
  std::uint64_t damagesPerSpace = 500;
  // Puts the files of an older commit back, whole, instead of damaging them. No engine can notice that, so the campaign must.
  bool rollback = false;
  std::uint64_t maxFaults = 20;
};

Verdict RunFileDamage(const FileDamageOptions& options);

}  // namespace vemo::campaign
