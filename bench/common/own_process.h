// Running a part of a job in a process of its own.
#pragma once

#include <functional>
#include <vector>

#include "bench/common/measure.h"

namespace vemo::bench {

// Runs `work` in a child process, which starts with the memory of this one and leaves nothing behind in it,
// and returns what it measured. Throws std::runtime_error when the child fails; what it says stands on
// standard error. This process must have one thread only.
std::vector<Measurement> RunInOwnProcess(const std::function<std::vector<Measurement>()>& work);

}  // namespace vemo::bench
