#include "platform/xostream.h"

#include <charconv>
#include <ostream>

namespace vemo {

xostream& xostream::put(char c) { return put(std::string_view(&c, 1)); }

xostream& xostream::put(std::string_view text) {
  while (!text.empty()) {
    const std::size_t feed = text.find('\n');
    if (feed == std::string_view::npos) {
      PutWithinLine(text);
      break;
    }
    if (feed > 0) PutWithinLine(text.substr(0, feed));
    m_out.put('\n');
    m_atLineStart = true;
    text.remove_prefix(feed + 1);
  }
  return *this;
}

xostream& xostream::put(std::int64_t number) {
  char digits[24];
  const auto end = std::to_chars(digits, digits + sizeof(digits), number).ptr;
  return put(std::string_view(digits, static_cast<std::size_t>(end - digits)));
}

void xostream::PutWithinLine(std::string_view text) {
  if (m_atLineStart) {
    for (int i = 0; i < m_indentation; ++i) m_out.put(' ');
    m_atLineStart = false;
  }
  m_out.write(text.data(), static_cast<std::streamsize>(text.size()));
}

}  // namespace vemo
