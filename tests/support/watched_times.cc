#include "tests/support/watched_times.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <climits>
#include <filesystem>

#include "tests/support/next_function.h"

namespace {

using vemo::test::NextFunction;

thread_local std::vector<std::string>* t_asked = nullptr;

// Not by std::filesystem, which asks for the status of a link before it reads it.
std::string NameOf(int file) {
  char name[PATH_MAX];
  const ssize_t length = ::readlink(("/proc/self/fd/" + std::to_string(file)).c_str(), name, sizeof name);
  if (length < 0) return "descriptor " + std::to_string(file);
  return std::filesystem::path(name, name + length).filename().string();
}

void NoteFile(int file) {
  if (t_asked != nullptr) t_asked->push_back(NameOf(file));
}

// An empty path means the descriptor itself.
void NotePath(int folder, const char* path) {
  if (*path == '\0') {
    NoteFile(folder);
  } else if (t_asked != nullptr) {
    t_asked->push_back(std::filesystem::path(path).filename().string());
  }
}

}  // namespace

extern "C" {

int stat(const char* path, struct stat* status) noexcept {
  static const auto next = NextFunction<int (*)(const char*, struct stat*)>("stat");
  NotePath(AT_FDCWD, path);
  return next(path, status);
}
int lstat(const char* path, struct stat* status) noexcept {
  static const auto next = NextFunction<int (*)(const char*, struct stat*)>("lstat");
  NotePath(AT_FDCWD, path);
  return next(path, status);
}
int fstat(int file, struct stat* status) noexcept {
  static const auto next = NextFunction<int (*)(int, struct stat*)>("fstat");
  NoteFile(file);
  return next(file, status);
}
int fstatat(int folder, const char* path, struct stat* status, int flags) noexcept {
  static const auto next = NextFunction<int (*)(int, const char*, struct stat*, int)>("fstatat");
  NotePath(folder, path);
  return next(folder, path, status, flags);
}
int statx(int folder, const char* path, int flags, unsigned mask, struct statx* status) noexcept {
  static const auto next = NextFunction<int (*)(int, const char*, int, unsigned, struct statx*)>("statx");
  constexpr unsigned kTimes = STATX_ATIME | STATX_MTIME | STATX_CTIME | STATX_BTIME;
  if ((mask & kTimes) != 0) NotePath(folder, path);
  return next(folder, path, flags, mask, status);
}

}  // extern "C"

namespace vemo::test {

WatchedTimes::WatchedTimes() noexcept {
  t_asked = &m_asked;
}
WatchedTimes::~WatchedTimes() {
  t_asked = nullptr;
}

}  // namespace vemo::test
