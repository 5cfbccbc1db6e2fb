// Runs the campaign of damage to the engine's own files: file_campaign file_damage [--seed N] [--OPTION N]... A program of its own, since it is
// built from the tests of the engines and not from those of the store.
#include <exception>
#include <iostream>

#include "tests/campaigns/file_damage.h"
#include "tests/campaigns/numbers.h"

int main(int argc, char** argv) {
  using namespace vemo::campaign;
  try {
    Numbers numbers(argc, argv);
    FileDamageOptions options;
    numbers.Take("seed", options.seed);
    numbers.Take("damages", options.damages);
    numbers.Take("damages-per-space", options.damagesPerSpace);
    numbers.Take("rollback", options.rollback);
    numbers.RequireAllTaken();
    const Verdict verdict = RunFileDamage(options);
    for (const std::string& fault : verdict.faults()) std::cout << fault << '\n';
    std::cout << verdict.Line() << std::endl;
    return verdict.IsSound() ? 0 : 1;
  } catch (const std::exception& error) {
    std::cerr << error.what() << std::endl;
    return 2;
  }
}
