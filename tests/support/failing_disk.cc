#include "tests/support/failing_disk.h"

#include <errno.h>
#include <sys/syscall.h>
#include <sys/types.h>
#include <sys/uio.h>
#include <unistd.h>

namespace {

// Of the thread that tests; 0 means that none is to fail.
thread_local int t_untilFailure = 0;
thread_local bool t_staysBroken = false;
thread_local bool t_failed = false;

bool Fails() noexcept {
  if (t_untilFailure == 0) return false;
  if (t_untilFailure > 1) {
    --t_untilFailure;
    return false;
  }
  if (t_failed && !t_staysBroken) return false;
  t_failed = true;
  errno = EIO;
  return true;
}

}  // namespace

extern "C" {

ssize_t pwrite(int file, const void* data, size_t size, off_t offset) {
  return Fails() ? -1 : ::syscall(SYS_pwrite64, file, data, size, offset);
}
ssize_t writev(int file, const iovec* parts, int count) {
  return Fails() ? -1 : ::syscall(SYS_writev, file, parts, count);
}
int fdatasync(int file) {
  return Fails() ? -1 : static_cast<int>(::syscall(SYS_fdatasync, file));
}
int fsync(int file) {
  return Fails() ? -1 : static_cast<int>(::syscall(SYS_fsync, file));
}

}  // extern "C"

namespace vemo::test {

FailingDisk::FailingDisk(int nth, bool staysBroken) noexcept {
  t_failed = false;
  t_staysBroken = staysBroken;
  t_untilFailure = nth;
}
FailingDisk::~FailingDisk() {
  t_untilFailure = 0;
}
bool FailingDisk::HasFailed() const noexcept {
  return t_failed;
}

}  // namespace vemo::test
