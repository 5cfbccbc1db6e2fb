// Integer vocabulary of the module.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <vector>

namespace vemo {

using ::ssize_t;  // counts, positions and heights
static_assert(sizeof(ssize_t) == 8, "vemo needs a 64-bit target");

using Bytes = std::vector<std::uint8_t>;

}  // namespace vemo
