// The assertion facility: a broken invariant stops the process, everything else is an exception.
#pragma once

namespace vemo {

// Prints "FILE:LINE: FUNCTION: assertion failed: CONDITION" to standard error and calls abort().
[[noreturn]] void AssertionFailed(const char* condition, const char* file, int line,
                                  const char* function) noexcept;

}  // namespace vemo

// VEMO_VERIFY_TEXT evaluates `condition` in every configuration; use it where the condition has a side effect.
// The text is given apart from the condition because the same code serves several maps and node capacities
// while the message is fixed.
#define VEMO_VERIFY_TEXT(condition, text)           \
  (__builtin_expect(static_cast<bool>(condition), 1) \
       ? static_cast<void>(0)                        \
       : ::vemo::AssertionFailed(text, __FILE__, __LINE__, __PRETTY_FUNCTION__))

#if defined(VEMO_NO_ASSERTIONS)
#define VEMO_ASSERT_TEXT(condition, text) static_cast<void>(sizeof(static_cast<bool>(condition)))
#else
#define VEMO_ASSERT_TEXT(condition, text) VEMO_VERIFY_TEXT(condition, text)
#endif

#define VEMO_ASSERT(condition) VEMO_ASSERT_TEXT(condition, #condition)
