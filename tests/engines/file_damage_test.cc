// A slice of the campaign of damage to files. tests/campaigns/run file_damage runs it at any size.
#include "tests/campaigns/file_damage.h"

#include <gtest/gtest.h>

#include <iostream>

#include "tests/support/seed.h"

namespace vemo::campaign {
namespace {

TEST(FileDamage, IsFoundOrChangesNoAnswer) {
  const Verdict verdict = RunFileDamage({.seed = test::TestSeed(18), .damages = 120, .damagesPerSpace = 30});
  std::cout << verdict.Line() << std::endl;
  for (const std::string& fault : verdict.faults()) ADD_FAILURE() << fault;
  EXPECT_EQ(verdict.CountOf("damages"), 120u);
  EXPECT_GT(verdict.CountOf("refused somewhere"), 30u);
}

TEST(FileDamage, WrongAnswersAreFoundOut) {
  const Verdict verdict = RunFileDamage({.seed = test::TestSeed(18), .damages = 4, .damagesPerSpace = 1, .rollback = true});
  std::cout << verdict.Line() << std::endl;
  EXPECT_EQ(verdict.faults().size(), 4u) << "the campaign cannot fail";
}

}  // namespace
}  // namespace vemo::campaign
