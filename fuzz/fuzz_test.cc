// Each fuzz target for a second, from the same seed; fuzz/run runs them for as long as one likes.
#include <gtest/gtest.h>
#include <sys/wait.h>

#include <cstdio>
#include <filesystem>
#include <sstream>
#include <string>
#include <vector>

#include "tests/support/seed.h"
#include "tests/support/temp_folder.h"

namespace vemo::test {
namespace {

struct Outcome {
  int exitCode = -1;
  std::string output;
};

// What the target finds new is kept in a folder that goes away, beside the corpus of the sources, which stays as it is.
Outcome RunTarget(const std::string& target, std::uint64_t seed, int seconds) {
  const TempFolder folder;
  const std::string found = (folder.path() / "found").string();
  std::filesystem::create_directory(found);
  const std::string corpus = std::string(VEMO_SOURCE_DIR "/fuzz/corpus/") + target;
  std::string command = std::string(VEMO_FUZZ_FOLDER "/") + target + "_fuzz -seed=" + std::to_string(seed % 0x7FFFFFFF + 1) +
                        " -max_total_time=" + std::to_string(seconds) +
                        " -timeout=20 -rss_limit_mb=2048 -malloc_limit_mb=256 -artifact_prefix=" + folder.path().string() + "/ " + found;
  if (std::filesystem::exists(corpus)) command += " " + corpus;
  Outcome outcome;
  std::FILE* const pipe = ::popen((command + " 2>&1").c_str(), "r");
  if (pipe == nullptr) return outcome;
  char buffer[4096];
  for (std::size_t n; (n = std::fread(buffer, 1, sizeof(buffer), pipe)) > 0;) outcome.output.append(buffer, n);
  const int status = ::pclose(pipe);
  if (WIFEXITED(status)) outcome.exitCode = WEXITSTATUS(status);
  return outcome;
}

std::vector<std::string> Targets() {
  std::istringstream list(VEMO_FUZZ_TARGETS);
  std::vector<std::string> targets;
  for (std::string target; std::getline(list, target, ',');) targets.push_back(target);
  return targets;
}

class FuzzTest : public testing::TestWithParam<std::string> {};
INSTANTIATE_TEST_SUITE_P(Targets, FuzzTest, testing::ValuesIn(Targets()), [](const auto& info) { return info.param; });

TEST_P(FuzzTest, NoInputCrashesHangsOrTakesMemoryWithoutBound) {
  const Outcome outcome = RunTarget(GetParam(), TestSeed(1), 1);
  EXPECT_EQ(outcome.exitCode, 0) << outcome.output;
  EXPECT_NE(outcome.output.find("Done "), std::string::npos) << outcome.output;
}

TEST(FuzzCanaryTest, APlantedFaultIsFound) {
  const Outcome outcome = RunTarget("canary", TestSeed(1), 60);
  EXPECT_NE(outcome.exitCode, 0) << "it was not found";
  EXPECT_NE(outcome.output.find("deadly signal"), std::string::npos) << outcome.output;
}

}  // namespace
}  // namespace vemo::test
