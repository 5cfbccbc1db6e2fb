// Objects that nothing reaches leave the engine when they are collected, and nothing else does.
#include "store/collect.h"

#include <future>
#include <thread>

#include "store/verify.h"
#include "tests/store/store_fixture.h"

namespace vemo::test {
namespace {

using Phase = CollectProgress::Phase;

class CollectTest : public StoreTest {
 protected:
  // Makes root "t" anew with the keys 1 .. count and each number's payload plus `shift`, by copy and swap.
  void Assign(std::uint64_t count, std::uint64_t shift) {
    WriteTransaction transaction(space());
    TombstonesMap fresh;
    Fill(fresh, 1, count, shift);
    transaction.Root<TombstonesMap>("t") = fresh;
    transaction.Commit();
  }

  VerifyReport Verify() {
    Snapshot snapshot(space());
    return VerifySpace(snapshot);
  }

  void ExpectSoundAndNothingUnreachable() {
    const VerifyReport report = Verify();
    EXPECT_TRUE(report.findings.empty()) << report.findings.front().fault;
    EXPECT_EQ(report.unreachable, 0u);
  }

  // A root of three leaves' tree and a tree of a root and two leaves that nothing reaches.
  void MakeGarbage() {
    CommitFilled<TombstonesMap>(space(), "t", 120);
    Assign(160, 7);
    ASSERT_EQ(Verify().unreachable, kGarbage);
  }
  // What copy and swap left: the first tree's nodes. (Nodes of the temporaries have no records.)
  static constexpr std::uint64_t kGarbage = 3;

  template <class E>
  void ExpectRefusal(OID oid, const std::string& className) {
    const StoredState stored = Stored();
    try {
      Collect(space());
      ADD_FAILURE() << "it was collected";
    } catch (const E& error) {
      EXPECT_EQ(error.place().oid, oid) << error.what();
      EXPECT_EQ(error.place().root, "t");
      EXPECT_EQ(error.place().className, className);
      EXPECT_NE(std::string(error.what()).find("root \"t\""), std::string::npos) << error.what();
    }
    EXPECT_EQ(Stored(), stored);
  }
};
INSTANTIATE_STORE_TEST(CollectTest);

constexpr const char* kLeafClass = "vemo::FieldIdToVectorTombstonesMapLeafNode";
constexpr const char* kInternalClass = "vemo::FieldIdToVectorTombstonesMapInternalNode";
constexpr const char* kMapClass = "vemo::FieldIdToVectorTombstonesMap";

TEST_P(CollectTest, WhatCopyAssignmentLeavesBehindIsSwept) {
  MakeGarbage();
  const std::string text = CommittedText<TombstonesMap>("t");
  std::uint64_t bytes = 0;
  for (const auto& [oid, record] : Stored().records) bytes += record.size();
  const CollectReport report = Collect(space());
  EXPECT_EQ(report.records, 5u + kGarbage);
  EXPECT_EQ(report.marked, 5u);
  EXPECT_EQ(report.awaitingDeletion, 0u);
  EXPECT_EQ(report.unreachable, kGarbage);
  EXPECT_EQ(report.swept, kGarbage);
  EXPECT_EQ(report.sweptBytes, report.unreachableBytes);
  EXPECT_FALSE(report.cancelled);
  for (const auto& [oid, record] : Stored().records) bytes -= record.size();
  EXPECT_EQ(report.sweptBytes, bytes);
  EXPECT_EQ(CommittedText<TombstonesMap>("t"), text);
  ExpectSoundAndNothingUnreachable();
}

TEST_P(CollectTest, ASoundSpaceWithoutLeftoversIsNotWrittenTo) {
  CommitFilled<TombstonesMap>(space(), "t", 160);
  const StoredState stored = Stored();
  EXPECT_EQ(Collect(space()).swept, 0u);
  EXPECT_EQ(Stored(), stored);
}

TEST_P(CollectTest, ADryRunCountsAndRemovesNothing) {
  MakeGarbage();
  const StoredState stored = Stored();
  const CollectReport report = Collect(space(), {.dryRun = true});
  EXPECT_EQ(report.unreachable, kGarbage);
  EXPECT_EQ(report.swept, 0u);
  EXPECT_EQ(Stored(), stored);
}

TEST_P(CollectTest, MapsOfAllClassesAndOwnedOnesStay) {
  OID owned;
  {
    WriteTransaction transaction(space());
    Fill(transaction.Root<InsertionsMap>("i"), 1, 300);
    Fill(transaction.Root<HistoriesMap>("h"), 1, 300);
    transaction.Root<TombstonesMap>("empty");
    auto& map = transaction.Own<TombstonesMap>();
    Fill(map, 1, 300);
    owned = map.GetPersistObjState().m_oid;
    transaction.Commit();
  }
  MakeGarbage();
  site.Reopen();
  const std::size_t before = Stored().records.size();
  EXPECT_EQ(Collect(space()).swept, kGarbage);
  EXPECT_EQ(Stored().records.size(), before - kGarbage);
  ExpectSoundAndNothingUnreachable();
  WriteTransaction transaction(space());
  EXPECT_EQ(transaction.Owned<TombstonesMap>(owned).size(), 300);
}

TEST_P(CollectTest, TheQueueOfDeletionsIsWorkedOff) {
  CommitFilled<TombstonesMap>(space(), "t", 40'000);
  site.Reopen();
  {
    WriteTransaction transaction(space());
    transaction.Root<TombstonesMap>("t").clear();
    transaction.Commit();
  }
  const std::size_t records = Stored().records.size();
  ASSERT_GT(records, 500u);
  EXPECT_EQ(Collect(space(), {.dryRun = true}).awaitingDeletion, records - 1);
  const CollectReport report = Collect(space(), {.recordsPerCommit = 100});
  EXPECT_EQ(report.unreachable, 0u);
  EXPECT_EQ(Stored().records.size(), 1u);
  EXPECT_TRUE(Stored().queue.empty());
  ExpectSoundAndNothingUnreachable();
}

TEST_P(CollectTest, TheSweepCommitsABoundedNumberOfRecordsAtATime) {
  CommitFilled<TombstonesMap>(space(), "t", 2'000);
  Assign(10, 0);
  const std::uint64_t garbage = Verify().unreachable;
  ASSERT_EQ(garbage, 40u);
  const std::uint64_t commits = watch().commits;
  EXPECT_EQ(Collect(space(), {.recordsPerCommit = 15}).swept, garbage);
  EXPECT_EQ(watch().commits - commits, 3u);
  EXPECT_EQ(watch().removed.size(), 10u);
  EXPECT_THROW(Collect(space(), {.recordsPerCommit = 0}), UsageError);
}

TEST_P(CollectTest, CancelledWhileMarkingItRemovesNothing) {
  MakeGarbage();
  const StoredState stored = Stored();
  const CollectReport report = Collect(space(), {.progress = [](const CollectProgress&) { return false; }});
  EXPECT_TRUE(report.cancelled);
  EXPECT_EQ(Stored(), stored);
}

TEST_P(CollectTest, CancelledWhileSweepingWhatWasSweptStaysSweptAndTheNextOneGoesOn) {
  CommitFilled<TombstonesMap>(space(), "t", 2'000);
  Assign(120, 0);
  const std::size_t before = Stored().records.size();
  const CollectReport first = Collect(space(), {.recordsPerCommit = 10, .progress = [](const CollectProgress& progress) {
                                                  return progress.phase != Phase::kSweeping || progress.done < 20;
                                                }});
  EXPECT_TRUE(first.cancelled);
  EXPECT_EQ(first.swept, 20u);
  EXPECT_EQ(Stored().records.size(), before - 20);
  EXPECT_TRUE(Verify().findings.empty());
  const CollectReport second = Collect(space());
  EXPECT_EQ(second.swept, first.unreachable - 20);
  ExpectSoundAndNothingUnreachable();
}

TEST_P(CollectTest, CancelledWhileTheQueueIsWorkedOffTheRestStaysQueued) {
  CommitFilled<TombstonesMap>(space(), "t", 40'000);
  site.Reopen();
  {
    WriteTransaction transaction(space());
    transaction.Root<TombstonesMap>("t").clear();
    transaction.Commit();
  }
  const auto stop = [](const CollectProgress& progress) { return progress.phase != Phase::kDeleting; };
  EXPECT_TRUE(Collect(space(), {.recordsPerCommit = 100, .progress = stop}).cancelled);
  EXPECT_FALSE(Stored().queue.empty());
  ExpectSoundAndNothingUnreachable();
  Collect(space());
  EXPECT_EQ(Stored().records.size(), 1u);
}

TEST_P(CollectTest, ACommitOfTheSweepThatFailsLeavesASoundSpaceForTheNextOne) {
  CommitFilled<TombstonesMap>(space(), "t", 2'000);
  Assign(120, 3);
  const std::string text = CommittedText<TombstonesMap>("t");
  for (int failing = 1; failing <= 4; ++failing) {
    watch().failingCommit.Set(failing);
    EXPECT_THROW(Collect(space(), {.recordsPerCommit = 4}), InjectedFailure) << failing;
    watch().failingCommit.Set(0);
    if (failing % 2 == 0) site.Reopen();
    EXPECT_TRUE(Verify().findings.empty());
    EXPECT_EQ(CommittedText<TombstonesMap>("t"), text);
  }
  EXPECT_EQ(Collect(space()).swept, 40u - 4 * (0 + 1 + 2 + 3));
  EXPECT_EQ(CommittedText<TombstonesMap>("t"), text);
  ExpectSoundAndNothingUnreachable();
}

TEST_P(CollectTest, ItIsRefusedInsideATransaction) {
  MakeGarbage();
  WriteTransaction transaction(space());
  EXPECT_THROW(Collect(space()), UsageError);
  EXPECT_EQ(Collect(space(), {.dryRun = true}).unreachable, kGarbage);
}

TEST_P(CollectTest, ItSweepsNothingWhileALeafIsMissing) {
  MakeGarbage();
  const OID leaf = Snapshot(space()).Root<TombstonesMap>("t").m_lastLeaf.m_oid;
  site.Tamper(leaf, std::nullopt);
  ExpectRefusal<DanglingReference>(leaf, kLeafClass);
}

TEST_P(CollectTest, ItSweepsNothingWhileANodeIsDamaged) {
  MakeGarbage();
  const OID node = Snapshot(space()).Root<TombstonesMap>("t").m_root.m_oid;
  Bytes record = Stored().records.at(node);
  record[20] ^= 0x40;
  site.Tamper(node, record);
  ExpectRefusal<CorruptRecord>(node, kInternalClass);
}

TEST_P(CollectTest, ItSweepsNothingWhileARootMapIsMissing) {
  MakeGarbage();
  const OID map = Snapshot(space()).Root<TombstonesMap>("t").GetPersistObjState().m_oid;
  site.Tamper(map, std::nullopt);
  ExpectRefusal<DanglingReference>(map, kMapClass);
}

TEST_P(CollectTest, ItSweepsNothingWhileALeafNamesANeighbourThatIsNotTheTrees) {
  MakeGarbage();
  OID leaf;
  {
    WriteTransaction transaction(space());
    auto& map = transaction.Root<TombstonesMap>("t");
    auto* second = map.m_firstLeaf->m_next.Get();
    leaf = second->GetPersistObjState().m_oid;
    second->m_prev.Clear();
    second->MarkAsDirtyWithoutTrace();
    transaction.Commit();
  }
  ExpectRefusal<CorruptRecord>(leaf, kLeafClass);
}

TEST_P(CollectTest, ItSweepsNothingWhileTheMapEndsAtAnotherLeaf) {
  MakeGarbage();
  OID oid;
  {
    WriteTransaction transaction(space());
    auto& map = transaction.Root<TombstonesMap>("t");
    map.m_lastLeaf = map.m_firstLeaf.Get();
    map.MarkAsDirtyWithoutTrace();
    oid = map.GetPersistObjState().m_oid;
    transaction.Commit();
  }
  ExpectRefusal<CorruptRecord>(oid, kMapClass);
}

TEST_P(CollectTest, AnUnreachableRecordIsSweptEvenWhenItIsDamaged) {
  CommitFilled<TombstonesMap>(space(), "t", 120);
  const OID leaf = Snapshot(space()).Root<TombstonesMap>("t").m_firstLeaf.m_oid;
  Assign(160, 7);
  Bytes record = Stored().records.at(leaf);
  for (std::size_t i = 0; i < 12; ++i) record[i] = 0xFF;  // the number of its commit too
  site.Tamper(leaf, record);
  EXPECT_EQ(Collect(space()).swept, kGarbage);
  ExpectSoundAndNothingUnreachable();
}

TEST_P(CollectTest, ASnapshotThatIsOlderGoesOnReadingWhatIsSwept) {
  CommitFilled<TombstonesMap>(space(), "t", 120);
  Snapshot older(space());
  Assign(160, 7);
  EXPECT_EQ(Collect(space()).swept, kGarbage);
  EXPECT_EQ(FaultsOf(older.Root<TombstonesMap>("t")), "");
  EXPECT_EQ(older.Root<TombstonesMap>("t").size(), 120);
}

TEST_P(CollectTest, WhatTransactionsMakeBetweenItsCommitsStays) {
  CommitFilled<TombstonesMap>(space(), "t", 2'000);
  Assign(120, 0);
  std::uint64_t key = 1'000;
  const auto insert = [&](const CollectProgress& progress) {
    if (progress.phase != Phase::kSweeping) return true;
    CommitFilled<TombstonesMap>(space(), "made " + std::to_string(++key), 150);
    Assign(120 + key % 50, key);  // garbage that is newer than the marking
    return true;
  };
  EXPECT_EQ(Collect(space(), {.recordsPerCommit = 10, .progress = insert}).swept, 40u);
  EXPECT_TRUE(Verify().findings.empty());
  EXPECT_EQ(Snapshot(space()).RootNames().size(), key - 1'000 + 1);
  EXPECT_GT(Verify().unreachable, 0u) << "the newer garbage is the next collection's";
  Collect(space());
  ExpectSoundAndNothingUnreachable();
}

TEST_P(CollectTest, NodesThatAnOpenTransactionHasTakenOutOfARootStay) {
  MakeGarbage();
  WriteTransaction transaction(space());
  TombstonesMap taken;
  transaction.Root<TombstonesMap>("t").swap(taken);
  std::promise<void> marked;
  std::thread collector([&] {
    bool told = false;
    const CollectReport report = Collect(space(), {.progress = [&](const CollectProgress& progress) {
                                                     if (!told && progress.done == 5) {
                                                       told = true;
                                                       marked.set_value();
                                                     }
                                                     return true;
                                                   }});
    EXPECT_EQ(report.swept, kGarbage);
  });
  marked.get_future().wait();  // the sweep waits for this transaction
  transaction.Root<TombstonesMap>("other").swap(taken);
  transaction.Commit();
  collector.join();
  EXPECT_EQ(NumbersOf(Snapshot(space()).Root<TombstonesMap>("other")).size(), 160u);
  ExpectSoundAndNothingUnreachable();
}

TEST_P(CollectTest, ItWorksBesideAWriterOnAnotherThread) {
  CommitFilled<TombstonesMap>(space(), "t", 500);
  std::thread writer([this] {
    for (std::uint64_t n = 1; n <= 30; ++n) {
      Assign(300 + n, n);
      CommitFilled<InsertionsMap>(space(), "i", 40 * n);
      WriteTransaction transaction(space());
      if (n % 5 == 0) transaction.Root<InsertionsMap>("i").clear();
      transaction.Commit();
    }
  });
  std::uint64_t swept = 0;
  for (int i = 0; i < 30; ++i) swept += Collect(space(), {.recordsPerCommit = 5}).swept;
  writer.join();
  swept += Collect(space()).swept;
  EXPECT_GT(swept, 0u);
  ExpectSoundAndNothingUnreachable();
  std::map<std::uint64_t, std::uint64_t> expected;
  for (std::uint64_t n = 1; n <= 330; ++n) expected[n] = n + 30;
  EXPECT_EQ(NumbersOf(Snapshot(space()).Root<TombstonesMap>("t")), expected);
  site.Reopen();
  ExpectSoundAndNothingUnreachable();
}

}  // namespace
}  // namespace vemo::test
