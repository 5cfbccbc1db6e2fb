#include "store/id_set.h"

#include <gtest/gtest.h>

#include <limits>
#include <random>
#include <unordered_set>

#include "tests/support/seed.h"

namespace vemo::test {
namespace {

TEST(IdSet, InsertSaysWhetherTheIdWasNew) {
  IdSet ids;
  EXPECT_TRUE(ids.empty());
  EXPECT_TRUE(ids.Insert(OID(7)));
  EXPECT_FALSE(ids.Insert(OID(7)));
  EXPECT_TRUE(ids.Insert(OID(8)));
  EXPECT_EQ(ids.size(), 2u);
}

TEST(IdSet, NeighboursAcrossWordsAndChunksAreToldApart) {
  IdSet ids;
  for (const std::uint64_t edge : {std::uint64_t{64}, IdSet::kIdsPerChunk, 3 * IdSet::kIdsPerChunk}) {
    EXPECT_TRUE(ids.Insert(OID(edge)));
    EXPECT_FALSE(ids.Contains(OID(edge - 1)));
    EXPECT_FALSE(ids.Contains(OID(edge + 1)));
  }
  EXPECT_FALSE(ids.Contains(OID(64 + IdSet::kIdsPerChunk)));
}

TEST(IdSet, EraseGivesAnEmptyChunkBack) {
  IdSet ids;
  ids.Insert(OID(1));
  ids.Insert(OID(1 + IdSet::kIdsPerChunk));
  const std::size_t two = ids.MemoryBytes();
  EXPECT_TRUE(ids.Erase(OID(1)));
  EXPECT_FALSE(ids.Erase(OID(1)));
  EXPECT_FALSE(ids.Erase(OID(2)));
  EXPECT_LT(ids.MemoryBytes(), two);
  EXPECT_FALSE(ids.Contains(OID(1)));
  EXPECT_TRUE(ids.Contains(OID(1 + IdSet::kIdsPerChunk)));
  EXPECT_EQ(ids.size(), 1u);
}

TEST(IdSet, ClearAndSwapTakeEverything) {
  IdSet ids, others;
  ids.Insert(OID(5));
  ids.swap(others);
  EXPECT_TRUE(ids.empty());
  EXPECT_TRUE(others.Contains(OID(5)));
  others.clear();
  EXPECT_TRUE(others.empty());
  EXPECT_FALSE(others.Contains(OID(5)));
}

TEST(IdSet, AMillionIdsInSequenceTakeAboutABitEach) {
  IdSet ids;
  for (std::uint64_t n = 1; n <= 1'000'000; ++n) ids.Insert(OID(n));
  EXPECT_EQ(ids.size(), 1'000'000u);
  EXPECT_LT(ids.MemoryBytes(), 150'000u);
}

TEST(IdSet, AnIdFarOffCostsOneChunk) {
  IdSet ids;
  ids.Insert(OID(1));
  EXPECT_TRUE(ids.Insert(OID(std::numeric_limits<std::uint64_t>::max())));
  EXPECT_TRUE(ids.Contains(OID(std::numeric_limits<std::uint64_t>::max())));
  EXPECT_LT(ids.MemoryBytes(), 4'000u);
}

TEST(IdSet, AgreesWithASetOfTheStandardLibrary) {
  std::mt19937_64 random(TestSeed(21));
  IdSet ids;
  std::unordered_set<OID> model;
  for (int i = 0; i < 50'000; ++i) {
    const OID oid(random() % 2 == 0 ? random() % 20'000 : (random() % 20'000) << 40);
    if (random() % 3 == 0) {
      ASSERT_EQ(ids.Erase(oid), model.erase(oid) == 1) << oid.m_value;
    } else {
      ASSERT_EQ(ids.Insert(oid), model.insert(oid).second) << oid.m_value;
    }
    ASSERT_EQ(ids.size(), model.size());
  }
  for (std::uint64_t n = 0; n < 20'000; ++n) {
    ASSERT_EQ(ids.Contains(OID(n)), model.contains(OID(n))) << n;
    ASSERT_EQ(ids.Contains(OID(n << 40)), model.contains(OID(n << 40))) << n;
  }
}

}  // namespace
}  // namespace vemo::test
