#include "history/replay.h"

#include <gtest/gtest.h>

#include "history/verify_history.h"
#include "recorded_fields.h"
#include "scripted_source.h"
#include "store/error.h"
#include "tests/support/seed.h"

namespace vemo::test {
namespace {

std::map<std::string, std::string> MetaOf(CSpace& space, std::string_view prefix = "") {
  std::map<std::string, std::string> values;
  Snapshot(space).ScanMeta(prefix, [&](std::string_view name, std::string_view value) {
    values.emplace(name, value);
    return true;
  });
  return values;
}

std::uint64_t CommitsOf(CSpace& space) {
  return Snapshot(space).Generation();
}

template <class Action>
std::string UsageErrorOf(const Action& action) {
  try {
    action();
  } catch (const UsageError& error) {
    return error.what();
  }
  return "it was not refused";
}

TEST(ReplayTest, RecordsEditsInTheThreeMaps) {
  const auto space = CSpace::Open("memory:");
  ScriptedSource source(Field(7, 3));
  source.Insert('A', Field(7, 3), 0, "hallo").Delete('A', Field(7, 3), 1, 1).Insert('A', Field(7, 3), 1, "e");
  const ReplayReport report = Replay(*space, source, {});
  EXPECT_EQ(report.edits, 3u);
  EXPECT_EQ(report.editsApplied, 3u);
  EXPECT_EQ(report.elementsInserted, 6u);
  EXPECT_EQ(report.elementsDeleted, 1u);
  EXPECT_EQ(report.sites, 1u);
  EXPECT_EQ(report.objects, 0u);
  EXPECT_EQ(report.sourceCommits, 0u);
  EXPECT_EQ(report.storeCommits, 1u);
  Snapshot snapshot(*space);
  EXPECT_EQ(RunsText(snapshot.Root<FieldIdToVectorInsertionsMap>(kInsertionsRoot).rFind(Field(7, 3))->m_c),
            "A0@0 A6@1 A1-4@2");
  EXPECT_EQ(CheckReplay(*space, source), std::nullopt);
}

TEST(ReplayTest, CommitsABatchAtATime) {
  for (const std::uint64_t batch : {1u, 7u, 20u, 100u}) {
    const auto space = CSpace::Open("memory:");
    const std::uint64_t commitsBefore = CommitsOf(*space);
    ScriptedSource source = ScriptedSource::RandomRecording(1, 20, Field(1));
    ReplayOptions options;
    options.batchEdits = batch;
    std::vector<std::uint64_t> progress;
    options.progress = [&](std::uint64_t done) { progress.push_back(done); };
    const ReplayReport report = Replay(*space, source, options);
    EXPECT_EQ(report.storeCommits, 20 / batch + 1) << "the last one may be of the meta values alone";
    EXPECT_EQ(CommitsOf(*space) - commitsBefore, report.storeCommits);
    ASSERT_EQ(progress.size(), 20u);
    for (std::uint64_t i = 0; i < 20; ++i) EXPECT_EQ(progress[i], i + 1);
  }
}

TEST(ReplayTest, BatchesAreVisibleAsTheyAreCommitted) {
  const auto space = CSpace::Open("memory:");
  ScriptedSource source = ScriptedSource::RandomRecording(2, 10, Field(1));
  std::vector<std::string> seen;
  source.beforeEdit = [&](std::uint64_t) { seen.push_back(MetaOf(*space)["replay/1:0/edits"]); };
  ReplayOptions options;
  options.batchEdits = 4;
  Replay(*space, source, options);
  EXPECT_EQ(seen, (std::vector<std::string>{"", "", "", "", "4", "4", "4", "4", "8", "8"}));
}

TEST(ReplayTest, MetaTellsWhatTheNumbersMean) {
  const auto space = CSpace::Open("memory:");
  ScriptedSource source;
  source.CommitBy('A', "1111")
      .Object(1, "README")
      .Insert('A', Field(1), 0, "abc")
      .Delete('A', Field(1), 0, 1);
  source.CommitBy('A', "2222");  // without an edit
  source.CommitBy('B', "3333").Object(2, "odd \n\xff name").Insert('B', Field(2), 0, "x");
  source.CommitBy('A', "4444").Delete('A', Field(1), 0, 2).Insert('A', Field(2), 0, "y");
  source.CommitBy('A', "5555").Object(16, "empty");
  const ReplayReport report = Replay(*space, source, {});
  EXPECT_EQ(report.objects, 3u);
  EXPECT_EQ(report.sourceCommits, 5u);
  const std::string a = "00000041-0000-0000-0000-000000000001";
  const std::string b = "00000042-0000-0000-0000-000000000001";
  std::map<std::string, std::string> meta = MetaOf(*space);
  EXPECT_EQ(meta["replay/git/digest"].size(), 16u);
  meta.erase("replay/git/digest");
  EXPECT_EQ(meta, (std::map<std::string, std::string>{
                      {"site/" + a, "Author A"},
                      {"site/" + b, "Author B"},
                      {"next/" + a, "7"},
                      {"next/" + b, "1"},
                      {"commit/" + a + "/0000000000000000", "1111"},
                      {"commit/" + a + "/0000000000000004", "4444"},
                      {"commit/" + b + "/0000000000000000", "3333"},
                      {"object/0000000000000001", "README"},
                      {"object/0000000000000002", "odd \n\xff name"},
                      {"object/0000000000000010", "empty"},
                      {"replay/git/edits", "5"},
                      {"replay/git/start/" + a, "0"},
                      {"replay/git/start/" + b, "0"},
                  }));
}

TEST(ReplayTest, MetaNamesAreThoseOfTheValues) {
  EXPECT_EQ(SiteMetaName(Site('A')), "site/" + GuidText(Site('A')));
  EXPECT_EQ(NextNumberMetaName(Site('A')), "next/" + GuidText(Site('A')));
  EXPECT_EQ(CommitMetaName(Site('A'), 255), "commit/" + GuidText(Site('A')) + "/00000000000000ff");
  EXPECT_EQ(ObjectMetaName(OID(18)), "object/0000000000000012");
  EXPECT_EQ(ReplayMetaPrefix(ScriptedSource(Field(3, 4))), "replay/3:4/");
  EXPECT_EQ(ReplayMetaPrefix(ScriptedSource()), "replay/git/");
}

TEST(ReplayTest, BatchesDoNotMatterToTheMaps) {
  ScriptedSource source = ScriptedSource::Random(TestSeed(6'010), 300, 3, 40);
  const auto whole = CSpace::Open("memory:");
  Replay(*whole, source, {});
  EXPECT_EQ(CheckReplay(*whole, source), std::nullopt);
  Snapshot snapshot(*whole);
  EXPECT_TRUE(HasHistory(snapshot));
  for (const HistoryFinding& finding : VerifyHistory(snapshot)) ADD_FAILURE() << finding.fault;
  for (const std::uint64_t batch : {1u, 13u, 299u}) {
    const auto space = CSpace::Open("memory:");
    ReplayOptions options;
    options.batchEdits = batch;
    Replay(*space, source, options);
    EXPECT_EQ(CommittedBytes(*space), CommittedBytes(*whole));
    EXPECT_EQ(MetaOf(*space), MetaOf(*whole));
  }
}

TEST(ReplayTest, TwoRecordingsOfOneAuthorShareItsNumbers) {
  const auto space = CSpace::Open("memory:");
  ScriptedSource first = ScriptedSource::RandomRecording(3, 50, Field(1));
  ScriptedSource second = ScriptedSource::RandomRecording(4, 50, Field(2));
  Replay(*space, first, {});
  const std::string next = MetaOf(*space)[NextNumberMetaName(Site('A'))];
  Replay(*space, second, {});
  EXPECT_EQ(MetaOf(*space)["replay/2:0/start/" + GuidText(Site('A'))], next);
  EXPECT_EQ(CheckReplay(*space, first), std::nullopt);
  EXPECT_EQ(CheckReplay(*space, second), std::nullopt);
  Snapshot snapshot(*space);
  EXPECT_TRUE(VerifyHistory(snapshot).empty());
}

TEST(ReplayTest, AnEmptySourceLeavesThreeEmptyMaps) {
  const auto space = CSpace::Open("memory:");
  ScriptedSource source(Field(1));
  const ReplayReport report = Replay(*space, source, {});
  EXPECT_EQ(report.edits, 0u);
  EXPECT_TRUE(CommittedBytes(*space).empty());
  EXPECT_EQ(CheckReplay(*space, source), std::nullopt);
}

// --- What is refused ---

TEST(ReplayTest, IntoAFieldThatExistsIsRefused) {
  const auto space = CSpace::Open("memory:");
  ScriptedSource source = ScriptedSource::RandomRecording(5, 10, Field(1));
  Replay(*space, source, {});
  const PayloadBytes before = CommittedBytes(*space);
  const std::uint64_t commits = CommitsOf(*space);
  EXPECT_EQ(UsageErrorOf([&] { Replay(*space, source, {}); }),
            "memory:: field 1:0 exists already; go on with --resume, or replay into a new space");
  EXPECT_EQ(CommittedBytes(*space), before);
  EXPECT_EQ(CommitsOf(*space), commits);
}

TEST(ReplayTest, IntoAFieldThatNoReplayMadeIsRefusedAlsoForResuming) {
  RecordingSpace recorded;
  recorded.recorder().Insert(Site('A'), Field(1), 0, 1);
  recorded.Commit();
  ScriptedSource source = ScriptedSource::RandomRecording(5, 10, Field(1));
  ScriptedSource repository = ScriptedSource::Random(5, 10, 1, 1);
  ReplayOptions resume;
  resume.resume = true;
  const std::unique_ptr<CSpace> space = recorded.Release();
  const PayloadBytes before = CommittedBytes(*space);
  for (const ReplayOptions& options : {ReplayOptions(), resume}) {
    EXPECT_EQ(UsageErrorOf([&] { Replay(*space, source, options); }),
              "memory:: field 1:0 exists already; go on with --resume, or replay into a new space");
    EXPECT_EQ(UsageErrorOf([&] { Replay(*space, repository, options); }),
              "memory:: it holds fields already, and a repository wants a space of its own; go on with "
              "--resume, or "
              "replay into a new space");
  }
  EXPECT_EQ(CommittedBytes(*space), before);
}

TEST(ReplayTest, AnotherFieldBesideThoseThatExistIsFine) {
  const auto space = CSpace::Open("memory:");
  ScriptedSource first = ScriptedSource::RandomRecording(5, 10, Field(1));
  ScriptedSource second = ScriptedSource::RandomRecording(5, 10, Field(1, 1));
  Replay(*space, first, {});
  EXPECT_NO_THROW(Replay(*space, second, {}));
}

TEST(ReplayTest, AnEditOutsideItsFieldEndsTheReplayBehindTheBatchesBefore) {
  const auto space = CSpace::Open("memory:");
  ScriptedSource source(Field(1));
  source.Insert('A', Field(1), 0, "ab").Insert('A', Field(1), 2, "c").Insert('A', Field(1), 1, "d");
  source.Insert('A', Field(1), 9, "e");
  ReplayOptions options;
  options.batchEdits = 2;
  EXPECT_EQ(UsageErrorOf([&] { Replay(*space, source, options); }),
            "field 1:0: live position 9 is out of range; the field has 4 live elements");
  EXPECT_EQ(MetaOf(*space)["replay/1:0/edits"], "2");
  ScriptedSource twoEdits(Field(1));
  twoEdits.Insert('A', Field(1), 0, "ab").Insert('A', Field(1), 2, "c");
  EXPECT_EQ(CheckReplay(*space, twoEdits), std::nullopt);
}

// --- Resuming ---

struct Stopped : std::runtime_error {
  Stopped() : std::runtime_error("the script stops") {}
};

class ResumeTest : public ::testing::Test {
 protected:
  // A space in which the replay of `source` was interrupted at that edit.
  static std::unique_ptr<CSpace> Interrupted(ScriptedSource source, std::uint64_t atEdit,
                                             std::uint64_t batch) {
    auto space = CSpace::Open("memory:");
    source.beforeEdit = [atEdit](std::uint64_t index) {
      if (index == atEdit) throw Stopped();
    };
    ReplayOptions options;
    options.batchEdits = batch;
    EXPECT_THROW(Replay(*space, source, options), Stopped);
    return space;
  }

  static ReplayReport Resume(CSpace& space, ScriptedSource& source, std::uint64_t batch = 10'000) {
    ReplayOptions options;
    options.batchEdits = batch;
    options.resume = true;
    return Replay(space, source, options);
  }

  static std::string RefusedResume(CSpace& space, ScriptedSource& source) {
    const PayloadBytes before = CommittedBytes(space);
    const auto meta = MetaOf(space);
    const std::string refusal = UsageErrorOf([&] { Resume(space, source); });
    EXPECT_EQ(CommittedBytes(space), before);
    EXPECT_EQ(MetaOf(space), meta);
    return refusal;
  }
};

TEST_F(ResumeTest, AfterAnyNumberOfBatchesEndsAsOneRun) {
  constexpr std::uint64_t kEdits = 60;
  constexpr std::uint64_t kBatch = 7;
  const std::uint64_t seed = TestSeed(6'011);
  for (const bool recording : {false, true}) {
    ScriptedSource source = recording ? ScriptedSource::RandomRecording(seed, kEdits, Field(4))
                                      : ScriptedSource::Random(seed, kEdits, 3, 5);
    const auto whole = CSpace::Open("memory:");
    Replay(*whole, source, {});
    for (std::uint64_t stop = 0; stop < kEdits; ++stop) {
      SCOPED_TRACE("stopped at edit " + std::to_string(stop));
      const auto space = Interrupted(source, stop, kBatch);
      const std::string edits = MetaOf(*space)[ReplayMetaPrefix(source) + "edits"];
      EXPECT_EQ(edits, stop < kBatch ? "" : std::to_string(stop / kBatch * kBatch));
      const ReplayReport report = Resume(*space, source, 11);
      EXPECT_EQ(report.edits, kEdits);
      EXPECT_EQ(report.editsApplied, kEdits - stop / kBatch * kBatch);
      EXPECT_EQ(CommittedBytes(*space), CommittedBytes(*whole));
      EXPECT_EQ(MetaOf(*space), MetaOf(*whole));
    }
  }
}

TEST_F(ResumeTest, CanBeInterruptedAgainAndAgain) {
  ScriptedSource source = ScriptedSource::Random(TestSeed(6'012), 60, 3, 5);
  const auto whole = CSpace::Open("memory:");
  Replay(*whole, source, {});
  const auto space = Interrupted(source, 13, 5);
  for (const std::uint64_t stop : {25u, 26u, 44u, 59u}) {
    ScriptedSource stopping = source;
    stopping.beforeEdit = [stop](std::uint64_t index) {
      if (index == stop) throw Stopped();
    };
    EXPECT_THROW(Resume(*space, stopping, 5), Stopped);
  }
  Resume(*space, source);
  EXPECT_EQ(CommittedBytes(*space), CommittedBytes(*whole));
  EXPECT_EQ(MetaOf(*space), MetaOf(*whole));
}

TEST_F(ResumeTest, OfACompleteReplayAppliesNothing) {
  ScriptedSource source = ScriptedSource::Random(9, 30, 2, 3);
  const auto space = CSpace::Open("memory:");
  Replay(*space, source, {});
  const PayloadBytes before = CommittedBytes(*space);
  EXPECT_EQ(Resume(*space, source).editsApplied, 0u);
  EXPECT_EQ(CommittedBytes(*space), before);
}

TEST_F(ResumeTest, OfNothingBeginsAtTheFirstEdit) {
  ScriptedSource source = ScriptedSource::Random(9, 30, 2, 3);
  const auto space = CSpace::Open("memory:");
  EXPECT_EQ(Resume(*space, source).editsApplied, 30u);
  EXPECT_EQ(CheckReplay(*space, source), std::nullopt);
}

TEST_F(ResumeTest, AddsWhatASourceHasGrownBy) {
  ScriptedSource source = ScriptedSource::RandomRecording(10, 30, Field(1));
  const auto space = CSpace::Open("memory:");
  Replay(*space, source, {});
  source.Insert('A', Field(1), 0, "more").Insert('B', Field(1), 2, "of another author");
  EXPECT_EQ(Resume(*space, source).editsApplied, 2u);
  EXPECT_EQ(CheckReplay(*space, source), std::nullopt);
}

TEST_F(ResumeTest, OfAnotherSourceIsRefused) {
  ScriptedSource source(Field(1));
  source.Insert('A', Field(1), 0, "one").Insert('A', Field(1), 3, "two").Insert('A', Field(1), 6, "three");
  const auto space = Interrupted(source, 2, 2);
  const std::string refusal =
      "memory:: the script is not what was replayed before: its first 2 edits are others";
  ScriptedSource otherText(Field(1));
  otherText.Insert('A', Field(1), 0, "one").Insert('A', Field(1), 3, "tvo").Insert('A', Field(1), 6, "three");
  EXPECT_EQ(RefusedResume(*space, otherText), refusal);
  ScriptedSource otherPosition(Field(1));
  otherPosition.Insert('A', Field(1), 0, "one").Insert('A', Field(1), 2, "two");
  EXPECT_EQ(RefusedResume(*space, otherPosition), refusal) << "it ends where the recorded edits end";
  ScriptedSource otherSite(Field(1));
  otherSite.Insert('B', Field(1), 0, "one").Insert('B', Field(1), 3, "two").Insert('B', Field(1), 6, "three");
  EXPECT_EQ(RefusedResume(*space, otherSite), refusal);
  EXPECT_EQ(Resume(*space, source).editsApplied, 1u) << "refusals leave it as it was";
}

TEST_F(ResumeTest, OfAShorterSourceIsRefused) {
  ScriptedSource source(Field(1));
  source.Insert('A', Field(1), 0, "one").Insert('A', Field(1), 3, "two").Insert('A', Field(1), 6, "three");
  const auto space = Interrupted(source, 2, 2);
  ScriptedSource shorter(Field(1));
  shorter.Insert('A', Field(1), 0, "one");
  EXPECT_EQ(RefusedResume(*space, shorter),
            "memory:: the script is not what was replayed before: it has 1 edits, fewer than are recorded");
}

TEST_F(ResumeTest, IsRefusedOnceTheSiteHasRecordedOtherOperations) {
  ScriptedSource source = ScriptedSource::RandomRecording(10, 30, Field(1));
  const auto space = Interrupted(source, 20, 10);
  ScriptedSource other = ScriptedSource::RandomRecording(11, 5, Field(2));
  Replay(*space, other, {});
  EXPECT_EQ(RefusedResume(*space, source),
            "memory:: site " + GuidText(Site('A')) +
                " has recorded other operations since this replay stopped, so it cannot be resumed");
}

TEST_F(ResumeTest, IsRefusedWhereTheLastEditAppliedIsNoNumber) {
  ScriptedSource source = ScriptedSource::RandomRecording(10, 30, Field(1));
  const auto space = Interrupted(source, 20, 10);
  {
    WriteTransaction transaction(*space);
    transaction.SetMeta("replay/1:0/edits", "1o");
    transaction.Commit();
  }
  EXPECT_EQ(RefusedResume(*space, source), "meta value \"replay/1:0/edits\" should be a number, not \"1o\"");
}

}  // namespace
}  // namespace vemo::test
