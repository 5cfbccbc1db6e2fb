// The names of spaces.
#pragma once

#include <cstdint>
#include <filesystem>
#include <string>
#include <string_view>

namespace vemo {

struct SpaceUri {
  enum class Engine { kMemory, kLmdb };
  Engine engine = Engine::kMemory;
  std::filesystem::path path;      // lmdb: the folder of the space
  std::uint64_t mapBytes = 0;      // lmdb: address space to reserve; 0 lets the engine choose
  std::uint64_t pendingBytes = 0;  // lmdb: changes that may wait to be written into their records; 0 lets the engine choose
  bool syncEachCommit = true;      // lmdb: false risks the whole space at a power cut
};

// Reads "memory:" or "lmdb:PATH", the latter with options behind a question mark, joined by ampersands:
//   map_bytes=N                            see SpaceUri::mapBytes
//   pending_bytes=N                        see SpaceUri::pendingBytes
//   sync=commit | sync=none_risking_loss   see SpaceUri::syncEachCommit
// Throws UsageError that says what is wrong; an option that is not listed is an error.
SpaceUri ParseSpaceUri(std::string_view uri);

// The URI with all options written out.
std::string SpaceUriText(const SpaceUri& uri);

}  // namespace vemo
