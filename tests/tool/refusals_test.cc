// What the command says and returns where it is used badly, where its input is bad, and where the store
// fails.
#include "tests/history/test_repository.h"
#include "tool_fixture.h"

namespace vemo::test {
namespace {

constexpr int kBadInput = 2;
constexpr int kStoreFault = 3;

class RefusalsTest : public ToolTest {
 protected:
  // The refusal of a replay into a space that does not exist, and still does not afterwards.
  std::string RefusedReplay(std::vector<std::string> arguments) {
    arguments.insert(arguments.begin(), {"replay", "--store", uri()});
    const std::string line = Refusal(Vemo(arguments), kBadInput);
    EXPECT_FALSE(std::filesystem::exists(path("space")));
    return line;
  }
  std::string RefusedRecording(const std::string& text) {
    WriteFile(path("bad.json"), text);
    const std::string line = RefusedReplay({path("bad.json").string(), "--field", "1:0"});
    const std::string begin = "vemo: " + path("bad.json").string() + ": ";
    EXPECT_EQ(line.rfind(begin, 0), 0u) << line;
    return line.substr(std::min(line.size(), begin.size()));
  }
};

// --- Bad use ---

TEST_F(RefusalsTest, WithoutASubcommand) {
  EXPECT_NE(Refusal(Vemo({}), kBadInput).find("vemo --help"), std::string::npos);
}

TEST_F(RefusalsTest, OfUnknownSubcommandsAndOptions) {
  Refusal(Vemo({"frobnicate"}), kBadInput);
  Refusal(Vemo({"verify", uri(), "--fast"}), kBadInput);
  Refusal(Vemo({"verify", uri(), "more"}), kBadInput);
  Refusal(Vemo({"replay", "--stor", uri()}), kBadInput);
}

TEST_F(RefusalsTest, OfMissingArguments) {
  EXPECT_NE(Refusal(Vemo({"replay", SmallRecording()}), kBadInput).find("--store"), std::string::npos);
  Refusal(Vemo({"replay", "--store"}), kBadInput);
  for (const char* command : {"dump", "verify", "stats", "blame"}) {
    EXPECT_NE(Refusal(Vemo({command}), kBadInput).find("store"), std::string::npos) << command;
  }
  EXPECT_NE(Refusal(Vemo({"dump", uri()}), kBadInput).find("map"), std::string::npos);
}

TEST_F(RefusalsTest, OfAReplayWithoutASourceOrWithTwo) {
  const std::string refusal = "vemo: name either a recording, with --field, or a repository, with --git";
  EXPECT_EQ(RefusedReplay({}), refusal);
  EXPECT_EQ(RefusedReplay({"--git", ".", SmallRecording(), "--field", "1:0"}), refusal);
}

TEST_F(RefusalsTest, OfOptionsThatBelongToTheOtherSource) {
  EXPECT_EQ(RefusedReplay({"--git", ".", "--field", "1:0"}),
            "vemo: --field is for a recording; a repository has a field for each file");
  EXPECT_EQ(RefusedReplay({SmallRecording(), "--field", "1:0", "--rev", "HEAD"}),
            "vemo: --rev names a commit of a repository; a recording has none");
}

TEST_F(RefusalsTest, OfABatchWithoutEdits) {
  for (const char* batch : {"0", "00", "-1"}) {
    EXPECT_EQ(RefusedReplay({SmallRecording(), "--field", "1:0", "--batch", batch}),
              "vemo: --batch: a batch has at least 1 edit");
  }
  RefusedReplay({SmallRecording(), "--field", "1:0", "--batch", "many"});
}

TEST_F(RefusalsTest, OfAMissingOrUnreadableField) {
  EXPECT_EQ(RefusedReplay({SmallRecording()}),
            "vemo: a recording needs --field to say where it goes, such as --field 1:0");
  for (const char* field : {"1", "0:0", "x", "1:0.", "1:-1"}) {
    EXPECT_NE(RefusedReplay({SmallRecording(), "--field", field}).find(field), std::string::npos);
  }
}

TEST_F(RefusalsTest, OfUrisThatNameNoSpace) {
  for (const std::string uri : {"", "space", "file:x", "lmdb:", "LMDB:x", "lmdb:x?sync=never",
                                "lmdb:x?color=red", "lmdb:x?map_bytes=many"}) {
    for (const std::vector<std::string>& command :
         std::vector<std::vector<std::string>>{{"replay", SmallRecording(), "--field", "1:0", "--store", uri},
                                               {"dump", uri, "insertions"},
                                               {"verify", uri}}) {
      const std::string line = Refusal(Vemo(command), kBadInput);
      if (!uri.empty()) {
        EXPECT_EQ(line.rfind("vemo: \"" + uri + "\" does not name a space: ", 0), 0u) << line;
      }
    }
  }
}

// --- Bad recordings ---

TEST_F(RefusalsTest, OfARecordingThatIsNotThere) {
  EXPECT_EQ(RefusedReplay({path("none.json").string(), "--field", "1:0"}),
            "vemo: cannot read " + path("none.json").string() + ": No such file or directory");
}

TEST_F(RefusalsTest, OfARecordingThatIsCut) {
  const std::string whole = RecordingText({R"(0,0,"text")"}, "text");
  for (const std::size_t length : {std::size_t(0), std::size_t(1), whole.size() / 2, whole.size() - 1}) {
    EXPECT_EQ(RefusedRecording(whole.substr(0, length)).rfind("this is not a complete JSON document: ", 0),
              0u);
  }
}

TEST_F(RefusalsTest, OfAFileThatIsNoRecording) {
  EXPECT_EQ(RefusedRecording("[]"), "the JSON document is not an object");
  EXPECT_EQ(RefusedRecording("{}"), "there is no field \"startContent\"");
}

TEST_F(RefusalsTest, OfAnEditOutsideItsDocument) {
  EXPECT_EQ(RefusedRecording(RecordingText({R"(0,0,"abc")", R"(4,0,"d")"}, "")),
            "transaction 1, patch 0: the position 4 is out of range in a document of 3 code points");
  EXPECT_EQ(RefusedRecording(RecordingText({R"(0,0,"abc")", R"(2,2,"")"}, "")),
            "transaction 1, patch 0: the deleted count 2 at position 2 is out of range in a document of 3 "
            "code points");
}

TEST_F(RefusalsTest, OfARecordingOfConcurrentAuthors) {
  EXPECT_EQ(RefusedRecording(R"({"kind":"concurrent","endContent":"","numAgents":2,"txns":[]})"),
            "this is a recording of concurrent authors; only those of one author can be replayed");
}

// --- Bad repositories ---

TEST_F(RefusalsTest, OfAFolderThatIsNoRepository) {
  std::filesystem::create_directory(path("plain"));
  EXPECT_EQ(RefusedReplay({"--git", path("plain").string()})
                .rfind("vemo: cannot read a git repository at " + path("plain").string(), 0),
            0u);
  RefusedReplay({"--git", path("nowhere").string()});
}

TEST_F(RefusalsTest, OfARevisionThatIsNotThere) {
  TestRepository repository;
  RefusedReplay({"--git", repository.path().string()});  // no commit at all
  repository.Write("a", "a\n");
  repository.Commit();
  EXPECT_NE(RefusedReplay({"--git", repository.path().string(), "--rev", "v9"}).find("v9"),
            std::string::npos);
}

// --- What stands in the way ---

TEST_F(RefusalsTest, OfAReplayIntoAFieldThatExists) {
  const std::vector<std::string> replay{"replay", "--store", uri(), SmallRecording(), "--field", "1:0"};
  ASSERT_EQ(Vemo(replay).exitCode, 0);
  const std::string dump = Vemo({"dump", uri(), "history"}).out;
  EXPECT_NE(Refusal(Vemo(replay), kBadInput).find("field 1:0 exists already; go on with --resume"),
            std::string::npos);
  EXPECT_EQ(Vemo({"dump", uri(), "history"}).out, dump);
}

TEST_F(RefusalsTest, OfResumingWithAnotherRecording) {
  ASSERT_EQ(Vemo({"replay", "--store", uri(), SmallRecording(), "--field", "1:0"}).exitCode, 0);
  const std::string dump = Vemo({"dump", uri(), "history"}).out;
  const std::string other = WriteRecording("other.json", {R"(0,0,"other")"}, "other");
  EXPECT_NE(Refusal(Vemo({"replay", "--store", uri(), other, "--field", "1:0", "--resume"}), kBadInput)
                .find("is not what was replayed before"),
            std::string::npos);
  EXPECT_EQ(Vemo({"dump", uri(), "history"}).out, dump);
}

TEST_F(RefusalsTest, OfARootMapThatIsNotThere) {
  ASSERT_EQ(Vemo({"replay", "--store", uri(), SmallRecording(), "--field", "1:0"}).exitCode, 0);
  EXPECT_NE(Refusal(Vemo({"dump", uri(), "no\nsuch"}), kBadInput).find("it has no root map \"no?such\""),
            std::string::npos);
}

// --- Store errors ---

TEST_F(RefusalsTest, OfReadingASpaceThatIsNotThereWhichDoesNotMakeOne) {
  for (const std::vector<std::string>& command : std::vector<std::vector<std::string>>{
           {"dump", uri(), "insertions"}, {"verify", uri()}, {"stats", uri()}, {"blame", uri(), "1:0"}}) {
    EXPECT_NE(Refusal(Vemo(command), kStoreFault).find("there is no space"), std::string::npos);
    EXPECT_FALSE(std::filesystem::exists(path("space"))) << command[0];
  }
}

TEST_F(RefusalsTest, OfReadingAnEmptyFolderWhichStaysEmpty) {
  std::filesystem::create_directory(path("space"));
  for (const std::vector<std::string>& command : std::vector<std::vector<std::string>>{
           {"dump", uri(), "insertions"}, {"verify", uri()}, {"stats", uri()}, {"blame", uri(), "1:0"}}) {
    Refusal(Vemo(command), kStoreFault);
    EXPECT_TRUE(std::filesystem::is_empty(path("space"))) << command[0];
  }
}

TEST_F(RefusalsTest, OfAFileInThePlaceOfASpace) {
  WriteFile(path("space"), "not a folder");
  EXPECT_NE(Refusal(Vemo({"replay", "--store", uri(), SmallRecording(), "--field", "1:0"}), kStoreFault)
                .find("it is not a folder"),
            std::string::npos);
  Refusal(Vemo({"verify", uri()}), kStoreFault);
  EXPECT_EQ(std::filesystem::file_size(path("space")), 12u);
}

TEST_F(RefusalsTest, OfAFolderWithOtherFilesWhichStayAsTheyAre) {
  WriteFile(path("space") / "letter", "dear");
  Refusal(Vemo({"replay", "--store", uri(), SmallRecording(), "--field", "1:0"}), kStoreFault);
  EXPECT_EQ(std::distance(std::filesystem::directory_iterator(path("space")), {}), 1);
}

TEST_F(RefusalsTest, OfAPlaceWithoutAParent) {
  Refusal(Vemo({"replay", "--store", uri("no/such/folder"), SmallRecording(), "--field", "1:0"}),
          kStoreFault);
}

TEST_F(RefusalsTest, WhereStandardOutputIsFull) {
  ASSERT_EQ(Vemo({"replay", "--store", uri(), SmallRecording(), "--field", "1:0"}).exitCode, 0);
  for (const std::vector<std::string>& command : std::vector<std::vector<std::string>>{
           {"dump", uri(), "insertions"}, {"verify", uri()}, {"stats", uri()}, {"blame", uri(), "1:0"}}) {
    const Outcome outcome = RunProgram({"sh", "-c", "exec \"$0\" \"$@\" > /dev/full", VEMO_BINARY_DIR "/vemo",
                                        command[0], command[1], command.size() > 2 ? command[2] : "--"});
    EXPECT_NE(Refusal(outcome, kStoreFault).find("standard output"), std::string::npos) << command[0];
  }
}

}  // namespace
}  // namespace vemo::test
