// The first page's promise: a program that compiles and prints what the page says.
#include <filesystem>
#include <fstream>
#include <iterator>

#include "tool_fixture.h"

namespace vemo::test {
namespace {

std::string ContentOf(const std::string& name) {
  std::ifstream in(std::string(VEMO_SOURCE_DIR "/") + name, std::ios::binary);
  EXPECT_TRUE(in) << name;
  return {std::istreambuf_iterator<char>(in), {}};
}

class ReadmeTest : public ToolTest {
 protected:
  static constexpr std::string_view kFence = "```cpp\n";

  // The first block of C++ on the page, and where it ends.
  static std::string FirstProgram(const std::string& page, std::size_t& end) {
    const std::size_t fence = page.find(kFence);
    EXPECT_NE(fence, std::string::npos);
    if (fence == std::string::npos) return {};
    const std::size_t begin = fence + kFence.size();
    end = page.find("```", begin);
    return page.substr(begin, end - begin);
  }
};

TEST_F(ReadmeTest, BeginsWithTheExampleThatIsBuilt) {
  const std::string page = ContentOf("README.md");
  std::size_t end = 0;
  EXPECT_EQ(FirstProgram(page, end), ContentOf("examples/first_steps.cc"));
}

TEST_F(ReadmeTest, HasTheExampleWithinItsFirstTwentyLines) {
  const std::string page = ContentOf("README.md");
  std::size_t end = 0;
  FirstProgram(page, end);
  EXPECT_LE(std::count(page.begin(), page.begin() + static_cast<std::ptrdiff_t>(end), '\n'), 20)
      << "its last line";
}

TEST_F(ReadmeTest, SaysWhatTheExamplePrints) {
  const std::string page = ContentOf("README.md");
  std::size_t end = 0;
  FirstProgram(page, end);
  const std::string promise = "This prints `";
  const std::size_t begin = page.find(promise, end);
  ASSERT_NE(begin, std::string::npos);
  const std::size_t first = begin + promise.size();
  const std::string printed = page.substr(first, page.find('`', first) - first);
  for (const char* run : {"first", "second, with the space of the first"}) {
    const Outcome outcome =
        RunProgram({VEMO_FIRST_STEPS}, [this] { std::filesystem::current_path(path("")); });
    EXPECT_EQ(outcome.exitCode, 0) << run << ": " << outcome.err;
    EXPECT_EQ(outcome.out, printed + "\n") << run;
  }
}

}  // namespace
}  // namespace vemo::test
