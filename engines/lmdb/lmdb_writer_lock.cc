#include "engines/lmdb/lmdb_writer_lock.h"

#include <fcntl.h>
#include <sys/file.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdio>
#include <thread>

#include "engines/lmdb/lmdb_error.h"
#include "engines/lmdb/space_folder.h"

namespace vemo {
namespace {

using Line = std::array<char, 20>;

// That of the last holder for a moment after each lock, and never trusted for more than a message.
std::string HolderText(int file) {
  Line text{};
  const ssize_t size = ::pread(file, text.data(), text.size(), 0);
  std::string pid;
  for (ssize_t i = 0;
       i < size && text[static_cast<std::size_t>(i)] >= '0' && text[static_cast<std::size_t>(i)] <= '9';
       ++i) {
    pid.push_back(text[static_cast<std::size_t>(i)]);
  }
  if (pid.empty()) return "another transaction";
  if (pid == std::to_string(::getpid())) return "another transaction of this process";
  return "process " + pid;
}

// Leaves the name of the holder in the file where the disk lets it: the lock holds whether or not its holder can be named. A
// file that changes with each transaction would be written by the file system with each, so a name that is there stays.
void WriteHolder(int file, pid_t holder) {
  Line line{}, before{};
  std::snprintf(line.data(), line.size(), "%-18ld\n", static_cast<long>(holder));
  if (::pread(file, before.data(), before.size(), 0) == static_cast<ssize_t>(before.size()) && before == line) return;
  if (::pwrite(file, line.data(), line.size(), 0) < 0) return;
}

}  // namespace

LmdbWriterLock::LmdbWriterLock(const std::filesystem::path& folder, const std::string& space,
                               std::chrono::milliseconds timeout)
    : m_process(::getpid()) {
  m_file = ::open((folder / kWriterLockFile).c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0666);
  if (m_file < 0) throw LmdbError("lock for writing", space, errno);
  try {
    Acquire(space, timeout);
  } catch (...) {
    ::close(m_file);
    throw;
  }
}

LmdbWriterLock::~LmdbWriterLock() {
  // Descriptors inherited over fork share the lock: the holder must release it by name, a child must not.
  if (m_process == ::getpid()) ::flock(m_file, LOCK_UN);
  ::close(m_file);
}

void LmdbWriterLock::Acquire(const std::string& space, std::chrono::milliseconds timeout) {
  using Clock = std::chrono::steady_clock;
  constexpr std::chrono::milliseconds kLongestWait = std::chrono::hours(24 * 365);
  constexpr std::chrono::milliseconds kLongestNap(16);
  const auto start = Clock::now();
  const auto bounded = std::min(timeout, kLongestWait);
  std::chrono::milliseconds nap(1);
  while (::flock(m_file, LOCK_EX | LOCK_NB) != 0) {
    if (errno == EINTR) continue;
    if (errno != EWOULDBLOCK) throw LmdbError("lock for writing", space, errno);
    const auto waited = std::chrono::duration_cast<std::chrono::milliseconds>(Clock::now() - start);
    if (waited >= bounded) {
      throw SpaceBusy("cannot lock " + space + " for writing within " +
                      std::to_string(std::max<std::chrono::milliseconds::rep>(timeout.count(), 0)) +
                      " ms: " + HolderText(m_file) + " holds the lock; try again when it has ended");
    }
    std::this_thread::sleep_for(std::min(nap, bounded - waited));
    nap = std::min(2 * nap, kLongestNap);
  }
  WriteHolder(m_file, m_process);
}

}  // namespace vemo
