// What the memory engine keeps, and for how long.
#include "engines/memory/memory_engine.h"

#include <gtest/gtest.h>

#include "tests/engines/engine_contract.h"
#include "tests/support/failing_allocator.h"

namespace vemo::test {
namespace {

void Commit(Engine& engine, BatchBuilder& batch) {
  const std::uint64_t newest = engine.OpenSnapshot()->Generation();
  engine.Commit(batch.At(newest));
}

BatchBuilder Records100(char fill) {
  BatchBuilder batch;
  for (std::uint64_t oid = 1; oid <= 100; ++oid) batch.Put(oid, std::string(100, fill));
  batch.Name(NamedTable::kMeta, "name", std::string(100, fill)).Queue(1);
  return batch;
}

BatchBuilder Removal100() {
  BatchBuilder batch;
  for (std::uint64_t oid = 1; oid <= 100; ++oid) batch.Remove(oid);
  batch.Unname(NamedTable::kMeta, "name").Finish(1);
  return batch;
}

TEST(MemoryEngine, KeepsNoOldVersionWhenNoSnapshotIsOpen) {
  const auto engine = OpenMemoryEngine();
  BatchBuilder batch = Records100('a');
  Commit(*engine, batch);
  const std::uint64_t once = engine->Usage().bytes;
  EXPECT_EQ(once, 100u * (8 + 100) + 4 + 100 + 8);
  for (int i = 0; i < 10; ++i) Commit(*engine, batch);
  EXPECT_EQ(engine->Usage().bytes, once);
  BatchBuilder removal = Removal100();
  Commit(*engine, removal);
  EXPECT_EQ(engine->Usage().bytes, 0u);
}

TEST(MemoryEngine, KeepsOneOldVersionForASnapshotAndFreesItWhenTheSnapshotCloses) {
  const auto engine = OpenMemoryEngine();
  BatchBuilder batch = Records100('a');
  Commit(*engine, batch);
  const std::uint64_t once = engine->Usage().bytes;
  auto snapshot = engine->OpenSnapshot();
  for (int i = 0; i < 10; ++i) Commit(*engine, batch);
  EXPECT_EQ(engine->Usage().bytes, 2 * once);
  snapshot.reset();
  EXPECT_EQ(engine->Usage().bytes, once);
}

TEST(MemoryEngine, KeepsOnlyTheVersionsThatOpenSnapshotsSee) {
  const auto engine = OpenMemoryEngine();
  std::vector<std::unique_ptr<EngineSnapshot>> snapshots;
  BatchBuilder batch = Records100('a');
  Commit(*engine, batch);
  const std::uint64_t once = engine->Usage().bytes;
  for (int i = 0; i < 4; ++i) {
    snapshots.push_back(engine->OpenSnapshot());
    Commit(*engine, batch);
    Commit(*engine, batch);
  }
  EXPECT_EQ(engine->Usage().bytes, 5 * once);
  snapshots.erase(snapshots.begin());  // the oldest
  EXPECT_EQ(engine->Usage().bytes, 4 * once);
  snapshots.erase(snapshots.begin() + 1);  // in the middle: goes with the next commit at the latest
  Commit(*engine, batch);
  EXPECT_EQ(engine->Usage().bytes, 3 * once);
  snapshots.clear();
  EXPECT_EQ(engine->Usage().bytes, once);
}

TEST(MemoryEngine, FreesRemovedRecordsWhenTheLastSnapshotThatSeesThemCloses) {
  const auto engine = OpenMemoryEngine();
  BatchBuilder batch = Records100('a');
  BatchBuilder removal = Removal100();
  Commit(*engine, batch);
  auto one = engine->OpenSnapshot();
  auto two = engine->OpenSnapshot();
  Commit(*engine, removal);
  EXPECT_GT(engine->Usage().bytes, 0u);
  EXPECT_EQ(engine->Usage().records, 0u);
  one.reset();
  EXPECT_EQ(AllRecords(*two).size(), 100u);
  two.reset();
  EXPECT_EQ(engine->Usage().bytes, 0u);
}

TEST(MemoryEngine, ShortSnapshotsBesideALongOneDoNotPileUpVersions) {
  const auto engine = OpenMemoryEngine();
  const auto oldest = engine->OpenSnapshot();
  std::uint64_t most = 0;
  for (std::uint64_t oid = 1; oid <= 5000; ++oid) {
    BatchBuilder put, remove;
    put.Put(oid, std::string(100, 'x'));
    remove.Remove(oid);
    Commit(*engine, put);
    const auto shortLived = engine->OpenSnapshot();
    Commit(*engine, remove);
    most = std::max(most, engine->Usage().bytes);
  }
  EXPECT_LT(most, 100u * 200);
}

TEST(MemoryEngine, ReturnsAllItsMemory) {
  const std::int64_t before = LiveAllocations();
  {
    const auto engine = OpenMemoryEngine();
    BatchBuilder batch = Records100('a');
    BatchBuilder removal = Removal100();
    Commit(*engine, batch);
    const auto snapshot = engine->OpenSnapshot();
    Commit(*engine, removal);
    Commit(*engine, batch);
  }
  EXPECT_EQ(LiveAllocations(), before);
}

TEST(MemoryEngine, SnapshotsAndTheWriterLockOutliveTheEngine) {
  auto engine = OpenMemoryEngine();
  BatchBuilder batch;
  batch.Put(1, "one");
  Commit(*engine, batch);
  const auto snapshot = engine->OpenSnapshot();
  const auto lock = engine->LockWriter(std::chrono::milliseconds(0));
  engine.reset();
  EXPECT_EQ(AllRecords(*snapshot), (Records{{1, "one"}}));
}

TEST(MemoryEngine, EachOneIsASpaceOfItsOwn) {
  const auto one = OpenMemoryEngine();
  const auto two = OpenMemoryEngine();
  BatchBuilder batch;
  batch.Put(1, "one");
  Commit(*one, batch);
  EXPECT_EQ(NewestContents(*two), Contents());
  const auto lock = one->LockWriter(std::chrono::milliseconds(0));
  EXPECT_NE(two->LockWriter(std::chrono::milliseconds(0)), nullptr);
}

}  // namespace
}  // namespace vemo::test
