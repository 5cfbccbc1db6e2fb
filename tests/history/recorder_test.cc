// What a few edits leave in the three maps, worked out by hand.
#include <gtest/gtest.h>

#include "recorded_fields.h"
#include "vxUtils/ByteForms.h"

namespace vemo::test {
namespace {

class RecorderTest : public ::testing::Test {
 protected:
  void Insert(char site, ssize_t position, ssize_t n) {
    m_recorded.recorder().Insert(Site(site), m_field, position, n);
  }
  void Delete(char site, ssize_t position, ssize_t n) {
    m_recorded.recorder().Delete(Site(site), m_field, position, n);
  }

  // The insertions, the tombstones and the deletions. That the two lists of insertions agree, and the numbers
  // that the runs' text leaves out, are checked on the way.
  std::string Maps() {
    m_recorded.Settle();
    const VectorInsertions& insertions = *std::as_const(m_recorded.insertions()).rFind(m_field);
    const VectorInsertionsAndDeletions& history = *std::as_const(m_recorded.history()).rFind(m_field);
    EXPECT_EQ(ToBytes(insertions), ToBytes(history.m_insertions));
    ssize_t q = 0;
    for (const auto* run = insertions.m_c.m_first; run != nullptr; run = run->m_next) {
      EXPECT_EQ(run->m_q, q);
      EXPECT_EQ(run->m_u, run->m_opid.t + run->m_n - 1);
      q += run->m_n;
    }
    EXPECT_EQ(insertions.m_u2, q);
    return RunsText(insertions.m_c) + " | " +
           ToText(std::as_const(m_recorded.tombstones()).rFind(m_field)->m_tombstones) + " | " +
           RunsText(history.m_deletions);
  }

  const FieldId m_field = Field(1);
  RecordingSpace m_recorded;
};

TEST_F(RecorderTest, OneInsertionIsOneRun) {
  Insert('A', 0, 5);
  EXPECT_EQ(Maps(), "A0-4@0 | {} | ");
}

TEST_F(RecorderTest, ContinuingInsertionJoinsItsRun) {
  Insert('A', 0, 2);
  Insert('A', 2, 1);
  Insert('A', 3, 4);
  EXPECT_EQ(Maps(), "A0-6@0 | {} | ");
}

TEST_F(RecorderTest, InsertionInTheMiddleSplitsTheRun) {
  Insert('A', 0, 5);
  Insert('B', 2, 3);
  EXPECT_EQ(Maps(), "A0-1@0 B0-2@2 A2-4@5 | {} | ");
}

TEST_F(RecorderTest, OwnInsertionInTheMiddleSplitsTheRunAsWell) {
  Insert('A', 0, 4);
  Insert('A', 2, 1);
  Insert('A', 3, 1);
  EXPECT_EQ(Maps(), "A0-1@0 A4-5@2 A2-3@4 | {} | ");
}

TEST_F(RecorderTest, InsertionAtTheStartIsARunOfItsOwn) {
  Insert('A', 0, 2);
  Insert('A', 0, 1);
  Insert('A', 0, 1);
  EXPECT_EQ(Maps(), "A3@0 A2@1 A0-1@2 | {} | ");
}

TEST_F(RecorderTest, AdjacentRunOfAnotherSiteWithTheNextNumberStaysApart) {
  Insert('A', 0, 2);
  Insert('B', 0, 2);
  Insert('B', 4, 1);
  Insert('A', 5, 1);
  EXPECT_EQ(Maps(), "B0-1@0 A0-1@2 B2@4 A2@5 | {} | ");
}

TEST_F(RecorderTest, NumbersCountOverDeletionsToo) {
  Insert('A', 0, 3);
  Delete('A', 0, 2);
  Insert('A', 1, 1);
  EXPECT_EQ(Maps(), "A0-2@0 A5@3 | {[0,2)} | A3-4@0");
}

TEST_F(RecorderTest, TypingOnAfterAPauseForAnotherFieldStartsARun) {
  Insert('A', 0, 1);
  m_recorded.recorder().Insert(Site('A'), Field(2), 0, 1);
  Insert('A', 1, 1);
  EXPECT_EQ(Maps(), "A0@0 A2@1 | {} | ");
}

TEST_F(RecorderTest, DeletionLeavesTombstonesInPlace) {
  Insert('A', 0, 6);
  Delete('B', 1, 2);
  EXPECT_EQ(Maps(), "A0-5@0 | {[1,3)} | B0-1@1");
}

TEST_F(RecorderTest, DeletionOverSeveralSegmentsSkipsTheTombstonesBetween) {
  Insert('A', 0, 10);
  Delete('A', 2, 2);  // q 2 and 3
  Delete('A', 4, 1);  // q 6
  Delete('B', 1, 5);  // q 1, 4, 5, 7, 8
  EXPECT_EQ(Maps(), "A0-9@0 | {[1,9)} | B0@1 A10-11@2 B1-2@4 A12@6 B3-4@7");
}

TEST_F(RecorderTest, DeletingForwardsAtOnePositionIsOneRun) {
  Insert('A', 0, 5);
  Delete('A', 1, 1);
  Delete('A', 1, 2);
  EXPECT_EQ(Maps(), "A0-4@0 | {[1,4)} | A5-7@1");
}

TEST_F(RecorderTest, BackspacingIsOneTombstoneRunOfSeveralDeletions) {
  Insert('A', 0, 5);
  Delete('A', 3, 1);
  Delete('A', 2, 1);
  Delete('A', 1, 1);
  EXPECT_EQ(Maps(), "A0-4@0 | {[1,4)} | A7@1 A6@2 A5@3");
}

TEST_F(RecorderTest, AdjacentDeletionsOfTwoSitesWithContinuingNumbersStayApart) {
  Insert('C', 0, 4);
  Delete('A', 1, 1);
  Insert('B', 0, 1);
  Delete('B', 2, 1);  // number 1, as A's next would be
  EXPECT_EQ(Maps(), "B0@0 C0-3@1 | {[2,4)} | A0@2 B1@3");
}

TEST_F(RecorderTest, InsertionGoesBeforeTheTombstonesThatFollowItsLeftNeighbour) {
  Insert('A', 0, 4);
  Delete('A', 1, 2);
  Insert('B', 1, 1);
  EXPECT_EQ(Maps(), "A0@0 B0@1 A1-3@2 | {[2,4)} | A4-5@2");
}

TEST_F(RecorderTest, InsertionAtTheStartGoesBeforeTombstones) {
  Insert('A', 0, 3);
  Delete('A', 0, 3);
  Insert('B', 0, 2);
  EXPECT_EQ(Maps(), "B0-1@0 A0-2@2 | {[2,5)} | A3-5@2");
}

TEST_F(RecorderTest, AppendingAfterTrailingTombstonesGoesBeforeThem) {
  Insert('A', 0, 3);
  Delete('A', 2, 1);
  Insert('A', 2, 1);
  EXPECT_EQ(Maps(), "A0-1@0 A4@2 A2@3 | {[3,4)} | A3@3");
}

TEST_F(RecorderTest, ReplacedElementsLieBeforeTheirTombstones) {
  Insert('A', 0, 6);
  Delete('B', 2, 2);
  Insert('B', 2, 2);
  Delete('B', 2, 2);
  EXPECT_EQ(Maps(), "A0-1@0 B2-3@2 A2-5@4 | {[2,6)} | B4-5@2 B0-1@4");
}

TEST_F(RecorderTest, InsertionBeforeADeletedRunMovesIt) {
  Insert('A', 0, 8);
  Delete('A', 6, 1);
  Delete('A', 2, 2);
  Insert('B', 1, 10);
  EXPECT_EQ(Maps(), "A0@0 B0-9@1 A1-7@11 | {[12,14)[16,17)} | A9-10@12 A8@16");
}

TEST_F(RecorderTest, LiveLengthFollowsEveryEdit) {
  EXPECT_EQ(m_recorded.recorder().LiveLength(m_field), 0);
  Insert('A', 0, 8);
  EXPECT_EQ(m_recorded.recorder().LiveLength(m_field), 8);
  Delete('A', 2, 3);
  EXPECT_EQ(m_recorded.recorder().LiveLength(m_field), 5);
  m_recorded.Settle();
  EXPECT_EQ(m_recorded.recorder().LiveLength(m_field), 5) << "counted from the payloads";
}

TEST_F(RecorderTest, NumbersOfASiteCountOverItsFields) {
  m_recorded.recorder().Insert(Site('A'), Field(1), 0, 3);
  m_recorded.recorder().Insert(Site('A'), Field(2), 0, 2);
  m_recorded.recorder().Delete(Site('A'), Field(1), 0, 1);
  m_recorded.recorder().Insert(Site('B'), Field(2), 0, 1);
  m_recorded.Settle();
  EXPECT_EQ(RunsText(m_recorded.insertions().rFind(Field(2))->m_c), "B0@0 A3-4@1");
  EXPECT_EQ(RunsText(m_recorded.history().rFind(Field(1))->m_deletions), "A5@0");
  EXPECT_EQ(m_recorded.numbers().Next(Site('A')), 6);
  EXPECT_EQ(m_recorded.numbers().Next(Site('B')), 1);
  EXPECT_EQ(m_recorded.numbers().Next(Site('C')), 0);
}

TEST_F(RecorderTest, PayloadsHaveTheirTextForms) {
  Insert('A', 0, 3);
  Delete('A', 1, 1);
  m_recorded.Settle();
  const std::string insertions =
      "insertions(u2=3 c=[(opid=S00000041-0000-0000-0000-000000000001:0 q=0 n=3 u=2)])";
  EXPECT_EQ(ToText(*m_recorded.insertions().rFind(m_field)), insertions);
  EXPECT_EQ(ToText(*m_recorded.tombstones().rFind(m_field)), "[.*]{[1,2)}");
  EXPECT_EQ(ToText(*m_recorded.history().rFind(m_field)),
            "(i=" + insertions + " d=[(opid=S00000041-0000-0000-0000-000000000001:3 q=1 n=1)])");
}

}  // namespace
}  // namespace vemo::test
