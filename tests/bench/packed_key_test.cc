#include <gtest/gtest.h>

#include <algorithm>
#include <set>

#include "bench/common/entries.h"
#include "bench/stores/bytes_peer.h"
#include "vxUtils/ByteForms.h"

namespace vemo::bench {
namespace {

// Peers that compare bytes must keep the keys in the order of the maps.
TEST(PackedKey, HasTheOrderOfTheKeysByteForByte) {
  for (const KeyKind kind : {KeyKind::kClustered, KeyKind::kRandom}) {
    std::vector<FieldId> keys = MakeKeys(kind, 2'000);
    const std::vector<FieldId> missing = MakeMissingKeys(kind, 2'000);
    keys.insert(keys.end(), missing.begin(), missing.end());
    keys.push_back({OID(5), Path{}});
    keys.push_back({OID(5), Path{1, 0}});
    keys.push_back({OID(5), Path{200}});
    keys.push_back({OID(5), Path{70'000}});
    std::sort(keys.begin(), keys.end());
    for (std::size_t i = 1; i < keys.size(); ++i) {
      EXPECT_LT(PackedKey(keys[i - 1]).view(), PackedKey(keys[i]).view())
          << FieldIdText(keys[i - 1]) << " and " << FieldIdText(keys[i]);
    }
  }
}

TEST(Entries, KeysDifferAndMissingOnesAreNotAmongThem) {
  for (const KeyKind kind : {KeyKind::kClustered, KeyKind::kRandom, KeyKind::kAscending}) {
    const std::vector<FieldId> keys = MakeKeys(kind, 5'000);
    const std::set<FieldId> set(keys.begin(), keys.end());
    EXPECT_EQ(set.size(), keys.size());
    for (const FieldId& key : MakeMissingKeys(kind, 5'000)) EXPECT_EQ(set.count(key), 0U) << FieldIdText(key);
  }
  const std::vector<FieldId> ascending = MakeKeys(KeyKind::kAscending, 5'000);
  EXPECT_TRUE(std::is_sorted(ascending.begin(), ascending.end()));
}

// Peers read payloads as bytes and the maps as objects: both must arrive at the same number.
template <class Payload>
void ExpectReadTheSame(StorePayload payload) {
  const PayloadPool<Payload> pool;
  for (std::size_t i = 0; i < PayloadPool<Payload>::kCount; ++i) {
    const Bytes bytes = ToBytes(pool[i]);
    ASSERT_EQ(ReadPayloadBytes(payload, bytes.data()), PayloadKind<Payload>::Read(pool[i])) << i;
    ASSERT_EQ(PayloadKind<Payload>::Touch(pool[i]), PayloadKind<Payload>::kTouched) << i;
  }
}

TEST(Payloads, ReadTheSameFromTheirBytes) {
  ExpectReadTheSame<VectorTombstones>(StorePayload::kTombstones);
  ExpectReadTheSame<VectorInsertions>(StorePayload::kInsertions);
}

}  // namespace
}  // namespace vemo::bench
