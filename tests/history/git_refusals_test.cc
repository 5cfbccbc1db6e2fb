// What is no repository, and what is wrong with one, is said in one line.
#include <gtest/gtest.h>

#include <cstdlib>

#include "edit_model.h"
#include "history/edit_source.h"
#include "test_repository.h"

namespace vemo::test {
namespace {

std::string OpenError(const std::filesystem::path& repository, std::string_view revision = "HEAD") {
  return SourceErrorOf([&] { OpenGitHistory(repository, revision); });
}

class GitRefusals : public ::testing::Test {
 protected:
  TestRepository m_repository;
};

TEST_F(GitRefusals, AFolderWithoutARepository) {
  const std::string folder = m_repository.folder().string();
  EXPECT_EQ(OpenError(folder).find("cannot read a git repository at " + folder + ": not a git repository"),
            0u)
      << OpenError(folder);
}

TEST_F(GitRefusals, AFolderThatIsNotThere) {
  const std::string folder = (m_repository.folder() / "missing").string();
  EXPECT_EQ(OpenError(folder), "cannot read a git repository at " + folder + ": cannot change to '" + folder +
                                   "': No such file or directory");
  EXPECT_EQ(OpenError(""), "the name of the git repository is empty");
}

TEST_F(GitRefusals, AFolderInsideOfARepository) {
  m_repository.Write("sub/folder/f", "1\n");
  m_repository.Commit();
  const std::string folder = (m_repository.path() / "sub/folder").string();
  EXPECT_EQ(
      OpenError(folder),
      folder + " is not a git repository but lies in one, as sub/folder/: name the repository's top folder");
}

TEST_F(GitRefusals, ARepositoryWithoutCommits) {
  EXPECT_EQ(OpenError(m_repository.path()),
            "the git repository " + m_repository.path().string() + " has no commit at HEAD yet");
}

TEST_F(GitRefusals, ARevisionThatIsNoCommit) {
  m_repository.Write("f", "1\n");
  const std::string commit = m_repository.Commit();
  const std::string beginning =
      "the git repository " + m_repository.path().string() + " has no commit named \"";
  for (const std::string revision : {"missing", "", "--all", "-p", "--help", "HEAD:f", "HEAD^{tree}", "^HEAD",
                                     "HEAD..HEAD", "HEAD HEAD", "HEAD --", "@{u}"}) {
    EXPECT_EQ(OpenError(m_repository.path(), revision), beginning + revision + "\"");
  }
  EXPECT_EQ(OpenError(m_repository.path(), "a\nb"), beginning + "a?b\"");
}

TEST_F(GitRefusals, AnObjectThatIsMissing) {
  m_repository.Write("f", "1\n");
  m_repository.Commit();
  m_repository.Write("f", "2\n");
  m_repository.Commit();
  const std::string blob = m_repository.Git({"rev-parse", "HEAD~1:f"});
  const auto source = OpenGitHistory(m_repository.path());
  std::filesystem::remove(m_repository.path() / ".git/objects" / blob.substr(0, 2) / blob.substr(2));
  const std::string message = SourceErrorOf([&] { source->CountEdits(); });
  EXPECT_EQ(message, "git failed: unable to read " + blob);
}

TEST_F(GitRefusals, AMachineWithoutGit) {
  const std::string path = std::getenv("PATH");
  ::setenv("PATH", m_repository.folder().c_str(), 1);
  const std::string message = OpenError(m_repository.path());
  ::setenv("PATH", path.c_str(), 1);
  EXPECT_EQ(message, "cannot run git: No such file or directory (is git installed and in PATH?)");
}

}  // namespace
}  // namespace vemo::test
