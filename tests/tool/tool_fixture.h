// A folder for spaces and recordings, and what every refusal of the command has in common.
#pragma once

#include <gtest/gtest.h>

#include <algorithm>

#include "command_line.h"
#include "tests/history/temporary_folder.h"

namespace vemo::test {

class ToolTest : public ::testing::Test {
 protected:
  std::filesystem::path path(const std::string& name) const { return m_folder.path() / name; }
  // The URI of the space of that name in the folder.
  std::string uri(const std::string& name = "space") const { return "lmdb:" + path(name).string(); }

  std::string WriteRecording(const std::string& name, const std::vector<std::string>& patches,
                             std::string_view endContent) {
    WriteFile(path(name), RecordingText(patches, endContent));
    return path(name).string();
  }

  // "hello, world" with some detours.
  std::string SmallRecording() {
    return WriteRecording("small.json",
                          {R"(0,0,"hallo world")", R"(1,1,"e")", R"(5,0,",")", R"(0,5,"")", R"(0,0,"hello")"},
                          "hello, world");
  }

  // One line on standard error and nothing on standard output. Returns the line.
  static std::string Refusal(const Outcome& outcome, int exitCode) {
    EXPECT_EQ(outcome.exitCode, exitCode) << outcome.err;
    EXPECT_EQ(outcome.out, "");
    EXPECT_EQ(std::count(outcome.err.begin(), outcome.err.end(), '\n'), 1) << outcome.err;
    EXPECT_EQ(outcome.err.rfind("vemo: ", 0), 0u) << outcome.err;
    EXPECT_TRUE(outcome.err.ends_with('\n')) << outcome.err;
    EXPECT_LT(outcome.err.size(), 400u) << outcome.err;
    return outcome.err.substr(0, outcome.err.size() - 1);
  }

 private:
  TemporaryFolder m_folder;
};

}  // namespace vemo::test
