// Who wrote a line, as the maps of a replay tell it and as git blame does. Both look for the lines that a
// commit keeps with the same diff (Myers' algorithm with git's indent heuristic, no context), so they must
// agree line by line. What git blame does beside it is switched off (--no-follow), or, where it is on,
// explains every line that differs.
#include <gtest/gtest.h>

#include <algorithm>
#include <sstream>

#include "history/blame.h"
#include "history/git_process.h"
#include "history/replay.h"
#include "random_git_history.h"
#include "test_repository.h"
#include "tests/support/seed.h"

namespace vemo::test {
namespace {

using Strings = std::vector<std::string>;

// Every line as "COMMIT AUTHOR".
Strings LinesOf(const std::vector<BlameRun>& runs) {
  Strings lines;
  for (const BlameRun& run : runs) {
    EXPECT_EQ(run.p, static_cast<ssize_t>(lines.size()));
    for (ssize_t i = 0; i < run.n; ++i) lines.push_back(run.commit + " " + run.author);
  }
  return lines;
}

class GitBlame : public testing::Test {
 protected:
  void Replay(const std::string& revision = "HEAD") {
    m_space = CSpace::Open("memory:");
    const auto source = OpenGitHistory(m_repository.path(), revision);
    vemo::Replay(*m_space, *source, {});
  }

  Strings OurLines(const std::string& path) {
    Snapshot snapshot(*m_space);
    const std::optional<FieldId> field = FindGitField(snapshot, path);
    if (!field) return {"there is no file " + path};
    return LinesOf(BlameField(snapshot, *field));
  }

  Strings GitLines(const std::string& path, const std::string& revision = "HEAD",
                   const char* follow = "--no-follow") {
    std::istringstream output(
        m_repository.Git({"-c", "diff.algorithm=myers", "blame", "--first-parent", "--root", "--no-textconv",
                          "--line-porcelain", follow, revision, "--", path}));
    Strings lines;
    std::string commit, author;
    for (std::string line; std::getline(output, line);) {
      if (line.starts_with('\t')) {
        lines.push_back(commit + " " + author);
        commit.clear();
      } else if (commit.empty()) {
        commit = line.substr(0, line.find(' '));
      } else if (line.starts_with("author ")) {
        author = line.substr(7);
      } else if (line.starts_with("author-mail ")) {
        author += " " + line.substr(12);
      }
    }
    return lines;
  }

  Strings Paths(const std::string& revision = "HEAD") {
    std::istringstream output(m_repository.Git({"ls-tree", "-r", "--name-only", revision}));
    Strings paths;
    for (std::string path; std::getline(output, path);) paths.push_back(path);
    return paths;
  }

  // The number of lines compared.
  std::size_t ExpectAgreement(const std::string& revision = "HEAD") {
    std::size_t lines = 0;
    for (const std::string& path : Paths(revision)) {
      const Strings expected = GitLines(path, revision);
      EXPECT_EQ(OurLines(path), expected) << path << " at " << revision;
      lines += expected.size();
    }
    return lines;
  }

  // The first-parent history, oldest commit first.
  Strings Commits() {
    std::istringstream output(m_repository.Git({"rev-list", "--first-parent", "--reverse", "HEAD"}));
    Strings commits;
    for (std::string commit; std::getline(output, commit);) commits.push_back(commit);
    return commits;
  }

  // The commit that made `path` last, seen from its first parent.
  std::string Maker(const std::string& path) {
    return m_repository.Git({"log", "--first-parent", "--diff-merges=first-parent", "--no-patch",
                             "--no-renames", "--diff-filter=A", "-1", "--format=%H", "HEAD", "--", path});
  }

  // Compares with a git blame that follows renames, and returns how many lines differ. Where one does, git
  // has looked behind the commit that made the path, and that commit is ours.
  std::size_t CountFollowedLines() {
    const Strings commits = Commits();
    const auto ageOf = [&](const std::string& line) {
      const auto found = std::find(commits.begin(), commits.end(), line.substr(0, line.find(' ')));
      EXPECT_NE(found, commits.end()) << line;
      return found - commits.begin();
    };
    std::size_t followed = 0;
    for (const std::string& path : Paths()) {
      const Strings ours = OurLines(path);
      const Strings gits = GitLines(path, "HEAD", "--follow");
      const std::string maker = Maker(path);
      EXPECT_EQ(ours.size(), gits.size()) << path;
      for (std::size_t i = 0; i < std::min(ours.size(), gits.size()); ++i) {
        if (ours[i] == gits[i]) continue;
        ++followed;
        EXPECT_EQ(ours[i].substr(0, maker.size()), maker) << path << ", line " << i + 1;
        EXPECT_LT(ageOf(gits[i]), ageOf(ours[i])) << path << ", line " << i + 1;
      }
    }
    return followed;
  }

  TestRepository m_repository;
  std::unique_ptr<CSpace> m_space;
};

TEST_F(GitBlame, AgreesOnLinesThatOneAuthorAddedInSeveralCommits) {
  m_repository.Write("f", "1\n2\n");
  const std::string first = m_repository.Commit();
  m_repository.Write("f", "1\n2\n3\n");
  const std::string second = m_repository.Commit();
  Replay();
  const std::string author = " Ada Lovelace <ada@example.org>";
  EXPECT_EQ(OurLines("f"), (Strings{first + author, first + author, second + author}));
  EXPECT_EQ(ExpectAgreement(), 3u);
}

TEST_F(GitBlame, AgreesOnAnIncompleteLastLine) {
  m_repository.Write("f", "1\nlast");
  m_repository.Commit();
  m_repository.Write("f", "1\nlast\n");
  m_repository.Commit();
  m_repository.Write("f", "1\nlast\n2");
  m_repository.Commit();
  Replay();
  EXPECT_EQ(ExpectAgreement(), 3u);
}

TEST_F(GitBlame, AgreesOnAFileThatWasDeletedAndMadeAgain) {
  m_repository.Write("f", "1\n2\n");
  m_repository.Write("other", "");
  m_repository.Commit();
  m_repository.Remove("f");
  m_repository.Commit();
  m_repository.Write("f", "1\n2\n");
  const std::string again = m_repository.Commit();
  Replay();
  EXPECT_EQ(OurLines("f")[0].substr(0, again.size()), again);
  EXPECT_EQ(ExpectAgreement(), 2u);
  EXPECT_EQ(CountFollowedLines(), 0u);
}

TEST_F(GitBlame, AgreesOnAFileThatWasASymbolicLinkForATime) {
  m_repository.Write("f", "1\n2\n");
  m_repository.Commit();
  m_repository.Remove("f");
  std::filesystem::create_symlink("nowhere", m_repository.path() / "f");
  m_repository.Commit();
  m_repository.Remove("f");
  m_repository.Write("f", "1\n2\n");
  m_repository.Commit();
  Replay();
  EXPECT_EQ(ExpectAgreement(), 2u);
}

TEST_F(GitBlame, AgreesThatAMergeWroteWhatItBringsFromItsOtherParent) {
  m_repository.Write("f", "1\n2\n3\n4\n5\n");
  m_repository.Commit();
  m_repository.Git({"checkout", "-q", "-b", "side"});
  m_repository.SetAuthor("Side", "side@example.org");
  m_repository.Write("f", "1\n2\n3\n4\n5\n6\n");
  m_repository.Commit();
  m_repository.Git({"checkout", "-q", "main"});
  m_repository.SetAuthor("Main", "main@example.org");
  m_repository.Write("f", "0\n1\n2\n3\n4\n5\n");
  m_repository.Commit();
  m_repository.SetAuthor("Merger", "merger@example.org");
  m_repository.Git({"merge", "-q", "--no-ff", "-m", "merge", "side"});
  Replay();
  EXPECT_TRUE(OurLines("f").back().ends_with(" Merger <merger@example.org>"));
  EXPECT_EQ(ExpectAgreement(), 7u);
}

TEST_F(GitBlame, DiffersOnARenamedFileOnlyWhereGitFollowsIt) {
  m_repository.Write("old", "1\n2\n3\n4\n5\n6\n7\n8\n");
  m_repository.Commit();
  m_repository.Remove("old");
  m_repository.Write("new", "1\n2\n3\n4\n5\n6\n7\neight\n");
  const std::string renaming = m_repository.Commit();
  Replay();
  for (const std::string& line : OurLines("new")) EXPECT_EQ(line.substr(0, renaming.size()), renaming);
  EXPECT_EQ(ExpectAgreement(), 8u);
  EXPECT_EQ(CountFollowedLines(), 7u);
}

TEST_F(GitBlame, NamesTheAuthorAsTheCommitHasItWhereGitMapsIt) {
  m_repository.Write("f", "1\n");
  m_repository.Write(".mailmap", "Ada King <king@example.org> <ada@example.org>\n");
  const std::string commit = m_repository.Commit();
  Replay();
  EXPECT_EQ(GitLines("f"), (Strings{commit + " Ada King <king@example.org>"}));
  EXPECT_EQ(OurLines("f"), (Strings{commit + " Ada Lovelace <ada@example.org>"}));
}

class RandomGitBlame : public GitBlame, public testing::WithParamInterface<std::uint64_t> {};

TEST_P(RandomGitBlame, AgreesLineByLineOnAWholeHistory) {
  RandomGitHistory history(TestSeed(GetParam()));
  for (int i = 0; i < 299; ++i) history.AddCommit();
  history.AddRename();
  GitProcess import({"-C", m_repository.path().string(), "fast-import", "--quiet"}, history.Stream());
  import.Finish();

  Replay();
  const Strings commits = Commits();
  EXPECT_EQ(commits.size(), 300u);
  EXPECT_GT(ExpectAgreement(), 200u);
  EXPECT_GT(CountFollowedLines(), 0u);

  const std::string middle = commits[150];
  Replay(middle);
  EXPECT_GT(ExpectAgreement(middle), 100u);
}

INSTANTIATE_TEST_SUITE_P(Seeds, RandomGitBlame, testing::Values(1, 2, 3));

}  // namespace
}  // namespace vemo::test
