// For functions of the system that a test program replaces.
#pragma once

#include <dlfcn.h>

namespace vemo::test {

// The function of that name behind the program's own: the system's, or that of a library which watches it.
template <class Function>
Function NextFunction(const char* name) noexcept {
  return reinterpret_cast<Function>(::dlsym(RTLD_NEXT, name));
}

}  // namespace vemo::test
