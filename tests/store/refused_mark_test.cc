// Changes where none are allowed: outside a transaction, and in a snapshot.
#include <atomic>
#include <thread>

#include "tests/store/store_fixture.h"

namespace vemo::test {
namespace {

class RefusedMarkTest : public StoreTest {
 protected:
  RefusedMarkTest() {
    CommitFilled<TombstonesMap>(space(), "t", 1000);
    m_text = CommittedText<TombstonesMap>("t");
    m_stored = Stored();
  }

  TombstonesMap& RootOutsideATransaction() {
    WriteTransaction transaction(space());
    auto& map = transaction.Root<TombstonesMap>("t");
    map.Validate();
    return map;
  }

  void ExpectCommittedState() {
    EXPECT_EQ(Stored(), m_stored);
    WriteTransaction transaction(space());
    auto& map = transaction.Root<TombstonesMap>("t");
    EXPECT_EQ(ToText(map), m_text);
    EXPECT_EQ(FaultsOf(map), "");
  }

  std::string m_text;
  StoredState m_stored;
};
INSTANTIATE_STORE_TEST(RefusedMarkTest);

// Every way to change a map of 1000 entries.
template <class Act>
void ForEachChange(Act&& act) {
  act([](TombstonesMap& map) { map.Insert(Key(5000), {}, false); });
  act([](TombstonesMap& map) { map.Insert(Key(500), {}, true); });
  act([](TombstonesMap& map) { map[Key(500)] = {}; });
  act([](TombstonesMap& map) { map[Key(5000)] = {}; });
  act([](TombstonesMap& map) {
    map.Insert(LongKey(50), {}, false);
  });  // splits, or goes into a leaf with room
  act([](TombstonesMap& map) { map.Delete(Key(1)); });
  act([](TombstonesMap& map) { map.Delete(Key(1000)); });
  act([](TombstonesMap& map) { map.erase(map.cbegin()); });
  act([](TombstonesMap& map) { map.clear(); });
  act([](TombstonesMap& map) { map.begin()->second = {}; });
  act([](TombstonesMap& map) { map = TombstonesMap(); });
  act([](TombstonesMap& map) {
    TombstonesMap stack;
    map.swap(stack);
  });
}

TEST_P(RefusedMarkTest, ChangingARootOutsideATransactionThrowsAndTheNextOneSeesTheCommittedState) {
  site.Close();
  site.Open({.create = true, .cacheBytes = 10'000'000});  // so that nodes stay in memory between transactions
  ForEachChange([&](const auto& change) {
    auto& map = RootOutsideATransaction();
    const std::string message = MessageOf<UsageError>([&] { change(map); });
    EXPECT_NE(message.find("WriteTransaction"), std::string::npos) << message;
    ExpectCommittedState();
  });
}

TEST_P(RefusedMarkTest, ARootIsAlsoRefusedWhileTheThreadChangesAnotherSpace) {
  auto& map = RootOutsideATransaction();
  SpaceSite other(EngineKind::kMemory);
  {
    WriteTransaction transaction(other.space());
    Fill(transaction.Root<TombstonesMap>("t"), 1, 10);
    EXPECT_THROW(map.Delete(Key(1)), UsageError);
    EXPECT_FALSE(transaction.IsPoisoned()) << "it was not its map";
    transaction.Commit();
  }
  EXPECT_EQ(Snapshot(other.space()).Root<TombstonesMap>("t").size(), 10);
  ExpectCommittedState();
}

TEST_P(RefusedMarkTest, ChangingTheMapOfASnapshotThrowsAndTheSnapshotStillReadsRight) {
  Snapshot snapshot(space());
  const auto& map = snapshot.Root<TombstonesMap>("t");
  for (const bool inTransaction : {false, true}) {
    ForEachChange([&](const auto& change) {
      map.Validate();
      {
        std::optional<WriteTransaction> transaction;
        if (inTransaction) transaction.emplace(space());
        EXPECT_THROW(change(const_cast<TombstonesMap&>(map)), UsageError);
      }
      EXPECT_EQ(&snapshot.Root<TombstonesMap>("t"), &map);
      EXPECT_EQ(ToText(map), m_text);
      EXPECT_EQ(FaultsOf(map), "");
    });
  }
  ExpectCommittedState();
}

TEST_P(RefusedMarkTest, OtherSnapshotsKeepTheirObjects) {
  Snapshot first(space());
  Snapshot second(space());
  const auto& kept = second.Root<TombstonesMap>("t");
  kept.Validate();
  const std::uint64_t reads = watch().reads;
  EXPECT_THROW(const_cast<TombstonesMap&>(first.Root<TombstonesMap>("t")).Delete(Key(1)), UsageError);
  const std::uint64_t readsOfFirst = watch().reads;
  EXPECT_GT(readsOfFirst, reads);
  EXPECT_EQ(ToText(kept), m_text);
  EXPECT_EQ(watch().reads, readsOfFirst);
}

TEST_P(RefusedMarkTest, OtherThreadsReadTheirSnapshotsUndisturbed) {
  std::atomic<bool> done{false};
  std::thread reader([&] {
    do {
      Snapshot snapshot(space());
      EXPECT_EQ(NumbersOf(snapshot.Root<TombstonesMap>("t")).size(), 1000u);
    } while (!done);
  });
  Snapshot snapshot(space());
  auto& map = const_cast<TombstonesMap&>(snapshot.Root<TombstonesMap>("t"));
  for (std::uint64_t n = 1; n <= 100; ++n) EXPECT_THROW(map.Delete(Key(n)), UsageError);
  done = true;
  reader.join();
  EXPECT_EQ(FaultsOf(map), "");
}

TEST_P(RefusedMarkTest, ReadingARootOutsideATransactionIsRefusedWhereSomethingMustBeLoaded) {
  site.Reopen();
  const TombstonesMap* map = nullptr;
  {
    WriteTransaction transaction(space());
    map = &transaction.View<TombstonesMap>("t");
  }
  const std::string message = MessageOf<UsageError>([&] { map->rFind(Key(1)); });
  EXPECT_NE(message.find("outside a transaction"), std::string::npos) << message;
  WriteTransaction transaction(space());
  EXPECT_NE(map->rFind(Key(1)), nullptr);
}

TEST_P(RefusedMarkTest, AReferenceThatWasReadOutsideASpaceCannotBeFollowed) {
  TombstonesMap loose;
  FromBytes(ToBytes(Snapshot(space()).Root<TombstonesMap>("t")), loose);
  EXPECT_EQ(loose.size(), 1000);
  EXPECT_NE(MessageOf<UsageError>([&] { loose.rFind(Key(1)); }).find("outside a space"), std::string::npos);
}

}  // namespace
}  // namespace vemo::test
