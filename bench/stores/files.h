// What a store has on disk.
#pragma once

#include <cstdint>
#include <filesystem>

namespace vemo::bench {

// Bytes that the files below `folder` take on disk, holes not counted.
std::uint64_t BytesOnDisk(const std::filesystem::path& folder);

// Has the kernel write the files below `folder` and forget their pages, so that the next reader reads from
// the disk. Needs no right but that to read them. Nobody may have them mapped.
void DropFromPageCache(const std::filesystem::path& folder);

}  // namespace vemo::bench
