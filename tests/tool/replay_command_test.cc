#include <sys/resource.h>

#include <csignal>
#include <cstdlib>

#include "history/replay.h"
#include "store/snapshot.h"
#include "tests/history/test_repository.h"
#include "tool_fixture.h"

namespace vemo::test {
namespace {

class ReplayCommandTest : public ToolTest {
 protected:
  Outcome Replay(std::vector<std::string> arguments, const std::function<void()>& inChild = {}) {
    arguments.insert(arguments.begin(), {"replay", "--store", uri()});
    return Vemo(arguments, inChild);
  }
  // Of the recording of that field, or of "git".
  int EditsApplied(const std::string& key) {
    const auto space = CSpace::Open(uri());
    return std::stoi(Snapshot(*space).Meta("replay/" + key + "/edits").value_or("0"));
  }
  static bool Contains(const std::string& text, const std::string& part) {
    return text.find(part) != std::string::npos;
  }
};

TEST_F(ReplayCommandTest, OfARecordingMatches) {
  const Outcome outcome = Replay({SmallRecording(), "--field", "1:0", "--check"});
  EXPECT_EQ(outcome.exitCode, 0);
  EXPECT_EQ(outcome.err, "") << "no progress bar where there is no terminal";
  EXPECT_TRUE(Contains(outcome.out, "recording " + path("small.json").string() + " in " + uri()))
      << outcome.out;
  EXPECT_TRUE(Contains(outcome.out, "\n  edits                           6\n")) << outcome.out;
  EXPECT_TRUE(Contains(outcome.out, "\n  elements inserted              18\n")) << outcome.out;
  EXPECT_TRUE(Contains(outcome.out, "\n  elements deleted                6\n")) << outcome.out;
  EXPECT_TRUE(Contains(outcome.out, "\n  insertions            1          1        0            6\n"))
      << outcome.out;
  EXPECT_TRUE(outcome.out.ends_with("\ncontent matches\n")) << outcome.out;
}

TEST_F(ReplayCommandTest, WithoutCheckSaysNothingOfTheContent) {
  const Outcome outcome = Replay({SmallRecording(), "--field", "1:0"});
  EXPECT_EQ(outcome.exitCode, 0);
  EXPECT_FALSE(Contains(outcome.out, "content"));
}

TEST_F(ReplayCommandTest, IntoMemoryMatches) {
  const Outcome outcome =
      Vemo({"replay", "--store", "memory:", SmallRecording(), "--field", "7:1.2", "--check", "--batch", "2"});
  EXPECT_EQ(outcome.exitCode, 0) << outcome.err;
  EXPECT_TRUE(outcome.out.ends_with("\ncontent matches\n")) << outcome.out;
}

TEST_F(ReplayCommandTest, OfARecordingWithAnotherEndFindsTheFirstDifference) {
  const std::string lying =
      WriteRecording("lying.json", {R"(0,0,"one\ntwo\n")", R"(4,3,"2")"}, R"(one\ntwo\n)");
  const Outcome outcome = Replay({lying, "--field", "1:0", "--check"});
  EXPECT_EQ(outcome.exitCode, 1);
  EXPECT_EQ(outcome.err, "");
  EXPECT_TRUE(outcome.out.ends_with(
      "\nfield 1:0 (lying.json) differs at byte 4, line 2: the source has \"two?\", the maps give \"2?\"\n"))
      << outcome.out;
}

TEST_F(ReplayCommandTest, NamesTheAuthorAndCommitsInBatches) {
  const Outcome outcome = Replay({SmallRecording(), "--field", "1:0", "--author", "Ada", "--batch", "2"});
  EXPECT_EQ(outcome.exitCode, 0);
  EXPECT_TRUE(Contains(outcome.out, "\n  store commits                   4  in ")) << outcome.out;
  const auto space = CSpace::Open(uri());
  Snapshot snapshot(*space);
  int authors = 0;
  snapshot.ScanMeta("site/", [&](std::string_view, std::string_view author) {
    EXPECT_EQ(author, "Ada");
    return ++authors > 0;
  });
  EXPECT_EQ(authors, 1);
}

TEST_F(ReplayCommandTest, OfASecondRecordingIntoAnotherFieldMatches) {
  EXPECT_EQ(Replay({SmallRecording(), "--field", "1:0", "--check"}).exitCode, 0);
  const Outcome outcome = Replay({SmallRecording(), "--field", "1:1", "--check"});
  EXPECT_EQ(outcome.exitCode, 0) << outcome.out << outcome.err;
  EXPECT_EQ(Vemo({"verify", uri()}).exitCode, 0);
}

TEST_F(ReplayCommandTest, ResumedWithNothingToDoMatches) {
  EXPECT_EQ(Replay({SmallRecording(), "--field", "1:0"}).exitCode, 0);
  const Outcome outcome = Replay({SmallRecording(), "--field", "1:0", "--resume", "--check"});
  EXPECT_EQ(outcome.exitCode, 0);
  EXPECT_TRUE(Contains(outcome.out, "6  of which 0 now\n")) << outcome.out;
  EXPECT_TRUE(outcome.out.ends_with("\ncontent matches\n"));
}

TEST_F(ReplayCommandTest, OutOfDiskSpaceKeepsItsCommitsAndIsFinishedByResuming) {
  constexpr int kEdits = 3'000;
  std::vector<std::string> patches;
  std::string content;
  for (int i = 0; i < kEdits; ++i) {  // each a run of its own
    const std::size_t at = static_cast<std::size_t>(i) * 7'919 % (content.size() + 1);
    const char letter = static_cast<char>('a' + i % 26);
    patches.push_back(std::to_string(at) + ",0,\"" + letter + "\"");
    content.insert(at, 1, letter);
  }
  const std::string recording = WriteRecording("long.json", patches, content);
  const Outcome full = Replay({recording, "--field", "1:0", "--batch", "100"}, [] {
    const rlimit fileSize{256 * 1024, 256 * 1024};
    ::setrlimit(RLIMIT_FSIZE, &fileSize);
    ::signal(SIGXFSZ, SIG_IGN);
  });
  EXPECT_TRUE(Contains(Refusal(full, 3), "cannot commit to " + uri())) << full.err;
  EXPECT_EQ(Vemo({"verify", uri()}).exitCode, 0);
  const int applied = EditsApplied("1:0");
  EXPECT_GT(applied, 0);
  EXPECT_LT(applied, kEdits);
  EXPECT_EQ(applied % 100, 0);
  Refusal(Replay({recording, "--field", "1:0"}), 2);
  const Outcome resumed = Replay({recording, "--field", "1:0", "--resume", "--check"});
  EXPECT_EQ(resumed.exitCode, 0) << resumed.err;
  EXPECT_TRUE(Contains(resumed.out, "3,000  of which ")) << resumed.out;
  EXPECT_TRUE(resumed.out.ends_with("\ncontent matches\n")) << resumed.out;
  ASSERT_EQ(Vemo({"replay", "--store", uri("whole"), recording, "--field", "1:0"}).exitCode, 0);
  EXPECT_EQ(Vemo({"dump", uri(), "history"}).out, Vemo({"dump", uri("whole"), "history"}).out);
}

// The git of this test kills whoever started it when the second reading of the history (the first counts the
// edits) is well past what pipes and buffers can hold, and far from its end.
TEST_F(ReplayCommandTest, KilledBetweenItsCommitsIsFinishedByResuming) {
  TestRepository repository;
  constexpr int kCommits = 16;
  for (int i = 0; i < kCommits; ++i) {
    std::string text;
    for (int line = 0; line < 1'000; ++line)
      text +=
          "line " + std::to_string(line) + " of version " + std::to_string(i) + std::string(20, '.') + "\n";
    repository.Write("file", text);
    repository.Commit();
  }
  WriteFile(path("bin/git"),
            "#!/bin/sh\n"
            "PATH=$REAL_PATH\n"
            "case \" $* \" in *' log '*)\n"
            "  echo >> \"$READINGS\"\n"
            "  if [ \"$(wc -l < \"$READINGS\")\" -eq 2 ]; then git \"$@\" | head -c 700000; kill -9 $PPID; "
            "exit; fi\n"
            "esac\n"
            "exec git \"$@\"\n");
  std::filesystem::permissions(path("bin/git"), std::filesystem::perms::owner_all);
  const Outcome killed = Replay({"--git", repository.path().string(), "--batch", "1"}, [this] {
    const std::string realPath = std::getenv("PATH");
    ::setenv("REAL_PATH", realPath.c_str(), 1);
    ::setenv("READINGS", path("readings").c_str(), 1);
    ::setenv("PATH", (path("bin").string() + ":" + realPath).c_str(), 1);
  });
  ASSERT_EQ(killed.signal, SIGKILL) << killed.out << killed.err;
  EXPECT_EQ(Vemo({"verify", uri()}).exitCode, 0);
  const int applied = EditsApplied("git");
  EXPECT_GT(applied, 0);
  EXPECT_LT(applied, 2 * kCommits - 1);
  const Outcome resumed = Replay({"--git", repository.path().string(), "--resume", "--check"});
  EXPECT_EQ(resumed.exitCode, 0) << resumed.err;
  EXPECT_TRUE(Contains(resumed.out, "31  of which " + std::to_string(31 - applied) + " now")) << resumed.out;
  EXPECT_TRUE(resumed.out.ends_with("\ncontent matches\n")) << resumed.out;
  ASSERT_EQ(Vemo({"replay", "--store", uri("whole"), "--git", repository.path().string()}).exitCode, 0);
  EXPECT_EQ(Vemo({"dump", uri(), "history"}).out, Vemo({"dump", uri("whole"), "history"}).out);
}

TEST_F(ReplayCommandTest, OfARepositoryMatches) {
  TestRepository repository;
  repository.Write("a", "1\n2\n3\n");
  repository.Write("odd\n\"name\"", "x");
  repository.Write("binary", std::string("\0", 1));
  std::filesystem::create_symlink("a", repository.path() / "link");
  repository.Commit();
  repository.SetAuthor("Grace Hopper", "grace@example.org");
  repository.Write("a", "1\nzwei\n3\n");
  repository.Git({"mv", "odd\n\"name\"", "even"});
  const std::string last = repository.Commit();
  repository.Write("a", "");
  repository.Commit();
  const Outcome outcome =
      Replay({"--git", repository.path().string(), "--rev", "HEAD~1", "--check", "--batch", "1"});
  EXPECT_EQ(outcome.exitCode, 0) << outcome.err;
  EXPECT_TRUE(Contains(outcome.out, " at " + last + " in " + uri())) << outcome.out;
  EXPECT_TRUE(Contains(outcome.out, "\n  authors                         2\n")) << outcome.out;
  EXPECT_TRUE(Contains(outcome.out, "\n  files                           3  in 2 git commits\n"))
      << outcome.out;
  EXPECT_TRUE(Contains(outcome.out, "  binary 1, symbolic links 1, submodules 0\n")) << outcome.out;
  EXPECT_TRUE(outcome.out.ends_with("\ncontent matches\n")) << outcome.out;
  const Outcome resumed = Replay({"--git", repository.path().string(), "--resume", "--check"});
  EXPECT_EQ(resumed.exitCode, 0) << resumed.err;
  EXPECT_TRUE(Contains(resumed.out, "of which 1 now")) << resumed.out;
  EXPECT_TRUE(resumed.out.ends_with("\ncontent matches\n")) << resumed.out;
  EXPECT_EQ(Vemo({"verify", uri()}).exitCode, 0);
}

}  // namespace
}  // namespace vemo::test
