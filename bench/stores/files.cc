#include "bench/stores/files.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <system_error>

namespace vemo::bench {

namespace fs = std::filesystem;

std::uint64_t BytesOnDisk(const fs::path& folder) {
  std::uint64_t bytes = 0;
  for (const auto& entry : fs::recursive_directory_iterator(folder)) {
    struct stat status {};
    if (entry.is_regular_file() && ::stat(entry.path().c_str(), &status) == 0)
      bytes += static_cast<std::uint64_t>(status.st_blocks) * 512;
  }
  return bytes;
}

void DropFromPageCache(const fs::path& folder) {
  for (const auto& entry : fs::recursive_directory_iterator(folder)) {
    if (!entry.is_regular_file()) continue;
    const int file = ::open(entry.path().c_str(), O_RDONLY);
    if (file < 0) throw std::system_error(errno, std::generic_category(), entry.path().string());
    // Pages that are not written yet would stay.
    ::fdatasync(file);
    ::posix_fadvise(file, 0, 0, POSIX_FADV_DONTNEED);
    ::close(file);
  }
}

}  // namespace vemo::bench
