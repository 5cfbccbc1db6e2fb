#include "engines/lmdb/page_file.h"

#include <gtest/gtest.h>

#include <cctype>
#include <fstream>
#include <memory>
#include <string>

#include "tests/support/temp_folder.h"

namespace vemo::test {
namespace {

constexpr std::uint64_t kFileBytes = std::uint64_t{1} << 20;
constexpr int kManyPages = 1'000;

// What the kernel says about the map in which `address` lies: its flags, "rr" among them where it was told to
// read nothing around the page that is asked for. Empty where the kernel does not tell.
std::string FlagsOfMap(const std::uint8_t* address) {
  const auto wanted = reinterpret_cast<std::uintptr_t>(address);
  std::ifstream maps("/proc/self/smaps");
  bool isInside = false;
  for (std::string line; std::getline(maps, line);) {
    std::size_t used = 0;
    const bool isHead = !line.empty() && std::isxdigit(static_cast<unsigned char>(line[0])) &&
                        line.find('-') < line.find(' ');
    if (isHead) {
      const std::uintptr_t from = std::stoull(line, &used, 16);
      isInside = from <= wanted && wanted < std::stoull(line.substr(used + 1), nullptr, 16);
    } else if (isInside && line.rfind("VmFlags:", 0) == 0) {
      return line + ' ';
    }
  }
  return "";
}

bool ReadsAhead(PageFile& file) {
  return FlagsOfMap(file.At(0, 1)).find(" rr ") == std::string::npos;
}

class PageFileTest : public testing::Test {
 protected:
  PageFileTest() {
    std::ofstream(m_path, std::ios::binary) << std::string(kFileBytes, 'x');
    m_file = std::make_unique<PageFile>(m_path, "a space");
  }
  void SetUp() override {
    if (FlagsOfMap(m_file->At(0, 1)).empty())
      GTEST_SKIP() << "/proc/self/smaps does not tell the flags of maps";
  }

  const TempFolder m_folder;
  const std::filesystem::path m_path = m_folder.path() / "pages";
  std::unique_ptr<PageFile> m_file;
};

TEST_F(PageFileTest, IsReadAheadOnceManyPagesWereReached) {
  m_file->CountReached();
  EXPECT_FALSE(ReadsAhead(*m_file));
  for (int i = 0; i < kManyPages; ++i) m_file->CountReached();
  EXPECT_TRUE(ReadsAhead(*m_file));
}

TEST_F(PageFileTest, IsReadAsBeforeWhereItIsMappedAnew) {
  m_file->Remap(2 * kFileBytes);
  EXPECT_FALSE(ReadsAhead(*m_file));
  for (int i = 0; i < kManyPages; ++i) m_file->CountReached();
  m_file->Remap(3 * kFileBytes);
  EXPECT_TRUE(ReadsAhead(*m_file));
}

}  // namespace
}  // namespace vemo::test
