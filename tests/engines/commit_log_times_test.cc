// Small commits and the times of files: who asks for those of commits.log makes the next flush of it write
// twice.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "engines/lmdb/space_folder.h"
#include "tests/engines/logged_space.h"
#include "tests/support/watched_times.h"

namespace vemo::test {
namespace {

namespace fs = std::filesystem;

using Names = std::vector<std::string>;

class SmallCommits : public LoggedSpace {};

TEST_F(SmallCommits, AskForTheTimesOfNoFile) {
  const auto engine = OpenSpace(space());
  const std::string data = ReadFile(file(kDataFile));
  const WatchedTimes times;
  for (std::uint64_t commit = 2; commit < 6; ++commit) {
    Edit(*engine, commit, commit);
    EXPECT_EQ(EditedIn(*engine), EditedRecord(kEdited, commit));
  }
  EXPECT_EQ(times.Asked(), Names{});
  EXPECT_TRUE(ReadFile(file(kDataFile)) == data) << "they went to the tables";
}

// The flush that writes twice is that of the next small commit.
TEST_F(SmallCommits, BehindOneToTheTablesAskForTheTimesOfNoFile) {
  const auto engine = OpenSpace(space());
  const WatchedTimes times;
  AddRecord(*engine, 2);
  Edit(*engine, 3, 3);
  EXPECT_EQ(EditedIn(*engine), EditedRecord(kEdited, 3));
  EXPECT_EQ(times.Asked(), Names{});
}

// Without this, that nothing was seen would tell nothing.
TEST(WatchedTimes, SeeEachCallThatAsksForThem) {
  const TempFolder folder;
  const fs::path path = folder.path() / "file";
  WriteFile(path, "text");
  const int parent = ::open(folder.path().c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  const int file = ::openat(parent, "file", O_RDONLY | O_CLOEXEC);
  struct stat status {};
  struct statx more {};
  Names seen;
  {
    const WatchedTimes times;
    EXPECT_EQ(::stat(path.c_str(), &status), 0);
    EXPECT_EQ(::lstat(path.c_str(), &status), 0);
    EXPECT_EQ(::fstat(file, &status), 0);
    EXPECT_EQ(::fstatat(parent, "file", &status, 0), 0);
    EXPECT_EQ(::fstatat(file, "", &status, AT_EMPTY_PATH), 0);
    EXPECT_EQ(::statx(parent, "file", 0, STATX_BASIC_STATS, &more), 0);
    EXPECT_EQ(::statx(file, "", AT_EMPTY_PATH, STATX_CTIME, &more), 0);
    EXPECT_EQ(fs::file_size(path), 4u) << "which calls stat";
    seen = times.Asked();
    EXPECT_EQ(::statx(file, "", AT_EMPTY_PATH, STATX_SIZE | STATX_INO, &more), 0);
    EXPECT_EQ(times.Asked(), seen);
  }
  EXPECT_EQ(seen, Names(8, "file"));
  ::close(file);
  ::close(parent);
}

}  // namespace
}  // namespace vemo::test
