#include <gtest/gtest.h>
#include <zlib.h>

#include "edit_model.h"
#include "history/edit_source.h"
#include "history/site.h"
#include "temporary_folder.h"

namespace vemo::test {
namespace {

std::string Compressed(const std::filesystem::path& scratch, std::string_view content) {
  gzFile out = gzopen(scratch.c_str(), "wb");
  EXPECT_EQ(gzwrite(out, content.data(), static_cast<unsigned>(content.size())),
            static_cast<int>(content.size()));
  EXPECT_EQ(gzclose(out), Z_OK);
  std::ifstream in(scratch, std::ios::binary);
  return std::string(std::istreambuf_iterator<char>(in), {});
}

class TraceSource : public ::testing::Test {
 protected:
  std::unique_ptr<EditSource> Open(std::string_view content) {
    WriteFile(m_file, content);
    return OpenTrace(m_file, ParseFieldId("7:1.2"), "writer");
  }

  // The message about a file with this content, which starts with the file's name, without the name.
  std::string Refusal(std::string_view content) {
    const std::string message = SourceErrorOf([&] { Open(content); });
    const std::string name = m_file.string();
    const std::size_t found = message.find(name);
    EXPECT_NE(found, std::string::npos) << message;
    return found == std::string::npos ? message : std::string(message).erase(found, name.size());
  }

  // The message about a recording with this patch, the third one of the second transaction.
  std::string PatchRefusal(const std::string& patch) {
    return Refusal(R"({"startContent":"","endContent":"","txns":[{"time":"t","patches":[[0,0,"abc"]]},)"
                   R"({"time":"t","patches":[[3,0,"d"],[0,1,""],)" +
                   patch + "]}]}");
  }

  TemporaryFolder m_folder;
  std::filesystem::path m_file = m_folder.path() / "recording.json";
};

constexpr std::string_view kSmall = R"({"startContent":"","endContent":"h\u00e9y!\n","txns":[)"
                                    R"({"time":"2020-01-01T00:00:00Z","patches":[[0,0,"hallo"]]},)"
                                    R"({"time":1,"patches":[[1,4,"\u00e9"],[2,0,"x!"],[2,1,"y"]]},)"
                                    R"({"time":2,"patches":[]},)"
                                    R"({"patches":[[2,0,""],[4,0,"\n"]]}]})";

TEST_F(TraceSource, GivesADeletionAndAnInsertionForEachPatch) {
  const auto source = Open(kSmall);
  const EditModel model = ReplayAndCheck(*source);
  EXPECT_EQ(model.log, (std::vector<std::string>{"7:1.2 @0 +5", "7:1.2 @1 -4", "7:1.2 @1 +1", "7:1.2 @2 +2",
                                                 "7:1.2 @2 -1", "7:1.2 @2 +1", "7:1.2 @4 +1"}));
  EXPECT_EQ(model.fields.at(ParseFieldId("7:1.2")).Elements(),
            (std::vector<std::string>{"h", "\u00e9", "y", "!", "\n"}));
  ASSERT_EQ(model.authors.size(), 1u);
  EXPECT_EQ(model.authors[0].text, "writer");
  EXPECT_TRUE(model.paths.empty());
  EXPECT_TRUE(model.commits.empty());
}

TEST_F(TraceSource, HasOneFinalContentForTheField) {
  const auto source = Open(kSmall);
  std::vector<FinalContent> contents;
  source->ForEachFinalContent([&](const FinalContent& content) { contents.push_back(content); });
  ASSERT_EQ(contents.size(), 1u);
  EXPECT_EQ(FieldIdText(contents[0].field), "7:1.2");
  EXPECT_EQ(contents[0].label, "recording.json");
  EXPECT_EQ(contents[0].bytes, "h\u00e9y!\n");
  EXPECT_EQ(source->Skipped().binary, 0u);
  EXPECT_EQ(source->Describe(), "recording " + m_file.string());
}

TEST_F(TraceSource, ReadsACompressedRecordingWhateverItsName) {
  const auto source = Open(Compressed(m_folder.path() / "scratch", kSmall));
  EXPECT_EQ(ReplayAndCheck(*source).edits, 7u);
}

TEST_F(TraceSource, ARecordingWithoutEditsHasNoSite) {
  const auto source = Open(R"({"startContent":"","endContent":"","txns":[{"patches":[[0,0,""]]}]})");
  const EditModel model = ReplayAndCheck(*source);
  EXPECT_EQ(model.edits, 0u);
  EXPECT_TRUE(model.authors.empty());
}

TEST_F(TraceSource, CountsCodePointsNotUtf16Units) {
  const auto source = Open(
      R"({"startContent":"","endContent":"\ud83d\ude00!b","txns":[{"patches":[[0,0,"\ud83d\ude00ab"],[1,1,"!"]]}]})");
  EXPECT_EQ(ReplayAndCheck(*source).log,
            (std::vector<std::string>{"7:1.2 @0 +3", "7:1.2 @1 -1", "7:1.2 @1 +1"}));
}

TEST_F(TraceSource, AcceptsTheKindSequential) {
  EXPECT_EQ(Open(R"({"kind":"sequential","startContent":"","endContent":"","txns":[]})")->CountEdits(), 0u);
}

TEST_F(TraceSource, RefusesARecordingOfConcurrentAuthors) {
  EXPECT_EQ(Refusal(R"({"kind":"concurrent","endContent":"","numAgents":2,"txns":[]})"),
            ": this is a recording of concurrent authors; only those of one author can be replayed");
}

TEST_F(TraceSource, RefusesAnUnknownKind) {
  EXPECT_EQ(Refusal(R"({"kind":"a\nb","startContent":"","endContent":"","txns":[]})"),
            ": recordings of the kind \"a?b\" are not known");
  EXPECT_EQ(Refusal(R"({"kind":3,"startContent":"","endContent":"","txns":[]})"),
            ": the field \"kind\" is not a string");
}

TEST_F(TraceSource, RefusesMissingFields) {
  EXPECT_EQ(Refusal("{}"), ": there is no field \"startContent\"");
  EXPECT_EQ(Refusal(R"({"startContent":""})"), ": there is no field \"endContent\"");
  EXPECT_EQ(Refusal(R"({"startContent":"","endContent":""})"), ": there is no field \"txns\"");
  EXPECT_EQ(Refusal(R"({"startContent":"","endContent":"","txns":[{"patches":[]},{"time":"t"}]})"),
            ": transaction 1: there is no field \"patches\"");
}

TEST_F(TraceSource, RefusesFieldsOfAnotherType) {
  EXPECT_EQ(Refusal("[]"), ": the JSON document is not an object");
  EXPECT_EQ(Refusal(R"({"startContent":null})"), ": the field \"startContent\" is not a string");
  EXPECT_EQ(Refusal(R"({"startContent":"","endContent":[]})"), ": the field \"endContent\" is not a string");
  EXPECT_EQ(Refusal(R"({"startContent":"","endContent":"","txns":{}})"),
            ": the field \"txns\" is not an array");
  EXPECT_EQ(Refusal(R"({"startContent":"","endContent":"","txns":[[]]})"),
            ": transaction 0: this is not an object");
  EXPECT_EQ(Refusal(R"({"startContent":"","endContent":"","txns":[{"patches":"x"}]})"),
            ": transaction 0: the field \"patches\" is not an array");
}

TEST_F(TraceSource, RefusesARecordingThatStartsWithText) {
  EXPECT_EQ(Refusal(R"({"startContent":"a","endContent":"a","txns":[]})"),
            ": the field \"startContent\" is not empty; only recordings that start with an empty document "
            "can be replayed");
}

TEST_F(TraceSource, RefusesPatchesOfAnotherForm) {
  const std::string place = ": transaction 1, patch 2: ";
  const std::string form = place + "a patch is not an array of position, deleted count and inserted text";
  EXPECT_EQ(PatchRefusal("3"), form);
  EXPECT_EQ(PatchRefusal("[]"), form);
  EXPECT_EQ(PatchRefusal("[1,0]"), form);
  EXPECT_EQ(PatchRefusal(R"([1,0,"a",1])"), form);
  EXPECT_EQ(PatchRefusal(R"(["1",0,"a"])"), place + "the position is not a whole number");
  EXPECT_EQ(PatchRefusal(R"([1.5,0,"a"])"), place + "the position is not a whole number");
  EXPECT_EQ(PatchRefusal(R"([18446744073709551615,0,"a"])"), place + "the position is not a whole number");
  EXPECT_EQ(PatchRefusal(R"([1,null,"a"])"), place + "the deleted count is not a whole number");
  EXPECT_EQ(PatchRefusal("[1,0,2]"), place + "the inserted text is not a string");
}

TEST_F(TraceSource, RefusesPatchesOutsideOfTheDocument) {
  const std::string place = ": transaction 1, patch 2: ";
  const std::string range = " is out of range in a document of 3 code points";
  EXPECT_EQ(PatchRefusal(R"([-1,0,"a"])"), place + "the position -1" + range);
  EXPECT_EQ(PatchRefusal(R"([4,0,"a"])"), place + "the position 4" + range);
  EXPECT_EQ(PatchRefusal(R"([9223372036854775807,1,"a"])"),
            place + "the position 9223372036854775807" + range);
  EXPECT_EQ(PatchRefusal(R"([1,-1,"a"])"), place + "the deleted count -1 at position 1" + range);
  EXPECT_EQ(PatchRefusal(R"([1,3,"a"])"), place + "the deleted count 3 at position 1" + range);
  EXPECT_EQ(PatchRefusal(R"([3,9223372036854775807,"a"])"),
            place + "the deleted count 9223372036854775807 at position 3" + range);
}

TEST_F(TraceSource, RefusesTextThatIsNotUnicode) {
  const std::string json = ": this is not a complete JSON document: ";
  const std::string escape = json + "Problem while parsing a string";
  EXPECT_EQ(PatchRefusal(R"([0,0,"a\udc00"])"), escape);
  EXPECT_EQ(PatchRefusal(R"([0,0,"\ud800x"])"), escape);
  EXPECT_EQ(Refusal(R"({"startContent":"","endContent":"a\udc00","txns":[]})"), escape);
  EXPECT_EQ(PatchRefusal("[0,0,\"\xff\"]"), json + "The input is not valid UTF-8");
}

TEST_F(TraceSource, RefusesEveryBeginningOfARecording) {
  for (std::size_t size = 0; size < kSmall.size(); ++size) {
    EXPECT_EQ(Refusal(kSmall.substr(0, size)).find(": this is not a complete JSON document: "), 0u) << size;
  }
}

TEST_F(TraceSource, RefusesEveryBeginningOfACompressedRecording) {
  const std::string whole = Compressed(m_folder.path() / "scratch", kSmall);
  for (std::size_t size = 0; size < whole.size(); ++size) {
    const std::string message = Refusal(whole.substr(0, size));
    // The first byte alone does not show yet that the file is compressed.
    EXPECT_NE(message.find(size < 2 ? "not a complete JSON document" : "the compressed file is cut off"),
              std::string::npos)
        << size << message;
  }
}

TEST_F(TraceSource, RefusesADamagedCompressedRecording) {
  std::string damaged = Compressed(m_folder.path() / "scratch", kSmall);
  damaged[damaged.size() - 6] ^= 1;  // in the checksum
  EXPECT_EQ(Refusal(damaged),
            "cannot read : the compressed file is damaged: " + m_file.string() + ": incorrect data check");
}

TEST_F(TraceSource, RefusesWhatIsNoReadableFile) {
  const std::string missing = (m_folder.path() / "missing\nfile").string();
  EXPECT_EQ(SourceErrorOf([&] { OpenTrace(missing, ParseFieldId("1:0"), "a"); }),
            "cannot read " + (m_folder.path() / "missing?file").string() + ": No such file or directory");
  EXPECT_EQ(SourceErrorOf([&] { OpenTrace(m_folder.path(), ParseFieldId("1:0"), "a"); }),
            "cannot read " + m_folder.path().string() + ": Is a directory");
}

}  // namespace
}  // namespace vemo::test
