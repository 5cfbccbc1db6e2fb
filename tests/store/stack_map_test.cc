// Maps on the stack beside root maps, and maps that a space owns without a name.
#include "tests/store/store_fixture.h"

namespace vemo::test {
namespace {

using StackMapTest = StoreTest;
INSTANTIATE_STORE_TEST(StackMapTest);

TEST_P(StackMapTest, AMapOnTheStackIsNeverFlaggedAndDiesClean) {
  WriteTransaction transaction(space());
  {
    TombstonesMap stack;
    Fill(stack, 1, 1000);
    EXPECT_FALSE(stack.IsDirty());
    EXPECT_EQ(stack.GetSysState().m_cspace, nullptr);
    EXPECT_TRUE(stack.GetPersistObjState().m_oid.IsNull());
    for (std::uint64_t n = 1; n <= 600; ++n) stack.Delete(Key(n));
    EXPECT_EQ(FaultsOf(stack), "");
    EXPECT_EQ(stack.size(), 400);
    const TombstonesMap copy(stack);
    EXPECT_TRUE(copy == stack);
    stack.clear();
    EXPECT_EQ(stack.m_height, -1);
    EXPECT_EQ(copy.size(), 400);
  }
  transaction.Commit();
  EXPECT_TRUE(Stored().records.empty());
}

TEST_P(StackMapTest, SwappedIntoARootItsNodesAreKept) {
  CommitFilled<TombstonesMap>(space(), "t", 300);
  {
    WriteTransaction transaction(space());
    auto& root = transaction.Root<TombstonesMap>("t");
    TombstonesMap stack;
    Fill(stack, 1000, 2000);
    root.swap(stack);
    EXPECT_TRUE(root.IsDirty());
    EXPECT_FALSE(stack.IsDirty());
    EXPECT_EQ(stack.size(), 300);
    EXPECT_EQ(FaultsOf(stack), "");
    Fill(root, 3000, 3100);  // goes on growing as the root's own
    transaction.Commit();
  }
  {
    WriteTransaction transaction(space());
    EXPECT_EQ(transaction.View<TombstonesMap>("t").size(), 1001 + 101);
  }
  site.Reopen();
  Snapshot snapshot(space());
  EXPECT_EQ(snapshot.Root<TombstonesMap>("t").size(), 1001 + 101);
  EXPECT_EQ(FaultsOf(snapshot.Root<TombstonesMap>("t")), "");
}

TEST_P(StackMapTest, TheOldTreeOfASwappedRootCanBeClearedThroughTheStack) {
  site.Close();
  site.Open({.create = true, .cacheBytes = 10'000'000});  // so that nodes stay in memory between transactions
  CommitFilled<TombstonesMap>(space(), "t", 300);
  WriteTransaction transaction(space());
  TombstonesMap stack;
  Fill(stack, 1, 3);
  transaction.Root<TombstonesMap>("t").swap(stack);
  stack.clear();
  transaction.Commit();
  EXPECT_EQ(Stored().records.size(), 2u);  // the map and its one leaf
  EXPECT_EQ(Snapshot(space()).Root<TombstonesMap>("t").size(), 3);
}

TEST_P(StackMapTest, ARootAssignedFromTheStackSurvivesIt) {
  {
    WriteTransaction transaction(space());
    auto& root = transaction.Root<TombstonesMap>("t");
    {
      TombstonesMap stack;
      Fill(stack, 1, 777);
      root = stack;
    }
    EXPECT_EQ(FaultsOf(root), "");
    transaction.Commit();
  }
  site.Reopen();
  EXPECT_EQ(Snapshot(space()).Root<TombstonesMap>("t").size(), 777);
}

TEST_P(StackMapTest, AnAbortAfterASwapRestoresTheRoot) {
  CommitFilled<TombstonesMap>(space(), "t", 300);
  const std::string text = CommittedText<TombstonesMap>("t");
  {
    WriteTransaction transaction(space());
    TombstonesMap stack;
    Fill(stack, 1, 1000);
    transaction.Root<TombstonesMap>("t").swap(stack);
  }
  WriteTransaction transaction(space());
  EXPECT_EQ(ToText(transaction.View<TombstonesMap>("t")), text);
}

TEST_P(StackMapTest, TwoRootsCanSwap) {
  CommitFilled<TombstonesMap>(space(), "a", 300);
  CommitFilled<TombstonesMap>(space(), "b", 5);
  {
    WriteTransaction transaction(space());
    transaction.Root<TombstonesMap>("a").swap(transaction.Root<TombstonesMap>("b"));
    transaction.Commit();
    EXPECT_EQ(watch().written.size(), 2u);
  }
  site.Reopen();
  Snapshot snapshot(space());
  EXPECT_EQ(snapshot.Root<TombstonesMap>("a").size(), 5);
  EXPECT_EQ(snapshot.Root<TombstonesMap>("b").size(), 300);
}

TEST_P(StackMapTest, GrowingAMapWithoutATransactionIsRefused) {
  TombstonesMap stack;
  EXPECT_THROW(stack.Insert(Key(1), {}, false), UsageError);
  EXPECT_EQ(stack.m_height, -1);
}

// --- Owned maps ---

using OwnedMapTest = StoreTest;
INSTANTIATE_STORE_TEST(OwnedMapTest);

TEST_P(OwnedMapTest, AnOwnedMapIsFoundByItsIdUntilItIsDisowned) {
  OID oid;
  {
    WriteTransaction transaction(space());
    auto& map = transaction.Own<TombstonesMap>();
    Fill(map, 1, 500);
    oid = map.GetPersistObjState().m_oid;
    EXPECT_EQ(&transaction.Owned<TombstonesMap>(oid), &map);
    transaction.Commit();
  }
  EXPECT_TRUE(Snapshot(space()).RootNames().empty());
  site.Reopen();
  {
    WriteTransaction transaction(space());
    auto& map = transaction.Owned<TombstonesMap>(oid);
    EXPECT_EQ(map.size(), 500);
    EXPECT_EQ(FaultsOf(map), "");
    EXPECT_THROW(transaction.Owned<InsertionsMap>(oid), UsageError);
    EXPECT_THROW(transaction.Owned<TombstonesMap>(OID(oid.m_value + 1)), UsageError);
    transaction.Disown(map);
    EXPECT_THROW(transaction.Owned<TombstonesMap>(oid), UsageError);
    EXPECT_THROW(transaction.Disown(map), UsageError);
    transaction.Commit();
  }
  EXPECT_TRUE(Stored().records.empty());
  EXPECT_TRUE(Stored().roots.empty());
  site.Reopen();
  WriteTransaction transaction(space());
  EXPECT_THROW(transaction.Owned<TombstonesMap>(oid), UsageError);
}

TEST_P(OwnedMapTest, AnAbortBringsADisownedMapBack) {
  OID oid;
  {
    WriteTransaction transaction(space());
    auto& map = transaction.Own<TombstonesMap>();
    Fill(map, 1, 500);
    oid = map.GetPersistObjState().m_oid;
    transaction.Commit();
  }
  const StoredState stored = Stored();
  {
    WriteTransaction transaction(space());
    transaction.Disown(transaction.Owned<TombstonesMap>(oid));
  }
  EXPECT_EQ(Stored(), stored);
  WriteTransaction transaction(space());
  EXPECT_EQ(transaction.Owned<TombstonesMap>(oid).size(), 500);
  EXPECT_EQ(FaultsOf(transaction.Owned<TombstonesMap>(oid)), "");
}

TEST_P(OwnedMapTest, AMapThatIsOwnedAndDisownedInOneTransactionLeavesNothing) {
  WriteTransaction transaction(space());
  auto& map = transaction.Own<TombstonesMap>();
  Fill(map, 1, 500);
  transaction.Disown(map);
  transaction.SetMeta("m", "");
  transaction.Commit();
  EXPECT_TRUE(Stored().records.empty());
  EXPECT_TRUE(Stored().roots.empty());
}

TEST_P(OwnedMapTest, ANamedRootCannotBeDisownedAndKeepsItsEntries) {
  CommitFilled<TombstonesMap>(space(), "t", 500);
  WriteTransaction transaction(space());
  auto& map = transaction.Root<TombstonesMap>("t");
  EXPECT_THROW(transaction.Disown(map), UsageError);
  EXPECT_EQ(map.size(), 500);
  EXPECT_FALSE(transaction.IsPoisoned());
  TombstonesMap stack;
  EXPECT_THROW(transaction.Disown(stack), UsageError);
  transaction.Commit();
}

TEST_P(OwnedMapTest, ADisownedMapCannotBeChangedAnyMore) {
  WriteTransaction transaction(space());
  auto& map = transaction.Own<TombstonesMap>();
  transaction.Disown(map);
  EXPECT_EQ(map.size(), 0);
  EXPECT_THROW(map.Insert(Key(1), {}, false), UsageError);
  EXPECT_THROW(transaction.Commit(), PoisonedTransaction);
}

// --- References that must not be written ---

using RefusedReferenceTest = StoreTest;
INSTANTIATE_STORE_TEST(RefusedReferenceTest);

// Gives `to` the tree of `from`, as only a mistake with the public members could.
void StealTree(TombstonesMap& to, const TombstonesMap& from) {
  to.m_root = from.m_root;
  to.m_firstLeaf = from.m_firstLeaf;
  to.m_lastLeaf = from.m_lastLeaf;
  to.m_size = from.m_size;
  to.m_height = from.m_height;
  to.MarkAsDirtyWithoutTrace();
}

void ExpectCommitRefused(WriteTransaction& transaction, const TombstonesMap& map, const std::string& reason) {
  const std::string message = MessageOf<UsageError>([&] { transaction.Commit(); });
  EXPECT_NE(message.find("object " + std::to_string(map.GetPersistObjState().m_oid.m_value)),
            std::string::npos);
  EXPECT_NE(message.find(reason), std::string::npos) << message;
}

TEST_P(RefusedReferenceTest, IntoAnotherSpace) {
  SpaceSite other(EngineKind::kMemory);
  CommitFilled<TombstonesMap>(other.space(), "t", 300);
  CommitFilled<TombstonesMap>(space(), "t", 5);
  const StoredState stored = Stored();
  TombstonesMap* theirs = nullptr;
  {
    WriteTransaction transaction(other.space());
    theirs = &transaction.Root<TombstonesMap>("t");
  }
  {
    WriteTransaction transaction(space());
    auto& map = transaction.Root<TombstonesMap>("t");
    StealTree(map, *theirs);
    ExpectCommitRefused(transaction, map, "another space");
  }
  EXPECT_EQ(Stored(), stored);
  WriteTransaction transaction(space());
  EXPECT_EQ(transaction.View<TombstonesMap>("t").size(), 5);
}

TEST_P(RefusedReferenceTest, IntoASnapshotBoundOrNot) {
  CommitFilled<TombstonesMap>(space(), "t", 300);
  CommitFilled<TombstonesMap>(space(), "u", 5);
  const StoredState stored = Stored();
  Snapshot snapshot(space());
  const auto& theirs = snapshot.Root<TombstonesMap>("t");
  for (const bool bound : {false, true}) {
    if (bound) {
      EXPECT_EQ(NumbersOf(theirs).size() + FaultsOf(theirs).size(), 300u);  // now in memory
    }
    EXPECT_EQ(theirs.m_root.m_ptr.m_self != nullptr && theirs.m_firstLeaf.m_ptr.m_self != nullptr &&
                  theirs.m_lastLeaf.m_ptr.m_self != nullptr,
              bound);
    WriteTransaction transaction(space());
    auto& map = transaction.Root<TombstonesMap>("u");
    StealTree(map, theirs);
    ExpectCommitRefused(transaction, map, "another space or snapshot");
  }
  EXPECT_EQ(Stored(), stored);
}

TEST_P(RefusedReferenceTest, ToADeletedObject) {
  CommitFilled<TombstonesMap>(space(), "t", 300);
  CommitFilled<TombstonesMap>(space(), "u", 5);
  const StoredState stored = Stored();
  {
    WriteTransaction transaction(space());
    auto& map = transaction.Root<TombstonesMap>("u");
    StealTree(map, transaction.View<TombstonesMap>("t"));
    transaction.Root<TombstonesMap>("t").clear();
    ExpectCommitRefused(transaction, map, "has deleted");
  }
  EXPECT_EQ(Stored(), stored);
  WriteTransaction transaction(space());
  EXPECT_EQ(transaction.View<TombstonesMap>("t").size(), 300);
  EXPECT_EQ(transaction.View<TombstonesMap>("u").size(), 5);
}

}  // namespace
}  // namespace vemo::test
