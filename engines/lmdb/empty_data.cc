#include "engines/lmdb/empty_data.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <system_error>
#include <vector>

#include "engines/lmdb/lmdb_error.h"
#include "engines/lmdb/page_format.h"
#include "engines/lmdb/seal_file.h"
#include "engines/lmdb/space_folder.h"

namespace vemo {
namespace {

namespace fs = std::filesystem;

constexpr std::size_t kFlagsAt = 10;  // in a page

// As LMDB writes them when it opens a new file: two meta pages, each of no commit.
std::vector<std::uint8_t> MetaPages() {
  constexpr std::uint64_t kMapBytes = 1 << 20;  // LMDB's default; whoever opens the file says how large its own is
  const auto pageBytes = std::min<std::size_t>(static_cast<std::size_t>(::sysconf(_SC_PAGESIZE)), kMaxPageBytes);
  const TableRoot noFreePages{static_cast<std::uint32_t>(pageBytes), kNumberKeys, 0, 0, 0, 0, 0, kNoPage};
  const TableRoot noTables{0, 0, 0, 0, 0, 0, 0, kNoPage};
  const MetaPage meta{kLmdbMagic, kLmdbVersion, 0, kMapBytes, noFreePages, noTables, kMetaPages - 1, 0};
  std::vector<std::uint8_t> pages(kMetaPages * pageBytes);
  for (PageNumber number = 0; number < kMetaPages; ++number) {
    std::uint8_t* const page = &pages[number * pageBytes];
    std::memcpy(page, &number, sizeof number);
    std::memcpy(page + kFlagsAt, &kMetaPageFlag, sizeof kMetaPageFlag);
    std::memcpy(page + kPageHeaderBytes, &meta, sizeof meta);
  }
  return pages;
}

void WriteSynced(const fs::path& path, const std::string& space) {
  const int file = ::open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0666);
  if (file < 0) throw LmdbError("make", space, errno);
  const std::vector<std::uint8_t> bytes = MetaPages();
  int failure = 0;
  if (const ssize_t written = ::pwrite(file, bytes.data(), bytes.size(), 0); written < 0) {
    failure = errno;
  } else if (static_cast<std::size_t>(written) != bytes.size()) {
    failure = ENOSPC;
  } else if (::fsync(file) != 0) {
    failure = errno;
  }
  ::close(file);
  if (failure != 0) throw LmdbError("make", space, failure);
}

bool IsThere(const fs::path& file) {
  std::error_code error;
  const std::uintmax_t bytes = fs::file_size(file, error);
  return !error && bytes != 0;
}

}  // namespace

void MakeEmptyData(const fs::path& folder, const std::string& space) {
  const fs::path data = folder / kDataFile;
  const fs::path unfinished = folder / kUnfinishedDataFile;
  SealFile seal(folder / kSealFile, space, false);
  seal.Lock();  // it ends with the file
  if (IsThere(data)) return;
  WriteSynced(unfinished, space);
  if (std::rename(unfinished.c_str(), data.c_str()) != 0) throw LmdbError("make", space, errno);
  SyncFolder(folder, space);
}

}  // namespace vemo
