// Uses that the rules of threads and processes forbid are found out and do no harm.
#include <future>
#include <memory>
#include <thread>

#include "tests/engines/child_process.h"
#include "tests/store/store_fixture.h"

namespace vemo::test {
namespace {

// What `act` throws on a thread of its own.
template <class Act>
std::string MessageOnAnotherThread(Act&& act) {
  return std::async(std::launch::async, [&] { return MessageOf<UsageError>(act); }).get();
}

class MisuseTest : public StoreTest {
 protected:
  // A committed map of which nothing is in memory.
  void MakeStoredMap() {
    CommitFilled<TombstonesMap>(space(), "t", 1'000);
    site.Reopen();
  }
};
INSTANTIATE_STORE_TEST(MisuseTest);

TEST_P(MisuseTest, AnotherThreadCannotCallTheTransaction) {
  MakeStoredMap();
  WriteTransaction transaction(space());
  const auto expectRefused = [&](auto act) {
    const std::string message = MessageOnAnotherThread(act);
    EXPECT_NE(message.find("the transaction belongs to another thread"), std::string::npos) << message;
  };
  expectRefused([&] { transaction.Root<TombstonesMap>("t"); });
  expectRefused([&] { transaction.View<TombstonesMap>("t"); });
  expectRefused([&] { transaction.RootNames(); });
  expectRefused([&] { transaction.DeleteRoot("t"); });
  expectRefused([&] { transaction.SetMeta("m", ""); });
  expectRefused([&] { transaction.Meta("m"); });
  expectRefused([&] { transaction.Dirty(); });
  expectRefused([&] { transaction.Trim(); });
  expectRefused([&] { transaction.Commit(); });
  transaction.SetMeta("m", "mine");
  transaction.Commit();
  EXPECT_EQ(Snapshot(space()).Meta("m"), "mine");
}

TEST_P(MisuseTest, AnotherThreadCannotLoadThroughTheTransaction) {
  MakeStoredMap();
  WriteTransaction transaction(space());
  const auto& map = transaction.View<TombstonesMap>("t");
  const std::uint64_t reads = watch().reads;
  const std::string message = MessageOnAnotherThread([&] { map.rFind(Key(1)); });
  EXPECT_NE(message.find("belongs to another thread"), std::string::npos) << message;
  EXPECT_EQ(watch().reads, reads);
  EXPECT_EQ(NumbersOf(map).size(), 1'000u) << "the owner goes on";
  transaction.Root<TombstonesMap>("t").Delete(Key(1));
  transaction.Commit();
}

TEST_P(MisuseTest, AChangeByAnotherThreadIsRefusedAndSpoilsTheTransaction) {
  MakeStoredMap();
  const std::string text = CommittedText<TombstonesMap>("t");
  const StoredState stored = Stored();
  {
    WriteTransaction transaction(space());
    auto& map = transaction.Root<TombstonesMap>("t");
    map.Validate();  // follows every reference down the tree: the other thread need not load
    const std::string message = MessageOnAnotherThread([&] { map.Delete(Key(1)); });
    EXPECT_NE(message.find("outside a transaction of this thread"), std::string::npos) << message;
    EXPECT_THROW(transaction.Commit(), PoisonedTransaction);
  }
  EXPECT_EQ(Stored(), stored);
  WriteTransaction transaction(space());
  EXPECT_EQ(ToText(transaction.View<TombstonesMap>("t")), text);
  transaction.Root<TombstonesMap>("t").Delete(Key(1));
  transaction.Commit();
}

TEST_P(MisuseTest, AChangeByAnotherThreadThatHasToLoadIsRefusedAndSpoilsTheTransactionToo) {
  MakeStoredMap();
  WriteTransaction transaction(space());
  auto& map = transaction.Root<TombstonesMap>("t");
  const std::string message = MessageOnAnotherThread([&] { map.Delete(Key(1)); });
  EXPECT_NE(message.find("belongs to another thread"), std::string::npos) << message;
  EXPECT_THROW(transaction.Commit(), PoisonedTransaction);
}

TEST_P(MisuseTest, AChangeByAnotherThreadLeavesNothingToTheNextTransaction) {
  MakeStoredMap();
  const std::string text = CommittedText<TombstonesMap>("t");
  {
    WriteTransaction transaction(space());
    auto& map = transaction.Root<TombstonesMap>("t");
    map.Validate();
    MessageOnAnotherThread([&] { map.Delete(Key(1)); });
  }  // it has changed nothing itself
  WriteTransaction transaction(space());
  EXPECT_EQ(ToText(transaction.View<TombstonesMap>("t")), text);
}

// The snapshot asks the clock before it reads from the engine, which holds it there for as long as the test likes.
TEST_P(MisuseTest, ASecondThreadCannotUseASnapshotAtTheSameTime) {
  MakeStoredMap();
  site.Close();
  std::promise<void> reached, released;
  std::atomic<bool> isHeld{false};
  SpaceOptions options{.create = true, .readerMaxAge = std::chrono::hours(1)};
  options.clock = [&] {
    if (isHeld.exchange(false)) {
      reached.set_value();
      released.get_future().wait();
    }
    return std::chrono::steady_clock::time_point();
  };
  site.Open(options);
  {
    Snapshot snapshot(space());
    const auto& map = snapshot.Root<TombstonesMap>("t");
    isHeld = true;
    auto first = std::async(std::launch::async, [&] { return map.contains(Key(1)); });
    reached.get_future().wait();
    const auto expectRefused = [](const std::string& message) {
      EXPECT_NE(message.find("by two threads at the same time"), std::string::npos) << message;
    };
    expectRefused(MessageOf<UsageError>([&] { map.rFind(Key(900)); }));
    expectRefused(MessageOf<UsageError>([&] { snapshot.Root<TombstonesMap>("t"); }));
    expectRefused(MessageOf<UsageError>([&] { snapshot.Trim(); }));
    expectRefused(MessageOf<UsageError>([&] { snapshot.Refresh(); }));
    released.set_value();
    EXPECT_TRUE(first.get());
    EXPECT_TRUE(map.contains(Key(900))) << "one after the other they may";
  }
  site.Close();  // before the clock goes
}

TEST_P(MisuseTest, AForkedChildCanUseNothingOfItsParents) {
  MakeStoredMap();
  auto transaction = std::make_unique<WriteTransaction>(space());
  auto snapshot = std::make_unique<Snapshot>(space());
  auto& written = transaction->Root<TombstonesMap>("t");
  const auto& read = snapshot->Root<TombstonesMap>("t");
  written.Insert(Key(1), PayloadOf<TombstonesMap>(5), true);
  ChildProcess child([&](const Conversation&) {
    const auto expectRefused = [](auto act) {
      const std::string message = MessageOf<UsageError>(act);
      EXPECT_NE(message.find("process that forked this one"), std::string::npos) << message;
    };
    expectRefused([&] { written.rFind(Key(700)); });
    expectRefused([&] { written.begin()->second = PayloadOf<TombstonesMap>(1); });
    expectRefused([&] { transaction->SetMeta("m", ""); });
    expectRefused([&] { transaction->Commit(); });
    expectRefused([&] { read.rFind(Key(1)); });
    expectRefused([&] { snapshot->Root<TombstonesMap>("t"); });
    expectRefused([&] { snapshot->Meta("m"); });
    expectRefused([&] { snapshot->RootNames(); });
    expectRefused([&] { snapshot->Refresh(); });
    expectRefused([&] { Snapshot another(space()); });
    transaction.reset();
    expectRefused([&] { WriteTransaction another(space()); });
    snapshot.reset();
    site.Close();
    return !testing::Test::HasFailure();
  });
  EXPECT_TRUE(child.Succeeded());
  EXPECT_EQ(read.size(), 1'000);
  EXPECT_TRUE(read.contains(Key(700)));
  transaction->Commit();
  snapshot->Refresh();
  EXPECT_EQ(PayloadNumber<VectorTombstones>::Number(*read.rFind(Key(1))), 5u);
}

}  // namespace
}  // namespace vemo::test
