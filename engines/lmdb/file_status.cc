#include "engines/lmdb/file_status.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>

namespace vemo {
namespace {

std::optional<FileStatus> Ask(int file, const char* path, int flags) noexcept {
  constexpr std::uint64_t kBlockBytes = 512;
  struct statx status {};
  if (::statx(file, path, flags, STATX_INO | STATX_SIZE | STATX_BLOCKS, &status) != 0) return std::nullopt;
  return FileStatus{::gnu_dev_makedev(status.stx_dev_major, status.stx_dev_minor), status.stx_ino, status.stx_size,
                    status.stx_blocks * kBlockBytes};
}

}  // namespace

std::optional<FileStatus> StatusOf(const std::filesystem::path& path) noexcept { return Ask(AT_FDCWD, path.c_str(), 0); }

std::optional<FileStatus> StatusOf(int file) noexcept { return Ask(file, "", AT_EMPTY_PATH); }

}  // namespace vemo
