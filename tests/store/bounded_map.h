// A map that takes a hundred times the memory that its space may use.
#pragma once

#include <random>

#include "store/scope.h"
#include "tests/store/store_fixture.h"

namespace vemo::test {

inline constexpr std::uint64_t kCacheBytes = 100'000;
inline constexpr std::uint64_t kKeysOfLargeMap = 100'000;  // in ascending order: nodes are half full
// A path from the root with the neighbours that a deletion looks at: what one operation may load on top of the budget.
inline constexpr std::uint64_t kOperationBytes = 12 * 10'000;

class BoundedTest : public testing::TestWithParam<EngineKind> {
 protected:
  BoundedTest() : site(GetParam()) {}

  CSpace& space() { return site.space(); }
  std::uint64_t ResidentBytes() { return space().CacheStatistics().residentBytes; }
  void OpenBounded(std::uint64_t seed = 1) {
    site.Close();
    site.Open({.create = true, .cacheBytes = kCacheBytes, .cacheSeed = seed});
  }

  // Commits root "t" with the keys of the large map, and opens the space with the budget.
  void MakeLargeMap() {
    CommitFilled<TombstonesMap>(space(), "t", kKeysOfLargeMap);
    ASSERT_GT(ResidentBytes(), 100 * kCacheBytes);
    OpenBounded();
  }

  SpaceSite site;
};

#define INSTANTIATE_BOUNDED_TEST(fixture)                                                             \
  INSTANTIATE_TEST_SUITE_P(Engines, fixture, testing::Values(EngineKind::kMemory, EngineKind::kLmdb), \
                           EngineKindName)

inline std::uint64_t NumberUnder(const TombstonesMap& map, std::uint64_t n) {
  const VectorTombstones* payload = map.rFind(Key(n));
  return payload == nullptr ? 0 : PayloadNumber<VectorTombstones>::Number(*payload);
}

}  // namespace vemo::test
