#include "history/git_log_parser.h"

#include <gtest/gtest.h>

#include "edit_model.h"
#include "history/git_quoting.h"

namespace vemo::test {
namespace {

using Strings = std::vector<std::string>;

constexpr const char* kId = "0123456789abcdef0123456789abcdef01234567";

// Writes down what it is told.
class Recorder : public GitLogVisitor {
 public:
  void OnLogCommit(std::string_view id, std::string_view author) override {
    EXPECT_EQ(id, kId);
    calls.push_back("commit " + std::string(author));
  }
  void OnLogFile(std::string_view path, GitFileKind kind) override {
    const char* kinds[] = {"regular ", "symlink ", "submodule "};
    calls.push_back(kinds[static_cast<int>(kind)] + std::string(path));
  }
  void OnLogBinary() override { calls.push_back("binary"); }
  void OnLogHunk(const GitHunk& hunk) override {
    std::string call = "@" + std::to_string(hunk.position) + " -" + std::to_string(hunk.deleted);
    for (const std::string_view line : hunk.inserted) call += " [" + std::string(line) + "]";
    calls.push_back(call);
  }
  Strings calls;
};

Strings Parse(const Strings& lines) {
  Recorder recorder;
  GitLogParser parser(recorder);
  for (const std::string& line : lines) parser.Line(line);
  parser.End();
  return recorder.calls;
}

Strings WithFile(const Strings& lines) {
  Strings all = {std::string("commit ") + kId + " A <a>",
                 "",
                 "diff --git a/f b/f",
                 "index 1..2 100644",
                 "--- a/f",
                 "+++ b/f"};
  all.insert(all.end(), lines.begin(), lines.end());
  return all;
}

Strings Hunks(const Strings& lines) {
  Strings calls = Parse(WithFile(lines));
  EXPECT_EQ((Strings{calls.begin(), calls.begin() + 2}), (Strings{"commit A <a>", "regular f"}));
  return {calls.begin() + 2, calls.end()};
}

TEST(GitLogParser, ReadsTheFourFormsOfARange) {
  EXPECT_EQ(Hunks({"@@ -1 +1 @@", "-a", "+b", "@@ -4,2 +4,0 @@ text @@", "-a", "-b", "@@ -9,0 +8,2 @@", "+x",
                   "+y"}),
            (Strings{"@0 -1 [b\n]", "@4 -2", "@7 -0 [x\n] [y\n]"}));
}

TEST(GitLogParser, TakesTheLineFeedFromTheLineBeforeTheMark) {
  const std::string mark = "\\ No newline at end of file";
  EXPECT_EQ(Hunks({"@@ -1 +1 @@", "-a", mark, "+b"}), (Strings{"@0 -1 [b\n]"}));
  EXPECT_EQ(Hunks({"@@ -1 +1 @@", "-a", "+b", mark}), (Strings{"@0 -1 [b]"}));
  EXPECT_EQ(Hunks({"@@ -1 +1,2 @@", "-a", mark, "+b", "+c", mark}), (Strings{"@0 -1 [b\n] [c]"}));
  EXPECT_EQ(Hunks({"@@ -1 +0,0 @@", "-a", mark}), (Strings{"@0 -1"}));
  EXPECT_EQ(Hunks({"@@ -0,0 +1 @@", "+", mark}), (Strings{"@0 -0 []"}));
}

TEST(GitLogParser, TellsTheKindOfAFileBeforeItsContent) {
  const std::string commit = std::string("commit ") + kId + " A <a>";
  EXPECT_EQ(Parse({commit,
                   "",
                   "diff --git a/e b/e",
                   "new file mode 100644",
                   "index 0..1",
                   "diff --git a/l b/l",
                   "deleted file mode 120000",
                   "index 1..0",
                   "--- a/l",
                   "+++ /dev/null",
                   "@@ -1 +0,0 @@",
                   "-x",
                   "\\ No newline at end of file",
                   "diff --git a/m b/m",
                   "index 1..2 160000",
                   "--- a/m",
                   "+++ b/m",
                   "@@ -1 +1 @@",
                   "-Subproject commit 1",
                   "+Subproject commit 2",
                   "diff --git a/b b/b",
                   "index 1..2 100755",
                   "Binary files a/b and b/b differ",
                   "diff --git a/x b/x",
                   "old mode 100755",
                   "new mode 100644"}),
            (Strings{"commit A <a>", "regular e", "symlink l", "@0 -1", "submodule m",
                     "@0 -1 [Subproject commit 2\n]", "regular b", "binary", "regular x"}));
}

TEST(GitLogParser, AuthorsCanHaveAnyText) {
  EXPECT_EQ(Parse({std::string("commit ") + kId + "  <>",
                   std::string("commit ") + kId + " commit commit <diff --git>"}),
            (Strings{"commit  <>", "commit commit commit <diff --git>"}));
}

TEST(GitLogParser, RefusesLinesOutOfPlace) {
  const Strings outOfPlace[] = {
      {"index 1..2 100644"},
      {"commit 0123 A <a>"},
      {std::string("commit ") + kId},
      WithFile({"+line"}),
      WithFile({"\\ No newline at end of file"}),
      WithFile({"@@ -1 +1 @@", "+b"}),
      WithFile({"@@ -1 +1 @@", "-a", "-b"}),
      WithFile({"@@ -1 +1 @@", " a"}),
      WithFile({"@@ -1 +1 @@", "\\ No newline at end of file"}),
      WithFile({"@@ -0,0 +1,2 @@", "+a", "\\ No newline at end of file", "+b"}),
      WithFile({"@@ -0,0 +1 @@", "+a", "\\ No newline at end of file", "\\ No newline at end of file", "+b"}),
      WithFile({"@@ -1 +0 @@", "-a", "+b"}),
      WithFile({"@@ -x +1 @@"}),
      WithFile({"@@ -1,x +1 @@"}),
      WithFile({"@@ -1 1 @@"}),
      WithFile({"@@ -1 +1"}),
      WithFile({"@@@ -1 -1 +1 @@@"}),
      WithFile({"similarity index 90%"}),
      WithFile({"diff --cc f"}),
  };
  for (const Strings& lines : outOfPlace) {
    const std::string message = SourceErrorOf([&] { Parse(lines); });
    EXPECT_EQ(message.find("git printed a line that cannot be understood: "), 0u) << message << lines.back();
  }
}

TEST(GitLogParser, RefusesALogThatEndsInsideAHunk) {
  EXPECT_EQ(SourceErrorOf([] {
              Parse(WithFile({"@@ -1 +1 @@", "-a"}));
            }),
            "the output of git ends inside a hunk of f");
}

TEST(GitLogParser, RefusesAFileWithoutAKnownMode) {
  EXPECT_EQ(SourceErrorOf([] {
              Parse({"diff --git a/f b/f", "--- a/f", "+++ b/f", "@@ -1 +1 @@"});
            }),
            "git printed no file mode for f");
  EXPECT_EQ(SourceErrorOf([] {
              Parse({"diff --git a/f b/f", "new file mode 040000"});
            }),
            "git printed an unknown file mode for f: 040000");
}

TEST(GitQuoting, ReadsPlainAndQuotedPaths) {
  EXPECT_EQ(PathOfDiffLine("a/f b/f"), "f");
  EXPECT_EQ(PathOfDiffLine("a/f b/f b/f b/f"), "f b/f");
  EXPECT_EQ(PathOfDiffLine(R"("a/\a\b\t\n\v\f\r\"\\" "b/\a\b\t\n\v\f\r\"\\")"), "\a\b\t\n\v\f\r\"\\");
  EXPECT_EQ(PathOfDiffLine(R"("a/\303\251\3770" "b/\303\251\3770")"),
            "\xc3\xa9\xff"
            "0");
}

TEST(GitQuoting, RefusesWhatIsNotTheSamePathTwice) {
  for (const char* paths :
       {"", " ", "a/f", "a/f b/g", "a/f a/f", "f f", "a/f  b/f", R"("a/f)", R"("a/f" b/f)", R"("a/f" "b/g")",
        R"("a/f" "b/f)", R"("a/f" "b/f" )", R"("a/\" "b/\")", R"("a/\x" "b/\x")", R"("a/\40" "b/\40")",
        R"("a/\400" "b/\400")", R"("a/f""b/f)"}) {
    EXPECT_EQ(SourceErrorOf([&] { PathOfDiffLine(paths); }),
              std::string("git printed paths that cannot be understood: ") + paths);
  }
}

}  // namespace
}  // namespace vemo::test
