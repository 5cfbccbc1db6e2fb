// Edits that are refused have changed nothing, and those that are interrupted are never committed.
#include <gtest/gtest.h>

#include <new>

#include "recorded_fields.h"
#include "store/error.h"
#include "tests/support/failing_allocator.h"

namespace vemo::test {
namespace {

template <class Action>
std::string RefusalOf(const Action& action) {
  try {
    action();
  } catch (const UsageError& error) {
    return error.what();
  }
  return "it was not refused";
}

class RecorderRefusalTest : public ::testing::Test {
 protected:
  RecorderRefusalTest() {
    m_recorded.recorder().Insert(Site('A'), Field(1), 0, 6);
    m_recorded.recorder().Delete(Site('A'), Field(1), 2, 2);
  }

  // The message of the refusal, after checking that everything is as it was.
  template <class Action>
  std::string RefusalWithoutChange(const Action& action) {
    const PayloadBytes before = m_recorded.Contents();
    const auto numbers = m_recorded.numbers().All();
    const ssize_t live = m_recorded.recorder().LiveLength(Field(1));
    const std::string refusal = RefusalOf([&] { action(m_recorded.recorder()); });
    EXPECT_EQ(m_recorded.recorder().LiveLength(Field(1)), live);
    EXPECT_EQ(m_recorded.Contents(), before);
    EXPECT_EQ(m_recorded.numbers().All(), numbers);
    EXPECT_FALSE(m_recorded.transaction().IsPoisoned());
    return refusal;
  }

  // A field of `length` elements, all of one run and live.
  void MakeField(const FieldId& field, ssize_t length) {
    VectorInsertions insertions;
    AppendRun(insertions, {Site('Z'), 0}, length);
    VectorInsertionsAndDeletions history;
    history.m_insertions = insertions;
    m_recorded.insertions().Insert(field, insertions, true);
    m_recorded.tombstones().Insert(field, {}, true);
    m_recorded.history().Insert(field, history, true);
  }

  RecordingSpace m_recorded;
};

TEST_F(RecorderRefusalTest, InsertionBehindTheEnd) {
  EXPECT_EQ(RefusalWithoutChange([](Recorder& recorder) { recorder.Insert(Site('A'), Field(1), 5, 1); }),
            "field 1:0: live position 5 is out of range; the field has 4 live elements");
}

TEST_F(RecorderRefusalTest, InsertionBeforeTheStart) {
  EXPECT_EQ(RefusalWithoutChange([](Recorder& recorder) { recorder.Insert(Site('A'), Field(1), -1, 1); }),
            "field 1:0: live position -1 is out of range; the field has 4 live elements");
}

TEST_F(RecorderRefusalTest, InsertionIntoTheMiddleOfAFieldThatIsNotThere) {
  EXPECT_EQ(RefusalWithoutChange([](Recorder& recorder) { recorder.Insert(Site('A'), Field(9), 1, 1); }),
            "field 9:0: live position 1 is out of range; the field has 0 live elements");
  EXPECT_FALSE(m_recorded.insertions().contains(Field(9)));
}

TEST_F(RecorderRefusalTest, InsertionOfNothingOrLess) {
  EXPECT_EQ(RefusalWithoutChange([](Recorder& recorder) { recorder.Insert(Site('A'), Field(1), 0, 0); }),
            "field 1:0: an insertion of 0 elements");
  EXPECT_EQ(RefusalWithoutChange([](Recorder& recorder) { recorder.Insert(Site('A'), Field(1), 0, -3); }),
            "field 1:0: an insertion of -3 elements");
}

TEST_F(RecorderRefusalTest, DeletionOverTheEnd) {
  EXPECT_EQ(RefusalWithoutChange([](Recorder& recorder) { recorder.Delete(Site('A'), Field(1), 1, 4); }),
            "field 1:0: a deletion of 4 elements at live position 1 is out of range; the field has 4 live "
            "elements");
}

TEST_F(RecorderRefusalTest, DeletionOfMoreElementsThanCanBeCounted) {
  constexpr ssize_t kMost = std::numeric_limits<ssize_t>::max();
  EXPECT_NE(RefusalWithoutChange([](Recorder& recorder) {
              recorder.Delete(Site('A'), Field(1), 3, kMost);
            }).find("is out of range"),
            std::string::npos);
  EXPECT_NE(RefusalWithoutChange([](Recorder& recorder) {
              recorder.Insert(Site('A'), Field(1), 3, kMost);
            }).find("it cannot grow"),
            std::string::npos);
}

TEST_F(RecorderRefusalTest, DeletionOutsideTheField) {
  EXPECT_NE(RefusalWithoutChange([](Recorder& recorder) { recorder.Delete(Site('A'), Field(1), -1, 1); }),
            "");
  EXPECT_EQ(RefusalWithoutChange([](Recorder& recorder) { recorder.Delete(Site('A'), Field(1), 4, 1); }),
            "field 1:0: a deletion of 1 elements at live position 4 is out of range; the field has 4 live "
            "elements");
  EXPECT_EQ(RefusalWithoutChange([](Recorder& recorder) { recorder.Delete(Site('A'), Field(7), 0, 1); }),
            "field 7:0: a deletion of 1 elements at live position 0 is out of range; the field has 0 live "
            "elements");
  EXPECT_FALSE(m_recorded.tombstones().contains(Field(7)));
}

TEST_F(RecorderRefusalTest, DeletionOfNothing) {
  EXPECT_EQ(RefusalWithoutChange([](Recorder& recorder) { recorder.Delete(Site('A'), Field(1), 0, 0); }),
            "field 1:0: a deletion of 0 elements");
}

TEST_F(RecorderRefusalTest, OperationNumbersBehindTheLast) {
  m_recorded.numbers().SetNext(Site('A'), kMaxRecordedNumber - 1);
  const std::string refusal =
      "site " + GuidText(Site('A')) + " has no 3 operation numbers left; numbers end at 4294967295";
  EXPECT_EQ(RefusalWithoutChange([](Recorder& recorder) { recorder.Insert(Site('A'), Field(1), 1, 3); }),
            refusal);
  EXPECT_EQ(RefusalWithoutChange([](Recorder& recorder) { recorder.Delete(Site('A'), Field(1), 1, 3); }),
            refusal);
}

TEST_F(RecorderRefusalTest, TheLastOperationNumberIsRecordedAndReadBack) {
  m_recorded.numbers().SetNext(Site('A'), kMaxRecordedNumber - 1);
  m_recorded.recorder().Insert(Site('A'), Field(2), 0, 2);
  EXPECT_NE(RefusalWithoutChange([](Recorder& recorder) { recorder.Insert(Site('A'), Field(2), 2, 1); }), "");
  EXPECT_EQ(RefusalWithoutChange([](Recorder& recorder) { recorder.Delete(Site('A'), Field(2), 0, 1); }),
            "site " + GuidText(Site('A')) + " has no 1 operation numbers left; numbers end at 4294967295");
  m_recorded.recorder().Delete(Site('B'), Field(2), 1, 1);
  m_recorded.Commit();
  Snapshot snapshot(m_recorded.space());
  const auto& insertions = snapshot.Root<FieldIdToVectorInsertionsMap>(kInsertionsRoot);
  EXPECT_EQ(RunsText(insertions.rFind(Field(2))->m_c), "A4294967294-4294967295@0");
  EXPECT_EQ(insertions.rFind(Field(2))->m_c.m_first->m_u, kMaxRecordedNumber);
}

TEST_F(RecorderRefusalTest, PositionsBehindTheLast) {
  MakeField(Field(3), kMaxRecordedNumber - 1);
  EXPECT_EQ(RefusalWithoutChange([](Recorder& recorder) { recorder.Insert(Site('A'), Field(3), 5, 2); }),
            "field 3:0: it cannot grow by 2 elements; positions end at 4294967295");
  m_recorded.recorder().Insert(Site('A'), Field(3), 5, 1);
  EXPECT_EQ(RefusalWithoutChange([](Recorder& recorder) { recorder.Insert(Site('A'), Field(3), 0, 1); }),
            "field 3:0: it cannot grow by 1 elements; positions end at 4294967295")
      << "the recorder knows the length from its own edits";
}

TEST_F(RecorderRefusalTest, DeletedElementsStillTakePositions) {
  MakeField(Field(3), kMaxRecordedNumber);
  m_recorded.recorder().Delete(Site('A'), Field(3), 0, 1'000);
  EXPECT_EQ(RefusalWithoutChange([](Recorder& recorder) { recorder.Insert(Site('A'), Field(3), 0, 1); }),
            "field 3:0: it cannot grow by 1 elements; positions end at 4294967295");
  m_recorded.recorder().Delete(Site('A'), Field(3), kMaxRecordedNumber - 1'001, 1);
  m_recorded.Commit();
  Snapshot snapshot(m_recorded.space());
  EXPECT_EQ(
      RunsText(
          snapshot.Root<FieldIdToVectorInsertionsAndDeletionsMap>(kHistoryRoot).rFind(Field(3))->m_deletions),
      "A8-1007@0 A1008@4294967294");
}

// --- Committing edits in place ---

TEST(RecorderCommitTest, EditsOfExistingEntriesArePersistedInEveryLeaf) {
  RecordingSpace recorded;
  constexpr std::uint64_t kFields = 1'000;  // several leaves in each map
  for (std::uint64_t i = 1; i <= kFields; ++i) recorded.recorder().Insert(Site('A'), Field(i), 0, 3);
  recorded.Commit();
  const PayloadBytes before = CommittedBytes(recorded.space());
  for (std::uint64_t i = 1; i <= kFields; i += 37) {
    recorded.recorder().Insert(Site('B'), Field(i), 1, 2);
    recorded.recorder().Delete(Site('B'), Field(i), 4, 1);
  }
  recorded.Commit();
  const PayloadBytes after = CommittedBytes(recorded.space());
  ASSERT_EQ(after.size(), 3 * kFields);
  for (std::uint64_t i = 1; i <= kFields; ++i) {
    for (const char* map : {kInsertionsRoot, kTombstonesRoot, kHistoryRoot}) {
      const std::string name = std::string(map) + " " + FieldIdText(Field(i));
      EXPECT_EQ(after.at(name) != before.at(name), i % 37 == 1) << name;
    }
  }
}

TEST(RecorderCommitTest, AbortedEditsAreGone) {
  RecordingSpace recorded;
  recorded.recorder().Insert(Site('A'), Field(1), 0, 3);
  recorded.Commit();
  const PayloadBytes before = recorded.Contents();
  recorded.recorder().Insert(Site('A'), Field(1), 1, 3);
  recorded.recorder().Delete(Site('A'), Field(1), 0, 2);
  recorded.recorder().Insert(Site('A'), Field(2), 0, 1);
  recorded.Abort();
  EXPECT_EQ(recorded.Contents(), before);
  EXPECT_EQ(recorded.recorder().LiveLength(Field(1)), 3);
}

// --- Interrupted edits ---

// Runs `edit` with its first allocation failing, then the second, and so on, until it succeeds. A failure
// must either have changed nothing or keep the transaction from being committed. Returns how many
// transactions it has poisoned.
template <class Edit>
int CountPoisonings(RecordingSpace& recorded, const Edit& edit) {
  const PayloadBytes before = recorded.Contents();
  recorded.Abort();
  int poisonings = 0;
  for (int nth = 1; nth < 200; ++nth) {
    SCOPED_TRACE("allocation " + std::to_string(nth));
    const SiteNumbers numbers = recorded.numbers();
    bool failed = false;
    try {
      const FailingAllocation failing(nth);
      edit(recorded.recorder());
    } catch (const std::bad_alloc&) {
      failed = true;
    }
    if (!failed) return poisonings;
    EXPECT_EQ(recorded.numbers().Next(Site('B')), numbers.Next(Site('B')));
    if (recorded.transaction().IsPoisoned()) {
      ++poisonings;
      recorded.Settle();
      EXPECT_THROW(recorded.transaction().Commit(), PoisonedTransaction);
    } else {
      EXPECT_EQ(recorded.Contents(), before);
    }
    recorded.Abort();
    EXPECT_EQ(recorded.Contents(), before);
  }
  ADD_FAILURE() << "the edit never succeeded";
  return poisonings;
}

class InterruptedEditTest : public ::testing::Test {
 protected:
  InterruptedEditTest() {
    m_recorded.recorder().Insert(Site('A'), Field(1), 0, 20);
    m_recorded.recorder().Delete(Site('A'), Field(1), 5, 3);
    m_recorded.Commit();
  }
  RecordingSpace m_recorded;
};

TEST_F(InterruptedEditTest, InsertionThatSplitsARunPoisons) {
  EXPECT_GT(
      CountPoisonings(m_recorded, [](Recorder& recorder) { recorder.Insert(Site('B'), Field(1), 2, 4); }), 4);
}

TEST_F(InterruptedEditTest, FirstInsertionIntoAFieldPoisons) {
  EXPECT_GT(
      CountPoisonings(m_recorded, [](Recorder& recorder) { recorder.Insert(Site('B'), Field(2), 0, 4); }), 2);
}

TEST_F(InterruptedEditTest, DeletionOverSegmentsPoisons) {
  EXPECT_GT(
      CountPoisonings(m_recorded, [](Recorder& recorder) { recorder.Delete(Site('B'), Field(1), 3, 6); }), 2);
}

TEST_F(InterruptedEditTest, LaterEditOfTheSameTransactionPoisons) {
  EXPECT_GT(CountPoisonings(m_recorded,
                            [](Recorder& recorder) {
                              recorder.Insert(Site('A'), Field(1), 2, 4);
                              recorder.Insert(Site('B'), Field(1), 3, 1);
                            }),
            5);
}

}  // namespace
}  // namespace vemo::test
