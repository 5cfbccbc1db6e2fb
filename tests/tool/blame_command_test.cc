// `vemo blame`.
#include "history/site.h"
#include "platform/guid.h"
#include "store/transaction.h"
#include "tests/history/test_repository.h"
#include "tool_fixture.h"

namespace vemo::test {
namespace {

class BlameCommand : public ToolTest {
 protected:
  void Replay(const std::vector<std::string>& source) {
    std::vector<std::string> arguments = {"replay", "--store", uri()};
    arguments.insert(arguments.end(), source.begin(), source.end());
    const Outcome outcome = Vemo(arguments);
    ASSERT_EQ(outcome.exitCode, 0) << outcome.err;
  }

  std::string Output(const std::vector<std::string>& what) {
    const Outcome outcome = Run(what);
    EXPECT_EQ(outcome.exitCode, 0) << outcome.err;
    EXPECT_EQ(outcome.err, "");
    return outcome.out;
  }
  Outcome Run(const std::vector<std::string>& what) {
    std::vector<std::string> arguments = {"blame", uri()};
    arguments.insert(arguments.end(), what.begin(), what.end());
    return Vemo(arguments);
  }
};

class BlameOfARepository : public BlameCommand {
 protected:
  void SetUp() override {
    m_repository.Write("f", "1\n2\n3\n4\n5\n6\n7\n8\n9\n");
    m_repository.Write("folder/empty", "");
    m_first = m_repository.Commit().substr(0, 12);
    m_repository.SetAuthor("Jörg\tÖtzi", "joerg@example.org");
    m_repository.Write("f", "1\n2\n3\nfour\n5\n6\n7\n8\n9\n10\n");
    m_second = m_repository.Commit().substr(0, 12);
    Replay({"--git", m_repository.path().string()});
  }

  TestRepository m_repository;
  std::string m_first;
  std::string m_second;
};

// The second author's numbers: 0 deleted a line, 1 is "four", 2 is "10".
TEST_F(BlameOfARepository, PrintsLinesCommitNumberAndAuthorOfEachRun) {
  const std::string ada = "  Ada Lovelace <ada@example.org>\n";
  const std::string joerg = "  Jörg?Ötzi <joerg@example.org>\n";
  const std::string expected = "1-3  " + m_first + "  0" + ada +     //
                               "4    " + m_second + "  1" + joerg +  //
                               "5-9  " + m_first + "  4" + ada +     //
                               "10   " + m_second + "  2" + joerg;
  EXPECT_EQ(Output({"--path", "f"}), expected);
  EXPECT_EQ(Output({"1:0"}), expected);
}

TEST_F(BlameOfARepository, PrintsNothingOfAnEmptyFile) {
  EXPECT_EQ(Output({"--path", "folder/empty"}), "");
}

TEST_F(BlameOfARepository, RefusesAPathThatIsNoFileOfIt) {
  EXPECT_EQ(Refusal(Run({"--path", "folder"}), 2),
            "vemo: " + uri() + "?sync=commit: it has no file \"folder\"");
}

TEST_F(BlameOfARepository, RefusesAFieldAndAPathAtOnceAndNeither) {
  EXPECT_NE(Refusal(Run({"1:0", "--path", "f"}), 2).find("name either a field"), std::string::npos);
  EXPECT_NE(Refusal(Run({}), 2).find("name either a field"), std::string::npos);
}

class BlameOfARecording : public BlameCommand {
 protected:
  void SetUp() override { Replay({"--field", "5:1", SmallRecording()}); }
};

// "hallo world" had the numbers 0 to 10; of it "o world" was deleted around.
TEST_F(BlameOfARecording, HasNoCommits) {
  const std::string output = Output({"5:1"});
  EXPECT_EQ(output,
            "1-5   -             19  recorded author\n"
            "6     -             13  recorded author\n"
            "7-12  -              5  recorded author\n");
}

TEST_F(BlameOfARecording, RefusesAFieldThatIsNotThere) {
  EXPECT_EQ(Refusal(Run({"5:2"}), 2), "vemo: " + uri() + "?sync=commit: field 5:2 is not recorded");
}

TEST_F(BlameOfARecording, RefusesAFieldThatIsNone) {
  EXPECT_NE(Refusal(Run({"five"}), 2).find("five"), std::string::npos);
}

TEST_F(BlameOfARecording, NamesTheSiteWhereNoAuthorIsRecorded) {
  const std::string site = GuidText(SiteOfAuthor("recorded author"));
  {
    const auto space = CSpace::Open(uri());
    WriteTransaction txn(*space);
    txn.EraseMeta("site/" + site);
    txn.Commit();
  }
  EXPECT_TRUE(Output({"5:1"}).starts_with("1-5   -             19  " + site + "\n"));
}

TEST_F(BlameCommand, RefusesASpaceWithoutARecordersMaps) {
  CSpace::Open(uri(), {.create = true});
  EXPECT_NE(Refusal(Run({"1:0"}), 2).find("no root map \"insertions\""), std::string::npos);
}

TEST_F(BlameCommand, RefusesASpaceThatIsNotThere) {
  Refusal(Run({"1:0"}), 3);
}

}  // namespace
}  // namespace vemo::test
