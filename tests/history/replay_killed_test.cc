// A replay that dies without a chance to say goodbye.
#include <gtest/gtest.h>

#include "recorded_fields.h"
#include "scripted_source.h"
#include "tests/engines/child_process.h"
#include "tests/support/temp_folder.h"

namespace vemo::test {
namespace {

constexpr std::uint64_t kBatch = 5;

// Replays in a process that is killed before that edit.
void ReplayAndKill(const std::string& uri, ScriptedSource source, std::uint64_t beforeEdit, bool resume) {
  ChildProcess child([&](const Conversation& parent) {
    source.beforeEdit = [&](std::uint64_t index) {
      if (index != beforeEdit) return;
      parent.Say("now");
      parent.Hear();  // until the kill
    };
    const auto space = CSpace::Open(uri, {.create = true});
    ReplayOptions options;
    options.batchEdits = kBatch;
    options.resume = resume;
    Replay(*space, source, options);
    return true;
  });
  ASSERT_EQ(child.Hear(), "now");
  child.Kill();
}

TEST(KilledReplayTest, IsFinishedByResuming) {
  for (const bool recording : {true, false}) {
    const TempFolder folder;
    const std::string uri = "lmdb:" + (folder.path() / "space").string();
    ScriptedSource source =
        recording ? ScriptedSource::RandomRecording(21, 60, Field(1)) : ScriptedSource::Random(21, 60, 3, 12);
    ReplayAndKill(uri, source, 23, false);
    ReplayAndKill(uri, source, 24, true);  // nothing new was committed
    ReplayAndKill(uri, source, 41, true);
    if (HasFatalFailure()) return;
    auto space = CSpace::Open(uri);
    EXPECT_EQ(Snapshot(*space).Meta(ReplayMetaPrefix(source) + "edits"), "40");
    ReplayOptions options;
    options.resume = true;
    EXPECT_EQ(Replay(*space, source, options).editsApplied, 20u);
    space.reset();
    space = CSpace::Open(uri);
    EXPECT_EQ(CheckReplay(*space, source), std::nullopt);
    const auto whole = CSpace::Open("memory:");
    Replay(*whole, source, {});
    EXPECT_EQ(CommittedBytes(*space), CommittedBytes(*whole));
  }
}

TEST(KilledReplayTest, BeforeItsFirstCommitLeavesAnEmptySpace) {
  const TempFolder folder;
  const std::string uri = "lmdb:" + (folder.path() / "space").string();
  ScriptedSource source = ScriptedSource::RandomRecording(22, 20, Field(1));
  ReplayAndKill(uri, source, 4, false);
  if (HasFatalFailure()) return;
  const auto space = CSpace::Open(uri);
  EXPECT_TRUE(Snapshot(*space).RootNames().empty());
  EXPECT_EQ(Replay(*space, source, {}).editsApplied, 20u) << "without resuming, since nothing is there";
  EXPECT_EQ(CheckReplay(*space, source), std::nullopt);
}

}  // namespace
}  // namespace vemo::test
