#include "engines/lmdb/log_file.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <exception>

#include "engines/lmdb/lmdb_error.h"
#include "engines/lmdb/log_entry.h"
#include "engines/lmdb/space_folder.h"

namespace vemo {

LogFile::LogFile(const std::filesystem::path& folder, const std::string& space, bool readOnly, bool sync)
    : m_folder(folder), m_path(folder / kLogFile), m_space(space), m_readOnly(readOnly), m_sync(sync) {}

LogFile::~LogFile() {
  if (IsOpen()) ::close(m_file);
}

void LogFile::WillNeed(const std::filesystem::path& folder) noexcept {
  const int file = ::open((folder / kLogFile).c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK);
  if (file < 0) return;
  ::posix_fadvise(file, 0, kLogBytes, POSIX_FADV_WILLNEED);
  ::close(file);
}

void LogFile::Replace(int file) noexcept {
  if (m_file >= 0) ::close(m_file);
  m_file = file;
  m_status = IsOpen() ? StatusOf(m_file) : std::nullopt;
}

// Once a commit: one call where nothing has changed.
void LogFile::Open() {
  if (IsOpen() && m_status) {
    const std::optional<FileStatus> named = StatusOf(m_path);
    if (named && named->IsSameFile(*m_status)) {
      m_status = named;
      return;
    }
  }
  const int flags = (m_readOnly ? O_RDONLY : O_RDWR) | O_CLOEXEC | O_NONBLOCK;
  const int file = ::open(m_path.c_str(), flags);
  if (file < 0 && errno != ENOENT) throw LmdbError(std::string("open ") + kLogFile + " of", m_space, errno);
  Replace(file);
}

bool LogFile::IsWhole() const noexcept {
  return IsOpen() && m_status && m_status->bytes >= kLogBytes;
}

Bytes LogFile::Read(std::uint64_t from, std::uint64_t to) const {
  Bytes bytes(from < to && IsOpen() ? to - from : 0);
  std::size_t read = 0;
  while (read < bytes.size()) {
    const ssize_t count =
        ::pread(m_file, bytes.data() + read, bytes.size() - read, static_cast<off_t>(from + read));
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) throw LmdbError(std::string("read ") + kLogFile + " of", m_space, errno);
    if (count == 0) break;
    read += static_cast<std::size_t>(count);
  }
  bytes.resize(read);
  return bytes;
}

int LogFile::Write(ByteView bytes, std::uint64_t offset) noexcept {
  while (!bytes.empty()) {
    const ssize_t written = ::pwrite(m_file, bytes.data(), bytes.size(), static_cast<off_t>(offset));
    if (written < 0 && errno == EINTR) continue;
    if (written <= 0) return written < 0 ? errno : ENOSPC;
    bytes = bytes.subspan(static_cast<std::size_t>(written));
    offset += static_cast<std::uint64_t>(written);
  }
  return 0;
}

int LogFile::Flush() noexcept {
  return !m_sync || ::fdatasync(m_file) == 0 ? 0 : errno;
}

// As with data.mdb, the file has its name only when it is whole, so that no other process meets half of it.
bool LogFile::Make() noexcept {
  try {
    const std::filesystem::path unfinished = m_folder / kUnfinishedLogFile;
    const Bytes zeros(kLogBytes, 0);
    const int file = ::open(unfinished.c_str(), O_RDWR | O_CREAT | O_TRUNC | O_CLOEXEC, 0666);
    if (file < 0) return false;
    Replace(file);
    if (Write(zeros, 0) == 0 && (!m_sync || ::fsync(file) == 0) &&
        std::rename(unfinished.c_str(), m_path.c_str()) == 0) {
      m_status = StatusOf(m_file);
      if (m_sync) SyncName();
      return true;
    }
    ::unlink(unfinished.c_str());
  } catch (const std::exception&) {
    // What could not be synced is not used.
  }
  Replace(-1);
  return false;
}

void LogFile::SyncName() const {
  SyncFolder(m_folder, m_space);
}

void LogFile::SyncAll() const {
  if (!IsOpen()) return;
  if (::fdatasync(m_file) != 0) throw LmdbError(std::string("flush ") + kLogFile + " of", m_space, errno);
  SyncName();
}

std::uint64_t LogFile::DiskBytes() const noexcept {
  const std::optional<FileStatus> status = IsOpen() ? StatusOf(m_file) : std::nullopt;
  return status ? status->diskBytes : 0;
}

}  // namespace vemo
