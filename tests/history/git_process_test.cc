#include "history/git_process.h"

#include <gtest/gtest.h>
#include <sys/wait.h>

#include <cerrno>

#include "edit_model.h"
#include "test_repository.h"

namespace vemo::test {
namespace {

bool HasChildren() {
  errno = 0;
  return !(::waitpid(-1, nullptr, WNOHANG) == -1 && errno == ECHILD);
}

class GitProcessTest : public ::testing::Test {
 protected:
  TestRepository m_repository;
};

TEST_F(GitProcessTest, ReadsLinesBlocksAndTheRest) {
  GitProcess git({"hash-object", "--stdin-paths"}, "/dev/null\n/dev/null\n/dev/null\n");
  const std::string empty = "e69de29bb2d1d6434b8b29ae775ad8c2e48c5391";
  EXPECT_EQ(git.ReadLine(), empty);
  EXPECT_EQ(git.ReadBlock(10), empty.substr(0, 10));
  EXPECT_EQ(git.ReadLine(), empty.substr(10));
  EXPECT_EQ(git.ReadLine('\0'), empty + "\n");
  EXPECT_EQ(git.ReadLine(), std::nullopt);
  EXPECT_EQ(git.ReadBlock(5), "");
  git.Finish();
  EXPECT_FALSE(HasChildren());
}

TEST_F(GitProcessTest, ReadsLinesLongerThanItsBuffer) {
  const std::string line(5 << 20, 'x');
  m_repository.Write("f", line + "\n" + line + "\n\n" + line);
  const std::string blob = m_repository.Git({"hash-object", "-w", "f"});
  GitProcess git({"-C", m_repository.path().string(), "cat-file", "blob", blob});
  EXPECT_TRUE(git.ReadLine() == line);
  EXPECT_TRUE(git.ReadLine() == line);
  EXPECT_TRUE(git.ReadLine() == "");
  EXPECT_TRUE(git.ReadLine() == line);
  EXPECT_EQ(git.ReadLine(), std::nullopt);
  git.Finish();
}

TEST_F(GitProcessTest, SaysWhyGitFailed) {
  GitProcess git({"-C", m_repository.path().string(), "cat-file", "blob", "missing"});
  EXPECT_EQ(git.ReadLine(), std::nullopt);
  EXPECT_EQ(SourceErrorOf([&] { git.Finish(); }), "git failed: Not a valid object name missing");
  EXPECT_FALSE(HasChildren());
}

TEST_F(GitProcessTest, SaysTheStatusOfACommandThatSaysNothing) {
  GitProcess git({"-C", m_repository.path().string(), "rev-parse", "--verify", "--quiet", "missing"});
  const GitExit exit = git.Wait();
  EXPECT_FALSE(exit.succeeded);
  EXPECT_EQ(exit.reason, "it ended with status 1");
}

TEST_F(GitProcessTest, SaysThatACommandWasKilled) {
  GitProcess git({"-c", "alias.die=!kill -9 $PPID", "-C", m_repository.path().string(), "die"});
  EXPECT_EQ(git.ReadLine(), std::nullopt);
  EXPECT_EQ(git.Wait().reason, "it was ended by signal 9");
}

TEST_F(GitProcessTest, NeitherInputNorMessagesCanBlockIt) {
  // Far more than a pipe holds on each of the three sides, all of it unread until git has ended.
  std::string input;
  for (int i = 0; i < 40000; ++i) input += "no such object " + std::to_string(i) + "\n";
  GitProcess git(
      {"-C", m_repository.path().string(), "-c", "alias.echo=!cat; yes message | head -n 100000 >&2", "echo"},
      input);
  std::size_t lines = 0;
  while (git.ReadLine()) ++lines;
  EXPECT_EQ(lines, 40000u);
  git.Finish();
}

TEST_F(GitProcessTest, ACommandThatIsNotReadToItsEndLeavesNothingBehind) {
  const std::string line(5 << 20, 'x');
  m_repository.Write("f", line);
  const std::string blob = m_repository.Git({"hash-object", "-w", "f"});
  {
    GitProcess git({"-C", m_repository.path().string(), "cat-file", "blob", blob});
    EXPECT_EQ(git.ReadBlock(3), "xxx");
  }
  EXPECT_FALSE(HasChildren());
}

}  // namespace
}  // namespace vemo::test
