// The scripts around the benchmark's programs.
#include <gtest/gtest.h>
#include <sys/wait.h>

#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <nlohmann/json.hpp>
#include <sstream>
#include <string>

#include "tests/support/temp_folder.h"

namespace vemo::bench {
namespace {

namespace fs = std::filesystem;

std::string ReadFile(const fs::path& path) {
  std::ifstream file(path);
  std::ostringstream text;
  text << file.rdbuf();
  return std::move(text).str();
}

class Driver : public testing::Test {
 protected:
  void SetUp() override {
    if (std::system("python3 -c 0 >/dev/null 2>&1") != 0) GTEST_SKIP() << "there is no python3 here";
  }

  int Run(const std::string& script, const std::string& arguments) {
    const std::string command = "PYTHONDONTWRITEBYTECODE=1 python3 '" VEMO_SOURCE_DIR "/bench/" + script +
                                "' " + arguments + " >'" + Path("out").string() + "' 2>'" +
                                Path("err").string() + "'";
    const int status = std::system(command.c_str());
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
  }
  int RunSmoke(const std::string& arguments) {
    return Run("driver.py", "--build '" VEMO_BINARY_DIR "' --smoke --scratch '" + m_folder.path().string() +
                                "' " + arguments);
  }
  fs::path Path(const std::string& name) const { return m_folder.path() / name; }

 private:
  test::TempFolder m_folder;
};

TEST_F(Driver, WritesAResultForEachRowSizeAndPeer) {
  ASSERT_EQ(RunSmoke("--filter '^map.(insert|scan).clustered.P1/.*/(vemo|std::map)$' --rounds 2 --json '" +
                     Path("json").string() + "'"),
            0)
      << ReadFile(Path("err"));
  const nlohmann::json results = nlohmann::json::parse(ReadFile(Path("json")));
  ASSERT_EQ(results.size(), 4U);
  for (const nlohmann::json& result : results) {
    EXPECT_TRUE(result["workload"] == "map.insert.clustered" || result["workload"] == "map.scan.clustered")
        << result;
    EXPECT_EQ(result["payload"], "P1");
    EXPECT_EQ(result["size"], 1'000);
    EXPECT_EQ(result["unit"], "ns/op");
    EXPECT_EQ(result["runs"], 2);
    EXPECT_LE(result["min"], result["median"]);
    EXPECT_LE(result["median"], result["max"]);
  }
}

TEST_F(Driver, RunsTheProgramsOfStoresAndOfReplaysToo) {
  ASSERT_EQ(RunSmoke("--filter '^store.load.clustered.P1/.*/(vemo|LMDB)$|^replay.git.durable/' --json '" +
                     Path("json").string() + "'"),
            0)
      << ReadFile(Path("err"));
  std::string rows;
  for (const nlohmann::json& result : nlohmann::json::parse(ReadFile(Path("json"))))
    rows += result["workload"].get<std::string>() + "/" + result["peer"].get<std::string>() + " ";
  const bool hasReplay = fs::exists(VEMO_BINARY_DIR "/bench/replay_bench");
  EXPECT_EQ(rows, std::string("store.load.clustered/vemo store.load.clustered/LMDB ") +
                      (hasReplay ? "replay.git.durable/vemo " : ""));
}

TEST_F(Driver, ReplacesTheTableBetweenTheMarksOfADocument) {
  std::ofstream(Path("page")) << "before\n<!-- results -->\nold\n<!-- end of results -->\nafter\n";
  ASSERT_EQ(RunSmoke("--filter '^map.insert.clustered.P1/' --markdown '" + Path("page").string() + "'"), 0);
  const std::string page = ReadFile(Path("page"));
  EXPECT_EQ(page.find("old"), std::string::npos) << page;
  EXPECT_EQ(page.rfind("before\n<!-- results -->\n", 0), 0U) << page;
  EXPECT_NE(page.find("| map.insert.clustered.P1/1000 | ns/op |"), std::string::npos) << page;
  EXPECT_NE(page.find("<!-- end of results -->\nafter\n"), std::string::npos) << page;
}

TEST_F(Driver, DrawsTheRatiosAndACurveForWhatHasTwoSizes) {
  std::ofstream(Path("plot.py")) << R"(import sys
sys.path.insert(0, sys.argv[1])
import plots
import xml.etree.ElementTree as tree
results = [{"workload": "map.insert", "payload": "P1", "size": size, "peer": peer, "unit": "ns/op",
            "median": size * factor, "min": 1, "max": 2, "runs": 1}
           for size in (10, 1000) for peer, factor in (("vemo", 1), ("peer<1>", 2))]
plots.write_all(results, sys.argv[2])
ratios = tree.parse(sys.argv[2] + "/ratios.svg").getroot()
assert [node.text for node in ratios if node.text == "0.50"] == ["0.50", "0.50"], "a ratio a row"
curves = tree.parse(sys.argv[2] + "/cost-map.insert.P1.svg").getroot()
assert len([node for node in curves if node.tag.endswith("polyline")]) == 2, "a curve a peer"
)";
  const std::string command = "PYTHONDONTWRITEBYTECODE=1 python3 '" + Path("plot.py").string() +
                              "' '" VEMO_SOURCE_DIR "/bench' '" + Path("plots").string() + "'";
  EXPECT_EQ(std::system(command.c_str()), 0);
}

TEST_F(Driver, RefusesAFilterThatNothingFits) {
  EXPECT_EQ(RunSmoke("--filter nothing.is.called.so"), 1);
  EXPECT_NE(ReadFile(Path("err")).find("No row fits"), std::string::npos);
  EXPECT_EQ(RunSmoke("--filter '('"), 2);
}

TEST_F(Driver, ComparesTheRowsThatTwoBuildsHaveInCommon) {
  ASSERT_EQ(
      Run("compare.py", "'" VEMO_BINARY_DIR "' '" VEMO_BINARY_DIR
                        "' --filter '^map.insert.clustered.P1/' --sizes 500 --rounds 1 --no-instructions"),
      0)
      << ReadFile(Path("err"));
  EXPECT_NE(ReadFile(Path("out")).find("| map.insert.clustered.P1/500 | ns/op |"), std::string::npos);
  EXPECT_EQ(ReadFile(Path("out")).find("find-hit"), std::string::npos);
}

}  // namespace
}  // namespace vemo::bench
