// The file commits.log: its bytes, and how they get to the disk.
//
// Not to be called by two threads at once.
#pragma once

#include <cstdint>
#include <filesystem>
#include <optional>
#include <string>

#include "engines/lmdb/file_status.h"
#include "platform/types.h"
#include "store/engine.h"

namespace vemo {

class LogFile {
 public:
  // With `sync`, what Flush and Make have done survives a loss of power.
  LogFile(const std::filesystem::path& folder, const std::string& space, bool readOnly, bool sync);
  ~LogFile();
  LogFile(const LogFile&) = delete;
  LogFile& operator=(const LogFile&) = delete;

  // The log of a space that is about to be opened: the system is asked to read it from the disk meanwhile.
  static void WillNeed(const std::filesystem::path& folder) noexcept;

  // Opens the file that has the name now, where it is there: another process may have made it anew since. Throws
  // StoreError.
  void Open();
  bool IsOpen() const noexcept { return m_file >= 0; }
  // Whether the file that is open had all its bytes at the last Open or Make.
  bool IsWhole() const noexcept;
  bool readOnly() const noexcept { return m_readOnly; }

  // The bytes from `from` on and before `to`, as far as the file has them. Throws StoreError.
  Bytes Read(std::uint64_t from, std::uint64_t to) const;

  // They return 0 or an errno.
  int Write(ByteView bytes, std::uint64_t offset) noexcept;
  int Flush() noexcept;

  // Makes a file of zeros and opens it instead of the one before. False where the disk refuses; then that one
  // may be gone.
  bool Make() noexcept;
  // Makes the name of the file survive a loss of power, and with SyncAll what is in it. They throw
  // StoreError.
  void SyncName() const;
  void SyncAll() const;

  // Taken on the disk.
  std::uint64_t DiskBytes() const noexcept;

 private:
  void Replace(int file) noexcept;

  const std::filesystem::path m_folder;
  const std::filesystem::path m_path;
  const std::string m_space;
  const bool m_readOnly;
  const bool m_sync;
  int m_file = -1;
  std::optional<FileStatus> m_status;  // of that file
};

}  // namespace vemo
