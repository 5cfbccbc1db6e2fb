// Damage of every kind in the records and named values of a space: each is found by both checks, named by whoever reads what is
// damaged, and costs nothing else; what is salvaged is sound.
#pragma once

#include <cstdint>

#include "tests/campaigns/verdict.h"

namespace vemo::campaign {

struct DamageOptions {
  std::uint64_t seed = 1;
  std::uint64_t damages = 10'000;
  std::uint64_t forgeries = 10'000;      // bodies changed under a checksum that is right: the two checks must agree
  std::uint64_t salvageEvery = 20;       // 1 salvages after each damage, 2 after every other, and so on
  std::uint64_t maxFaults = 20;
};

Verdict RunDamage(const DamageOptions& options);

}  // namespace vemo::campaign
