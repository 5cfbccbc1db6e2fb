#include "history/pipe_reader.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <string>

#include "history/source_error.h"

namespace vemo {

namespace {

constexpr std::size_t kFirstBufferBytes = 1 << 20;

}  // namespace

std::optional<std::string_view> PipeReader::ReadLine(char terminator) {
  std::size_t searched = 0;
  for (;;) {
    const char* unread = m_buffer.data() + m_begin;
    const void* found =
        searched < Buffered() ? std::memchr(unread + searched, terminator, Buffered() - searched) : nullptr;
    if (found != nullptr) {
      const std::string_view line = Take(static_cast<std::size_t>(static_cast<const char*>(found) - unread));
      ++m_begin;  // the terminator
      return line;
    }
    searched = Buffered();
    if (Fill()) continue;
    if (searched == 0) return std::nullopt;
    return Take(searched);
  }
}

std::string_view PipeReader::ReadBlock(std::size_t size) {
  while (Buffered() < size && Fill()) continue;
  return Take(std::min(size, Buffered()));
}

std::string_view PipeReader::Take(std::size_t size) noexcept {
  const std::string_view taken(m_buffer.data() + m_begin, size);
  m_begin += size;
  return taken;
}

// Reads what there is, after the unread bytes, which move to the front where the buffer is full. Returns
// whether there was anything.
bool PipeReader::Fill() {
  if (m_end == m_buffer.size()) {
    if (Buffered() != 0) std::memmove(m_buffer.data(), m_buffer.data() + m_begin, Buffered());
    m_end = Buffered();
    m_begin = 0;
    if (m_end * 2 >= m_buffer.size()) m_buffer.resize(std::max(kFirstBufferBytes, m_buffer.size() * 2));
  }
  for (;;) {
    const ssize_t got = ::read(m_fd.get(), m_buffer.data() + m_end, m_buffer.size() - m_end);
    if (got >= 0) {
      m_end += static_cast<std::size_t>(got);
      return got > 0;
    }
    if (errno != EINTR)
      throw SourceError(std::string("cannot read the output of git: ") + std::strerror(errno));
  }
}

}  // namespace vemo
