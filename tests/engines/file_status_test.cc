#include "engines/lmdb/file_status.h"

#include <gtest/gtest.h>

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <fstream>
#include <string>

#include "tests/support/temp_folder.h"

namespace vemo::test {
namespace {

std::filesystem::path MakeFile(const std::filesystem::path& path, std::size_t bytes) {
  std::ofstream(path) << std::string(bytes, 'x');
  return path;
}

TEST(FileStatus, TellsLengthAndRoomOnTheDisk) {
  TempFolder folder;
  const auto path = MakeFile(folder.path() / "file", 10'000);
  ASSERT_EQ(::truncate(path.c_str(), 1'000'000), 0);
  const int synced = ::open(path.c_str(), O_RDWR);
  ASSERT_EQ(::fsync(synced), 0);
  ::close(synced);
  const auto status = StatusOf(path);
  ASSERT_TRUE(status);
  EXPECT_EQ(status->bytes, 1'000'000u);
  EXPECT_GE(status->diskBytes, 10'000u);
  EXPECT_LT(status->diskBytes, 1'000'000u);
}

TEST(FileStatus, ADescriptorAndANameOfOneFileAreTheSame) {
  TempFolder folder;
  const auto path = MakeFile(folder.path() / "file", 10);
  const int file = ::open(path.c_str(), O_RDONLY);
  std::filesystem::rename(path, folder.path() / "renamed");
  EXPECT_TRUE(StatusOf(file)->IsSameFile(*StatusOf(folder.path() / "renamed")));
  EXPECT_FALSE(StatusOf(file)->IsSameFile(*StatusOf(MakeFile(path, 10))));
  ::close(file);
}

TEST(FileStatus, IsNothingWhereThereIsNoFile) {
  TempFolder folder;
  EXPECT_FALSE(StatusOf(folder.path() / "none"));
  EXPECT_EQ(errno, ENOENT);
  EXPECT_FALSE(StatusOf(-1));
  EXPECT_EQ(errno, EBADF);
}

}  // namespace
}  // namespace vemo::test
