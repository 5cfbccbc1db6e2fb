// Tells a forked child from the process that opened something, for the price of a load.
#pragma once

#include <cstdint>

namespace vemo {

// How many forks lie between the first process and this one, counted from the first call. Thread-safe.
std::uint64_t ForkCount() noexcept;

}  // namespace vemo
