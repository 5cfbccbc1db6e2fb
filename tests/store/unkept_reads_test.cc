// Scans and look-ups that read what is not in memory without keeping it.
#include <chrono>
#include <optional>
#include <stdexcept>
#include <thread>

#include "store/peek.h"
#include "store/scan.h"
#include "tests/store/bounded_map.h"

namespace vemo::test {
namespace {

using UnkeptReads = StoreTest;
INSTANTIATE_STORE_TEST(UnkeptReads);

constexpr std::uint64_t kCount = 3'000;  // of keys, in some sixty leaves below one internal node

// Commits the even ones of the keys 2 .. 2 * kCount.
template <class Map>
void CommitEven(CSpace& space) {
  WriteTransaction transaction(space);
  auto& map = transaction.Root<Map>("m");
  for (std::uint64_t n = 2; n <= 2 * kCount; n += 2) map.Insert(n % 3 == 0 ? LongKey(n) : Key(n), PayloadOf<Map>(n), true);
  transaction.Commit();
}

template <class Payload>
std::optional<std::uint64_t> NumberIn(const std::optional<Payload>& payload) {
  return payload ? std::optional(PayloadNumber<Payload>::Number(*payload)) : std::nullopt;
}

template <class Map, class Owner>
void ExpectPeeksOfEven(Owner& owner, const Map& map) {
  for (std::uint64_t n = 1; n <= 2 * kCount + 1; ++n) {
    const bool isThere = n % 2 == 0 && n <= 2 * kCount;
    const bool isLong = n % 3 == 0;
    ASSERT_EQ(NumberIn(PeekMap(owner, map, Key(n))), isThere && !isLong ? std::optional(n) : std::nullopt) << n;
    ASSERT_EQ(NumberIn(PeekMap(owner, map, LongKey(n))), isThere && isLong ? std::optional(n) : std::nullopt) << n;
  }
}

template <class Map, class Owner>
std::vector<std::uint64_t> ScannedFrom(Owner& owner, const Map& map, const FieldId& from) {
  std::vector<std::uint64_t> numbers;
  EXPECT_TRUE(ScanMap(owner, map, from, [&numbers](const FieldId& key, const auto& payload) {
    EXPECT_EQ(NumberOf(key), PayloadNumber<typename Map::Payload>::Number(payload));
    numbers.push_back(NumberOf(key));
    return true;
  }));
  return numbers;
}

template <class Map>
void CheckPeeksAndScans(CSpace& space) {
  CommitEven<Map>(space);
  Snapshot snapshot(space);
  const Map& map = snapshot.Root<Map>("m");
  ExpectPeeksOfEven(snapshot, map);
  std::vector<std::uint64_t> all;
  for (std::uint64_t n = 2; n <= 2 * kCount; n += 2) all.push_back(n);
  EXPECT_EQ(ScannedFrom(snapshot, map, FieldId()), all);
  NumbersOf(map);  // loads everything, where there is room
  ExpectPeeksOfEven(snapshot, map);
  EXPECT_EQ(ScannedFrom(snapshot, map, FieldId()), all);
}

TEST_P(UnkeptReads, FindInsertionsAsTheyAre) { CheckPeeksAndScans<InsertionsMap>(space()); }
TEST_P(UnkeptReads, FindTombstonesAsTheyAre) { CheckPeeksAndScans<TombstonesMap>(space()); }
TEST_P(UnkeptReads, FindHistoriesAsTheyAre) { CheckPeeksAndScans<HistoriesMap>(space()); }

TEST_P(UnkeptReads, FindNothingInAnEmptyMap) {
  {
    WriteTransaction transaction(space());
    transaction.Root<TombstonesMap>("never filled");
    auto& map = transaction.Root<TombstonesMap>("emptied");
    map.Insert(Key(1), {}, false);
    map.Delete(Key(1));
    transaction.Commit();
  }
  Snapshot snapshot(space());
  for (const char* root : {"never filled", "emptied"}) {
    const auto& map = snapshot.Root<TombstonesMap>(root);
    EXPECT_FALSE(PeekMap(snapshot, map, Key(1)));
    EXPECT_TRUE(ScannedFrom(snapshot, map, FieldId()).empty());
  }
}

TEST_P(UnkeptReads, ScanFromAnyKeyOn) {
  CommitEven<TombstonesMap>(space());
  Snapshot snapshot(space());
  const auto& map = snapshot.Root<TombstonesMap>("m");
  const auto firstFrom = [&](const FieldId& from) {
    std::uint64_t first = 0;
    ScanMap(snapshot, map, from, [&first](const FieldId& key, const auto&) {
      first = NumberOf(key);
      return false;
    });
    return first;
  };
  const auto check = [&] {
    for (std::uint64_t n = 1; n <= 2 * kCount; ++n) {
      ASSERT_EQ(firstFrom(Key(n)), n + n % 2) << n;
      ASSERT_EQ(firstFrom(LongKey(n)), n % 6 == 0 ? n : n == 2 * kCount ? 0 : n + 2 - n % 2) << n;
    }
    EXPECT_EQ(firstFrom(Key(2 * kCount + 1)), 0u);
  };
  check();
  NumbersOf(map);
  check();
}

TEST_P(UnkeptReads, LoadTheInternalNodesAtMost) {
  CommitEven<TombstonesMap>(space());
  site.Reopen();
  Snapshot snapshot(space());
  const auto& map = snapshot.Root<TombstonesMap>("m");
  ASSERT_EQ(map.m_height, 1);
  ScannedFrom(snapshot, map, FieldId());
  EXPECT_EQ(space().CacheStatistics().loads, 1u);
  const std::uint64_t loads = Evicts(GetParam()) ? 2u : 1u;  // the scan has trimmed
  ExpectPeeksOfEven(snapshot, map);
  EXPECT_EQ(space().CacheStatistics().loads, loads);
  EXPECT_LT(space().CacheStatistics().residentBytes, 10'000u);
}

TEST_P(UnkeptReads, ShowWhatTheTransactionHasChangedWhetherOrNotTheRestIsInMemory) {
  CommitEven<TombstonesMap>(space());
  WriteTransaction transaction(space());
  auto& map = transaction.Root<TombstonesMap>("m");
  for (std::uint64_t n = 2; n <= 2 * kCount; n += 500) map.Delete(n % 3 == 0 ? LongKey(n) : Key(n));
  for (std::uint64_t n = 2; n <= 2 * kCount; n += 500) map.Insert(Key(n + 1), PayloadOf<TombstonesMap>(n + 1), true);
  std::vector<std::uint64_t> expected;
  for (std::uint64_t n = 2; n <= 2 * kCount; n += 2) expected.push_back(n % 500 == 2 ? n + 1 : n);
  const auto check = [&] {
    EXPECT_EQ(ScannedFrom(transaction, std::as_const(map), FieldId()), expected);
    for (std::uint64_t n = 2; n <= 2 * kCount; n += 500) {
      EXPECT_FALSE(PeekMap(transaction, map, Key(n)));
      EXPECT_EQ(NumberIn(PeekMap(transaction, map, Key(n + 1))), n + 1);
    }
  };
  check();
  transaction.TrimTo(0);
  check();
}

TEST_P(UnkeptReads, OfAMapOnTheStack) {
  WriteTransaction transaction(space());
  TombstonesMap map;
  Fill(map, 1, 300);
  EXPECT_EQ(ScannedFrom(transaction, map, Key(100)).size(), 201u);
  EXPECT_EQ(NumberIn(PeekMap(transaction, map, Key(300))), 300u);
  EXPECT_FALSE(PeekMap(transaction, map, Key(301)));
  map.clear();
}

// With a budget of no bytes a scan trims.
using UnkeptReadsWithRoom = StoreTest;
INSTANTIATE_TEST_SUITE_P(Engines, UnkeptReadsWithRoom, testing::Values(EngineKind::kMemory, EngineKind::kLmdb), EngineKindName);

TEST_P(UnkeptReadsWithRoom, LeaveWhatIsInMemoryWhereItIs) {
  CommitFilled<TombstonesMap>(space(), "m", kCount);
  site.Reopen();
  Snapshot snapshot(space());
  const auto& map = snapshot.Root<TombstonesMap>("m");
  const VectorTombstones* const payload = map.rFind(Key(kCount / 2));
  const std::uint64_t loads = space().CacheStatistics().loads;
  EXPECT_EQ(ScannedFrom(snapshot, map, FieldId()).size(), kCount);
  EXPECT_EQ(NumberIn(PeekMap(snapshot, map, Key(1))), 1u);
  EXPECT_EQ(map.rFind(Key(kCount / 2)), payload);
  EXPECT_EQ(space().CacheStatistics().loads, loads);
}

TEST_P(UnkeptReads, AScanWhoseVisitorLooksThingsUpMeetsEachEntryOnce) {
  CommitEven<InsertionsMap>(space());
  CommitFilled<TombstonesMap>(space(), "t", 2 * kCount);
  Snapshot snapshot(space());
  const auto& map = snapshot.Root<InsertionsMap>("m");
  const auto& other = snapshot.Root<TombstonesMap>("t");
  std::uint64_t last = 0;
  EXPECT_TRUE(ScanMap(snapshot, map, FieldId(), [&](const FieldId& key, const auto& payload) {
    const std::uint64_t mirrored = 2 * kCount + 1 - NumberOf(key);
    EXPECT_EQ(NumberUnder(other, mirrored), mirrored);
    EXPECT_EQ(map.contains(Key(mirrored)), false);
    EXPECT_EQ(NumberOf(key), last + 2);
    last = PayloadNumber<VectorInsertions>::Number(payload);
    EXPECT_EQ(last, NumberOf(key)) << "the look-ups have changed what the visitor was given";
    return true;
  }));
  EXPECT_EQ(last, 2 * kCount);
}

TEST_P(UnkeptReads, AScanOfChangedLeavesWhoseVisitorLooksThingsUpMeetsEachEntryOnce) {
  CommitFilled<TombstonesMap>(space(), "m", kCount);
  CommitFilled<TombstonesMap>(space(), "other", kCount);
  WriteTransaction transaction(space());
  auto& map = transaction.Root<TombstonesMap>("m");
  for (std::uint64_t n = 1; n <= kCount; n += 20) map.Insert(Key(n), PayloadOf<TombstonesMap>(n), true);
  const auto& other = transaction.View<TombstonesMap>("other");
  std::uint64_t visited = 0;
  EXPECT_TRUE(ScanMap(transaction, std::as_const(map), FieldId(), [&](const FieldId& key, const auto&) {
    EXPECT_EQ(NumberOf(key), ++visited);
    EXPECT_EQ(NumberUnder(other, visited), visited);
    return visited < 2 * kCount;
  }));
  EXPECT_EQ(visited, kCount);
}

// Of a map of which each leaf is changed in a commit of its own, so that LMDB keeps changes instead of records.
TEST_P(UnkeptReads, OfRecordsWithPendingChanges) {
  CommitFilled<InsertionsMap>(space(), "m", 500);
  for (std::uint64_t n = 1; n <= 500; n += 25) {
    WriteTransaction transaction(space());
    transaction.Root<InsertionsMap>("m").Insert(Key(n), PayloadOf<InsertionsMap>(n + 7), true);
    transaction.Commit();
  }
  Snapshot snapshot(space());
  const auto& map = snapshot.Root<InsertionsMap>("m");
  std::uint64_t visited = 0;
  EXPECT_TRUE(ScanMap(snapshot, map, FieldId(), [&](const FieldId& key, const auto& payload) {
    const std::uint64_t n = NumberOf(key);
    EXPECT_EQ(n, ++visited);
    EXPECT_EQ(PayloadNumber<VectorInsertions>::Number(payload), n % 25 == 1 ? n + 7 : n);
    const std::uint64_t mirrored = 501 - n;
    EXPECT_EQ(NumberIn(PeekMap(snapshot, map, Key(mirrored))), mirrored % 25 == 1 ? mirrored + 7 : mirrored);
    return true;
  }));
  EXPECT_EQ(visited, 500u);
}

TEST_P(UnkeptReads, OfAMapThatIsNotTheOwnersAreRefused) {
  CommitFilled<TombstonesMap>(space(), "t", 500);
  Snapshot snapshot(space());
  const auto& map = snapshot.Root<TombstonesMap>("t");
  WriteTransaction transaction(space());
  transaction.Root<TombstonesMap>("t").Insert(Key(1), PayloadOf<TombstonesMap>(8), true);
  const std::string peeked = MessageOf<UsageError>([&] { PeekMap(transaction, map, Key(1)); });
  EXPECT_NE(peeked.find("the map was not taken from the transaction"), std::string::npos) << peeked;
  EXPECT_EQ(MessageOf<UsageError>([&] { ScannedFrom(transaction, map, FieldId()); }), peeked);
  EXPECT_EQ(NumberIn(PeekMap(snapshot, map, Key(1))), 1u);
}

TEST_P(UnkeptReads, OfASnapshotThatHasExpiredAreRefused) {
  CommitFilled<TombstonesMap>(space(), "t", 500);
  auto now = std::chrono::steady_clock::time_point();
  site.Close();
  SpaceOptions options{.create = true, .readerMaxAge = std::chrono::milliseconds(500)};
  options.clock = [&now] { return now; };
  site.Open(options);
  {
    Snapshot snapshot(space());
    const auto& map = snapshot.Root<TombstonesMap>("t");
    EXPECT_EQ(NumberIn(PeekMap(snapshot, map, Key(1))), 1u);
    now += std::chrono::milliseconds(501);
    EXPECT_THROW(PeekMap(snapshot, map, Key(400)), SnapshotExpired);
    EXPECT_THROW(ScannedFrom(snapshot, map, FieldId()), SnapshotExpired);
    snapshot.Refresh();
    EXPECT_EQ(NumberIn(PeekMap(snapshot, map, Key(400))), 400u);
  }
  site.Reopen();
}

TEST_P(UnkeptReads, AnExceptionOfTheVisitorPasses) {
  CommitFilled<TombstonesMap>(space(), "t", 500);
  Snapshot snapshot(space());
  const auto& map = snapshot.Root<TombstonesMap>("t");
  std::uint64_t visited = 0;
  const auto throwAtTheThird = [&visited](const FieldId&, const auto&) -> bool {
    if (++visited == 3) throw std::runtime_error("the visitor's own");
    return true;
  };
  EXPECT_EQ(MessageOf<std::runtime_error>([&] { ScanMap(snapshot, map, FieldId(), throwAtTheThird); }), "the visitor's own");
  EXPECT_EQ(visited, 3u);
  EXPECT_EQ(ScannedFrom(snapshot, map, FieldId()).size(), 500u);
}

TEST_P(UnkeptReads, SayWhichRecordIsMissing) {
  CommitFilled<TombstonesMap>(space(), "t", 500);
  OID leaf;
  {
    Snapshot snapshot(space());
    leaf = snapshot.Root<TombstonesMap>("t").m_firstLeaf.m_oid;
  }
  site.Tamper(leaf, std::nullopt);
  Snapshot snapshot(space());
  const auto& map = snapshot.Root<TombstonesMap>("t");
  const std::string peeked = MessageOf<DanglingReference>([&] { PeekMap(snapshot, map, Key(1)); });
  EXPECT_NE(peeked.find("object " + std::to_string(leaf.m_value)), std::string::npos) << peeked;
  EXPECT_EQ(MessageOf<DanglingReference>([&] { ScannedFrom(snapshot, map, FieldId()); }), peeked);
  EXPECT_EQ(MessageOf<DanglingReference>([&] { map.rFind(Key(1)); }), peeked);
  EXPECT_EQ(NumberIn(PeekMap(snapshot, map, Key(500))), 500u);
  EXPECT_EQ(ScannedFrom(snapshot, map, Key(400)).size(), 101u);
}

TEST_P(UnkeptReads, RefuseARecordOfWhichAByteHasChanged) {
  CommitFilled<TombstonesMap>(space(), "t", 500);
  OID leaf;
  {
    Snapshot snapshot(space());
    leaf = snapshot.Root<TombstonesMap>("t").m_lastLeaf.m_oid;
  }
  Bytes record = Stored().records.at(leaf);
  record.at(record.size() / 2) ^= 1;
  site.Tamper(leaf, record);
  Snapshot snapshot(space());
  const auto& map = snapshot.Root<TombstonesMap>("t");
  const std::string peeked = MessageOf<CorruptRecord>([&] { PeekMap(snapshot, map, Key(500)); });
  EXPECT_NE(peeked.find("TombstonesMapLeafNode"), std::string::npos) << peeked;
  std::uint64_t visited = 0;
  const auto count = [&visited](const FieldId&, const auto&) { return ++visited > 0; };
  EXPECT_EQ(MessageOf<CorruptRecord>([&] { ScanMap(snapshot, map, FieldId(), count); }), peeked);
  EXPECT_GE(visited, 400u) << "what stands before it is read";
}

TEST_P(UnkeptReads, BelongToTheThreadOfTheTransaction) {
  CommitFilled<TombstonesMap>(space(), "t", 500);
  site.Reopen();
  WriteTransaction transaction(space());
  const auto& map = transaction.View<TombstonesMap>("t");
  map.rFind(Key(1));  // the other thread need not load the root
  std::string peeked, scanned;
  std::thread other([&] {
    peeked = MessageOf<UsageError>([&] { PeekMap(transaction, map, Key(400)); });
    scanned = MessageOf<UsageError>([&] { ScannedFrom(transaction, map, Key(400)); });
  });
  other.join();
  EXPECT_NE(peeked.find("belongs to another thread"), std::string::npos) << peeked;
  EXPECT_EQ(scanned, peeked);
}

}  // namespace
}  // namespace vemo::test
