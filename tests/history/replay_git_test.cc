// The histories of git repositories, from git through a space on disk and back to the files.
#include <gtest/gtest.h>

#include "history/site.h"
#include "history/verify_history.h"
#include "recorded_fields.h"
#include "store/verify.h"
#include "test_repository.h"
#include "tests/support/temp_folder.h"

namespace vemo::test {
namespace {

class ReplayGitTest : public ::testing::Test {
 protected:
  // Replays the history in small batches and checks what a space opened anew holds.
  void ReplayAndCheck(const std::string& revision = "HEAD", bool resume = false) {
    const auto source = OpenGitHistory(m_repository.path(), revision);
    {
      const auto space = CSpace::Open(Uri(), {.create = true});
      ReplayOptions options;
      options.batchEdits = 3;
      options.resume = resume;
      m_report = Replay(*space, *source, options);
      EXPECT_EQ(m_report.edits, source->CountEdits());
    }
    const auto space = CSpace::Open(Uri());
    EXPECT_EQ(CheckReplay(*space, *source), std::nullopt);
    Snapshot snapshot(*space);
    for (const Finding& finding : VerifySpace(snapshot).findings) ADD_FAILURE() << finding.fault;
    for (const HistoryFinding& finding : VerifyHistory(snapshot)) ADD_FAILURE() << finding.fault;
  }

  std::string Uri() const { return "lmdb:" + (m_folder.path() / "space").string(); }

  std::vector<std::string> MetaValues(const std::string& prefix) {
    const auto space = CSpace::Open(Uri());
    std::vector<std::string> values;
    Snapshot(*space).ScanMeta(prefix, [&](std::string_view, std::string_view value) {
      values.emplace_back(value);
      return true;
    });
    return values;
  }

  static std::string Lines(int first, int last) {
    std::string text;
    for (int i = first; i <= last; ++i) text += "line " + std::to_string(i) + "\n";
    return text;
  }

  TestRepository m_repository;
  TempFolder m_folder;
  ReplayReport m_report;
};

TEST_F(ReplayGitTest, WithMergesRenamesAndDeletedFilesMatches) {
  m_repository.Write("a", Lines(1, 20));
  m_repository.Write("folder/b", Lines(1, 5));
  m_repository.Commit();
  m_repository.Git({"checkout", "-q", "-b", "side"});
  m_repository.SetAuthor("Grace Hopper", "grace@example.org");
  m_repository.Write("a", Lines(1, 9) + "from the side\n" + Lines(10, 20));
  m_repository.Write("side", "only there\n");
  m_repository.Commit();
  m_repository.Git({"checkout", "-q", "main"});
  m_repository.SetAuthor("Ada Lovelace", "ada@example.org");
  m_repository.Write("a", "first\n" + Lines(2, 20));
  m_repository.Commit();
  m_repository.Git({"merge", "-q", "--no-ff", "-m", "merge", "side"});
  m_repository.Git({"mv", "folder/b", "renamed"});
  m_repository.Commit();
  m_repository.Remove("a");
  m_repository.Write("a", Lines(5, 8));
  m_repository.Remove("side");
  m_repository.Commit();
  ReplayAndCheck();
  EXPECT_EQ(MetaValues("object/"), (std::vector<std::string>{"a", "folder/b", "side", "renamed"}));
  EXPECT_EQ(m_report.sites, 1u) << "who merges is the author of what the merge brings";
  EXPECT_EQ(m_report.objects, 4u);
}

TEST_F(ReplayGitTest, WithBinariesLinksAndOddNamesMatches) {
  m_repository.Write("text \"quoted\" \\ back", "no line feed at the end");
  m_repository.Write("tab\tand\nfeed", "a\r\nb\n\nc\n");
  m_repository.Write("latin \xe9 and \xc3\xa9", "\xff\xfe not UTF-8\n");
  m_repository.Write("binary", std::string("\0\1\2", 3));
  m_repository.Write("empty", "");
  m_repository.Write("-dash", "--- a/x\n+++ b/x\n@@ -1 +1 @@\n");
  std::filesystem::create_symlink("binary", m_repository.path() / "link");
  m_repository.Commit();
  m_repository.SetAuthor("\xc3\x85ngstr\xc3\xb6m", "a@example.org");
  m_repository.Write("text \"quoted\" \\ back", "no line feed at the end\nbut another line");
  m_repository.Write("tab\tand\nfeed", "a\nb\n\nc\n\n");
  m_repository.Write("binary", std::string("\0\1\2\3", 4));
  m_repository.Write("becomes binary", "text\n");
  m_repository.Commit();
  m_repository.Write("becomes binary", std::string("text\n\0", 6));
  m_repository.Write("-dash", "-- a/x\n");
  m_repository.Commit();
  ReplayAndCheck();
  EXPECT_EQ(MetaValues("site/" + GuidText(SiteOfAuthor("\xc3\x85ngstr\xc3\xb6m <a@example.org>"))),
            (std::vector<std::string>{"\xc3\x85ngstr\xc3\xb6m <a@example.org>"}));
  const std::vector<std::string> paths = MetaValues("object/");
  EXPECT_NE(std::find(paths.begin(), paths.end(), "tab\tand\nfeed"), paths.end());
  EXPECT_NE(std::find(paths.begin(), paths.end(), "latin \xe9 and \xc3\xa9"), paths.end());
}

TEST_F(ReplayGitTest, ResumesAtCommitsThatWereMadeSince) {
  m_repository.Write("a", Lines(1, 20));
  m_repository.Commit();
  m_repository.Write("a", Lines(4, 30));
  m_repository.Commit();
  ReplayAndCheck();
  const std::vector<std::string> commits = MetaValues("commit/");
  m_repository.SetAuthor("Grace Hopper", "grace@example.org");
  m_repository.Write("b", Lines(1, 3));
  m_repository.Write("a", "0\n" + Lines(4, 29));
  const std::string third = m_repository.Commit();
  ReplayAndCheck("HEAD", true);
  EXPECT_EQ(m_report.editsApplied, 3u);
  EXPECT_EQ(MetaValues("commit/").size(), commits.size() + 1);
  EXPECT_EQ(MetaValues(CommitMetaName(SiteOfAuthor("Grace Hopper <grace@example.org>"), 0)),
            (std::vector<std::string>{third}));
  ReplayAndCheck("HEAD", true);
  EXPECT_EQ(m_report.editsApplied, 0u);
}

TEST_F(ReplayGitTest, StopsAtTheRevisionAskedFor) {
  m_repository.Write("a", Lines(1, 20));
  const std::string first = m_repository.Commit();
  m_repository.Write("a", "other\n");
  m_repository.Commit();
  ReplayAndCheck(first);
  EXPECT_EQ(m_report.edits, 1u);
  EXPECT_EQ(m_report.sourceCommits, 1u);
  const auto space = CSpace::Open(Uri());
  const auto newest = OpenGitHistory(m_repository.path());
  EXPECT_NE(CheckReplay(*space, *newest), std::nullopt) << "the files of another revision";
}

}  // namespace
}  // namespace vemo::test
