// The engine that fails on demand: each fault does to the space what its name says.
#include "engines/faulty/faulty_engine.h"

#include <gtest/gtest.h>

#include <thread>

#include "engines/memory/memory_engine.h"
#include "tests/engines/engine_contract.h"

namespace vemo::test {
namespace {

class FaultyEngineTest : public testing::Test {
 protected:
  FaultyEngineTest() : m_inner(OpenMemoryEngine()), m_engine(MakeFaultyEngine(m_inner, plan)) {
    BatchBuilder batch;
    batch.Put(1, "one").Queue(7).Name(NamedTable::kMeta, "m", "one");
    m_engine->Commit(batch.At(0));
  }

  Engine& engine() { return *m_engine; }
  std::string RecordOne() { return ToText(m_inner->OpenSnapshot()->Read(OID(1))).value_or("nothing"); }
  std::uint64_t CommitTwo() {
    BatchBuilder batch;
    return m_engine->Commit(batch.Put(1, "two").At(1));
  }

  FaultPlan plan;

 private:
  std::shared_ptr<Engine> m_inner;
  std::unique_ptr<Engine> m_engine;
};

TEST_F(FaultyEngineTest, ARefusedCommitChangesNothingAndIsRefusedOnce) {
  for (const Fault fault : {Fault::kNoSpace, Fault::kIoError}) {
    plan.Set(fault, 1, EngineCall::kCommit);
    EXPECT_THROW(CommitTwo(), InjectedFault);
    EXPECT_TRUE(plan.HasFired());
    EXPECT_EQ(RecordOne(), "one");
  }
  EXPECT_EQ(CommitTwo(), 2u);
  EXPECT_EQ(RecordOne(), "two");
}

TEST_F(FaultyEngineTest, AFaultThatPersistsEndsWhenItIsCleared) {
  plan.Set(Fault::kIoError, 2, EngineCall::kRead, true);
  const auto snapshot = engine().OpenSnapshot();
  EXPECT_EQ(ToText(snapshot->Read(OID(1))), "one");
  for (int i = 0; i < 3; ++i) EXPECT_THROW(snapshot->Read(OID(1)), InjectedFault);
  EXPECT_EQ(snapshot->QueuedDeletions(9).size(), 1u);
  plan.Clear();
  EXPECT_EQ(ToText(snapshot->Read(OID(1))), "one");
}

TEST_F(FaultyEngineTest, AnUnknownOutcomeIsReportedWhetherOrNotTheCommitWasMade) {
  plan.Set(Fault::kUnknownDropped, 1);
  EXPECT_THROW(CommitTwo(), UnknownOutcome);
  EXPECT_EQ(RecordOne(), "one");
  plan.Set(Fault::kUnknownApplied, 1);
  EXPECT_THROW(CommitTwo(), UnknownOutcome);
  EXPECT_EQ(RecordOne(), "two");
}

TEST_F(FaultyEngineTest, ACommitThatIsDeliveredTwiceIsRefusedTheSecondTime) {
  plan.Set(Fault::kDeliveredTwice, 1);
  EXPECT_THROW(CommitTwo(), StaleGeneration);
  EXPECT_EQ(RecordOne(), "two");
}

TEST_F(FaultyEngineTest, IdsThatAreReservedTwiceAreOnlyLost) {
  plan.Set(Fault::kDeliveredTwice, 1, EngineCall::kReserveIds);
  EXPECT_EQ(engine().ReserveIds(10), OID(11));
  EXPECT_EQ(engine().ReserveIds(10), OID(21));
}

TEST_F(FaultyEngineTest, IdsWhoseAnswerIsLostAreAnErrorAndOnlyLost) {
  plan.Set(Fault::kUnknownApplied, 1, EngineCall::kReserveIds);
  EXPECT_THROW(engine().ReserveIds(10), InjectedFault);
  EXPECT_EQ(engine().ReserveIds(10), OID(11));
}

TEST_F(FaultyEngineTest, AScanFailsInItsMidst) {
  BatchBuilder batch;
  engine().Commit(batch.Put(2, "two").Put(3, "three").At(1));
  const auto snapshot = engine().OpenSnapshot();
  plan.Set(Fault::kIoError, 3, EngineCall::kScanRecords);
  int visited = 0;
  EXPECT_THROW(snapshot->ScanRecords(OID(), [&](OID, ByteView) { return ++visited > 0; }), InjectedFault);
  EXPECT_EQ(visited, 1);
}

TEST_F(FaultyEngineTest, OthersReadWhileACommitStalls) {
  int reads = 0;
  plan.onStall = [&](EngineCall call) {
    EXPECT_EQ(call, EngineCall::kCommit);
    std::thread reader([&] {
      if (ToText(engine().OpenSnapshot()->Read(OID(1))) == "one") ++reads;
    });
    reader.join();
  };
  plan.Set(Fault::kStall, 1, EngineCall::kCommit);
  EXPECT_EQ(CommitTwo(), 2u);
  EXPECT_EQ(reads, 1);
}

TEST_F(FaultyEngineTest, ALostTailTakesTheNewestCommitsBackAndCommitsGoOnFromThere) {
  plan.KeepTail(3);
  std::vector<Contents> states{NewestContents(engine())};
  for (std::uint64_t n = 1; n <= 5; ++n) {
    BatchBuilder batch;
    batch.Put(n, "commit " + std::to_string(n)).Remove(n - 1).Queue(10 + n).Finish(9 + n);
    batch.Name(NamedTable::kMeta, "m", std::to_string(n)).Name(NamedTable::kRoots, std::to_string(n), "r");
    ASSERT_EQ(engine().Commit(batch.At(n)), n + 1);
    states.push_back(NewestContents(engine()));
  }
  plan.LoseTail(2);
  EXPECT_EQ(NewestContents(engine()), states[3]);
  plan.LoseTail(9);
  EXPECT_EQ(NewestContents(engine()), states[2]) << "no more than was kept";
  BatchBuilder batch;
  EXPECT_EQ(engine().Commit(batch.Put(9, "anew").At(3)), 4u);
  EXPECT_EQ(NewestContents(engine()).generation, 4u);
  EXPECT_THROW(engine().Commit(batch.At(3)), StaleGeneration);
}

}  // namespace
}  // namespace vemo::test
