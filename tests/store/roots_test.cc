// Listing, renaming and deleting named roots; transactions as the scope of a function; what a commit would write.
#include "store/scope.h"
#include "tests/store/store_fixture.h"

namespace vemo::test {
namespace {

using Names = std::vector<std::string>;

using RootsTest = StoreTest;
INSTANTIATE_STORE_TEST(RootsTest);

TEST_P(RootsTest, AreListedWithThoseOfTheTransaction) {
  CommitFilled<TombstonesMap>(space(), "b", 3);
  WriteTransaction transaction(space());
  transaction.Root<InsertionsMap>("a");
  transaction.Own<InsertionsMap>();
  EXPECT_EQ(transaction.RootNames(), (Names{"a", "b"}));
}

TEST_P(RootsTest, RenamingKeepsMapAddressAndContent) {
  CommitFilled<TombstonesMap>(space(), "old", 300);
  {
    WriteTransaction transaction(space());
    auto& map = transaction.Root<TombstonesMap>("old");
    transaction.RenameRoot("old", "new");
    EXPECT_EQ(&transaction.Root<TombstonesMap>("new"), &map);
    EXPECT_EQ(transaction.RootNames(), Names{"new"});
    EXPECT_THROW(transaction.View<TombstonesMap>("old"), UsageError);
    map.Insert(Key(301), PayloadOf<TombstonesMap>(301), true);
    transaction.Commit();
  }
  site.Reopen();
  Snapshot snapshot(space());
  EXPECT_EQ(snapshot.RootNames(), Names{"new"});
  EXPECT_EQ(snapshot.Root<TombstonesMap>("new").size(), 301);
  EXPECT_EQ(FaultsOf(snapshot.Root<TombstonesMap>("new")), "");
}

TEST_P(RootsTest, AnAbortTakesRenamingBackAlsoInMemory) {
  CommitFilled<TombstonesMap>(space(), "old", 10);
  const StoredState before = Stored();
  const TombstonesMap* address = nullptr;
  {
    WriteTransaction transaction(space());
    address = &transaction.Root<TombstonesMap>("old");
    transaction.RenameRoot("old", "new");
    transaction.RenameRoot("new", "newer");
    transaction.Root<TombstonesMap>("old").Insert(Key(1), PayloadOf<TombstonesMap>(1), true);
  }
  EXPECT_EQ(Stored(), before);
  WriteTransaction transaction(space());
  EXPECT_EQ(transaction.RootNames(), Names{"old"});
  EXPECT_EQ(&transaction.Root<TombstonesMap>("old"), address);
  EXPECT_EQ(transaction.Root<TombstonesMap>("old").size(), 10);
}

TEST_P(RootsTest, RenamingRefusesMissingAndTakenNames) {
  CommitFilled<TombstonesMap>(space(), "a", 1);
  CommitFilled<TombstonesMap>(space(), "b", 1);
  WriteTransaction transaction(space());
  EXPECT_THROW(transaction.RenameRoot("c", "d"), UsageError);
  EXPECT_THROW(transaction.RenameRoot("a", "b"), UsageError);
  EXPECT_THROW(transaction.RenameRoot("a", ""), UsageError);
}

TEST_P(RootsTest, ANameThatWasGivenAwayCanBeTakenAgainInTheSameTransaction) {
  CommitFilled<TombstonesMap>(space(), "a", 5);
  {
    WriteTransaction transaction(space());
    transaction.RenameRoot("a", "b");
    transaction.Root<InsertionsMap>("a").Insert(Key(1), PayloadOf<InsertionsMap>(1), true);
    transaction.Commit();
  }
  site.Reopen();
  Snapshot snapshot(space());
  EXPECT_EQ(snapshot.Root<TombstonesMap>("b").size(), 5);
  EXPECT_EQ(snapshot.Root<InsertionsMap>("a").size(), 1);
}

TEST_P(RootsTest, DeletingTakesNameMapAndNodes) {
  CommitFilled<TombstonesMap>(space(), "a", 1000);
  CommitFilled<TombstonesMap>(space(), "b", 10);
  const std::size_t records = Stored().records.size();
  EXPECT_GT(records, 10u);
  site.Reopen();
  {
    WriteTransaction transaction(space());
    transaction.DeleteRoot("a");
    EXPECT_EQ(transaction.RootNames(), Names{"b"});
    EXPECT_THROW(transaction.DeleteRoot("a"), UsageError);
    transaction.Commit();
  }
  for (int i = 0; i < 3; ++i) {
    WriteTransaction transaction(space());
    transaction.SetMeta("tick", std::to_string(i));
    transaction.Commit();
  }
  EXPECT_EQ(Stored().records.size(), 2u) << "the map and the leaf of b";
  EXPECT_TRUE(Stored().queue.empty());
}

TEST_P(RootsTest, AnAbortedDeletionRestoresTheMapInPlace) {
  CommitFilled<TombstonesMap>(space(), "a", 500);
  const StoredState before = Stored();
  const TombstonesMap* address = nullptr;
  {
    WriteTransaction transaction(space());
    address = &transaction.Root<TombstonesMap>("a");
    transaction.DeleteRoot("a");
  }
  EXPECT_EQ(Stored(), before);
  WriteTransaction transaction(space());
  EXPECT_EQ(&transaction.Root<TombstonesMap>("a"), address);
  EXPECT_EQ(NumbersOf(transaction.View<TombstonesMap>("a")).size(), 500u);
}

TEST_P(RootsTest, ADeletedNameCanBeMadeAnewInTheSameTransaction) {
  CommitFilled<TombstonesMap>(space(), "a", 500);
  {
    WriteTransaction transaction(space());
    transaction.DeleteRoot("a");
    transaction.Root<TombstonesMap>("a").Insert(Key(7), PayloadOf<TombstonesMap>(7), true);
    EXPECT_EQ(transaction.Root<TombstonesMap>("a").size(), 1);
    transaction.Commit();
  }
  site.Reopen();
  Snapshot snapshot(space());
  EXPECT_EQ(NumbersOf(snapshot.Root<TombstonesMap>("a")), (std::map<std::uint64_t, std::uint64_t>{{7, 7}}));
}

TEST_P(RootsTest, AFunctionsTransactionCommitsItsResultOrAbortsItsException) {
  const ssize_t size = InTransaction(space(), [](WriteTransaction& transaction) {
    auto& map = transaction.Root<TombstonesMap>("t");
    Fill(map, 1, 10);
    return map.size();
  });
  EXPECT_EQ(size, 10);
  EXPECT_THROW(InTransaction(space(),
                             [](WriteTransaction& transaction) {
                               Fill(transaction.Root<TombstonesMap>("t"), 11, 20);
                               throw std::runtime_error("no");
                             }),
               std::runtime_error);
  EXPECT_EQ(InSnapshot(space(), [](Snapshot& snapshot) { return snapshot.Root<TombstonesMap>("t").size(); }), 10);
}

TEST_P(RootsTest, WhatACommitWouldWriteIsToldBefore) {
  CommitFilled<TombstonesMap>(space(), "t", 1000);
  WriteTransaction transaction(space());
  EXPECT_EQ(transaction.Dirty().objects, 0u);
  transaction.Root<TombstonesMap>("t").Insert(Key(500), PayloadOf<TombstonesMap>(1), true);
  const WriteTransaction::DirtySize dirty = transaction.Dirty();
  EXPECT_EQ(dirty.objects, 1u) << "one leaf";
  EXPECT_GT(dirty.bytes, 0u);
  transaction.Commit();
}

}  // namespace
}  // namespace vemo::test
