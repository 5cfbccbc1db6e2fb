#include "tests/support/failing_disk.h"

#include <errno.h>
#include <sys/types.h>
#include <sys/uio.h>
#include <unistd.h>

#include <filesystem>
#include <utility>

#include "tests/support/next_function.h"

namespace {

using vemo::test::NextFunction;

// Of the thread that tests; 0 means that none is to fail.
thread_local int t_untilFailure = 0;
thread_local bool t_staysBroken = false;
thread_local bool t_writesAllTheSame = false;
thread_local bool t_failed = false;

bool Fails() noexcept {
  if (t_untilFailure == 0) return false;
  if (t_untilFailure > 1) {
    --t_untilFailure;
    return false;
  }
  if (t_failed && !t_staysBroken) return false;
  t_failed = true;
  return true;
}

std::function<int(const vemo::test::WatchedDisk::Write&)> g_afterWrite;
std::function<void(const std::string&)> g_beforeSync;

std::string NameOf(int file) {
  std::error_code error;
  return std::filesystem::read_symlink("/proc/self/fd/" + std::to_string(file), error).filename().string();
}

template <class Result, class Call>
Result FailOr(Call&& call) noexcept {
  if (!Fails()) return call();
  if (t_writesAllTheSame) call();
  errno = EIO;
  return -1;
}

}  // namespace

extern "C" {

ssize_t pwrite(int file, const void* data, size_t size, off_t offset) {
  static const auto next = NextFunction<ssize_t (*)(int, const void*, size_t, off_t)>("pwrite");
  const ssize_t done = FailOr<ssize_t>([&] { return next(file, data, size, offset); });
  if (done < 0 || !g_afterWrite) return done;
  const int code = g_afterWrite({NameOf(file), size, offset});
  if (code == 0) return done;
  errno = code;
  return -1;
}
ssize_t writev(int file, const iovec* parts, int count) {
  static const auto next = NextFunction<ssize_t (*)(int, const iovec*, int)>("writev");
  return FailOr<ssize_t>([&] { return next(file, parts, count); });
}
int fdatasync(int file) {
  static const auto next = NextFunction<int (*)(int)>("fdatasync");
  if (g_beforeSync) g_beforeSync(NameOf(file));
  return FailOr<int>([&] { return next(file); });
}
int fsync(int file) {
  static const auto next = NextFunction<int (*)(int)>("fsync");
  if (g_beforeSync) g_beforeSync(NameOf(file));
  return FailOr<int>([&] { return next(file); });
}

}  // extern "C"

namespace vemo::test {

FailingDisk::FailingDisk(int nth, bool staysBroken, bool writesAllTheSame) noexcept {
  t_failed = false;
  t_staysBroken = staysBroken;
  t_writesAllTheSame = writesAllTheSame;
  t_untilFailure = nth;
}
FailingDisk::~FailingDisk() {
  t_untilFailure = 0;
}
bool FailingDisk::HasFailed() const noexcept {
  return t_failed;
}

WatchedDisk::WatchedDisk(std::function<int(const Write&)> afterWrite, std::function<void(const std::string&)> beforeSync) {
  g_afterWrite = std::move(afterWrite);
  g_beforeSync = std::move(beforeSync);
}
WatchedDisk::~WatchedDisk() {
  g_afterWrite = nullptr;
  g_beforeSync = nullptr;
}

}  // namespace vemo::test
