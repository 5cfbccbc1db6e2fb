// Every store that is installed goes through its whole life, and all of them answer the same.
#include "bench/stores/store_job.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <map>

#include "tests/support/temp_folder.h"

namespace vemo::bench {
namespace {

constexpr std::size_t kSize = 300;

std::vector<Measurement> RunJob(const StoreKind& kind, KeyKind keys, StorePayload payload) {
  const test::TempFolder folder;
  return StoreJob(kind, keys, payload, kSize, folder.path()).Run();
}

void ExpectSameAnswers(const std::vector<StoreKind>& kinds, KeyKind keys, StorePayload payload) {
  std::map<std::string, std::uint64_t> answers;
  for (const StoreKind& kind : kinds) {
    SCOPED_TRACE(kind.peer);
    std::vector<std::string> reported;
    for (const Measurement& measurement : RunJob(kind, keys, payload)) {
      reported.push_back(measurement.row);
      const auto [known, isFirst] = answers.emplace(measurement.row, measurement.answers);
      EXPECT_EQ(known->second, measurement.answers) << measurement.row;
      EXPECT_NE(measurement.answers, 0U) << measurement.row;
    }
    std::vector<std::string> announced = StoreJob::Operations(kind);
    std::sort(reported.begin(), reported.end());
    std::sort(announced.begin(), announced.end());
    EXPECT_EQ(reported, announced);
  }
}

TEST(StoreJob, AllPeersAnswerTheSame) {
  ExpectSameAnswers(AllStoreKinds(), KeyKind::kClustered, StorePayload::kTombstones);
}

TEST(StoreJob, VemoAndItsEngineAnswerTheSameForInsertionsUnderRandomKeys) {
  ExpectSameAnswers({VemoStore(), LmdbStore()}, KeyKind::kRandom, StorePayload::kInsertions);
}

TEST(StoreJob, VemoAndItsEngineAreMeasuredAlways) {
  const std::vector<StoreKind> kinds = AllStoreKinds();
  ASSERT_GE(kinds.size(), 3U);
  EXPECT_EQ(kinds.front().peer, "vemo");
  EXPECT_TRUE(
      std::any_of(kinds.begin(), kinds.end(), [](const StoreKind& kind) { return kind.peer == "LMDB"; }));
}

}  // namespace
}  // namespace vemo::bench
