// What the check of a replay notices.
#include <gtest/gtest.h>

#include "history/replay.h"
#include "recorded_fields.h"
#include "scripted_source.h"

namespace vemo::test {
namespace {

class CheckReplayTest : public ::testing::Test {
 protected:
  CheckReplayTest() : m_space(CSpace::Open("memory:")), m_source(Field(1)) {
    m_source.Insert('A', Field(1), 0, "one\ntwo\nthree\n")
        .Delete('A', Field(1), 4, 4)
        .Insert('A', Field(1), 4, "2\n");
    Replay(*m_space, m_source, {});
  }

  std::string Check() { return CheckReplay(*m_space, m_source).value_or("content matches"); }

  // Changes the stored maps behind the source's back.
  template <class Change>
  void Damage(const Change& change) {
    WriteTransaction transaction(*m_space);
    change(transaction.Root<FieldIdToVectorInsertionsMap>(kInsertionsRoot),
           transaction.Root<FieldIdToVectorTombstonesMap>(kTombstonesRoot));
    transaction.Commit();
  }

  std::unique_ptr<CSpace> m_space;
  ScriptedSource m_source;
};

TEST_F(CheckReplayTest, FindsNothingAfterAReplay) {
  EXPECT_EQ(m_source.contents[Field(1)], "one\n2\nthree\n");
  EXPECT_EQ(Check(), "content matches");
}

TEST_F(CheckReplayTest, FindsAContentThatTheSourceEndsWithOtherwise) {
  m_source.contents[Field(1)] = "one\n2\nthirteen\n";
  EXPECT_EQ(
      Check(),
      "field 1:0 (text 1:0) differs at byte 8, line 3: the source has \"irteen?\", the maps give \"ree?\"");
}

TEST_F(CheckReplayTest, FindsAContentThatTheSourceEndsEarlier) {
  m_source.contents[Field(1)] = "one\n";
  EXPECT_EQ(
      Check(),
      "field 1:0 (text 1:0) differs at byte 4, line 2: the source has its end, the maps give \"2?three?\"");
}

TEST_F(CheckReplayTest, FindsAContentThatTheSourceEndsLater) {
  m_source.contents[Field(1)] += "four";
  EXPECT_EQ(
      Check(),
      "field 1:0 (text 1:0) differs at byte 12, line 4: the source has \"four\", the maps give its end");
}

TEST_F(CheckReplayTest, FindsALiveElementThatWasDeleted) {
  Damage([](auto&, FieldIdToVectorTombstonesMap& tombstones) { tombstones[Field(1)] = VectorTombstones(); });
  EXPECT_EQ(Check(),
            "field 1:0 (text 1:0) differs at byte 7, line 3: the source has \"hree?\", the maps give "
            "\"wo?three?\"");
}

TEST_F(CheckReplayTest, FindsADeletedElementThatIsLive) {
  Damage([](auto&, FieldIdToVectorTombstonesMap& tombstones) {
    IntervalList<ssize_t> erased;
    tombstones[Field(1)].Erasep(0, 1, erased);
  });
  EXPECT_EQ(Check(),
            "field 1:0 (text 1:0) differs at byte 0, line 1: the source has \"one?2?three?\", the maps give "
            "\"ne?2?three?\"");
}

TEST_F(CheckReplayTest, FindsAnElementOfASiteThatTheSourceDoesNotHave) {
  Damage([](FieldIdToVectorInsertionsMap& insertions, auto&) {
    AppendRun(insertions[Field(1)], {Site('B'), 0}, 1);
  });
  EXPECT_EQ(Check(), "field 1:0 (text 1:0) differs: element S" + GuidText(Site('B')) +
                         ":0 at 16 is none that the source inserted");
}

TEST_F(CheckReplayTest, FindsAnElementWithANumberThatDeletedOne) {
  Damage([](FieldIdToVectorInsertionsMap& insertions, auto&) {
    AppendRun(insertions[Field(1)], {Site('A'), 14}, 1);
  });
  EXPECT_EQ(Check(), "field 1:0 (text 1:0) differs: element S" + GuidText(Site('A')) +
                         ":14 at 16 is none that the source inserted");
}

TEST_F(CheckReplayTest, FindsAnElementWithANumberBehindTheLast) {
  Damage([](FieldIdToVectorInsertionsMap& insertions, auto&) {
    AppendRun(insertions[Field(1)], {Site('A'), 20}, 2);
  });
  EXPECT_EQ(Check(), "field 1:0 (text 1:0) differs: element S" + GuidText(Site('A')) +
                         ":20 at 16 is none that the source inserted");
}

TEST_F(CheckReplayTest, FindsAnElementThatIsThereTwice) {
  Damage([](FieldIdToVectorInsertionsMap& insertions, auto&) {
    AppendRun(insertions[Field(1)], {Site('A'), 0}, 3);
  });
  EXPECT_EQ(Check(),
            "field 1:0 (text 1:0) differs at byte 12, line 4: the source has its end, the maps give \"one\"");
}

TEST_F(CheckReplayTest, FindsAFieldThatIsMissing) {
  Damage([](FieldIdToVectorInsertionsMap& insertions, auto&) { insertions.erase(Field(1)); });
  EXPECT_EQ(
      Check(),
      "field 1:0 (text 1:0) differs at byte 0, line 1: the source has \"one?2?three?\", the maps give its "
      "end");
}

TEST_F(CheckReplayTest, DoesNotMindOtherFieldsBesideARecording) {
  Damage([](FieldIdToVectorInsertionsMap& insertions, auto&) {
    AppendRun(insertions[Field(2)], {Site('B'), 0}, 1);
  });
  EXPECT_EQ(Check(), "content matches");
}

TEST(CheckRepositoryReplayTest, FindsAFieldOfADeletedFileThatIsNotEmpty) {
  const auto space = CSpace::Open("memory:");
  ScriptedSource source;
  source.Insert('A', Field(1), 0, "kept").Insert('A', Field(2), 0, "not kept").DeleteFile(Field(2));
  Replay(*space, source, {});
  EXPECT_EQ(CheckReplay(*space, source).value_or(""),
            "field 2:0 (deleted in the source) differs at byte 0, line 1: the source has its end, the maps "
            "give \"not "
            "kept\"");
  ScriptedSource emptied;
  emptied.Insert('A', Field(1), 0, "kept").Insert('A', Field(2), 0, "not kept").Delete('A', Field(2), 0, 8);
  emptied.DeleteFile(Field(2));
  const auto another = CSpace::Open("memory:");
  Replay(*another, emptied, {});
  EXPECT_EQ(CheckReplay(*another, emptied), std::nullopt);
}

TEST(CheckRepositoryReplayTest, FindsAFieldThatTheSourceDoesNotHave) {
  const auto space = CSpace::Open("memory:");
  ScriptedSource source;
  source.Insert('A', Field(1), 0, "text");
  Replay(*space, source, {});
  {
    WriteTransaction transaction(*space);
    AppendRun(transaction.Root<FieldIdToVectorInsertionsMap>(kInsertionsRoot)[Field(2)], {Site('A'), 0}, 1);
    transaction.Commit();
  }
  EXPECT_EQ(CheckReplay(*space, source).value_or(""), "field 2:0 is in the maps, but not in the source");
}

}  // namespace
}  // namespace vemo::test
