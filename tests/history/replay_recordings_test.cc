// The recorded sessions in a space on disk, where they are at hand: next to the source folder or in
// VEMO_DATA_DIR.
#include <gtest/gtest.h>

#include <filesystem>

#include "history/source_error.h"
#include "history/verify_history.h"
#include "recorded_fields.h"
#include "recordings.h"
#include "tests/support/temp_folder.h"

namespace vemo::test {
namespace {

struct Counts {
  const char* name;
  ssize_t length;
  ssize_t insertedRuns;
  ssize_t tombstoneRuns;
};

class ReplayRecordingsTest : public ::testing::TestWithParam<Counts> {};

TEST_P(ReplayRecordingsTest, EndWithTheirContentAndSoManyRuns) {
  const std::filesystem::path file = DataFolder() / GetParam().name;
  if (!std::filesystem::exists(file))
    GTEST_SKIP() << file << " is not there; VEMO_DATA_DIR can name its folder";
  const TempFolder folder;
  const std::string uri = "lmdb:" + (folder.path() / "space").string();
  const auto source = OpenTrace(file, Field(1), "writer");
  auto space = CSpace::Open(uri, {.create = true});
  ReplayOptions options;
  options.batchEdits = 50'000;
  EXPECT_EQ(Replay(*space, *source, options).elementsInserted, static_cast<std::uint64_t>(GetParam().length));
  space.reset();
  space = CSpace::Open(uri);
  EXPECT_EQ(CheckReplay(*space, *source), std::nullopt);
  Snapshot snapshot(*space);
  const VectorInsertions& insertions =
      *snapshot.Root<FieldIdToVectorInsertionsMap>(kInsertionsRoot).rFind(Field(1));
  EXPECT_EQ(insertions.m_u2, GetParam().length);
  EXPECT_EQ(insertions.m_c.size(), GetParam().insertedRuns);
  const VectorTombstones& tombstones =
      *snapshot.Root<FieldIdToVectorTombstonesMap>(kTombstonesRoot).rFind(Field(1));
  EXPECT_EQ(tombstones.m_tombstones.size(), GetParam().tombstoneRuns);
  for (const HistoryFinding& finding : VerifyHistory(snapshot)) ADD_FAILURE() << finding.fault;
}

INSTANTIATE_TEST_SUITE_P(Sequential, ReplayRecordingsTest,
                         ::testing::Values(Counts{"automerge-paper.json.gz", 182'315, 10'824, 1'769},
                                           Counts{"sveltecomponent.json.gz", 93'984, 5'748, 152},
                                           Counts{"json-crdt-blog-post.json.gz", 41'470, 2'435, 293}),
                         [](const auto& tested) {
                           std::string name = tested.param.name;
                           name.resize(name.find('.'));
                           std::erase(name, '-');
                           return name;
                         });

TEST(ConcurrentRecordingsTest, AreRefused) {
  const std::filesystem::path file = DataFolder() / "friendsforever.json.gz";
  if (!std::filesystem::exists(file))
    GTEST_SKIP() << file << " is not there; VEMO_DATA_DIR can name its folder";
  EXPECT_THROW(OpenTrace(file, Field(1), "writer"), SourceError);
}

}  // namespace
}  // namespace vemo::test
