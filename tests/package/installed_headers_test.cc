// What the installed header folder holds.
#include <fstream>
#include <set>

#include "tests/package/installed_package.h"

namespace vemo::test {
namespace {

using InstalledHeaders = InstalledPackage;

// The folders and files directly below `folder`.
std::set<std::string> NamesIn(const std::filesystem::path& folder) {
  std::set<std::string> names;
  for (const auto& entry : std::filesystem::directory_iterator(folder)) names.insert(entry.path().filename().string());
  return names;
}

TEST_F(InstalledHeaders, LieInOneFolderOfTheirOwn) {
  EXPECT_EQ(NamesIn(Prefix() / "include"), std::set<std::string>{"vemo"});
  EXPECT_TRUE(std::filesystem::exists(Prefix() / "include/vemo/vemo/maps.h"));
  EXPECT_TRUE(std::filesystem::exists(Prefix() / "include/vemo/vemo/store.h"));
  EXPECT_FALSE(std::filesystem::exists(Prefix() / "include/vemo/engines"));
}

// Quoted includes name headers of the package, the others the standard library or POSIX: no engine's or parser's own header.
TEST_F(InstalledHeaders, IncludeNothingOfTheEnginesAndParsers) {
  const std::set<std::string> system = {"sys/types.h", "unistd.h"};
  int headers = 0;
  for (const auto& entry : std::filesystem::recursive_directory_iterator(Prefix() / "include/vemo")) {
    if (!entry.is_regular_file()) continue;
    ++headers;
    std::ifstream file(entry.path());
    for (std::string line; std::getline(file, line);) {
      if (!line.starts_with("#include ")) continue;
      const std::string name = line.substr(10, line.find_first_of(">\"", 10) - 10);
      if (line[9] == '"') {
        EXPECT_TRUE(std::filesystem::exists(Prefix() / "include/vemo" / name)) << entry.path() << ": " << line;
      } else {
        EXPECT_TRUE(name.find('.') == std::string::npos || system.contains(name)) << entry.path() << ": " << line;
      }
    }
  }
  EXPECT_GT(headers, 30);
}

}  // namespace
}  // namespace vemo::test
