// Ownership of a file descriptor.
#pragma once

#include <unistd.h>

#include <utility>

namespace vemo {

// Closes its descriptor in the end; -1 means none.
class FileDescriptor {
 public:
  FileDescriptor() noexcept = default;
  explicit FileDescriptor(int fd) noexcept : m_fd(fd) {}
  FileDescriptor(FileDescriptor&& other) noexcept : m_fd(std::exchange(other.m_fd, -1)) {}
  FileDescriptor& operator=(FileDescriptor&& other) noexcept {
    std::swap(m_fd, other.m_fd);
    return *this;
  }
  ~FileDescriptor() { Close(); }

  int get() const noexcept { return m_fd; }
  void Close() noexcept {
    if (m_fd >= 0) ::close(std::exchange(m_fd, -1));
  }

 private:
  int m_fd = -1;
};

}  // namespace vemo
