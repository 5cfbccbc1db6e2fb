#include "engines/lmdb/page_file.h"

#include <gtest/gtest.h>

#include <sys/mman.h>

#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <fstream>
#include <memory>
#include <string>
#include <vector>

#include "engines/lmdb/space_folder.h"
#include "tests/engines/lmdb_site.h"
#include "tests/support/temp_folder.h"

namespace vemo::test {
namespace {

constexpr std::uint64_t kFileBytes = std::uint64_t{1} << 20;
constexpr int kFewPages = 200, kManyPages = 300;

// Whether the kernel was told to read nothing around the page that is asked for: "rr" among the flags of the
// map.
struct MapAdvice {
  std::uintptr_t begin;
  std::uintptr_t end;
  std::string path;
  bool readsAround;
};

std::vector<MapAdvice> AdviceOfMaps() {
  std::vector<MapAdvice> all;
  std::ifstream maps("/proc/self/smaps");
  for (std::string line; std::getline(maps, line);) {
    std::uintptr_t begin = 0, end = 0;
    int path = 0;
    if (std::sscanf(line.c_str(), "%zx-%zx %*s %*s %*s %*s %n", &begin, &end, &path) == 2) {
      all.push_back({begin, end, path > 0 ? line.substr(static_cast<std::size_t>(path)) : "", true});
    } else if (line.rfind("VmFlags:", 0) == 0 && !all.empty()) {
      all.back().readsAround = (line + ' ').find(" rr ") == std::string::npos;
    }
  }
  return all;
}

bool ReadsAround(const void* address) {
  const auto wanted = reinterpret_cast<std::uintptr_t>(address);
  for (const MapAdvice& map : AdviceOfMaps()) {
    if (map.begin <= wanted && wanted < map.end) return map.readsAround;
  }
  return true;
}

// Not every kernel that has /proc/self/smaps takes the advice.
bool TakesAdvice() {
  constexpr std::size_t kBytes = 4'096;
  void* map = ::mmap(nullptr, kBytes, PROT_READ, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
  if (map == MAP_FAILED) return false;
  ::madvise(map, kBytes, MADV_RANDOM);
  const bool isTaken = !ReadsAround(map);
  ::munmap(map, kBytes);
  return isTaken;
}

class PageFileTest : public testing::Test {
 protected:
  void SetUp() override {
    if (!TakesAdvice()) GTEST_SKIP() << "the kernel does not tell how it reads what is mapped";
    std::ofstream(m_path, std::ios::binary) << std::string(kFileBytes, 'x');
    m_file = std::make_unique<PageFile>(m_path, "a space");
  }
  bool ReadsAhead() { return ReadsAround(m_file->At(0, 1)); }

  const TempFolder m_folder;
  const std::filesystem::path m_path = m_folder.path() / "pages";
  std::unique_ptr<PageFile> m_file;
};

TEST_F(PageFileTest, IsReadAheadOnceManyPagesWereReached) {
  for (int i = 0; i < kFewPages; ++i) m_file->CountReached();
  EXPECT_FALSE(ReadsAhead());
  for (int i = 0; i < kManyPages; ++i) m_file->CountReached();
  EXPECT_TRUE(ReadsAhead());
}

TEST_F(PageFileTest, IsReadAsBeforeWhereItIsMappedAnew) {
  m_file->Remap(2 * kFileBytes);
  EXPECT_FALSE(ReadsAhead());
  for (int i = 0; i < kManyPages; ++i) m_file->CountReached();
  m_file->Remap(3 * kFileBytes);
  EXPECT_TRUE(ReadsAhead());
}

// Records of the first size share pages, those of the second have pages of their own.
class ReadAheadOfASpace : public testing::TestWithParam<std::size_t> {
 protected:
  static constexpr std::uint64_t kRecords = 1'200;

  void SetUp() override {
    if (!TakesAdvice()) GTEST_SKIP() << "the kernel does not tell how it reads what is mapped";
    BatchBuilder batch;
    for (std::uint64_t oid = 1; oid <= kRecords; ++oid) batch.Put(oid, std::string(GetParam(), 'r'));
    OpenAt(m_space, true)->Commit(batch.At(0));
  }
  // The other map of data.mdb is LMDB's own.
  bool IsReadAhead() const {
    const std::vector<MapAdvice> maps = AdviceOfMaps();
    return std::none_of(maps.begin(), maps.end(), [&](const MapAdvice& map) {
      return map.path == (m_space / kDataFile).string() && !map.readsAround;
    });
  }

  const TempFolder m_folder;
  const std::filesystem::path m_space = m_folder.path() / "space";
};

TEST_P(ReadAheadOfASpace, BeginsWhereManyOfItsRecordsAreRead) {
  const auto engine = OpenAt(m_space);
  const auto snapshot = engine->OpenSnapshot();
  EXPECT_TRUE(snapshot->Read(OID(kRecords / 2)));
  EXPECT_FALSE(IsReadAhead());
  for (std::uint64_t oid = 1; oid <= kRecords; ++oid) EXPECT_TRUE(snapshot->Read(OID(oid)));
  EXPECT_TRUE(IsReadAhead());
}

INSTANTIATE_TEST_SUITE_P(Records, ReadAheadOfASpace, testing::Values(1'300, 5'000),
                         [](const auto& parameter) {
                           return "Of" + std::to_string(parameter.param) + "Bytes";
                         });

}  // namespace
}  // namespace vemo::test
