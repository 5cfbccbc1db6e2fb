#include "tool_fixture.h"

namespace vemo::test {
namespace {

class HelpTest : public ToolTest {};

TEST_F(HelpTest, OfTheCommandNamesTheSubcommandsTheExitStatusAndAnExample) {
  const Outcome outcome = Vemo({"--help"});
  EXPECT_EQ(outcome.exitCode, 0);
  EXPECT_EQ(outcome.err, "");
  for (const char* word :
       {"replay", "dump", "verify", "stats", "blame", "collect", "salvage", "Exit status: 0", "\nTry: vemo replay "}) {
    EXPECT_NE(outcome.out.find(word), std::string::npos) << word;
  }
}

TEST_F(HelpTest, OfEachSubcommandHasAnExampleThatBeginsWithIt) {
  for (const std::string command : {"replay", "dump", "verify", "stats", "blame", "collect", "salvage"}) {
    const Outcome outcome = Vemo({command, "--help"});
    EXPECT_EQ(outcome.exitCode, 0) << command;
    EXPECT_EQ(outcome.err, "") << command;
    const std::size_t example = outcome.out.find("Example");
    ASSERT_NE(example, std::string::npos) << command;
    EXPECT_NE(outcome.out.find("  vemo " + command + " ", example), std::string::npos) << outcome.out;
  }
}

TEST_F(HelpTest, OfReplayNamesEveryOptionAndDefault) {
  const std::string help = Vemo({"replay", "--help"}).out;
  for (const char* word : {"--store", "--field", "--author", "--git", "--rev", "--batch", "--resume",
                           "--check", "--cache-bytes", "10000", "HEAD", "recorded author"}) {
    EXPECT_NE(help.find(word), std::string::npos) << word;
  }
}

}  // namespace
}  // namespace vemo::test
