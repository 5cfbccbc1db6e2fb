#include "bench/replay/replay_job.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <stdexcept>

#include "bench/replay/generated_repository.h"
#include "bench/replay/held_source.h"
#include "tests/support/temp_folder.h"

namespace vemo::bench {
namespace {

constexpr char kSession[] = VEMO_SOURCE_DIR "/examples/session.json";

std::unique_ptr<EditSource> OpenSession() {
  return OpenTrace(kSession, FieldId{OID(1), Path{0}}, "author");
}

// Everything that a visitor is told, as text.
class Transcript : public EditVisitor {
 public:
  void OnSite(const Guid& site, std::string_view author) override {
    text += "site " + GuidText(site) + std::string(author) + "\n";
  }
  void OnObject(OID object, std::string_view path) override {
    text += "object " + std::to_string(object.m_value) + std::string(path) + "\n";
  }
  void OnCommit(const Commit& commit) override {
    text += "commit " + std::string(commit.id) + std::string(commit.author) + GuidText(commit.site) + "\n";
  }
  void OnEdit(const Edit& edit) override {
    text += FieldIdText(edit.field) + GuidText(edit.site) + " " + std::to_string(edit.position) + " " +
            std::to_string(edit.deleted);
    for (const std::string_view element : edit.inserted) text += "+" + std::string(element);
    text += "\n";
  }

  std::string text;
};

std::string TranscriptOf(EditSource& source) {
  Transcript transcript;
  source.Replay(transcript);
  return transcript.text;
}

TEST(HeldSource, RepeatsAWholeSource) {
  const test::TempFolder folder;
  MakeRepository(folder.path() / "repository", 30);
  for (const std::unique_ptr<EditSource>& source :
       {OpenSession(), OpenGitHistory(folder.path() / "repository")}) {
    HeldSource held(*source, source->CountEdits());
    EXPECT_EQ(TranscriptOf(held), TranscriptOf(*source)) << source->Describe();
    EXPECT_EQ(held.CountEdits(), source->CountEdits());
  }
}

TEST(HeldSource, StopsAfterTheEditsAskedForAndRefusesMoreThanThereAre) {
  HeldSource held(*OpenSession(), 5);
  EXPECT_EQ(held.CountEdits(), 5U);
  const std::string whole = TranscriptOf(*OpenSession());
  const std::string part = TranscriptOf(held);
  EXPECT_EQ(whole.substr(0, part.size()), part);
  EXPECT_THROW(HeldSource(*OpenSession(), 1'000'000), std::runtime_error);
}

TEST(GeneratedRepository, IsTheSameEachTimeAndHasADozenEditsACommit) {
  const test::TempFolder folder;
  MakeRepository(folder.path() / "one", 40);
  MakeRepository(folder.path() / "two", 40);
  const auto one = OpenGitHistory(folder.path() / "one");
  const auto two = OpenGitHistory(folder.path() / "two");
  EXPECT_EQ(TranscriptOf(*one), TranscriptOf(*two));
  EXPECT_GE(one->CountEdits(), 400U);
}

TEST(ReplayJob, ReportsEachRowOnceAndTheSameEditsOnDiskAndInMemory) {
  const test::TempFolder folder;
  HeldSource held(*OpenSession(), 5);
  std::vector<std::string> reported;
  for (const Measurement& measurement : RunReplays(held, folder.path())) {
    reported.push_back(measurement.row);
    EXPECT_GT(measurement.answers, 0U) << measurement.row;
    EXPECT_TRUE(measurement.unit != "ns/edit" || measurement.value > 0) << measurement.row;
  }
  std::vector<std::string> announced = ReplayOperations();
  EXPECT_TRUE(std::is_permutation(reported.begin(), reported.end(), announced.begin(), announced.end()));
}

}  // namespace
}  // namespace vemo::bench
