// The budget for nodes in memory, as an option of the commands that read or write whole maps.
#pragma once

#include <CLI/CLI.hpp>
#include <cstdint>
#include <optional>

namespace vemo::tool {

// Adds --cache-bytes, which sets SpaceOptions::cacheBytes. `bytes` must outlive the parsing.
inline void AddCacheOption(CLI::App& command, std::optional<std::uint64_t>& bytes) {
  command.add_option("--cache-bytes", bytes,
                     "How much memory nodes and payloads may take, in bytes (default: as much as they need)");
}

}  // namespace vemo::tool
