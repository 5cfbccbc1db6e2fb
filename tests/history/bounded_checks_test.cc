// What looks at the maps of a replay stays within the budget of its space.
#include <gtest/gtest.h>

#include <algorithm>

#include "history/recorded_maps.h"
#include "history/verify_history.h"
#include "recorded_fields.h"
#include "scripted_source.h"

namespace vemo::test {
namespace {

constexpr std::uint64_t kCacheBytes = 100'000;
constexpr std::uint64_t kFields = 10'000;
// A snapshot's half of the budget, and a leaf with its way from the root and its neighbour in each of the three maps.
constexpr std::uint64_t kMostBytes = kCacheBytes / 2 + 3 * 4 * 20'000;

// Of many fields, with a look at what is in memory whenever it is asked for the next.
class WatchingSource : public ScriptedSource {
 public:
  WatchingSource() {
    for (std::uint64_t object = 1; object <= kFields; ++object) Insert('A', Field(object), 0, "ab").Delete('A', Field(object), 0, 1);
  }
  void ForEachFinalContent(const std::function<void(const FinalContent&)>& visit) override {
    ScriptedSource::ForEachFinalContent([&](const FinalContent& content) {
      visit(content);
      if (look) look();
    });
  }
  std::function<void()> look;
};

class BoundedChecksTest : public ::testing::Test {
 protected:
  BoundedChecksTest() : m_space(CSpace::Open("memory:", {.cacheBytes = kCacheBytes})) {
    ReplayOptions options;
    options.batchEdits = 500;
    Replay(*m_space, m_source, options);
    Snapshot whole(*m_space);
    m_mapBytes = CommittedNodeBytes(whole);
  }

  // What the nodes of the three maps take when all of them are loaded.
  std::uint64_t CommittedNodeBytes(Snapshot& snapshot) {
    const std::uint64_t before = ResidentBytes();
    for (const auto& entry : snapshot.Root<FieldIdToVectorInsertionsMap>(kInsertionsRoot)) static_cast<void>(entry);
    for (const auto& entry : snapshot.Root<FieldIdToVectorTombstonesMap>(kTombstonesRoot)) static_cast<void>(entry);
    for (const auto& entry : snapshot.Root<FieldIdToVectorInsertionsAndDeletionsMap>(kHistoryRoot)) static_cast<void>(entry);
    return ResidentBytes() - before;
  }
  std::uint64_t ResidentBytes() { return m_space->CacheStatistics().residentBytes; }

  WatchingSource m_source;
  std::unique_ptr<CSpace> m_space;
  std::uint64_t m_mapBytes = 0;
};

TEST_F(BoundedChecksTest, ComparingTheMapsOfARecorder) {
  ASSERT_GT(m_mapBytes, 10 * kMostBytes);
  Snapshot snapshot(*m_space);
  EXPECT_TRUE(VerifyHistory(snapshot).empty());
  EXPECT_LT(ResidentBytes(), kMostBytes);
}

TEST_F(BoundedChecksTest, MeasuringTheMapsOfARecorder) {
  Snapshot snapshot(*m_space);
  const std::vector<RecordedMap> maps = MeasureRecordedMaps(snapshot);
  EXPECT_LT(ResidentBytes(), kMostBytes);
  ASSERT_EQ(maps.size(), 3u);
  EXPECT_EQ(maps[0].root, kInsertionsRoot);
  EXPECT_EQ(maps[1].root, kTombstonesRoot);
  EXPECT_EQ(maps[2].root, kHistoryRoot);
  for (const RecordedMap& map : maps) {
    EXPECT_EQ(map.fields, kFields);
    EXPECT_EQ(map.height, 2);
  }
  EXPECT_EQ(maps[0].runs, kFields);
  EXPECT_EQ(maps[1].runs, kFields);
  EXPECT_EQ(maps[2].runs, 2 * kFields);
  EXPECT_EQ(maps[0].nodes, static_cast<std::uint64_t>(snapshot.Root<FieldIdToVectorInsertionsMap>(kInsertionsRoot).GetNumNodes()));
}

TEST_F(BoundedChecksTest, ComparingAReplayWithItsSource) {
  std::uint64_t most = 0;
  m_source.look = [&] { most = std::max(most, ResidentBytes()); };
  EXPECT_EQ(CheckReplay(*m_space, m_source), std::nullopt);
  EXPECT_GT(most, 0u);
  EXPECT_LT(most, kMostBytes);
}

}  // namespace
}  // namespace vemo::test
