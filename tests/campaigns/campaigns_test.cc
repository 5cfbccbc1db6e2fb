// A slice of each campaign. tests/campaigns/run runs them at any size.
#include <gtest/gtest.h>

#include "tests/campaigns/damage.h"
#include "tests/campaigns/fault_sweep.h"
#include "tests/campaigns/kill_loop.h"
#include "tests/campaigns/power_loss.h"
#include "tests/campaigns/races.h"
#include "tests/campaigns/soak.h"
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

TEST(Campaigns, ALossOfPowerAtAnyPointLeavesWhatWasReportedAndNothingHalfDone) {
  const Verdict verdict = RunPowerLoss({.seed = test::TestSeed(12), .images = 300, .keys = 150, .commits = 4});
  ExpectSound(verdict);
  EXPECT_GE(verdict.CountOf("images"), 300u);
  EXPECT_GT(verdict.CountOf("second losses"), 0u);
}

TEST(Campaigns, ALossOfPowerIsFoundOutWhereNothingWasSynced) {
  const Verdict verdict =
      RunPowerLoss({.seed = test::TestSeed(12), .images = 300, .keys = 150, .commits = 4, .sync = false, .maxFaults = 1});
  std::cout << verdict.Line() << std::endl;
  EXPECT_FALSE(verdict.IsSound()) << "the campaign cannot fail";
}

TEST(Campaigns, AnEngineThatFailsAtAnyCallLosesNothingCommittedAndTheHandleGoesOn) {
  const Verdict verdict = RunEngineFaults({.seed = test::TestSeed(13), .stride = 5, .allFaults = false});
  ExpectSound(verdict);
  EXPECT_GT(verdict.CountOf("faults injected"), 200u);
}

TEST(Campaigns, ADiskThatFailsAtAnyWriteOrSyncLosesNothingCommittedAndTheHandleGoesOn) {
  const Verdict verdict = RunDiskFaults({.seed = test::TestSeed(17), .stride = 3});
  ExpectSound(verdict);
  EXPECT_GT(verdict.CountOf("faults injected"), 50u);
}

TEST(Campaigns, AnAllocationThatFailsAnywhereLosesNothingCommittedAndTheHandleGoesOn) {
  const Verdict verdict = RunAllocationFailures({.seed = test::TestSeed(14), .stride = 47});
  ExpectSound(verdict);
  EXPECT_GT(verdict.CountOf("faults injected"), 100u);
}

TEST(Campaigns, ASoakedMapStaysWhatItsModelIs) {
  ExpectSound(RunSoak({.seed = test::TestSeed(15),
                       .operations = 200'000,
                       .keys = 8'000,
                       .operationsPerCommit = 4'000,
                       .cacheBytes = 100'000,
                       .print = false}));
}

TEST(Campaigns, ReadersBesideAWriterSeeWholeCommits) {
  ExpectSound(RunRaces({.seed = test::TestSeed(16), .commits = 150, .reads = 40, .keys = 600}));
}

TEST(Campaigns, EveryDamageIsFoundByBothChecksAndCostsNothingElse) {
  const Verdict verdict =
      RunDamage({.seed = test::TestSeed(16), .damages = 150, .forgeries = 150, .salvageEvery = 25});
  ExpectSound(verdict);
  EXPECT_EQ(verdict.CountOf("damages"), 150u);
  EXPECT_GT(verdict.CountOf("forgeries found"), 10u);
}

}  // namespace
}  // namespace vemo::campaign
