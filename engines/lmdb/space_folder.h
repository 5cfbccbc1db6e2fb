// The folder of a space: what is in it, and that a process opens it once.
#pragma once

#include <sys/types.h>

#include <filesystem>
#include <string>

namespace vemo {

inline constexpr const char* kDataFile = "data.mdb";
inline constexpr const char* kUnfinishedDataFile = "data.mdb.new";  // of a creation under way, or cut off
inline constexpr const char* kReadersFile = "lock.mdb";
inline constexpr const char* kWriterLockFile = "writer.lock";
inline constexpr const char* kSealFile = "data.seal";
inline constexpr const char* kLogFile = "commits.log";
inline constexpr const char* kUnfinishedLogFile = "commits.log.new";

enum class FolderContents {
  kNothingYet,  // an absent or empty folder, or what a creation left that ended before there was a data.mdb
  kData,        // a file that LMDB may or may not understand
};

// Looks without touching. Throws IncompatibleSpace for a file and for a folder with other files only,
// StoreError when it may not look. `space` is the name for messages.
FolderContents ExamineFolder(const std::filesystem::path& path, const std::string& space);

// Makes the folder where it is absent, and empties the seal of a creation that was interrupted. Throws StoreError, also when its parent is missing.
void MakeFolder(const std::filesystem::path& path, const std::string& space);

// Makes the names of new files in `path`, and of `path` itself, survive a power loss.
void SyncFolder(const std::filesystem::path& path, const std::string& space);

// Held while this process has the folder open. The folder is known by device and inode, so that other paths
// to it count as well. A child forked meanwhile may claim it for itself.
class FolderClaim {
 public:
  // Throws SpaceBusy when this process holds a claim already, StoreError when the folder cannot be looked at.
  FolderClaim(const std::filesystem::path& path, const std::string& space);
  ~FolderClaim();
  FolderClaim(const FolderClaim&) = delete;
  FolderClaim& operator=(const FolderClaim&) = delete;

 private:
  dev_t m_device = 0;
  ino_t m_inode = 0;
  pid_t m_process;
};

}  // namespace vemo
