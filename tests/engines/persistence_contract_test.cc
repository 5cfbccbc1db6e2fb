// What is there after the engine was closed and opened again.
#include "tests/engines/engine_contract.h"

namespace vemo::test {
namespace {

using PersistenceContract = EngineContract;
INSTANTIATE_TEST_SUITE_P(Engines, PersistenceContract, testing::ValuesIn(PersistentEngineKinds()),
                         EngineKindName);

TEST_P(PersistenceContract, EverythingCommittedIsThereAgain) {
  BatchBuilder batch;
  batch.Put(2, "two").Put(1, std::string(10000, '1')).Put(3, "").Queue(8);
  batch.Name(NamedTable::kInfo, "i", "info")
      .Name(NamedTable::kRoots, "r", "root")
      .Name(NamedTable::kMeta, "m", "");
  Commit(batch);
  const Contents before = NewestContents(engine());
  Reopen();
  EXPECT_EQ(NewestContents(engine()), before);
  EXPECT_EQ(engine().Usage().records, 3u);
}

TEST_P(PersistenceContract, TheGenerationGoesOn) {
  BatchBuilder batch;
  batch.Put(1, "one");
  Commit(batch);
  Reopen();
  EXPECT_THROW(engine().Commit(batch.At(0)), StaleGeneration);
  EXPECT_EQ(engine().Commit(batch.At(1)), 2u);
}

TEST_P(PersistenceContract, IdsAreNotUsedAgain) {
  engine().ReserveIds(5);
  Reopen();
  EXPECT_EQ(engine().ReserveIds(1), OID(6));
}

TEST_P(PersistenceContract, TheWriterLockIsFreeAgain) {
  engine().LockWriter(std::chrono::milliseconds(0)).reset();
  Reopen();
  EXPECT_NE(engine().LockWriter(std::chrono::milliseconds(0)), nullptr);
}

}  // namespace
}  // namespace vemo::test
