// The commands that the documents show work as they stand.
#include <algorithm>
#include <filesystem>
#include <fstream>

#include "tool_fixture.h"

namespace vemo::test {
namespace {

constexpr std::string_view kCommand = "    build/vemo ";

void ReplaceAll(std::string& text, const std::string& from, const std::string& to) {
  for (std::size_t at = 0; (at = text.find(from, at)) != std::string::npos; at += to.size()) {
    text.replace(at, from.size(), to);
  }
}

// The indented lines of a document that call the command, in order.
std::vector<std::string> CommandsOf(const std::filesystem::path& document) {
  std::vector<std::string> commands;
  std::ifstream in(document);
  for (std::string line; std::getline(in, line);) {
    if (line.starts_with(kCommand)) commands.push_back(line.substr(4));
  }
  return commands;
}

class DocumentedCommandsTest : public ToolTest {};

TEST_F(DocumentedCommandsTest, WorkInTheOrderInWhichTheyStand) {
  const std::filesystem::path source = VEMO_SOURCE_DIR;
  if (!std::filesystem::exists(source / ".git")) GTEST_SKIP() << "the documents replay the clone, and this is none";
  std::vector<std::filesystem::path> documents{source / "README.md"};
  for (const auto& entry : std::filesystem::directory_iterator(source / "docs")) {
    if (entry.path().extension() == ".md") documents.push_back(entry.path());
  }
  std::sort(documents.begin(), documents.end());
  std::size_t run = 0;
  for (const auto& document : documents) {
    for (std::string command : CommandsOf(document)) {
      const bool wantsRecordings = command.find("../shared/data/") != std::string::npos;
      if (wantsRecordings && !std::filesystem::exists(source / "../shared/data")) continue;
      ReplaceAll(command, "/tmp/", path("").string());
      ReplaceAll(command, "build/vemo", VEMO_BINARY_DIR "/vemo");  // after: the build may be below /tmp/ too
      const Outcome outcome =
          RunProgram({"/bin/sh", "-c", command}, [&source] { std::filesystem::current_path(source); });
      EXPECT_EQ(outcome.exitCode, 0) << document << ": " << command << '\n' << outcome.err;
      ++run;
    }
  }
  EXPECT_GE(run, 6u) << "the README alone shows that many";
}

}  // namespace
}  // namespace vemo::test
