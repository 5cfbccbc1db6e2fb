#include "tool/output.h"

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <string>

#include "store/error.h"

namespace vemo::tool {

void WriteOutput(std::string_view text) {
  if (std::fwrite(text.data(), 1, text.size(), stdout) == text.size() && std::fflush(stdout) == 0) return;
  throw StoreError(std::string("standard output cannot be written: ") + std::strerror(errno));
}

}  // namespace vemo::tool
