// A slice of each campaign. tests/campaigns/run runs them at any size.
#include <gtest/gtest.h>

#include "tests/campaigns/kill_loop.h"
#include "tests/support/seed.h"

namespace vemo::campaign {
namespace {

void ExpectSound(const Verdict& verdict) {
  std::cout << verdict.Line() << std::endl;
  for (const std::string& fault : verdict.faults()) ADD_FAILURE() << fault;
}

TEST(Campaigns, AKilledProcessLosesNoCommitThatItHasReportedAndLeavesNoneHalfDone) {
  const Verdict verdict = RunKillLoop({.seed = test::TestSeed(11), .kills = 40, .keys = 1'200});
  ExpectSound(verdict);
  EXPECT_GT(verdict.CountOf("commits"), 40u);
}

}  // namespace
}  // namespace vemo::campaign
