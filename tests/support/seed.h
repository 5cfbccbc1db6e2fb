// The seed of a randomised test: VEMO_SEED of the environment, else the test's own.
#pragma once

#include <cstdint>
#include <cstdlib>
#include <iostream>

namespace vemo::test {

// Prints the seed in use, so that a failing run can be repeated.
inline std::uint64_t TestSeed(std::uint64_t ownSeed) {
  const char* const given = std::getenv("VEMO_SEED");
  const std::uint64_t seed = given == nullptr ? ownSeed : std::strtoull(given, nullptr, 10);
  std::cout << "VEMO_SEED=" << seed << std::endl;
  return seed;
}

}  // namespace vemo::test
