// Who may include whom: tool -> history -> store -> module -> platform, and engines the little that their
// interface needs.
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <map>
#include <string>
#include <string_view>
#include <vector>

namespace vemo::test {
namespace {

namespace fs = std::filesystem;

struct Include {
  std::string from;  // both relative to the root of the sources
  std::string to;
};

bool StartsWithAny(std::string_view text, const std::vector<std::string>& prefixes) {
  for (const std::string& prefix : prefixes) {
    if (text.substr(0, prefix.size()) == prefix) return true;
  }
  return false;
}

bool IsSource(const fs::path& path) {
  return path.extension() == ".h" || path.extension() == ".cc";
}

// The files that `folder` includes from this project, which is what stands in quotes.
std::vector<Include> IncludesOf(const std::string& folder) {
  std::vector<Include> includes;
  const fs::path root = VEMO_SOURCE_DIR;
  for (const auto& entry : fs::recursive_directory_iterator(root / folder)) {
    if (!IsSource(entry.path())) continue;
    std::ifstream file(entry.path());
    for (std::string line; std::getline(file, line);) {
      const std::string opening = "#include \"";
      if (line.compare(0, opening.size(), opening) != 0) continue;
      includes.push_back({fs::relative(entry.path(), root).string(),
                          line.substr(opening.size(), line.rfind('"') - opening.size())});
    }
  }
  return includes;
}

void ExpectOnly(const std::string& folder, const std::vector<std::string>& allowed) {
  const std::vector<Include> includes = IncludesOf(folder);
  EXPECT_FALSE(includes.empty()) << folder;
  for (const Include& include : includes) {
    EXPECT_TRUE(StartsWithAny(include.to, allowed)) << include.from << " must not include " << include.to;
    EXPECT_TRUE(fs::exists(fs::path(VEMO_SOURCE_DIR) / include.to))
        << include.from << " includes " << include.to;
  }
}

// Each folder sees those before it.
const std::vector<std::string> kModule{"platform/", "vxUtils/", "vxOT/", "vxPersistStore/", "vxOperation/"};

TEST(IncludeDirection, TheModuleSeesThePlatformAndItself) {
  ExpectOnly("platform", {"platform/"});
  for (const std::string folder : {"vxUtils", "vxOT", "vxPersistStore", "vxOperation"})
    ExpectOnly(folder, kModule);
}

TEST(IncludeDirection, TheStoreSeesTheModuleAndTheFrontsOfTheEngines) {
  std::vector<std::string> allowed = kModule;
  allowed.insert(allowed.end(), {"store/", "engines/lmdb/lmdb_engine.h", "engines/memory/memory_engine.h"});
  ExpectOnly("store", allowed);
  for (const Include& include : IncludesOf("store")) {
    if (fs::path(include.from).extension() == ".h") {
      EXPECT_FALSE(StartsWithAny(include.to, {"engines/"}))
          << include.from << ": engines are no part of the store's face";
    }
  }
}

TEST(IncludeDirection, EnginesSeeTheirInterfaceAndThemselves) {
  ExpectOnly("engines", {"engines/", "platform/", "store/engine.h", "store/error.h", "vxUtils/BoundedReader.h"});
  for (const Include& include : IncludesOf("engines/lmdb"))
    EXPECT_FALSE(StartsWithAny(include.to, {"engines/memory/"}));
  for (const Include& include : IncludesOf("engines/memory"))
    EXPECT_FALSE(StartsWithAny(include.to, {"engines/lmdb/"}));
}

TEST(IncludeDirection, HistoryAndToolComeLast) {
  std::vector<std::string> allowed = kModule;
  allowed.insert(allowed.end(), {"store/", "history/"});
  ExpectOnly("history", allowed);
  allowed.push_back("tool/");
  if (!IncludesOf("tool").empty()) ExpectOnly("tool", allowed);
}

}  // namespace
}  // namespace vemo::test
