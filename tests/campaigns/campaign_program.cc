#include "tests/campaigns/campaign_program.h"

#include <exception>
#include <iostream>

namespace vemo::campaign {

int RunCampaign(const Campaign& campaign, int argc, char** argv) {
  Numbers numbers(argc, argv);
  const Verdict verdict = campaign(numbers);
  for (const std::string& fault : verdict.faults()) std::cout << fault << '\n';
  std::cout << verdict.Line() << std::endl;
  return verdict.IsSound() ? 0 : 1;
}

int RunProgram(const std::function<int()>& program) {
  try {
    return program();
  } catch (const std::exception& error) {
    std::cerr << error.what() << std::endl;
    return 2;
  }
}

}  // namespace vemo::campaign
