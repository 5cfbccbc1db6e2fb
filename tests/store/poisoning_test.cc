// Changes that an exception interrupts, and commits that fail.
#include <new>

#include "tests/store/store_fixture.h"
#include "tests/support/failing_allocator.h"

namespace vemo::test {
namespace {

class PoisoningTest : public StoreTest {
 protected:
  PoisoningTest() {
    CommitFilled<TombstonesMap>(space(), "t", 1000);
    m_text = CommittedText<TombstonesMap>("t");
    site.Reopen();
    m_stored = Stored();
  }

  // Nothing of what was tried is left, and the handle works.
  void ExpectAsBefore() {
    EXPECT_EQ(Stored(), m_stored);
    WriteTransaction transaction(space());
    EXPECT_FALSE(transaction.IsPoisoned());
    auto& map = transaction.Root<TombstonesMap>("t");
    EXPECT_EQ(ToText(map), m_text);
    EXPECT_EQ(FaultsOf(map), "");
    map.Insert(Key(1), PayloadOf<TombstonesMap>(0), true);
    transaction.Commit();
  }

  std::string m_text;
  StoredState m_stored;
};
INSTANTIATE_STORE_TEST(PoisoningTest);

void ExpectPoisoned(WriteTransaction& transaction) {
  EXPECT_TRUE(transaction.IsPoisoned());
  EXPECT_NE(MessageOf<PoisonedTransaction>([&] { transaction.Commit(); }).find("abort"), std::string::npos);
  EXPECT_THROW(transaction.Commit(), PoisonedTransaction);
}

TEST_P(PoisoningTest, AReadThatFailsInsideADeletion) {
  for (std::int64_t nth = 1;; ++nth) {
    bool failed = false;
    {
      WriteTransaction transaction(space());
      auto& map = transaction.Root<TombstonesMap>("t");
      watch().failingRead.Set(nth);
      try {
        for (std::uint64_t n = 400; n < 600; ++n) map.Delete(Key(n));
      } catch (const InjectedFailure&) {
        failed = true;
      }
      watch().failingRead.Set(0);
      if (failed) ExpectPoisoned(transaction);
    }
    site.Reopen();  // with all of it read, there would be nothing left to fail
    if (!failed) {
      EXPECT_GT(nth, 5);
      break;
    }
    EXPECT_EQ(Stored(), m_stored);
  }
  ExpectAsBefore();
}

TEST_P(PoisoningTest, AnIdThatCannotBeReservedInsideAnInsertion) {
  {
    WriteTransaction transaction(space());
    auto& map = transaction.Root<TombstonesMap>("t");
    watch().failingReservation.Set(1);
    EXPECT_THROW(Fill(map, 2000, 3000), InjectedFailure);
    ExpectPoisoned(transaction);
  }
  ExpectAsBefore();
}

TEST_P(PoisoningTest, AnAllocationThatFailsAnywhereInAChange) {
  const auto payload = PayloadOf<TombstonesMap>(7);
  std::vector<FieldId> keys;
  for (std::uint64_t n = 2000; n < 2120; ++n) keys.push_back(LongKey(n));
  std::int64_t nth = 1;
  for (bool failed = true; failed; nth += 3) {
    {
      WriteTransaction transaction(space());
      auto& map = transaction.Root<TombstonesMap>("t");
      FailingAllocation failing(nth);
      bool threw = false;
      try {
        for (const FieldId& key : keys) map.Insert(key, payload, true);
        for (std::uint64_t n = 300; n < 420; ++n) map.Delete(Key(n));
      } catch (const std::bad_alloc&) {
        threw = true;
      }
      failed = failing.HasFailed();
      // An engine may do without an allocation: the seal of a reservation that is made already.
      if (threw) {
        const ExemptAllocations exempt;
        ExpectPoisoned(transaction);
      }
    }
    ASSERT_EQ(Stored(), m_stored) << nth;
  }
  EXPECT_GT(nth, 100);
  ExpectAsBefore();
}

TEST_P(PoisoningTest, AnAllocationThatFailsAnywhereInAClear) {
  for (std::int64_t nth = 1, failures = 1; failures > 0; nth += 2) {
    WriteTransaction transaction(space());
    auto& map = transaction.Root<TombstonesMap>("t");
    map.Delete(Key(500));
    FailingAllocation failing(nth);
    try {
      map.clear();
    } catch (const std::bad_alloc&) {
    }
    failures = failing.HasFailed() ? 1 : 0;
    const ExemptAllocations exempt;
    if (failures > 0) ExpectPoisoned(transaction);
  }
  ExpectAsBefore();
}

TEST_P(PoisoningTest, AReadThatFailsInALookUpPoisonsNothing) {
  WriteTransaction transaction(space());
  auto& map = transaction.Root<TombstonesMap>("t");
  watch().failingRead.Set(2);
  EXPECT_THROW(map.rFind(Key(700)), InjectedFailure);
  EXPECT_FALSE(transaction.IsPoisoned());
  EXPECT_NE(map.rFind(Key(700)), nullptr);
  map.Insert(Key(700), PayloadOf<TombstonesMap>(1), true);
  transaction.Commit();
}

TEST_P(PoisoningTest, ACommitThatTheEngineRefusesCanBeTriedAgain) {
  WriteTransaction transaction(space());
  Fill(transaction.Root<InsertionsMap>("new class"), 1,
       200);  // with a class that the space has no number for
  auto& map = transaction.Root<TombstonesMap>("t");
  Fill(map, 2000, 2100);
  for (std::uint64_t n = 1; n < 300; ++n) map.Delete(Key(n));
  transaction.SetMeta("m", "value");
  for (int attempt = 0; attempt < 3; ++attempt) {
    watch().failingCommit.Set(1);
    EXPECT_THROW(transaction.Commit(), InjectedFailure);
    EXPECT_FALSE(transaction.IsPoisoned());
    EXPECT_EQ(Stored(), m_stored);
    EXPECT_EQ(FaultsOf(map), "");
    map.Insert(Key(3000), {}, false);
  }
  transaction.Commit();
  site.Reopen();
  Snapshot snapshot(space());
  EXPECT_EQ(snapshot.Root<TombstonesMap>("t").size(), 1000 + 101 - 299 + 1);
  EXPECT_EQ(FaultsOf(snapshot.Root<TombstonesMap>("t")), "");
  EXPECT_EQ(FaultsOf(snapshot.Root<InsertionsMap>("new class")), "");
  EXPECT_EQ(snapshot.Meta("m"), "value");
  EXPECT_EQ(snapshot.Generation(), m_stored.generation + 1);
}

TEST_P(PoisoningTest, AnAbortAfterARefusedCommitRestores) {
  {
    WriteTransaction transaction(space());
    Fill(transaction.Root<InsertionsMap>("new class"), 1, 200);
    transaction.Root<TombstonesMap>("t").clear();
    watch().failingCommit.Set(1);
    EXPECT_THROW(transaction.Commit(), InjectedFailure);
  }
  EXPECT_EQ(Stored(), m_stored);
  ExpectAsBefore();
  {
    // The class numbers of the commit that failed are not taken.
    WriteTransaction transaction(space());
    Fill(transaction.Root<HistoriesMap>("other class"), 1, 200);
    transaction.Commit();
  }
  site.Reopen();
  EXPECT_EQ(FaultsOf(Snapshot(space()).Root<HistoriesMap>("other class")), "");
}

TEST_P(PoisoningTest, AnAllocationThatFailsInACommitLeavesItToBeTriedAgain) {
  WriteTransaction transaction(space());
  auto& map = transaction.Root<TombstonesMap>("t");
  Fill(map, 2000, 2200);
  Fill(transaction.Root<InsertionsMap>("new class"), 1, 60);
  for (std::uint64_t n = 1; n < 300; ++n) map.Delete(Key(n));
  bool done = false;
  std::int64_t nth = 1;
  for (; !done && !transaction.IsPoisoned(); ++nth) {
    FailingAllocation failing(nth);
    try {
      transaction.Commit();
      done = true;
    } catch (const std::bad_alloc&) {
      const ExemptAllocations exempt;
      ASSERT_EQ(Stored(), m_stored) << nth;
    }
  }
  EXPECT_TRUE(done);
  EXPECT_GT(nth, 20);
  site.Reopen();
  Snapshot snapshot(space());
  EXPECT_EQ(snapshot.Root<TombstonesMap>("t").size(), 1000 + 201 - 299);
  EXPECT_EQ(FaultsOf(snapshot.Root<TombstonesMap>("t")), "");
  EXPECT_EQ(FaultsOf(snapshot.Root<InsertionsMap>("new class")), "");
}

TEST_P(PoisoningTest, ASpaceThatMovedUnderATransactionRefusesItsCommit) {
  {
    WriteTransaction transaction(space());
    transaction.Root<TombstonesMap>("t").Delete(Key(1));
    site.TamperNamed(NamedTable::kMeta, "x", Bytes{});
    EXPECT_THROW(transaction.Commit(), StaleGeneration);
    EXPECT_THROW(transaction.Commit(), PoisonedTransaction);
  }
  m_stored.generation += 1;
  m_stored.meta["x"] = {};
  ExpectAsBefore();
}

}  // namespace
}  // namespace vemo::test
