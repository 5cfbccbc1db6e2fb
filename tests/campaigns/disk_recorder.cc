// A library to be preloaded into a process: writes down what the process does to the files of one folder, in the order in which
// it does it, with the bytes. VEMO_DISK_FOLDER names the folder, VEMO_DISK_TRACE the file that is appended to; the form of the
// entries is in disk_trace.h. Every file of the folder is treated alike.
//
// What is written through a mapping of a file is not seen. An msync of such a mapping ends the process, since a campaign that
// rests on it would be blind.
#include <fcntl.h>
#include <limits.h>
#include <stdarg.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/uio.h>
#include <unistd.h>

#include <filesystem>
#include <mutex>
#include <string>
#include <vector>

#include "tests/campaigns/disk_trace.h"

namespace {

using vemo::campaign::DiskOp;
using vemo::campaign::TraceHeader;

[[noreturn]] void Die(const char* reason) {
  fprintf(stderr, "disk recorder: %s\n", reason);
  abort();
}

struct File {
  std::string name;  // empty where it is not of the folder; "." is the folder itself
  bool writesAreSynced = false;
};

class Recorder {
 public:
  Recorder() {
    const char* folder = getenv("VEMO_DISK_FOLDER");
    const char* trace = getenv("VEMO_DISK_TRACE");
    if (folder == nullptr || trace == nullptr) return;
    m_folder = folder;
    m_trace = static_cast<int>(syscall(SYS_openat, AT_FDCWD, trace, O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0666));
    if (m_trace < 0) Die("the trace cannot be opened");
  }

  // The name within the folder of a path, or nothing.
  std::string NameOf(const char* path) const {
    if (m_trace < 0 || path == nullptr) return {};
    std::error_code error;
    const std::string full = std::filesystem::absolute(path, error).lexically_normal();
    if (error) return {};
    if (full == m_folder || full == m_folder + "/") return ".";
    if (full.compare(0, m_folder.size() + 1, m_folder + "/") != 0) return {};
    return full.substr(m_folder.size() + 1);
  }

  void Opened(int file, const char* path, int flags, bool existed) {
    const std::string name = NameOf(path);
    const std::lock_guard lock(m_mutex);
    if (file >= static_cast<int>(m_files.size())) m_files.resize(static_cast<std::size_t>(file) + 1);
    m_files[static_cast<std::size_t>(file)] = {name, (flags & (O_DSYNC | O_SYNC)) != 0};
    if (name.empty() || name == ".") return;
    if (!existed) Put(DiskOp::kCreate, name, 0, 0, false, nullptr);
    if (existed && (flags & O_TRUNC) != 0) Put(DiskOp::kTruncate, name, 0, 0, false, nullptr);
  }
  void Closed(int file) {
    const std::lock_guard lock(m_mutex);
    if (Find(file) != nullptr) m_files[static_cast<std::size_t>(file)] = {};
  }

  bool Watches(int file) {
    const std::lock_guard lock(m_mutex);
    return Find(file) != nullptr;
  }
  void Wrote(int file, const void* data, std::size_t size, off_t offset) {
    const std::lock_guard lock(m_mutex);
    const File* found = Find(file);
    if (found != nullptr) Put(DiskOp::kWrite, found->name, static_cast<std::uint64_t>(offset), size, found->writesAreSynced, data);
  }
  void Truncated(int file, off_t size) {
    const std::lock_guard lock(m_mutex);
    const File* found = Find(file);
    if (found != nullptr) Put(DiskOp::kTruncate, found->name, static_cast<std::uint64_t>(size), 0, false, nullptr);
  }
  void Synced(int file) {
    const std::lock_guard lock(m_mutex);
    const File* found = Find(file);
    if (found != nullptr) Put(found->name == "." ? DiskOp::kSyncFolder : DiskOp::kSync, found->name, 0, 0, true, nullptr);
  }
  void Renamed(const char* from, const char* to) {
    const std::string source = NameOf(from), target = NameOf(to);
    const std::lock_guard lock(m_mutex);
    if (source.empty() != target.empty()) Die("a file was moved into the folder or out of it");
    if (source.empty()) return;
    for (File& file : m_files) {
      if (file.name == source) file.name = target;
    }
    Put(DiskOp::kRename, source, 0, target.size(), false, target.data());
  }
  void Unlinked(const char* path) {
    const std::string name = NameOf(path);
    const std::lock_guard lock(m_mutex);
    if (!name.empty()) Put(DiskOp::kUnlink, name, 0, 0, false, nullptr);
  }
  void Mark(std::uint64_t number) {
    const std::lock_guard lock(m_mutex);
    if (m_trace >= 0) Put(DiskOp::kMark, "", number, 0, true, nullptr);
  }

 private:
  const File* Find(int file) const {
    if (file < 0 || file >= static_cast<int>(m_files.size())) return nullptr;
    const File& found = m_files[static_cast<std::size_t>(file)];
    return found.name.empty() ? nullptr : &found;
  }

  void Put(DiskOp op, const std::string& name, std::uint64_t offset, std::size_t size, bool durable, const void* data) {
    TraceHeader header{};
    header.op = op;
    header.durable = durable ? 1 : 0;
    header.nameSize = static_cast<std::uint16_t>(name.size());
    header.offset = offset;
    header.size = size;
    std::string bytes(reinterpret_cast<const char*>(&header), sizeof header);
    bytes += name;
    if (size > 0) bytes.append(static_cast<const char*>(data), size);
    if (syscall(SYS_write, m_trace, bytes.data(), bytes.size()) != static_cast<long>(bytes.size())) Die("the trace is cut short");
  }

  std::mutex m_mutex;
  std::string m_folder;
  int m_trace = -1;
  std::vector<File> m_files;
};

Recorder& TheRecorder() {
  static Recorder& recorder = *new Recorder;  // other libraries close files late
  return recorder;
}

int Open(int folder, const char* path, int flags, mode_t mode) {
  const bool existed = syscall(SYS_faccessat, folder, path, F_OK) == 0;
  const int file = static_cast<int>(syscall(SYS_openat, folder, path, flags, mode));
  if (file >= 0) TheRecorder().Opened(file, path, flags, existed);
  return file;
}

mode_t ModeOf(int flags, va_list arguments) {
  return (flags & (O_CREAT | O_TMPFILE)) != 0 ? static_cast<mode_t>(va_arg(arguments, unsigned)) : 0;
}

// Where a write without a position goes.
off_t PositionOf(int file) {
  if ((fcntl(file, F_GETFL) & O_APPEND) == 0) return lseek(file, 0, SEEK_CUR);
  struct stat status {};
  fstat(file, &status);
  return status.st_size;
}

void WroteParts(int file, const iovec* parts, int count, ssize_t written, off_t offset) {
  if (written <= 0) return;
  std::string data;
  for (int i = 0; i < count; ++i) data.append(static_cast<const char*>(parts[i].iov_base), parts[i].iov_len);
  TheRecorder().Wrote(file, data.data(), static_cast<std::size_t>(written), offset);
}

}  // namespace

#define VEMO_OPEN(name, folderParameter, folder)                              \
  int name(folderParameter const char* path, int flags, ...) {                \
    va_list arguments;                                                        \
    va_start(arguments, flags);                                               \
    const mode_t mode = ModeOf(flags, arguments);                             \
    va_end(arguments);                                                        \
    return Open(folder, path, flags, mode);                                   \
  }
#define VEMO_FOLDER int atFolder,

extern "C" {

void vemo_disk_recorder_mark(std::uint64_t number) { TheRecorder().Mark(number); }

VEMO_OPEN(open, , AT_FDCWD)
VEMO_OPEN(open64, , AT_FDCWD)
VEMO_OPEN(openat, VEMO_FOLDER, atFolder)
VEMO_OPEN(openat64, VEMO_FOLDER, atFolder)

int close(int file) {
  TheRecorder().Closed(file);
  return static_cast<int>(syscall(SYS_close, file));
}

ssize_t pwrite(int file, const void* data, size_t size, off_t offset) {
  const ssize_t written = syscall(SYS_pwrite64, file, data, size, offset);
  if (written > 0) TheRecorder().Wrote(file, data, static_cast<std::size_t>(written), offset);
  return written;
}
ssize_t pwrite64(int file, const void* data, size_t size, off64_t offset) { return pwrite(file, data, size, offset); }

ssize_t pwritev(int file, const iovec* parts, int count, off_t offset) {
  const ssize_t written = syscall(SYS_pwritev, file, parts, count, offset, 0);
  if (TheRecorder().Watches(file)) WroteParts(file, parts, count, written, offset);
  return written;
}
ssize_t pwritev64(int file, const iovec* parts, int count, off64_t offset) { return pwritev(file, parts, count, offset); }

ssize_t write(int file, const void* data, size_t size) {
  const bool watched = TheRecorder().Watches(file);
  const off_t offset = watched ? PositionOf(file) : 0;
  const ssize_t written = syscall(SYS_write, file, data, size);
  if (watched && written > 0) TheRecorder().Wrote(file, data, static_cast<std::size_t>(written), offset);
  return written;
}
ssize_t writev(int file, const iovec* parts, int count) {
  const bool watched = TheRecorder().Watches(file);
  const off_t offset = watched ? PositionOf(file) : 0;
  const ssize_t written = syscall(SYS_writev, file, parts, count);
  if (watched) WroteParts(file, parts, count, written, offset);
  return written;
}

int ftruncate(int file, off_t size) {
  const int result = static_cast<int>(syscall(SYS_ftruncate, file, size));
  if (result == 0) TheRecorder().Truncated(file, size);
  return result;
}
int ftruncate64(int file, off64_t size) { return ftruncate(file, size); }

int fsync(int file) {
  const int result = static_cast<int>(syscall(SYS_fsync, file));
  if (result == 0) TheRecorder().Synced(file);
  return result;
}
int fdatasync(int file) {
  const int result = static_cast<int>(syscall(SYS_fdatasync, file));
  if (result == 0) TheRecorder().Synced(file);
  return result;
}

int rename(const char* from, const char* to) {
  const int result = static_cast<int>(syscall(SYS_renameat2, AT_FDCWD, from, AT_FDCWD, to, 0));
  if (result == 0) TheRecorder().Renamed(from, to);
  return result;
}
int unlink(const char* path) {
  const int result = static_cast<int>(syscall(SYS_unlinkat, AT_FDCWD, path, 0));
  if (result == 0) TheRecorder().Unlinked(path);
  return result;
}
int remove(const char* path) { return unlink(path); }

int msync(void* address, size_t size, int flags) {
  FILE* maps = fopen("/proc/self/maps", "re");
  char line[PATH_MAX + 200];
  while (maps != nullptr && fgets(line, sizeof line, maps) != nullptr) {
    unsigned long begin = 0, end = 0;
    char* path = strchr(line, '/');
    if (path == nullptr || sscanf(line, "%lx-%lx", &begin, &end) != 2) continue;
    path[strcspn(path, "\n")] = '\0';
    const auto at = reinterpret_cast<unsigned long>(address);
    if (at >= begin && at < end && !TheRecorder().NameOf(path).empty()) Die("a mapping of a file of the folder was synced");
  }
  if (maps != nullptr) fclose(maps);
  return static_cast<int>(syscall(SYS_msync, address, size, flags));
}

}  // extern "C"
