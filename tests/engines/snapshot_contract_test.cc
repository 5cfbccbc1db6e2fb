// Snapshots: isolated from later commits, any number of them, on any thread.
#include <atomic>
#include <thread>

#include "tests/engines/engine_contract.h"

namespace vemo::test {
namespace {

using SnapshotContract = EngineContract;
INSTANTIATE_TEST_SUITE_P(Engines, SnapshotContract, testing::ValuesIn(AllEngineKinds()), EngineKindName);

TEST_P(SnapshotContract, StaysAsItIsWhateverIsCommittedMeanwhile) {
  BatchBuilder first;
  first.Put(1, "one")
      .Put(2, "two")
      .Queue(7)
      .Name(NamedTable::kRoots, "r", "root")
      .Name(NamedTable::kMeta, "m", "meta");
  Commit(first);
  const auto snapshot = engine().OpenSnapshot();
  const Contents before = ContentsOf(*snapshot);

  BatchBuilder second;
  second.Put(1, "changed").Remove(2).Put(3, "new").Finish(7).Queue(6);
  second.Unname(NamedTable::kRoots, "r")
      .Name(NamedTable::kMeta, "m", "changed")
      .Name(NamedTable::kInfo, "i", "new");
  Commit(second);
  Commit(second);
  EXPECT_EQ(ContentsOf(*snapshot), before);
  EXPECT_EQ(ToText(snapshot->Read(OID(2))), "two");
  EXPECT_EQ(ToText(snapshot->Read(OID(3))), std::nullopt);
  EXPECT_NE(NewestContents(engine()), before);
}

TEST_P(SnapshotContract, WhatItReturnedStaysReadableWhateverIsCommitted) {
  BatchBuilder first;
  first.Put(1, std::string(5000, 'a')).Put(2, "b").Name(NamedTable::kMeta, "name", "value");
  Commit(first);
  const auto snapshot = engine().OpenSnapshot();
  const ByteView large = *snapshot->Read(OID(1));
  std::string_view name;
  snapshot->ScanNamed(NamedTable::kMeta, "", [&](std::string_view found, ByteView) {
    name = found;
    return false;
  });
  for (int i = 0; i < 50; ++i) {
    BatchBuilder next;
    next.Put(1, std::string(6000, 'x'))
        .Put(2, "y")
        .Put(100 + static_cast<std::uint64_t>(i), std::string(3000, 'z'));
    next.Unname(NamedTable::kMeta, "name");
    Commit(next);
  }
  EXPECT_EQ(ToText(large), std::string(5000, 'a'));
  EXPECT_EQ(ToText(snapshot->Read(OID(2))), "b");
  EXPECT_EQ(name, "name");
}

TEST_P(SnapshotContract, SeveralSnapshotsEachShowTheirOwnCommit) {
  std::vector<std::unique_ptr<EngineSnapshot>> snapshots;
  for (int i = 1; i <= 5; ++i) {
    BatchBuilder batch;
    batch.Put(1, "value " + std::to_string(i)).Put(static_cast<std::uint64_t>(10 + i), "own");
    if (i > 1) batch.Remove(static_cast<std::uint64_t>(9 + i));
    Commit(batch);
    snapshots.push_back(engine().OpenSnapshot());
    snapshots.push_back(engine().OpenSnapshot());
  }
  snapshots.erase(snapshots.begin() + 4, snapshots.begin() + 6);  // both of commit 3
  snapshots.erase(snapshots.begin());                             // one of commit 1
  for (const auto& snapshot : snapshots) {
    const std::uint64_t i = snapshot->Generation();
    EXPECT_EQ(AllRecords(*snapshot), (Records{{1, "value " + std::to_string(i)}, {10 + i, "own"}}));
  }
}

TEST_P(SnapshotContract, MayBeOpenedOnOneThreadAndUsedAndClosedOnAnother) {
  BatchBuilder batch;
  batch.Put(1, "one");
  Commit(batch);
  auto snapshot = engine().OpenSnapshot();
  Records seen;
  std::thread reader([&seen, snapshot = std::move(snapshot)]() mutable {
    seen = AllRecords(*snapshot);
    snapshot.reset();
  });
  reader.join();
  EXPECT_EQ(seen, (Records{{1, "one"}}));
  EXPECT_EQ(Commit(batch), 2u);
}

TEST_P(SnapshotContract, ReadersOnThreadsSeeWholeCommitsWhileAWriterCommits) {
  constexpr std::uint64_t kCommits = 200;
  BatchBuilder first;
  for (std::uint64_t oid = 1; oid <= 10; ++oid) first.Put(oid, "1");
  Commit(first);
  std::atomic<bool> done = false;
  std::atomic<int> torn = 0;
  const auto read = [&] {
    while (!done) {
      const auto snapshot = engine().OpenSnapshot();
      const Records records = AllRecords(*snapshot);
      for (const auto& record : records)
        torn += record.second != std::to_string(snapshot->Generation()) ? 1 : 0;
      torn += records.size() != 10 ? 1 : 0;
    }
  };
  std::thread one(read), two(read);
  for (std::uint64_t generation = 1; generation < kCommits; ++generation) {
    BatchBuilder batch;
    for (std::uint64_t oid = 1; oid <= 10; ++oid) batch.Put(oid, std::to_string(generation + 1));
    engine().Commit(batch.At(generation));
  }
  done = true;
  one.join();
  two.join();
  EXPECT_EQ(torn, 0);
  EXPECT_EQ(engine().OpenSnapshot()->Generation(), kCommits);
}

}  // namespace
}  // namespace vemo::test
