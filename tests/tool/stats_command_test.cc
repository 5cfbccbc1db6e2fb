// `vemo stats`, beside the library's own figures.
#include <unistd.h>

#include <nlohmann/json.hpp>

#include "store/statistics.h"
#include "store/transaction.h"
#include "tool_fixture.h"
#include "vxOperation/src/WorkingSet/CompOp/VectorOT.h"

namespace vemo::test {
namespace {

using Json = nlohmann::json;

class StatsCommand : public ToolTest {
 protected:
  // A root map of the fields 1:0, 2:0, ... with a tombstone each.
  void FillRoot(const std::string& root, std::uint64_t fields) {
    const auto space = CSpace::Open(uri(), {.create = true});
    WriteTransaction txn(*space);
    auto& map = txn.Root<FieldIdToVectorTombstonesMap>(root);
    for (std::uint64_t n = 1; n <= fields; ++n) map[FieldId{OID(n), Path{0}}].Erasep(0, 1);
    txn.SetMeta("name", "value");
    txn.Commit();
  }

  SpaceStatistics Expected() {
    const auto space = CSpace::Open(uri());
    Snapshot snapshot(*space);
    return CollectStatistics(snapshot);
  }

  std::string Output(const std::vector<std::string>& options = {}) {
    std::vector<std::string> arguments = {"stats", uri()};
    arguments.insert(arguments.end(), options.begin(), options.end());
    const Outcome outcome = Vemo(arguments);
    EXPECT_EQ(outcome.exitCode, 0) << outcome.err;
    EXPECT_EQ(outcome.err, "");
    return outcome.out;
  }
};

// Ascending keys leave half-full leaves behind, of 50 entries, and fill the last.
TEST_F(StatsCommand, PrintsATableOfEachMapsLevels) {
  FillRoot("tombstones", 320);
  const std::string output = Output();
  const std::string table =
      "\n"
      "\"tombstones\", a vemo::FieldIdToVectorTombstonesMap, object 1\n"
      "  320 entries, 7 nodes, height 1, records 2.3 KiB\n"
      "  payloads 960 bytes, mean 3.0 bytes, largest 3 bytes\n"
      "   level        nodes      entries  least   mean   most      records\n"
      "       1            1            5     5%     5%     5%     44 bytes\n"
      "       0            6          320    50%    53%    70%      2.2 KiB\n";
  EXPECT_EQ(output.substr(std::min(output.find("\n\"tombstones\""), output.size())), table);
}

TEST_F(StatsCommand, BeginsWithTheSpaceAsAWhole) {
  FillRoot("tombstones", 320);
  const std::string output = Output();
  EXPECT_TRUE(output.starts_with(uri() + "?sync=commit at commit 2\n  records                         8 "))
      << output;
  for (const char* row : {"\n  on the medium ", "\n  awaiting deletion               0      0 bytes\n",
                          "\n  unreachable                     0      0 bytes\n",
                          "\n  meta values                     1      9 bytes\n"}) {
    EXPECT_NE(output.find(row), std::string::npos) << row << output;
  }
}

TEST_F(StatsCommand, PrintsAsJsonWhatTheLibraryCounts) {
  FillRoot("a", 7'000);
  FillRoot("b", 3);
  {
    const auto space = CSpace::Open(uri());
    WriteTransaction txn(*space);
    txn.Root<FieldIdToVectorTombstonesMap>("b") = txn.View<FieldIdToVectorTombstonesMap>("a");
    txn.Root<FieldIdToVectorTombstonesMap>("a").clear();
    txn.Commit();
  }
  const SpaceStatistics expected = Expected();
  const Json json = Json::parse(Output({"--json"}));
  EXPECT_EQ(json.at("commit"), expected.commit);
  EXPECT_EQ(json.at("records").at("count"), expected.records.count);
  EXPECT_EQ(json.at("records").at("bytes"), expected.records.bytes);
  EXPECT_EQ(json.at("medium_bytes"), expected.mediumBytes);
  EXPECT_EQ(json.at("awaiting_deletion").at("count"), expected.awaitingDeletion.count);
  EXPECT_EQ(json.at("awaiting_deletion").at("queued"), expected.queuedDeletions);
  EXPECT_EQ(json.at("unreachable").at("count"), expected.unreachable.count);
  EXPECT_GT(expected.unreachable.count, 0u);
  EXPECT_EQ(json.at("meta").at("bytes"), expected.meta.bytes);
  ASSERT_EQ(json.at("maps").size(), 2u);
  EXPECT_EQ(json["maps"][0].at("root"), "a");
  EXPECT_EQ(json["maps"][0].at("height"), -1);
  EXPECT_TRUE(json["maps"][0].at("levels").empty());

  const Json& map = json["maps"][1];
  const MapStatistics& counted = expected.maps.at(1);
  EXPECT_EQ(map.at("class"), counted.className);
  EXPECT_EQ(map.at("object"), counted.oid.m_value);
  EXPECT_EQ(map.at("entries"), 7'000);
  EXPECT_EQ(map.at("nodes"), counted.nodes);
  EXPECT_EQ(map.at("payload_bytes").at("total"), counted.payloadBytes);
  EXPECT_EQ(map.at("payload_bytes").at("mean"), counted.MeanPayloadBytes());
  EXPECT_EQ(map.at("record_bytes"), counted.recordBytes);
  ASSERT_EQ(map.at("levels").size(), counted.levels.size());
  for (std::size_t i = 0; i < counted.levels.size(); ++i) {
    const Json& level = map["levels"][i];
    EXPECT_EQ(level.at("height"), i);
    EXPECT_EQ(level.at("nodes"), counted.levels[i].nodes);
    EXPECT_EQ(level.at("entries"), counted.levels[i].entries);
    EXPECT_EQ(level.at("capacity"), 100);
    EXPECT_EQ(level.at("fill").at("least"), counted.levels[i].LeastFill());
    EXPECT_EQ(level.at("fill").at("most"), counted.levels[i].MostFill());
  }
}

TEST_F(StatsCommand, NamesTheOtherProcessesThatReadTheSpace) {
  FillRoot("a", 1);
  EXPECT_EQ(Output().find("reading processes"), std::string::npos);
  EXPECT_TRUE(Json::parse(Output({"--json"})).at("reading_processes").empty());
  const auto space = CSpace::Open(uri());
  const Snapshot snapshot(*space);
  const std::string self = std::to_string(getpid());
  EXPECT_NE(Output().find("\n  reading processes               1               " + self + "\n"),
            std::string::npos);
  EXPECT_EQ(Json::parse(Output({"--json"})).at("reading_processes"), Json::array({getpid()}));
}

TEST_F(StatsCommand, PrintsNamesOfAnyBytes) {
  FillRoot("quote\" line\n \xff", 1);
  EXPECT_EQ(Json::parse(Output({"--json"})).at("maps").at(0).at("root"), "quote\" line\n \xef\xbf\xbd");
  EXPECT_NE(Output().find("\n\"quote\" line? "), std::string::npos);
}

TEST_F(StatsCommand, PrintsAnOwnedMapWithoutAName) {
  {
    const auto space = CSpace::Open(uri(), {.create = true});
    WriteTransaction txn(*space);
    txn.Own<FieldIdToVectorTombstonesMap>();
    txn.Commit();
  }
  EXPECT_NE(Output().find("\nan owned map, a vemo::FieldIdToVectorTombstonesMap, object 1\n"
                          "  0 entries, 0 nodes, height -1, records 24 bytes\n"),
            std::string::npos);
  EXPECT_TRUE(Json::parse(Output({"--json"})).at("maps").at(0).at("root").is_null());
}

TEST_F(StatsCommand, RefusesASpaceThatIsNotThereAndMakesNone) {
  const std::string line = Refusal(Vemo({"stats", uri("nowhere")}), 3);
  EXPECT_NE(line.find("nowhere"), std::string::npos) << line;
  EXPECT_FALSE(std::filesystem::exists(path("nowhere")));
}

TEST_F(StatsCommand, RefusesAUriThatIsNone) {
  Refusal(Vemo({"stats", "nothing"}), 2);
}

}  // namespace
}  // namespace vemo::test
