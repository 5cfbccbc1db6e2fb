// What a commit asks the file system about a file.
//
// Not stat: who asks for the times of a file makes the next write to it take a new time, which the flush behind that write
// then writes to the disk as well (multigrain timestamps, Linux 6.13). A flush would write twice.
#pragma once

#include <cstdint>
#include <filesystem>
#include <optional>

namespace vemo {

struct FileStatus {
  std::uint64_t device = 0;
  std::uint64_t inode = 0;
  std::uint64_t bytes = 0;      // its length
  std::uint64_t diskBytes = 0;  // taken on the disk

  bool IsSameFile(const FileStatus& other) const noexcept { return device == other.device && inode == other.inode; }
};

// Nothing where there is no such file, or the system does not tell; errno says why.
std::optional<FileStatus> StatusOf(const std::filesystem::path& path) noexcept;
std::optional<FileStatus> StatusOf(int file) noexcept;

}  // namespace vemo
