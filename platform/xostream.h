// The text output stream of the text forms.
#pragma once

#include <cstdint>
#include <iosfwd>
#include <string_view>

namespace vemo {

// Writes characters, strings and decimal numbers to a std::ostream, which it does not own. Inside an Indenter every
// line that is not empty starts with that many spaces. Errors of the stream below stay there, for its owner to look at.
class xostream {
 public:
  explicit xostream(std::ostream& out) noexcept : m_out(out) {}
  xostream(const xostream&) = delete;
  xostream& operator=(const xostream&) = delete;

  xostream& put(char c);
  xostream& put(std::string_view text);
  xostream& put(const char* text) { return put(std::string_view(text)); }
  xostream& put(std::int64_t number);

 private:
  friend class Indenter;
  void PutWithinLine(std::string_view text);

  std::ostream& m_out;
  int m_indentation = 0;
  bool m_atLineStart = true;
};

inline xostream& operator<<(xostream& os, char c) { return os.put(c); }
inline xostream& operator<<(xostream& os, const char* text) { return os.put(text); }
inline xostream& operator<<(xostream& os, std::string_view text) { return os.put(text); }
inline xostream& operator<<(xostream& os, std::int64_t number) { return os.put(number); }

// Indents by `amount` more columns until it is destroyed.
class Indenter {
 public:
  Indenter(xostream& os, int amount) noexcept : m_os(os), m_amount(amount) { m_os.m_indentation += m_amount; }
  ~Indenter() { m_os.m_indentation -= m_amount; }
  Indenter(const Indenter&) = delete;
  Indenter& operator=(const Indenter&) = delete;

 private:
  xostream& m_os;
  int m_amount;
};

}  // namespace vemo
