// What a command prints.
#pragma once

#include <string_view>

namespace vemo::tool {

// Writes `text` to standard output. Throws StoreError when not all of it arrives there.
void WriteOutput(std::string_view text);

}  // namespace vemo::tool
