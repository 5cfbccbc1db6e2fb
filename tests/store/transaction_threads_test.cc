// Who may have a transaction open beside whom.
#include <future>
#include <thread>

#include "tests/store/store_fixture.h"

namespace vemo::test {
namespace {

using namespace std::chrono_literals;

class TransactionThreadsTest : public StoreTest {
 protected:
  void OpenWithTimeout(std::chrono::milliseconds timeout) {
    site.Close();
    site.Open({.create = true, .writerTimeout = timeout});
  }
};
INSTANTIATE_STORE_TEST(TransactionThreadsTest);

TEST_P(TransactionThreadsTest, AThreadHasOneTransactionAtATime) {
  SpaceSite other(EngineKind::kMemory);
  WriteTransaction transaction(space());
  EXPECT_THROW(WriteTransaction second(space()), UsageError);
  EXPECT_THROW(WriteTransaction second(other.space()), UsageError);
  Fill(transaction.Root<TombstonesMap>("t"), 1, 3);  // the first one is none the worse
  transaction.Commit();
  WriteTransaction second(other.space());
}

TEST_P(TransactionThreadsTest, AnotherThreadIsToldThatTheSpaceIsBusyAfterTheTimeOut) {
  OpenWithTimeout(1ms);
  WriteTransaction transaction(space());
  const auto tryToOpen = [&] { return MessageOf<SpaceBusy>([&] { WriteTransaction another(space()); }); };
  const std::string message = std::async(std::launch::async, tryToOpen).get();
  EXPECT_NE(message.find(space().Name()), std::string::npos);
  Fill(transaction.Root<TombstonesMap>("t"), 1, 3);
  transaction.Commit();
  EXPECT_NO_THROW(std::async(std::launch::async, [&] { WriteTransaction another(space()); }).get());
}

TEST_P(TransactionThreadsTest, AnotherThreadWaitsForTheEndOfTheTransaction) {
  OpenWithTimeout(60s);
  std::promise<void> started;
  std::future<ssize_t> seen;
  {
    WriteTransaction transaction(space());
    seen = std::async(std::launch::async, [&] {
      started.set_value();
      WriteTransaction another(space());
      return another.View<TombstonesMap>("t").size();
    });
    started.get_future().wait();
    Fill(transaction.Root<TombstonesMap>("t"), 1, 500);
    transaction.Commit();
  }
  EXPECT_EQ(seen.get(), 500);
}

TEST_P(TransactionThreadsTest, ManyThreadsTakeTurns) {
  OpenWithTimeout(60s);
  std::vector<std::thread> threads;
  for (std::uint64_t thread = 0; thread < 4; ++thread) {
    threads.emplace_back([&, thread] {
      for (std::uint64_t round = 0; round < 25; ++round) {
        WriteTransaction transaction(space());
        transaction.Root<TombstonesMap>("t").Insert(Key(1 + thread * 25 + round), {}, false);
        if (round % 5 != 4) transaction.Commit();
        if (round % 5 == 0) Snapshot(space()).Root<TombstonesMap>("t").Validate();
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(Snapshot(space()).Root<TombstonesMap>("t").size(), 4 * 20);
  EXPECT_EQ(Snapshot(space()).Generation(), 1 + 4 * 20u);
}

}  // namespace
}  // namespace vemo::test
