// Buffered reading of the output of another process.
#pragma once

#include <cstddef>
#include <optional>
#include <string_view>
#include <utility>
#include <vector>

#include "history/file_descriptor.h"

namespace vemo {

// Reads lines and blocks of any length; the buffer grows to the longest of them. The views returned are valid
// until the next read. Throws SourceError where the system cannot read.
class PipeReader {
 public:
  explicit PipeReader(FileDescriptor fd) : m_fd(std::move(fd)) {}

  // The bytes up to the next `terminator`, without it, or those up to the end where there is no other.
  // Nothing where the end was reached before.
  std::optional<std::string_view> ReadLine(char terminator);

  // The next `size` bytes; fewer only where the end comes first.
  std::string_view ReadBlock(std::size_t size);

  void Close() noexcept { m_fd.Close(); }

 private:
  std::size_t Buffered() const noexcept { return m_end - m_begin; }
  bool Fill();
  std::string_view Take(std::size_t size) noexcept;

  FileDescriptor m_fd;
  std::vector<char> m_buffer;
  std::size_t m_begin = 0;  // the unread bytes are m_buffer[m_begin, m_end)
  std::size_t m_end = 0;
};

}  // namespace vemo
