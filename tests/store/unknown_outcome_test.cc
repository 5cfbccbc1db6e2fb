// Commits whose answer is lost: the transaction finds out what became of them, or says that nobody knows.
#include "engines/faulty/faulty_engine.h"
#include "engines/memory/memory_engine.h"
#include "tests/store/store_fixture.h"

namespace vemo::test {
namespace {

class UnknownOutcomeTest : public testing::Test {
 protected:
  UnknownOutcomeTest()
      : m_inner(OpenMemoryEngine()), m_space(CSpace::OpenOn(MakeFaultyEngine(m_inner, plan), {.create = true})) {
    CommitFilled<TombstonesMap>(space(), "t", 500);
    m_before = StoredStateOf(*m_inner);
  }

  CSpace& space() { return *m_space; }
  StoredState Stored() { return StoredStateOf(*m_inner); }

  static void Change(WriteTransaction& transaction) {
    Fill(transaction.Root<TombstonesMap>("t"), 501, 700);
    Fill(transaction.Root<InsertionsMap>("i"), 1, 150);
    transaction.RenameRoot("t", "renamed");
    transaction.SetMeta("m", "1");
  }
  // Everything of Change is there, or nothing, and the handle works.
  void ExpectChanged(bool changed) {
    {
      WriteTransaction transaction(space());
      EXPECT_FALSE(transaction.IsPoisoned());
      EXPECT_EQ(transaction.Meta("m").has_value(), changed);
      auto& map = transaction.Root<TombstonesMap>(changed ? "renamed" : "t");
      EXPECT_EQ(map.size(), changed ? 700 : 500);
      EXPECT_EQ(FaultsOf(map), "");
      EXPECT_EQ(transaction.Root<InsertionsMap>("i").size(), changed ? 150 : 0);
      Fill(map, 2001, 2300);
      transaction.Commit();
    }
    Snapshot snapshot(space());
    EXPECT_EQ(FaultsOf(snapshot.Root<TombstonesMap>(changed ? "renamed" : "t")), "");
    EXPECT_EQ(snapshot.HasRoot("t"), !changed);
  }

  FaultPlan plan;

 private:
  std::shared_ptr<Engine> m_inner;
  std::unique_ptr<CSpace> m_space;

 protected:
  StoredState m_before;
};

TEST_F(UnknownOutcomeTest, ACommitThatWasMadeReturnsAsIfNothingHadHappened) {
  for (const Fault fault : {Fault::kUnknownApplied, Fault::kDeliveredTwice}) {
    WriteTransaction transaction(space());
    if (fault == Fault::kUnknownApplied) {
      Change(transaction);
    } else {
      transaction.SetMeta("only", "named values");
    }
    plan.Set(fault, 1, EngineCall::kCommit);
    transaction.Commit();
    EXPECT_TRUE(plan.HasFired());
  }
  EXPECT_EQ(Stored().generation, m_before.generation + 2);
  EXPECT_EQ(Snapshot(space()).Meta("only"), "named values");
  ExpectChanged(true);
}

TEST_F(UnknownOutcomeTest, ACommitThatWasNotMadeSaysSoAndCanBeTriedAgain) {
  {
    WriteTransaction transaction(space());
    Change(transaction);
    plan.Set(Fault::kUnknownDropped, 1, EngineCall::kCommit);
    const std::string message = MessageOf<StoreError>([&] { transaction.Commit(); });
    EXPECT_NE(message.find("nothing was committed"), std::string::npos) << message;
    EXPECT_EQ(Stored(), m_before);
    EXPECT_FALSE(transaction.IsPoisoned());
    transaction.Commit();
  }
  ExpectChanged(true);
}

// The read that would tell fails too.
TEST_F(UnknownOutcomeTest, WhereReadingBackFailsTheOutcomeIsUnknownAndTheNextTransactionShowsIt) {
  for (const Fault fault : {Fault::kUnknownDropped, Fault::kUnknownApplied}) {
    {
      WriteTransaction transaction(space());
      if (fault == Fault::kUnknownDropped) {
        Change(transaction);
      } else {
        transaction.SetMeta("later", "1");
        transaction.Root<TombstonesMap>("t").Delete(Key(2001));
      }
      constexpr std::uint64_t kQueueReads = 1;  // before the commit, which is the next call and fails as all after it do
      plan.Set(fault, kQueueReads + 1, std::nullopt, true);
      EXPECT_THROW(transaction.Commit(), UnknownOutcome);
      EXPECT_TRUE(transaction.IsPoisoned());
      EXPECT_THROW(transaction.Commit(), PoisonedTransaction);
    }
    plan.Clear();
    if (fault == Fault::kUnknownDropped) {
      EXPECT_EQ(Stored(), m_before);
      ExpectChanged(false);
    } else {
      WriteTransaction transaction(space());
      EXPECT_EQ(transaction.Meta("later"), "1");
      EXPECT_FALSE(transaction.Root<TombstonesMap>("t").contains(Key(2001)));
    }
  }
}

TEST_F(UnknownOutcomeTest, ASpaceWhoseFirstCommitHasNoAnswerIsMadeAllTheSame) {
  for (const Fault fault : {Fault::kUnknownApplied, Fault::kDeliveredTwice}) {
    const std::shared_ptr<Engine> engine = OpenMemoryEngine();
    plan.Set(fault, 1, EngineCall::kCommit);
    const auto made = CSpace::OpenOn(MakeFaultyEngine(engine, plan), {.create = true});
    EXPECT_EQ(StoredStateOf(*engine).generation, 1u);
    CommitFilled<TombstonesMap>(*made, "t", 3);
  }
}

TEST_F(UnknownOutcomeTest, ALostTailBelowAnOpenHandleIsSeenByItsNextTransaction) {
  plan.KeepTail(1);
  {
    WriteTransaction transaction(space());
    Change(transaction);
    transaction.Commit();
  }
  plan.LoseTail(1);
  ExpectChanged(false);
}

}  // namespace
}  // namespace vemo::test
