#include "platform/assertion.h"

#include <cstdio>
#include <cstdlib>

namespace vemo {

void AssertionFailed(const char* condition, const char* file, int line, const char* function) noexcept {
  std::fprintf(stderr, "%s:%d: %s: assertion failed: %s\n", file, line, function, condition);
  std::abort();
}

}  // namespace vemo
