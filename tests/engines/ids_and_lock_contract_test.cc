// Ids are handed out once; the writer lock has one holder.
#include <chrono>
#include <set>
#include <thread>

#include "platform/error.h"
#include "tests/engines/engine_contract.h"

namespace vemo::test {
namespace {

using namespace std::chrono_literals;

using IdsContract = EngineContract;
INSTANTIATE_TEST_SUITE_P(Engines, IdsContract, testing::ValuesIn(AllEngineKinds()), EngineKindName);

using LockContract = EngineContract;
INSTANTIATE_TEST_SUITE_P(Engines, LockContract, testing::ValuesIn(AllEngineKinds()), EngineKindName);

TEST_P(IdsContract, StartAtOneAndFollowEachOther) {
  EXPECT_EQ(engine().ReserveIds(1), OID(1));
  EXPECT_EQ(engine().ReserveIds(100), OID(2));
  EXPECT_EQ(engine().ReserveIds(1), OID(102));
}

TEST_P(IdsContract, ReservingIsNoCommit) {
  const auto snapshot = engine().OpenSnapshot();
  engine().ReserveIds(10);
  EXPECT_EQ(engine().OpenSnapshot()->Generation(), 0u);
  EXPECT_EQ(engine().Commit(CommitBatch()), 1u);
}

TEST_P(IdsContract, AreNotUsedAgainAfterACommitThatWasRefused) {
  engine().ReserveIds(5);
  BatchBuilder stale;
  stale.Put(5, "five");
  EXPECT_THROW(engine().Commit(stale.At(9)), StaleGeneration);
  EXPECT_EQ(engine().ReserveIds(1), OID(6));
}

TEST_P(IdsContract, RefuseToBeReservedByNoneOrBeyondTheLast) {
  EXPECT_THROW(engine().ReserveIds(0), UsageError);
  EXPECT_THROW(engine().ReserveIds(~std::uint64_t{0}), StoreError);
  EXPECT_EQ(engine().ReserveIds(~std::uint64_t{0} - 1), OID(1));
  EXPECT_THROW(engine().ReserveIds(1), StoreError);
}

TEST_P(IdsContract, AreApartForThreadsThatReserveAtOnce) {
  constexpr int kRounds = 50;
  std::vector<OID> mine, others;
  std::thread other([&] {
    for (int i = 0; i < kRounds; ++i) others.push_back(engine().ReserveIds(3));
  });
  for (int i = 0; i < kRounds; ++i) mine.push_back(engine().ReserveIds(3));
  other.join();
  std::set<std::uint64_t> firsts;
  for (const OID oid : mine) firsts.insert(oid.m_value);
  for (const OID oid : others) firsts.insert(oid.m_value);
  ASSERT_EQ(firsts.size(), 2u * kRounds);
  EXPECT_EQ(*firsts.rbegin(), 1u + 3u * (2u * kRounds - 1u));
}

TEST_P(LockContract, HasOneHolderAtATime) {
  auto held = engine().LockWriter(0ms);
  EXPECT_THROW(engine().LockWriter(0ms), SpaceBusy);
  EXPECT_THROW(engine().LockWriter(3ms), SpaceBusy);
  held.reset();
  held = engine().LockWriter(0ms);
  EXPECT_NE(held, nullptr);
}

TEST_P(LockContract, ARefusalLeavesTheHolderItsLock) {
  const auto held = engine().LockWriter(0ms);
  EXPECT_THROW(engine().LockWriter(0ms), SpaceBusy);
  EXPECT_THROW(engine().LockWriter(-5ms), SpaceBusy);
}

TEST_P(LockContract, SaysWhoHoldsIt) {
  const auto held = engine().LockWriter(0ms);
  try {
    engine().LockWriter(0ms);
    FAIL() << "locked twice";
  } catch (const SpaceBusy& busy) {
    const std::string message = busy.what();
    EXPECT_NE(message.find(engine().Name()), std::string::npos) << message;
    EXPECT_NE(message.find("another transaction of this process"), std::string::npos) << message;
  }
}

TEST_P(LockContract, AWaiterGetsItOnceItIsReleased) {
  auto held = engine().LockWriter(0ms);
  std::unique_ptr<WriterLock> taken;
  std::thread waiter([&] { taken = engine().LockWriter(std::chrono::hours(1)); });
  held.reset();
  waiter.join();
  EXPECT_NE(taken, nullptr);
  EXPECT_THROW(engine().LockWriter(0ms), SpaceBusy);
}

TEST_P(LockContract, MayBeWaitedForWithoutEnd) {
  const auto held = engine().LockWriter(std::chrono::milliseconds::max());
  EXPECT_NE(held, nullptr);
}

TEST_P(LockContract, MayBeReleasedOnAnotherThread) {
  auto held = engine().LockWriter(0ms);
  std::thread([held = std::move(held)]() mutable { held.reset(); }).join();
  EXPECT_NE(engine().LockWriter(0ms), nullptr);
}

TEST_P(LockContract, ReadersNeedNone) {
  const auto held = engine().LockWriter(0ms);
  EXPECT_EQ(engine().OpenSnapshot()->Generation(), 0u);
  EXPECT_EQ(engine().Usage().records, 0u);
}

}  // namespace
}  // namespace vemo::test
