// Replaying a history into the maps, which is what the library is for.
#pragma once

#include <filesystem>
#include <string>
#include <vector>

#include "bench/common/measure.h"
#include "history/edit_source.h"

namespace vemo::bench {

// "durable": into a space on disk, in durable commits of 10,000 edits. "one-commit": into a space in memory,
// in one commit at the end. Each in a process of its own, for time and for memory. `source` should cost
// nothing itself. Throws what RunInOwnProcess does.
std::vector<Measurement> RunReplays(EditSource& source, const std::filesystem::path& folder);

// What RunReplays reports.
std::vector<std::string> ReplayOperations();

}  // namespace vemo::bench
