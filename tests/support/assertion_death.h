// Expecting assertions by their exact text.
#pragma once

#include <gtest/gtest.h>

#include <string>

namespace vemo::test {

// A regular expression that matches `text` and nothing else.
inline std::string Literally(const std::string& text) {
  std::string regex;
  for (const char c : text) {
    if (std::string("\\^$.|?*+()[]{}").find(c) != std::string::npos) regex += '\\';
    regex += c;
  }
  return regex;
}

}  // namespace vemo::test

// The statement stops with the assertion of exactly that text; in a function whose signature is `function`,
// if one wants to know that as well. Builds without assertions have none to expect.
#if defined(VEMO_NO_ASSERTIONS)
#define EXPECT_ASSERTION(statement, text) static_cast<void>(0)
#define EXPECT_ASSERTION_IN(statement, function, text) static_cast<void>(0)
#else
#define EXPECT_ASSERTION(statement, text) \
  EXPECT_DEATH(statement, ::vemo::test::Literally(std::string(": assertion failed: ") + (text) + "\n"))
#define EXPECT_ASSERTION_IN(statement, function, text)                             \
  EXPECT_DEATH(statement, ::vemo::test::Literally(std::string(": ") + (function) + \
                                                  ": assertion failed: " + (text) + "\n"))
#endif
