// A disk that fails on demand. Linking failing_disk.cc replaces pwrite, writev, fdatasync and fsync of the
// whole program, those of shared libraries included.
#pragma once

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

}  // namespace vemo::test
