// Histories of all shapes. ReplayAndCheck compares what the edits make with the files at the end.
#include <gtest/gtest.h>

#include <set>

#include "edit_model.h"
#include "history/edit_source.h"
#include "test_repository.h"

namespace vemo::test {
namespace {

using Strings = std::vector<std::string>;

class GitHistory : public ::testing::Test {
 protected:
  EditModel Replay(std::string_view revision = "HEAD") {
    m_source = OpenGitHistory(m_repository.path(), revision);
    return ReplayAndCheck(*m_source);
  }
  static Strings Lines(EditModel& model, std::uint64_t object) {
    return model.fields[FieldId{OID(object), Path{0}}].Elements();
  }
  void ExpectSkipped(std::uint64_t binary, std::uint64_t symlinks, std::uint64_t submodules) {
    const SkippedFiles skipped = m_source->Skipped();
    EXPECT_EQ(skipped.binary, binary);
    EXPECT_EQ(skipped.symlinks, symlinks);
    EXPECT_EQ(skipped.submodules, submodules);
  }

  TestRepository m_repository;
  std::unique_ptr<EditSource> m_source;
};

TEST_F(GitHistory, GivesTheDeletionOfAHunkBeforeItsInsertionAndHunksTopToBottom) {
  m_repository.Write("f", "1\n2\n3\n4\n5\n6\n7\n8\n");
  const std::string first = m_repository.Commit();
  m_repository.Write("f", "0\n1\n2\nthree\n4\n7\n8\nnine\n");
  const std::string second = m_repository.Commit();
  EditModel model = Replay();
  EXPECT_EQ(model.log,
            (Strings{"1:0 @0 +8", "1:0 @0 +1", "1:0 @3 -1", "1:0 @3 +1", "1:0 @5 -2", "1:0 @7 +1"}));
  EXPECT_EQ(model.commitIds, (Strings{first, second}));
  EXPECT_EQ(Lines(model, 1), (Strings{"0\n", "1\n", "2\n", "three\n", "4\n", "7\n", "8\n", "nine\n"}));
  EXPECT_EQ(m_source->Describe(), "git repository " + m_repository.path().string() + " at " + second);
}

TEST_F(GitHistory, NumbersFilesByFirstAppearanceInTheOrderOfGit) {
  m_repository.Write("m", "m\n");
  m_repository.Write("b/x", "x\n");
  m_repository.Commit();
  m_repository.Write("a", "a\n");
  m_repository.Write("b/x", "y\n");
  m_repository.Commit();
  EditModel model = Replay();
  EXPECT_EQ(model.paths, (Strings{"b/x", "m", "a"}));
  EXPECT_EQ(model.log, (Strings{"1:0 @0 +1", "2:0 @0 +1", "3:0 @0 +1", "1:0 @0 -1", "1:0 @0 +1"}));
}

TEST_F(GitHistory, FollowsTheFirstParentOfAMerge) {
  m_repository.Write("f", "base\n");
  const std::string base = m_repository.Commit();
  m_repository.Git({"checkout", "-q", "-b", "side"});
  m_repository.SetAuthor("Side", "side@example.org");
  m_repository.Write("f", "base\nside\n");
  m_repository.Write("g", "of the side\n");
  m_repository.Commit();
  m_repository.Git({"checkout", "-q", "main"});
  m_repository.SetAuthor("Main", "main@example.org");
  m_repository.Write("f", "main\nbase\n");
  const std::string main = m_repository.Commit();
  m_repository.SetAuthor("Merger", "merger@example.org");
  m_repository.Git({"merge", "-q", "--no-ff", "-m", "merge", "side"});
  EditModel model = Replay();
  EXPECT_EQ(model.commitIds, (Strings{base, main, m_repository.Git({"rev-parse", "HEAD"})}));
  EXPECT_EQ(model.commits.back(), "Merger <merger@example.org>");
  EXPECT_EQ(model.log, (Strings{"1:0 @0 +1", "1:0 @0 +1", "1:0 @2 +1", "2:0 @0 +1"}));
}

TEST_F(GitHistory, ARenameIsADeletionAndANewFile) {
  m_repository.Write("old", "1\n2\n3\n4\n5\n");
  m_repository.Commit();
  m_repository.Git({"mv", "old", "new"});
  m_repository.Commit();
  EditModel model = Replay();
  EXPECT_EQ(model.paths, (Strings{"old", "new"}));
  EXPECT_EQ(Lines(model, 1), Strings{});
  EXPECT_EQ(Lines(model, 2).size(), 5u);
}

TEST_F(GitHistory, AFileThatComesBackIsTheSameObject) {
  m_repository.Write("f", "1\n2\n");
  m_repository.Commit();
  m_repository.Remove("f");
  m_repository.Write("other", "x\n");
  m_repository.Commit();
  m_repository.Write("f", "3\n");
  m_repository.Commit();
  EditModel model = Replay();
  EXPECT_EQ(model.paths, (Strings{"f", "other"}));
  EXPECT_EQ(model.log, (Strings{"1:0 @0 +2", "1:0 @0 -2", "2:0 @0 +1", "1:0 @0 +1"}));
}

TEST_F(GitHistory, AnEmptyFileIsAnObjectWithoutEdits) {
  m_repository.Write("empty", "");
  m_repository.Write("emptied", "1\n");
  m_repository.Commit();
  m_repository.Write("emptied", "");
  m_repository.Commit();
  m_repository.Remove("empty");
  m_repository.Commit();
  EditModel model = Replay();
  EXPECT_EQ(model.paths, (Strings{"emptied", "empty"}));
  EXPECT_EQ(model.log, (Strings{"1:0 @0 +1", "1:0 @0 -1"}));
  EXPECT_EQ(model.commits.size(), 3u);
}

TEST_F(GitHistory, AFileCanEndWithoutALineFeed) {
  for (const char* content :
       {"1\n2", "1\n2\n", "1\n2\n3", "1\n2\n3\n4", "1\n2", "1\n2\r", "0\n1\n2\r", "", "x", "x\ny", "\n"}) {
    m_repository.Write("f", content);
    m_repository.Commit();
  }
  EditModel model = Replay();
  EXPECT_EQ(Lines(model, 1), (Strings{"\n"}));
  EXPECT_EQ((Strings{model.log.begin(), model.log.begin() + 3}),
            (Strings{"1:0 @0 +2", "1:0 @1 -1", "1:0 @1 +1"}));
  m_repository.Write("f", "last");
  m_repository.Commit();
  model = Replay();
  EXPECT_EQ(Lines(model, 1), (Strings{"last"}));
}

TEST_F(GitHistory, LinesEndAtLineFeedsAlone) {
  m_repository.Write("f",
                     "a\r\nb\rc\n\fd\v\n\n\r\n\xe2\x80\xa8"
                     "e");
  m_repository.Commit();
  EditModel model = Replay();
  EXPECT_EQ(Lines(model, 1), (Strings{"a\r\n", "b\rc\n", "\fd\v\n", "\n", "\r\n",
                                      "\xe2\x80\xa8"
                                      "e"}));
}

TEST_F(GitHistory, ContentThatLooksLikeADiffIsContent) {
  const std::string hostile =
      "diff --git a/x b/x\n--- a/x\n+++ b/x\n@@ -1 +1 @@\n\\ No newline at end of file\n"
      "commit 0123456789012345678901234567890123456789 A <a>\nBinary files a/x and b/x differ\n"
      "-- a/x\n++ b/x\n- a\n+ b\n\\\n\nindex 0000000..1111111 100644\nnew file mode 120000\ndeleted file "
      "mode 100644\n";
  m_repository.Write("f", hostile);
  m_repository.Commit();
  m_repository.Write("f", "kept\n" + hostile + "kept\n");
  m_repository.Commit();
  m_repository.Write("f", "kept\nkept\n");
  m_repository.Write("g", hostile + "\\ No newline at end of file");
  m_repository.Commit();
  m_repository.Write("g", "\\ No newline at end of file");
  m_repository.Commit();
  EditModel model = Replay();
  EXPECT_EQ(model.commits.size(), 4u);
  EXPECT_EQ(model.paths, (Strings{"f", "g"}));
  EXPECT_EQ(Lines(model, 2), (Strings{"\\ No newline at end of file"}));
}

TEST_F(GitHistory, AFileThatWasBinaryOnceIsSkippedWhole) {
  using namespace std::string_literals;
  m_repository.Write("a", "text\n");
  m_repository.Write("b", "1\n");
  m_repository.Commit();
  m_repository.Write("a", "\0binary\n"s);
  m_repository.Write("b", "1\n2\n");
  m_repository.Commit();
  m_repository.Write("a", "text again\n");
  m_repository.Write("c", "\0"s);
  m_repository.Commit();
  EditModel model = Replay();
  EXPECT_EQ(model.paths, (Strings{"b"}));
  EXPECT_EQ(model.log, (Strings{"1:0 @0 +1", "1:0 @1 +1"}));
  ExpectSkipped(2, 0, 0);
}

TEST_F(GitHistory, NulsFarBehindAreText) {
  const std::string content =
      std::string(9000, 'x') + '\n' + std::string(3, '\0') + "\n" + std::string(1, '\0');
  m_repository.Write("f", content);
  m_repository.Commit();
  EditModel model = Replay();
  EXPECT_EQ(Lines(model, 1).size(), 3u);
  ExpectSkipped(0, 0, 0);
}

TEST_F(GitHistory, TheAttributesOfTheWorkingTreeSayWhatIsBinary) {
  using namespace std::string_literals;
  m_repository.Write(".gitattributes", "*.dat -diff\n*.txt diff\n");
  m_repository.Write("a.dat", "text\n");
  m_repository.Write("a.txt", "\0 and yet text\n"s);
  m_repository.Write("empty.dat", "");
  m_repository.Commit();
  EditModel model = Replay();
  EXPECT_EQ(model.paths, (Strings{".gitattributes", "a.txt", "empty.dat"}));
  ExpectSkipped(1, 0, 0);
}

TEST_F(GitHistory, AChangeOfModeIsNoEdit) {
  m_repository.Write("f", "1\n");
  m_repository.Commit();
  m_repository.Git({"update-index", "--chmod=+x", "f"});
  m_repository.CommitIndex();
  m_repository.Write("f", "2\n");
  m_repository.Git({"add", "f"});
  m_repository.Git({"update-index", "--chmod=-x", "f"});
  m_repository.CommitIndex();
  EditModel model = Replay();
  EXPECT_EQ(model.log, (Strings{"1:0 @0 +1", "1:0 @0 -1", "1:0 @0 +1"}));
}

TEST_F(GitHistory, ASymbolicLinkIsNoTextFile) {
  namespace fs = std::filesystem;
  fs::create_symlink("target", m_repository.path() / "always");
  m_repository.Write("first", "text\n");
  fs::create_symlink("target", m_repository.path() / "later");
  m_repository.Commit();
  m_repository.Remove("always");
  fs::create_symlink("another", m_repository.path() / "always");
  m_repository.Remove("first");
  fs::create_symlink("text", m_repository.path() / "first");
  m_repository.Remove("later");
  m_repository.Write("later", "now text\n");
  m_repository.Commit();
  EditModel model = Replay();
  EXPECT_EQ(model.paths, (Strings{"first", "later"}));
  EXPECT_EQ(model.log, (Strings{"1:0 @0 +1", "1:0 @0 -1", "2:0 @0 +1"}));
  ExpectSkipped(0, 3, 0);
}

TEST_F(GitHistory, ASubmoduleIsNoTextFile) {
  m_repository.Write("f", "1\n");
  m_repository.Write("g", "1\n");
  const std::string first = m_repository.Commit();
  m_repository.Git({"update-index", "--add", "--cacheinfo", "160000," + first + ",module"});
  m_repository.Git({"update-index", "--cacheinfo", "160000," + first + ",g"});
  const std::string second = m_repository.CommitIndex();
  m_repository.Git({"update-index", "--cacheinfo", "160000," + second + ",module"});
  m_repository.CommitIndex();
  m_repository.Git({"update-index", "--force-remove", "module"});
  m_repository.CommitIndex();
  EditModel model = Replay();
  EXPECT_EQ(model.paths, (Strings{"f", "g"}));
  EXPECT_EQ(Lines(model, 2), Strings{});
  ExpectSkipped(0, 0, 2);
}

TEST_F(GitHistory, AFolderCanTakeTheNameOfAFile) {
  m_repository.Write("x", "1\n");
  m_repository.Commit();
  m_repository.Remove("x");
  m_repository.Write("x/y", "2\n");
  m_repository.Commit();
  EditModel model = Replay();
  EXPECT_EQ(model.paths, (Strings{"x", "x/y"}));
}

TEST_F(GitHistory, PathsCanHaveAnyBytes) {
  const Strings names = {"a space",
                         " lead",
                         "trail ",
                         "tab\there",
                         "quote\"d",
                         "line\nfeed",
                         "back\\slash",
                         "\\\"",
                         "\xc3\xa9t\xc3\xa9",
                         "\xff\xfe invalid",
                         "-dash",
                         "--option",
                         "a b/x b/x",
                         "a c",
                         "b/x b/b/x",
                         "bell\a\b\f\v\r\x1b\x7f",
                         "\001\002",
                         "dir with space/f",
                         "*?[x]",
                         ":(top)x",
                         "'single'",
                         "a => b",
                         "x }"};
  for (const std::string& name : names) m_repository.Write(name, "of " + name + "\nlast");
  m_repository.Commit();
  for (const std::string& name : names) m_repository.Write(name, "of " + name + "\nmore\n");
  m_repository.Commit();
  EditModel model = Replay();
  EXPECT_EQ(std::set<std::string>(model.paths.begin(), model.paths.end()),
            std::set<std::string>(names.begin(), names.end()));
  EXPECT_EQ(model.paths.size(), names.size());
  for (std::size_t i = 0; i < model.paths.size(); ++i) {
    std::string content;
    for (const std::string& line : Lines(model, i + 1)) content += line;
    EXPECT_EQ(content, "of " + model.paths[i] + "\nmore\n");
  }
}

TEST_F(GitHistory, ReportsEachAuthorBeforeTheFirstEdit) {
  const std::vector<std::pair<std::string, std::string>> authors = {
      {"Ada Lovelace", "ada@example.org"},
      {"Zo\xc3\xab \"Z\" O'Neil", "z@example.org"},
      {"commit 0123", "a b"},
      {"diff --git a/x b/x", "@@ -1 +1 @@"},
      {"Ada Lovelace", "another@example.org"}};
  int number = 0;
  for (const auto& [name, address] : authors) {
    m_repository.SetAuthor(name, address);
    m_repository.Write("f", std::to_string(++number) + "\n");
    m_repository.Commit();
  }
  m_repository.SetAuthor("Idle", "without@edits");
  m_repository.Commit();
  m_repository.SetAuthor("Ada Lovelace", "ada@example.org");
  m_repository.Write("f", "end\n");
  m_repository.Commit();
  EditModel model = Replay();
  Strings reported;
  for (const EditModel::Author& author : model.authors) reported.push_back(author.text);
  EXPECT_EQ(reported, (Strings{"Ada Lovelace <ada@example.org>", "Zo\xc3\xab \"Z\" O'Neil <z@example.org>",
                               "commit 0123 <a b>", "diff --git a/x b/x <@@ -1 +1 @@>",
                               "Ada Lovelace <another@example.org>"}));
  EXPECT_EQ(model.commits[5], "Idle <without@edits>");
}

TEST_F(GitHistory, AMailmapDoesNotMatter) {
  m_repository.Write(".mailmap", "Mapped <mapped@example.org> <ada@example.org>\n");
  m_repository.Commit();
  EXPECT_EQ(Replay().commits, (Strings{"Ada Lovelace <ada@example.org>"}));
}

TEST_F(GitHistory, AuthorsInAnotherEncodingAreReportedInUtf8) {
  m_repository.SetAuthor("Zo\xeb", "z@example.org");
  m_repository.Git({"config", "i18n.commitEncoding", "ISO-8859-1"});
  m_repository.Git({"config", "i18n.logOutputEncoding", "ISO-8859-1"});
  m_repository.Write("f", "1\n");
  m_repository.Commit();
  EXPECT_EQ(Replay().commits, (Strings{"Zo\xc3\xab <z@example.org>"}));
}

TEST_F(GitHistory, EndsAtTheRevisionAskedFor) {
  m_repository.Write("f", "1\n");
  m_repository.Write("gone", "x\n");
  const std::string first = m_repository.Commit();
  m_repository.Git({"tag", "-a", "-m", "annotated", "v1"});
  m_repository.Git({"branch", "--", "v2"});
  m_repository.Write("f", "1\n2\n");
  m_repository.Remove("gone");
  m_repository.Commit();
  for (const std::string& revision :
       {first, first.substr(0, 10), std::string("v1"), std::string("HEAD~1"), std::string("v2")}) {
    EditModel model = Replay(revision);
    EXPECT_EQ(model.commitIds, (Strings{first})) << revision;
    EXPECT_EQ(model.log, (Strings{"1:0 @0 +1", "2:0 @0 +1"})) << revision;
  }
  EXPECT_EQ(Replay().commitIds.size(), 2u);
}

TEST_F(GitHistory, ABranchThatMovesOnChangesNothing) {
  m_repository.Write("f", "1\n");
  const std::string first = m_repository.Commit();
  const auto source = OpenGitHistory(m_repository.path(), "main");
  EXPECT_EQ(source->CountEdits(), 1u);
  m_repository.Write("f", "2\n");
  m_repository.Commit();
  EXPECT_EQ(ReplayAndCheck(*source).commitIds, (Strings{first}));
}

TEST_F(GitHistory, AFileReadAsBinaryBetweenThePassesIsReported) {
  m_repository.Write("f", "1\n");
  m_repository.Commit();
  const auto source = OpenGitHistory(m_repository.path());
  EXPECT_EQ(source->CountEdits(), 1u);
  m_repository.Write(".gitattributes", "f -diff\n");
  EditModel model;
  EXPECT_EQ(SourceErrorOf([&] { source->Replay(model); }),
            "the repository changed while its history was read: try again");
}

TEST_F(GitHistory, ReadsABareRepositoryAndAGitFolder) {
  m_repository.Write("f", "1\n");
  m_repository.Commit();
  const std::filesystem::path bare = m_repository.folder() / "bare copy";
  m_repository.Git({"clone", "-q", "--bare", ".", bare.string()});
  for (const auto& path : {bare, m_repository.path() / ".git"}) {
    const auto source = OpenGitHistory(path);
    EXPECT_EQ(ReplayAndCheck(*source).log, (Strings{"1:0 @0 +1"})) << path;
  }
}

TEST_F(GitHistory, AShallowCloneStartsAtItsFirstCommit) {
  m_repository.Write("f", "1\n");
  m_repository.Commit();
  m_repository.Write("f", "1\n2\n3\n");
  const std::string last = m_repository.Commit();
  const std::filesystem::path shallow = m_repository.folder() / "shallow";
  m_repository.Git({"clone", "-q", "--depth=1", "file://" + m_repository.path().string(), shallow.string()});
  const auto source = OpenGitHistory(shallow);
  const EditModel model = ReplayAndCheck(*source);
  EXPECT_EQ(model.commitIds, (Strings{last}));
  EXPECT_EQ(model.log, (Strings{"1:0 @0 +3"}));
}

TEST_F(GitHistory, ReadsARepositoryWithLongObjectIds) {
  const std::filesystem::path sha256 = m_repository.folder() / "sha256";
  m_repository.Git({"init", "-q", "--object-format=sha256", sha256.string()});
  WriteFile(sha256 / "f", "1\n");
  m_repository.Git({"-C", sha256.string(), "add", "f"});
  m_repository.Git({"-C", sha256.string(), "commit", "-q", "-m", "x"});
  const auto source = OpenGitHistory(sha256);
  EXPECT_EQ(ReplayAndCheck(*source).commitIds.at(0).size(), 64u);
}

TEST_F(GitHistory, AVisitorThatThrowsEndsTheReplay) {
  // More than a pipe holds, so that git is still running.
  m_repository.Write("f", std::string(1 << 22, 'x') + "\n");
  m_repository.Commit();
  m_repository.Write("g", std::string(1 << 22, 'y') + "\n");
  m_repository.Commit();
  class Thrower : public EditModel {
   public:
    void OnEdit(const Edit&) override { throw 42; }
  } thrower;
  const auto source = OpenGitHistory(m_repository.path());
  EXPECT_THROW(source->Replay(thrower), int);
  EXPECT_EQ(ReplayAndCheck(*source).edits, 2u);
}

}  // namespace
}  // namespace vemo::test
