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
// if one wants to know that as well. In a build without assertions the statement is compiled and not run.
#if defined(VEMO_NO_ASSERTIONS)
#define VEMO_EXPECT_DEATH(statement, regex) \
  GTEST_AMBIGUOUS_ELSE_BLOCKER_             \
  if (true) {                               \
  } else                                    \
    EXPECT_DEATH(statement, regex)
#else
#define VEMO_EXPECT_DEATH(statement, regex) EXPECT_DEATH(statement, regex)
#endif
#define EXPECT_ASSERTION(statement, text) \
  VEMO_EXPECT_DEATH(statement, ::vemo::test::Literally(std::string(": assertion failed: ") + (text) + "\n"))
