#include "engines/lmdb/space_folder.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <map>
#include <mutex>
#include <system_error>
#include <utility>

#include "engines/lmdb/lmdb_error.h"
#include "engines/lmdb/seal_file.h"
#include "store/error.h"

namespace vemo {
namespace {

namespace fs = std::filesystem;

bool IsOurs(const fs::path& file) {
  constexpr std::array kNames{kDataFile, kUnfinishedDataFile, kReadersFile, kWriterLockFile,
                              kSealFile, kLogFile, kUnfinishedLogFile};
  return std::find(kNames.begin(), kNames.end(), file) != kNames.end();
}

// The first file in `path` that this engine does not make, or nothing.
fs::path ForeignFile(const fs::path& path, const std::string& space) {
  std::error_code error;
  fs::directory_iterator entries(path, error);
  for (; !error && entries != fs::directory_iterator(); entries.increment(error)) {
    const fs::path file = entries->path().filename();
    if (!IsOurs(file)) return file;
  }
  if (error) throw LmdbError("look into the folder of", space, error.value());
  return {};
}

// Where a commit behind the one that makes a space was sealed, there was a data.mdb with something in it.
void RequireNeverSealed(const fs::path& path, const std::string& space) {
  if (SealFile(path / kSealFile, space, true).Read().Newest() <= 1) return;
  throw DamagedStorage("cannot open " + space + ": its " + kDataFile + " is missing or empty, and " + kSealFile +
                           " tells of commits; restore the space from a backup",
                       {space, "", OID(), "", std::nullopt});
}

void SyncOneFolder(const fs::path& path, const std::string& space) {
  const int folder = ::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (folder < 0) throw LmdbError("sync the folder of", space, errno);
  const int failure = ::fsync(folder) == 0 ? 0 : errno;
  ::close(folder);
  // Some file systems have nothing to sync in a folder and say so.
  if (failure != 0 && failure != EINVAL) throw LmdbError("sync the folder of", space, failure);
}

using FolderId = std::pair<dev_t, ino_t>;

struct Claims {
  std::mutex mutex;
  std::map<FolderId, pid_t> owners;  // an owner other than this process is a parent that forked it
};

// Never destroyed: engines of static lifetime release their claims late.
Claims& ProcessClaims() {
  static Claims& claims = *new Claims;
  return claims;
}

}  // namespace

FolderContents ExamineFolder(const fs::path& path, const std::string& space) {
  std::error_code error;
  const fs::file_status status = fs::status(path, error);
  if (status.type() == fs::file_type::not_found) return FolderContents::kNothingYet;
  if (!fs::status_known(status)) throw LmdbError("look into the folder of", space, error.value());
  if (!fs::is_directory(status)) {
    throw IncompatibleSpace("cannot open " + space + ": it is not a folder; a space is a folder with " +
                            kDataFile + " in it");
  }
  const fs::file_status data = fs::status(path / kDataFile, error);
  if (data.type() == fs::file_type::not_found) {
    RequireNeverSealed(path, space);
    const fs::path foreign = ForeignFile(path, space);
    if (foreign.empty()) return FolderContents::kNothingYet;
    throw IncompatibleSpace("cannot open " + space + ": the folder holds other files (" + foreign.string() +
                            ") and no space; name a new or an empty folder");
  }
  if (!fs::status_known(data)) throw LmdbError("look into the folder of", space, error.value());
  if (!fs::is_regular_file(data)) {
    throw IncompatibleSpace("cannot open " + space + ": " + kDataFile + " in it is not a file");
  }
  const std::uintmax_t bytes = fs::file_size(path / kDataFile, error);
  if (error) throw LmdbError("look into the folder of", space, error.value());
  if (bytes != 0) return FolderContents::kData;
  RequireNeverSealed(path, space);
  const fs::path foreign = ForeignFile(path, space);
  if (foreign.empty()) return FolderContents::kNothingYet;
  throw IncompatibleSpace("cannot open " + space + ": " + kDataFile + " is empty and other files (" +
                          foreign.string() + ") lie beside it; name a new or an empty folder");
}

void MakeFolder(const fs::path& path, const std::string& space) {
  std::error_code error;
  fs::create_directory(path, error);
  // A power loss may have kept the seal of a creation and nothing else of it. The file stays: others may hold its lock.
  if (!error && fs::exists(path / kSealFile, error)) fs::resize_file(path / kSealFile, 0, error);
  if (error) throw LmdbError("make the folder of", space, error.value());
}

void SyncFolder(const fs::path& path, const std::string& space) {
  SyncOneFolder(path, space);
  SyncOneFolder(path / "..", space);
}

FolderClaim::FolderClaim(const fs::path& path, const std::string& space) : m_process(::getpid()) {
  struct stat status {};
  if (::stat(path.c_str(), &status) != 0) throw LmdbError("look into the folder of", space, errno);
  m_device = status.st_dev;
  m_inode = status.st_ino;
  Claims& claims = ProcessClaims();
  const std::lock_guard lock(claims.mutex);
  const auto [position, isNew] = claims.owners.try_emplace(FolderId(m_device, m_inode), m_process);
  if (isNew) return;
  if (position->second == m_process) {
    throw SpaceBusy("cannot open " + space +
                    ": this process has it open already; use that one, or close it first");
  }
  position->second = m_process;
}

FolderClaim::~FolderClaim() {
  Claims& claims = ProcessClaims();
  const std::lock_guard lock(claims.mutex);
  const auto position = claims.owners.find(FolderId(m_device, m_inode));
  // In a forked child, which may have claimed the folder anew, the parent's claim is not this entry any more.
  if (position != claims.owners.end() && position->second == m_process) claims.owners.erase(position);
}

}  // namespace vemo
