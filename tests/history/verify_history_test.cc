// Each kind of damage to the three maps, and the one finding that it causes.
#include "history/verify_history.h"

#include <gtest/gtest.h>

#include "recorded_fields.h"

namespace vemo::test {
namespace {

using Strings = std::vector<std::string>;

// Field 1 has twelve elements in three runs, of which B and then A deleted five; field 2 has two of A's.
class VerifyHistoryTest : public ::testing::Test {
 protected:
  VerifyHistoryTest() {
    Recorder& recorder = m_recorded.recorder();
    recorder.Insert(Site('A'), Field(1), 0, 8);  // A0-7
    recorder.Insert(Site('B'), Field(1), 3, 4);  // B0-3
    recorder.Delete(Site('B'), Field(1), 1, 3);  // B4-6
    recorder.Delete(Site('A'), Field(1), 7, 2);  // A8-9
    recorder.Insert(Site('A'), Field(2), 0, 2);  // A10-11
    m_recorded.Commit();
  }

  Strings Findings() {
    m_recorded.Commit();
    Snapshot snapshot(m_recorded.space());
    Strings findings;
    for (const HistoryFinding& finding : VerifyHistory(snapshot))
      findings.push_back(FieldIdText(finding.field) + " " + finding.fault);
    return findings;
  }

  // Changes the insertions of field 1 in both maps that have them.
  template <class Change>
  void ChangeInsertions(const Change& change) {
    change(m_recorded.insertions()[Field(1)]);
    change(m_recorded.history()[Field(1)].m_insertions);
  }
  VectorDeletions& Deletions() { return m_recorded.history()[Field(1)].m_deletions; }

  RecordingSpace m_recorded;
};

TEST_F(VerifyHistoryTest, FindsNothingInWhatARecorderMade) {
  EXPECT_EQ(RunsText(m_recorded.insertions()[Field(1)].m_c), "A0-2@0 B0-3@3 A3-7@7");
  EXPECT_EQ(RunsText(Deletions()), "B4-6@1 A8-9@10");
  EXPECT_EQ(Findings(), Strings());
}

TEST_F(VerifyHistoryTest, FindsAMissingTombstonesEntry) {
  m_recorded.tombstones().erase(Field(2));
  EXPECT_EQ(Findings(), Strings{"2:0 it has insertions, but no tombstones entry"});
}

TEST_F(VerifyHistoryTest, FindsAMissingHistory) {
  m_recorded.history().erase(Field(2));
  EXPECT_EQ(Findings(), Strings{"2:0 it has insertions, but no history"});
}

TEST_F(VerifyHistoryTest, FindsTombstonesWithoutInsertions) {
  m_recorded.tombstones()[Field(3)];
  EXPECT_EQ(Findings(), Strings{"3:0 it has tombstones, but no insertions"});
}

TEST_F(VerifyHistoryTest, FindsAHistoryWithoutInsertions) {
  m_recorded.history()[Field(3)];
  EXPECT_EQ(Findings(), Strings{"3:0 it has a history, but no insertions"});
}

TEST_F(VerifyHistoryTest, FindsInsertionsThatDiffer) {
  m_recorded.history()[Field(1)].m_insertions.m_c.m_first->m_n =
      2;  // what the payload's own equality leaves out
  EXPECT_EQ(Findings(), Strings{"1:0 insertions and history tell different insertions"});
}

TEST_F(VerifyHistoryTest, FindsAGapBetweenInsertedRuns) {
  ChangeInsertions([](VectorInsertions& insertions) {
    insertions.m_c.m_first->m_next->m_next->m_q += 1;
    insertions.m_u2 += 1;
  });
  EXPECT_EQ(Findings(), Strings{"1:0 the inserted run at 8 should begin at 7"});
}

TEST_F(VerifyHistoryTest, FindsAnEmptyInsertedRun) {
  ChangeInsertions([](VectorInsertions& insertions) { AppendRun(insertions, {Site('C'), 5}, 0); });
  EXPECT_EQ(Findings(), Strings{"1:0 the inserted run at 12 is empty"});
}

TEST_F(VerifyHistoryTest, FindsAWrongLastNumber) {
  ChangeInsertions([](VectorInsertions& insertions) { insertions.m_c.m_first->m_u = 7; });
  EXPECT_EQ(Findings(), Strings{"1:0 the inserted run at 0 has another number for its last element"});
}

TEST_F(VerifyHistoryTest, FindsInsertedRunsThatShouldBeOne) {
  ChangeInsertions([](VectorInsertions& insertions) {
    auto* last = insertions.m_c.m_first->m_next->m_next;
    VectorInsertionInterval tail = *last;
    tail.m_opid.t += 2;
    tail.m_q += 2;
    tail.m_n -= 2;
    last->m_n = 2;
    last->m_u = last->m_opid.t + 1;
    insertions.m_c.InsertAfter(last, tail);
  });
  EXPECT_EQ(Findings(),
            Strings{"1:0 the inserted run at 9 continues the one before it and should be part of it"});
}

TEST_F(VerifyHistoryTest, FindsAWrongLength) {
  ChangeInsertions([](VectorInsertions& insertions) { insertions.m_u2 = 13; });
  EXPECT_EQ(Findings(), Strings{"1:0 the inserted runs end at 12, not at the field's length 13"});
}

TEST_F(VerifyHistoryTest, FindsAnEmptyDeletedRun) {
  AppendRun(Deletions(), {Site('C'), 0}, 12, 0);
  EXPECT_EQ(Findings(), Strings{"1:0 the deleted run at 12 is empty or overlaps the one before it"});
}

TEST_F(VerifyHistoryTest, FindsDeletedRunsThatOverlap) {
  AppendRun(Deletions(), {Site('C'), 0}, 11, 1);
  EXPECT_EQ(Findings(), Strings{"1:0 the deleted run at 11 is empty or overlaps the one before it"});
}

TEST_F(VerifyHistoryTest, FindsDeletedRunsThatShouldBeOne) {
  Deletions().m_first->m_next->m_n = 1;
  AppendRun(Deletions(), {Site('A'), 9}, 11, 1);
  EXPECT_EQ(Findings(),
            Strings{"1:0 the deleted run at 11 continues the one before it and should be part of it"});
}

TEST_F(VerifyHistoryTest, FindsTombstonesThatNobodyDeleted) {
  IntervalList<ssize_t> erased;
  m_recorded.tombstones()[Field(1)].Erasep(0, 1, erased);
  EXPECT_EQ(Findings(), Strings{"1:0 the deleted runs are not the tombstones"});
}

TEST_F(VerifyHistoryTest, FindsDeletionsWithoutTombstones) {
  m_recorded.tombstones()[Field(1)] = VectorTombstones();
  EXPECT_EQ(Findings(), Strings{"1:0 the deleted runs are not the tombstones"});
}

TEST_F(VerifyHistoryTest, FindsADeletedRunBehindTheEnd) {
  AppendRun(Deletions(), {Site('C'), 0}, 12, 3);
  m_recorded.tombstones()[Field(1)].m_tombstones[1].t2 = 15;
  EXPECT_EQ(Findings(), Strings{"1:0 a deleted run lies behind the end of the field"});
}

TEST_F(VerifyHistoryTest, FindsANumberThatInsertedTwice) {
  m_recorded.insertions()[Field(2)].m_c.m_first->m_opid.t = 4;
  m_recorded.insertions()[Field(2)].m_c.m_first->m_u = 5;
  m_recorded.history()[Field(2)].m_insertions = m_recorded.insertions()[Field(2)];
  EXPECT_EQ(Findings(),
            Strings{"2:0 site " + GuidText(Site('A')) + " has used number 4 twice, also in field 1:0"});
}

TEST_F(VerifyHistoryTest, FindsANumberThatInsertedAndDeleted) {
  Deletions().m_first->m_opid.t = 2;
  EXPECT_EQ(Findings(),
            Strings{"1:0 site " + GuidText(Site('B')) + " has used number 2 twice, also in field 1:0"});
}

TEST_F(VerifyHistoryTest, FindsEveryUseOfANumberInsideALongRun) {
  for (const std::uint64_t field : {3u, 4u}) {
    const Opid first{Site('A'), field == 3 ? 4 : 6};
    AppendRun(m_recorded.insertions()[Field(field)], first, 1);
    AppendRun(m_recorded.history()[Field(field)].m_insertions, first, 1);
    m_recorded.tombstones()[Field(field)];
  }
  const std::string site = "site " + GuidText(Site('A'));
  EXPECT_EQ(Findings(), (Strings{"3:0 " + site + " has used number 4 twice, also in field 1:0",
                                 "4:0 " + site + " has used number 6 twice, also in field 1:0"}));
}

TEST_F(VerifyHistoryTest, FindsDamageInEveryField) {
  m_recorded.tombstones().erase(Field(1));
  m_recorded.tombstones().erase(Field(2));
  EXPECT_EQ(Findings().size(), 2u);
}

TEST(HasHistoryTest, WantsAllThreeMaps) {
  const auto space = CSpace::Open("memory:");
  EXPECT_FALSE(HasHistory(Snapshot(*space)));
  {
    WriteTransaction transaction(*space);
    transaction.Root<FieldIdToVectorInsertionsMap>(kInsertionsRoot);
    transaction.Root<FieldIdToVectorTombstonesMap>(kTombstonesRoot);
    transaction.Commit();
  }
  EXPECT_FALSE(HasHistory(Snapshot(*space)));
  {
    WriteTransaction transaction(*space);
    transaction.Root<FieldIdToVectorInsertionsAndDeletionsMap>(kHistoryRoot);
    transaction.Commit();
  }
  EXPECT_TRUE(HasHistory(Snapshot(*space)));
}

}  // namespace
}  // namespace vemo::test
