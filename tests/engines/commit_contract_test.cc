// Commits: what they change, together or not at all.
#include <cstdint>
#include <new>

#include "platform/error.h"
#include "tests/engines/engine_contract.h"
#include "tests/support/failing_allocator.h"

namespace vemo::test {
namespace {

using CommitContract = EngineContract;
INSTANTIATE_TEST_SUITE_P(Engines, CommitContract, testing::ValuesIn(AllEngineKinds()), EngineKindName);

BatchBuilder OneOfEach(const std::string& value) {
  BatchBuilder batch;
  batch.Put(2, value).Put(1, value).Queue(8);
  batch.Name(NamedTable::kInfo, "i", value)
      .Name(NamedTable::kRoots, "r", value)
      .Name(NamedTable::kMeta, "m", value);
  return batch;
}

TEST_P(CommitContract, ANewSpaceIsEmptyAtGenerationZero) {
  EXPECT_EQ(NewestContents(engine()), Contents());
  EXPECT_EQ(engine().Usage().records, 0u);
}

TEST_P(CommitContract, ChangesEveryTableTogetherAndReturnsTheNextGeneration) {
  BatchBuilder batch = OneOfEach("one");
  EXPECT_EQ(engine().Commit(batch.At(0)), 1u);
  Contents expected;
  expected.generation = 1;
  expected.records = {{1, "one"}, {2, "one"}};
  expected.info = {{"i", "one"}};
  expected.roots = {{"r", "one"}};
  expected.meta = {{"m", "one"}};
  expected.queue = {8};
  EXPECT_EQ(NewestContents(engine()), expected);
}

TEST_P(CommitContract, AnEmptyBatchIsACommitOfItsOwn) {
  EXPECT_EQ(engine().Commit(CommitBatch()), 1u);
  EXPECT_EQ(engine().OpenSnapshot()->Generation(), 1u);
}

TEST_P(CommitContract, ReplacesWhatIsThere) {
  BatchBuilder first = OneOfEach("long first value");
  BatchBuilder second = OneOfEach("2");
  Commit(first);
  Commit(second);
  const Contents contents = NewestContents(engine());
  EXPECT_EQ(contents.records, (Records{{1, "2"}, {2, "2"}}));
  EXPECT_EQ(contents.roots, (Named{{"r", "2"}}));
  EXPECT_EQ(contents.queue, (std::vector<std::uint64_t>{8}));
}

TEST_P(CommitContract, RefusesABatchMadeOnAnotherGenerationAndAppliesNothing) {
  BatchBuilder first = OneOfEach("one");
  Commit(first);
  const Contents before = NewestContents(engine());
  for (const std::uint64_t expected : {std::uint64_t{0}, std::uint64_t{2}, ~std::uint64_t{0}}) {
    BatchBuilder batch = OneOfEach("stale");
    batch.Remove(3).Finish(8);
    EXPECT_THROW(engine().Commit(batch.At(expected)), StaleGeneration);
    EXPECT_EQ(NewestContents(engine()), before);
  }
  BatchBuilder next = OneOfEach("two");
  EXPECT_EQ(engine().Commit(next.At(1)), 2u);
}

TEST_P(CommitContract, RemovesRecordsAndNamesAndForgivesMissingOnes) {
  BatchBuilder first = OneOfEach("one");
  Commit(first);
  BatchBuilder second;
  second.Remove(1).Remove(77).Unname(NamedTable::kRoots, "r").Unname(NamedTable::kMeta, "missing");
  Commit(second);
  const Contents contents = NewestContents(engine());
  EXPECT_EQ(contents.records, (Records{{2, "one"}}));
  EXPECT_EQ(contents.roots, Named());
  EXPECT_EQ(contents.meta, (Named{{"m", "one"}}));
}

TEST_P(CommitContract, PutsARemovedRecordAgain) {
  BatchBuilder put, remove;
  put.Put(5, "five");
  remove.Remove(5);
  Commit(put);
  Commit(remove);
  Commit(put);
  EXPECT_EQ(NewestContents(engine()).records, (Records{{5, "five"}}));
}

TEST_P(CommitContract, TheLastOfTwoValuesForANameCounts) {
  BatchBuilder batch;
  batch.Name(NamedTable::kMeta, "a", "first").Name(NamedTable::kMeta, "a", "second");
  batch.Name(NamedTable::kMeta, "b", "value").Unname(NamedTable::kMeta, "b");
  Commit(batch);
  EXPECT_EQ(NewestContents(engine()).meta, (Named{{"a", "second"}}));
}

TEST_P(CommitContract, TheTablesOfNamesAreApart) {
  BatchBuilder batch;
  batch.Name(NamedTable::kInfo, "same", "info").Name(NamedTable::kMeta, "same", "meta");
  Commit(batch);
  const auto snapshot = engine().OpenSnapshot();
  EXPECT_EQ(ToText(snapshot->ReadNamed(NamedTable::kInfo, "same")), "info");
  EXPECT_EQ(ToText(snapshot->ReadNamed(NamedTable::kMeta, "same")), "meta");
  EXPECT_EQ(ToText(snapshot->ReadNamed(NamedTable::kRoots, "same")), std::nullopt);
}

TEST_P(CommitContract, RefusesNamesThatAreEmptyOrTooLongAndAppliesNothing) {
  for (const std::string& name : {std::string(), std::string(401, 'n')}) {
    BatchBuilder batch;
    batch.Put(1, "one").Name(NamedTable::kMeta, "fine", "value").Name(NamedTable::kMeta, name, "value");
    EXPECT_THROW(engine().Commit(batch.At(0)), UsageError);
    EXPECT_EQ(NewestContents(engine()), Contents());
  }
}

void ExpectRefusedAsAWhole(Engine& engine, BatchBuilder& batch) {
  EXPECT_THROW(engine.Commit(batch.At(0)), UsageError);
  EXPECT_EQ(NewestContents(engine), Contents());
}

TEST_P(CommitContract, RefusesABatchThatTouchesTheRecordOfAnObjectTwiceAndAppliesNothing) {
  BatchBuilder put, putAndRemoved, removed;
  put.Put(1, "one").Put(2, "two").Put(1, "another");
  putAndRemoved.Put(1, "one").Put(2, "two").Remove(1);
  removed.Remove(1).Put(2, "two").Remove(1);
  ExpectRefusedAsAWhole(engine(), put);
  ExpectRefusedAsAWhole(engine(), putAndRemoved);
  ExpectRefusedAsAWhole(engine(), removed);
}

TEST_P(CommitContract, RefusesALargeBatchThatTouchesTheRecordOfAnObjectTwice) {
  BatchBuilder batch;
  for (std::uint64_t oid = 1'000; oid > 0; --oid) batch.Put(oid, "value");
  batch.Remove(500);
  ExpectRefusedAsAWhole(engine(), batch);
}

TEST_P(CommitContract, TheQueueKeepsEachIdOnceInAscendingOrder) {
  BatchBuilder first, second;
  first.Queue(300).Queue(2).Queue(300);
  second.Queue(2).Queue(1);
  Commit(first);
  Commit(second);
  EXPECT_EQ(Queue(*engine().OpenSnapshot()), (std::vector<std::uint64_t>{1, 2, 300}));
}

TEST_P(CommitContract, TheQueueGivesTheFirstIdsUpToALimit) {
  BatchBuilder batch;
  batch.Queue(3).Queue(1).Queue(2);
  Commit(batch);
  const auto snapshot = engine().OpenSnapshot();
  EXPECT_EQ(Queue(*snapshot, 0), std::vector<std::uint64_t>());
  EXPECT_EQ(Queue(*snapshot, 2), (std::vector<std::uint64_t>{1, 2}));
  EXPECT_EQ(Queue(*snapshot, 4), (std::vector<std::uint64_t>{1, 2, 3}));
}

TEST_P(CommitContract, FinishedDeletionsLeaveTheQueueBeforeNewOnesJoin) {
  BatchBuilder first, second;
  first.Queue(1).Queue(2);
  second.Finish(1).Finish(2).Finish(99).Queue(2).Queue(3);
  Commit(first);
  Commit(second);
  EXPECT_EQ(Queue(*engine().OpenSnapshot()), (std::vector<std::uint64_t>{2, 3}));
}

TEST_P(CommitContract, TheQueueAndTheRecordsAreApart) {
  BatchBuilder batch;
  batch.Put(4, "four").Queue(4);
  Commit(batch);
  BatchBuilder finish;
  finish.Finish(4);
  Commit(finish);
  EXPECT_EQ(NewestContents(engine()).records, (Records{{4, "four"}}));
}

TEST_P(CommitContract, UsageCountsTheRecordsOfTheNewestCommit) {
  BatchBuilder first;
  for (std::uint64_t oid = 1; oid <= 100; ++oid) first.Put(oid, std::string(1000, 'x'));
  Commit(first);
  const auto snapshot = engine().OpenSnapshot();
  EXPECT_EQ(engine().Usage().records, 100u);
  EXPECT_GE(engine().Usage().bytes, 100'000u);
  BatchBuilder second;
  second.Remove(1).Remove(2).Put(3, "replaced");
  Commit(second);
  EXPECT_EQ(engine().Usage().records, 98u);
}

TEST_P(CommitContract, ACommitThatRunsOutOfMemoryAppliesNothing) {
  BatchBuilder first = OneOfEach("one");
  first.Put(3, "three");
  Commit(first);
  const Contents before = NewestContents(engine());
  BatchBuilder second = OneOfEach(std::string(100, '2'));
  second.Remove(3).Finish(8).Queue(9).Put(10, "ten").Name(NamedTable::kMeta, "new", "value");
  const CommitBatch& batch = second.At(1);

  std::int64_t nth = 1;
  for (bool committed = false; !committed; ++nth) {
    try {
      const FailingAllocation failing(nth);
      engine().Commit(batch);
      committed = true;
    } catch (const std::bad_alloc&) {
      EXPECT_EQ(NewestContents(engine()), before) << "after allocation " << nth << " failed";
    }
  }
  EXPECT_GT(nth, 2) << "no allocation failed";
  EXPECT_EQ(NewestContents(engine()).records.back(), (Records::value_type{10, "ten"}));
  EXPECT_EQ(engine().OpenSnapshot()->Generation(), 2u);
}

}  // namespace
}  // namespace vemo::test
