// A disk that fails on demand. Linking failing_disk.cc replaces pwrite, writev, fdatasync and fsync of the
// whole program, those of shared libraries included.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <functional>
#include <string>

namespace vemo::test {

// While it lives, the `nth` write or sync of this thread (1 is the next one) fails with EIO, and where it is
// to stay broken all after it. Nothing of what fails is written, or with `writesAllTheSame` all of it: a disk
// that loses the answer. One at a time.
class FailingDisk {
 public:
  FailingDisk(int nth, bool staysBroken, bool writesAllTheSame = false) noexcept;
  ~FailingDisk();
  FailingDisk(const FailingDisk&) = delete;
  FailingDisk& operator=(const FailingDisk&) = delete;

  bool HasFailed() const noexcept;
};

// While it lives, sees the writes and syncs of all threads. One at a time.
class WatchedDisk {
 public:
  struct Write {
    std::string file;  // its name without the folder
    std::size_t size;
    off_t offset;
  };
  // `afterWrite` is called after each pwrite that was done, and returns 0 or the errno with which it is to fail all the same;
  // `beforeSync` before each fdatasync and fsync, with the name of the file or folder.
  explicit WatchedDisk(std::function<int(const Write&)> afterWrite, std::function<void(const std::string&)> beforeSync = {});
  ~WatchedDisk();
  WatchedDisk(const WatchedDisk&) = delete;
  WatchedDisk& operator=(const WatchedDisk&) = delete;
};

}  // namespace vemo::test
