// What a commit keeps and an abort undoes, and how long root maps live.
#include "tests/store/store_fixture.h"

namespace vemo::test {
namespace {

using TransactionTest = StoreTest;
INSTANTIATE_STORE_TEST(TransactionTest);

TEST_P(TransactionTest, ACommitIsThereAfterReopening) {
  {
    WriteTransaction transaction(space());
    Fill(transaction.Root<InsertionsMap>("i"), 1, 300);
    Fill(transaction.Root<TombstonesMap>("t"), 1, 7000);
    Fill(transaction.Root<HistoriesMap>("h"), 1, 1);
    transaction.Root<TombstonesMap>("empty");
    transaction.Commit();
  }
  const auto numbers = NumbersOf(Snapshot(space()).Root<TombstonesMap>("t"));
  EXPECT_EQ(numbers.size(), 7000u);
  site.Reopen();
  Snapshot snapshot(space());
  EXPECT_EQ(snapshot.RootNames(), (std::vector<std::string>{"empty", "h", "i", "t"}));
  EXPECT_EQ(NumbersOf(snapshot.Root<TombstonesMap>("t")), numbers);
  EXPECT_EQ(snapshot.Root<TombstonesMap>("t").m_height, 2);
  EXPECT_EQ(snapshot.Root<InsertionsMap>("i").size(), 300);
  EXPECT_EQ(snapshot.Root<HistoriesMap>("h").size(), 1);
  EXPECT_EQ(snapshot.Root<TombstonesMap>("empty").m_height, -1);
  EXPECT_EQ(FaultsOf(snapshot.Root<TombstonesMap>("t")), "");
  EXPECT_EQ(FaultsOf(snapshot.Root<InsertionsMap>("i")), "");
}

TEST_P(TransactionTest, AnAbortLeavesNoTraceInMemoryNorInTheEngineAndTheHandleGoesOn) {
  CommitFilled<TombstonesMap>(space(), "t", 1000);
  const std::string text = CommittedText<TombstonesMap>("t");
  const StoredState stored = Stored();
  {
    WriteTransaction transaction(space());
    auto& map = transaction.Root<TombstonesMap>("t");
    for (std::uint64_t n = 1; n <= 900; ++n) map.Delete(Key(n));
    Fill(map, 5000, 5600);
    map[Key(1000)] = PayloadOf<TombstonesMap>(4711);
    Fill(transaction.Root<InsertionsMap>("new"), 1, 200);
    transaction.SetMeta("m", "x");
  }
  EXPECT_EQ(Stored(), stored);
  WriteTransaction transaction(space());
  auto& map = transaction.Root<TombstonesMap>("t");
  EXPECT_EQ(ToText(map), text);
  EXPECT_EQ(FaultsOf(map), "");
  EXPECT_EQ(transaction.Meta("m"), std::nullopt);
  map.Delete(Key(1));
  transaction.Commit();
  site.Reopen();
  EXPECT_EQ(Snapshot(space()).Root<TombstonesMap>("t").size(), 999);
  EXPECT_FALSE(Snapshot(space()).HasRoot("new"));
}

TEST_P(TransactionTest, RootMapsKeepTheirAddress) {
  TombstonesMap* address = nullptr;
  {
    WriteTransaction transaction(space());
    address = &transaction.Root<TombstonesMap>("t");
    Fill(*address, 1, 500);
    transaction.Commit();
  }
  {
    WriteTransaction transaction(space());
    EXPECT_EQ(&transaction.Root<TombstonesMap>("t"), address);
    address->clear();
  }
  {
    WriteTransaction transaction(space());
    EXPECT_EQ(&transaction.Root<TombstonesMap>("t"), address);
    EXPECT_EQ(&transaction.View<TombstonesMap>("t"), address);
    EXPECT_EQ(address->size(), 500);  // also without having been asked for
  }
  // Somebody else's commit: the map is read anew in place.
  site.TamperNamed(NamedTable::kMeta, "x", Bytes{});
  WriteTransaction transaction(space());
  EXPECT_EQ(address->size(), 500);
  EXPECT_EQ(&transaction.Root<TombstonesMap>("t"), address);
  EXPECT_EQ(FaultsOf(*address), "");
}

TEST_P(TransactionTest, ARootThatWasNeverCommittedIsEmptyAfterAnAbortAndUsableWhenAskedForAgain) {
  TombstonesMap* map = nullptr;
  {
    WriteTransaction transaction(space());
    map = &transaction.Root<TombstonesMap>("t");
    Fill(*map, 1, 300);
  }
  EXPECT_EQ(map->m_height, -1);
  EXPECT_EQ(map->size(), 0);
  EXPECT_TRUE(Snapshot(space()).RootNames().empty());
  {
    WriteTransaction transaction(space());
    EXPECT_THROW(transaction.View<TombstonesMap>("t"), UsageError);
    EXPECT_THROW(map->Insert(Key(1), {}, false), UsageError);  // not asked for again
  }
  WriteTransaction transaction(space());
  EXPECT_EQ(&transaction.Root<TombstonesMap>("t"), map);
  Fill(*map, 1, 3);
  transaction.Commit();
  EXPECT_EQ(Snapshot(space()).Root<TombstonesMap>("t").size(), 3);
}

TEST_P(TransactionTest, ANameOfAnAbortedRootCanGoToAnotherClass) {
  TombstonesMap* old = nullptr;
  {
    WriteTransaction transaction(space());
    old = &transaction.Root<TombstonesMap>("t");
    Fill(*old, 1, 3);
  }
  {
    WriteTransaction transaction(space());
    Fill(transaction.Root<InsertionsMap>("t"), 1, 200);
    transaction.Commit();
  }
  {
    WriteTransaction transaction(space());
    EXPECT_THROW(old->Insert(Key(1), {}, false), UsageError);  // the name is not its any more
  }
  EXPECT_EQ(old->m_height, -1);
  EXPECT_EQ(ToText(*old), "Height = -1\n");
  EXPECT_EQ(Snapshot(space()).Root<InsertionsMap>("t").size(), 200);
}

TEST_P(TransactionTest, ARootOfAnotherClassIsRefused) {
  CommitFilled<TombstonesMap>(space(), "t", 3);
  site.Reopen();
  WriteTransaction transaction(space());
  const std::string message = MessageOf<UsageError>([&] { transaction.Root<InsertionsMap>("t"); });
  EXPECT_NE(message.find("\"t\""), std::string::npos);
  EXPECT_NE(message.find("FieldIdToVectorTombstonesMap"), std::string::npos);
  EXPECT_NE(message.find("FieldIdToVectorInsertionsMap"), std::string::npos);
  EXPECT_THROW(transaction.View<InsertionsMap>("t"), UsageError);
  EXPECT_EQ(transaction.Root<TombstonesMap>("t").size(), 3);
  Snapshot snapshot(space());
  EXPECT_THROW(snapshot.Root<HistoriesMap>("t"), UsageError);
  EXPECT_THROW(snapshot.Root<HistoriesMap>("none"), UsageError);
}

TEST_P(TransactionTest, NamesOfRootsHaveOneTo400BytesAndDoNotStartWithZero) {
  WriteTransaction transaction(space());
  EXPECT_THROW(transaction.Root<TombstonesMap>(""), UsageError);
  EXPECT_THROW(transaction.Root<TombstonesMap>(std::string(401, 'n')), UsageError);
  EXPECT_THROW(transaction.Root<TombstonesMap>(std::string("\0x", 2)), UsageError);
  const std::string longest = std::string(398, '\xff') + '\0' + '"';
  transaction.Root<TombstonesMap>(longest);
  transaction.Commit();
  site.Reopen();
  Snapshot snapshot(space());
  EXPECT_EQ(snapshot.RootNames(), std::vector<std::string>{longest});
  EXPECT_EQ(snapshot.Root<TombstonesMap>(longest).size(), 0);
  EXPECT_THROW(snapshot.Root<TombstonesMap>(""), UsageError);
  EXPECT_FALSE(snapshot.HasRoot(std::string(1000, 'n')));
}

TEST_P(TransactionTest, NothingCanBeDoneWithATransactionThatWasCommitted) {
  WriteTransaction transaction(space());
  auto& map = transaction.Root<TombstonesMap>("t");
  transaction.Commit();
  EXPECT_THROW(transaction.Commit(), UsageError);
  EXPECT_THROW(transaction.Root<TombstonesMap>("t"), UsageError);
  EXPECT_THROW(transaction.View<TombstonesMap>("t"), UsageError);
  EXPECT_THROW(transaction.Own<TombstonesMap>(), UsageError);
  EXPECT_THROW(transaction.Owned<TombstonesMap>(OID(1)), UsageError);
  EXPECT_THROW(transaction.Disown(map), UsageError);
  EXPECT_THROW(transaction.SetMeta("m", ""), UsageError);
  EXPECT_THROW(transaction.EraseMeta("m"), UsageError);
  EXPECT_THROW(transaction.Meta("m"), UsageError);
  EXPECT_THROW(transaction.ScanMeta("", [](auto, auto) { return true; }), UsageError);
  EXPECT_EQ(Snapshot(space()).Generation(), 2u);
  WriteTransaction another(space());
}

TEST_P(TransactionTest, ATransactionThatChangesNothingKeepsWhatIsInMemory) {
  CommitFilled<TombstonesMap>(space(), "t", 1000);
  site.Close();
  site.Open({.create = true, .cacheBytes = 1'000'000});
  const auto readAll = [&] {
    WriteTransaction transaction(space());
    EXPECT_EQ(NumbersOf(transaction.View<TombstonesMap>("t")).size(), 1000u);
  };
  readAll();
  std::uint64_t reads = watch().reads;
  EXPECT_GT(reads, 10u);
  readAll();
  EXPECT_EQ(watch().reads, reads);
  {
    WriteTransaction transaction(space());
    transaction.Root<TombstonesMap>("t").Insert(Key(1), {}, true);
    transaction.Commit();
  }
  reads = watch().reads;
  readAll();
  EXPECT_EQ(watch().reads, reads) << "a commit keeps them as well";
  {
    WriteTransaction transaction(space());
    transaction.Root<TombstonesMap>("t").Insert(Key(1), {}, true);
  }
  readAll();
  EXPECT_GT(watch().reads, reads) << "an abort forgets them";
}

TEST_P(TransactionTest, ACommitOfNothingIsNoCommit) {
  CommitFilled<TombstonesMap>(space(), "t", 10);
  const StoredState stored = Stored();
  const std::uint64_t commits = watch().commits;
  {
    WriteTransaction transaction(space());
    transaction.Commit();
  }
  {
    WriteTransaction transaction(space());
    EXPECT_EQ(NumbersOf(transaction.View<TombstonesMap>("t")).size(), 10u);
    transaction.Root<TombstonesMap>("t").Delete(Key(99));
    TombstonesMap stack;
    Fill(stack, 1, 300);
    transaction.Commit();
  }
  EXPECT_EQ(Stored(), stored);
  EXPECT_EQ(watch().commits, commits);
  CommitFilled<TombstonesMap>(space(), "t", 11);
  EXPECT_EQ(Stored().generation, stored.generation + 1);
}

TEST_P(TransactionTest, RootsThatCannotBeReadAgainAfterAnAbortAreReadByTheNextTransaction) {
  CommitFilled<TombstonesMap>(space(), "t", 300);
  TombstonesMap* map = nullptr;
  {
    WriteTransaction transaction(space());
    map = &transaction.Root<TombstonesMap>("t");
    map->clear();
    watch().failingRead.Set(1);
  }
  WriteTransaction transaction(space());
  EXPECT_EQ(map->size(), 300);
  EXPECT_EQ(FaultsOf(*map), "");
}

TEST_P(TransactionTest, CommitsOfAnotherProcessAreSeenByTheNextTransaction) {
  // A second handle on the same engine stands for the other process.
  EngineWatch otherWatch;
  const std::shared_ptr<Engine> sameEngine(&site.engine(), [](Engine*) {});
  const auto other = CSpace::OpenOn(WatchEngine(sameEngine, otherWatch));
  std::map<std::uint64_t, std::uint64_t> expected;
  for (std::uint64_t round = 1; round <= 10; ++round) {
    for (CSpace* turn : {&space(), other.get()}) {
      WriteTransaction transaction(*turn);
      auto& map = transaction.Root<TombstonesMap>("t");
      EXPECT_EQ(NumbersOf(std::as_const(map)), expected);
      EXPECT_EQ(FaultsOf(map), "");
      const std::uint64_t shift = round * 2 + (turn == other.get() ? 1 : 0);
      for (std::uint64_t n = 1 + 90 * (round % 4); n <= 90 * (round % 4) + 150; ++n) {
        map.Insert(Key(n), PayloadOf<TombstonesMap>(shift), true);
        expected[n] = shift;
      }
      for (std::uint64_t n = shift; n < 60; ++n) {
        map.Delete(Key(n));
        expected.erase(n);
      }
      if (turn == other.get()) Fill(transaction.Root<InsertionsMap>("theirs"), round, round);
      transaction.Commit();
    }
  }
  EXPECT_EQ(Snapshot(space()).Root<InsertionsMap>("theirs").size(), 10);
}

TEST_P(TransactionTest, ManyCommitsOnOneHandleEqualThoseOnFreshHandles) {
  std::map<std::uint64_t, std::uint64_t> expected;
  for (std::uint64_t round = 1; round <= 40; ++round) {
    {
      WriteTransaction transaction(space());
      auto& map = transaction.Root<TombstonesMap>("t");
      for (std::uint64_t n = round; n <= 40 * round; n += round) {
        map.Insert(Key(n), PayloadOf<TombstonesMap>(round), true);
        expected[n] = round;
      }
      transaction.Commit();
    }
    if (round % 8 == 0) site.Reopen();
    Snapshot snapshot(space());
    ASSERT_EQ(NumbersOf(snapshot.Root<TombstonesMap>("t")), expected) << round;
  }
}

}  // namespace
}  // namespace vemo::test
