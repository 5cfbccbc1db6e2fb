// Histories made by chance: few different lines, so that git has many ways to pair them.
#include <gtest/gtest.h>

#include <cstdlib>
#include <random>

#include "edit_model.h"
#include "history/edit_source.h"
#include "test_repository.h"

namespace vemo::test {
namespace {

std::uint64_t Seed() {
  const char* text = std::getenv("VEMO_SEED");
  return text != nullptr ? std::strtoull(text, nullptr, 10) : 20240229;
}

class RandomHistory {
 public:
  explicit RandomHistory(std::uint64_t seed) : m_random(seed) {}

  // A content near the last one: some lines deleted, some inserted, sometimes no line feed at the end.
  std::string Change(std::vector<std::string>& lines) {
    for (int changes = Below(4); changes >= 0; --changes) {
      const int begin = Below(static_cast<int>(lines.size()) + 1);
      const int deleted = std::min(Below(4), static_cast<int>(lines.size()) - begin);
      lines.erase(lines.begin() + begin, lines.begin() + begin + deleted);
      for (int inserted = Below(5); inserted > 0; --inserted) lines.insert(lines.begin() + begin, Line());
    }
    std::string content;
    for (const std::string& line : lines) content += line + "\n";
    if (!content.empty() && Below(3) == 0) content.pop_back();
    return content;
  }

  int Below(int bound) { return static_cast<int>(m_random() % static_cast<unsigned>(bound)); }

 private:
  std::string Line() {
    const char* lines[] = {"", "a", "b", "}", "-", "+", "\\ No newline at end of file", "@@ -1 +1 @@", "\r"};
    return lines[Below(std::size(lines))];
  }

  std::mt19937_64 m_random;
};

TEST(RandomHistory, EndsWithTheFilesOfTheLastCommit) {
  const std::uint64_t seed = Seed();
  SCOPED_TRACE("VEMO_SEED=" + std::to_string(seed));
  RandomHistory random(seed);
  TestRepository repository;
  std::vector<std::vector<std::string>> files(6);
  for (int commit = 0; commit < 40; ++commit) {
    for (std::size_t file = 0; file < files.size(); ++file) {
      const std::string name = "f" + std::to_string(file);
      const int chance = random.Below(10);
      if (chance == 0) {
        repository.Remove(name);
        files[file].clear();
      } else if (chance < 6) {
        repository.Write(name, random.Change(files[file]));
      }
    }
    repository.Commit();
  }
  const auto source = OpenGitHistory(repository.path());
  EXPECT_GT(ReplayAndCheck(*source).edits, 100u);
}

}  // namespace
}  // namespace vemo::test
