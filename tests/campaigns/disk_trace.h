// What a process did to the files of a folder, and what of it a power cut may leave.
#pragma once

#include <cstdint>
#include <filesystem>
#include <map>
#include <optional>
#include <random>
#include <string>
#include <vector>

namespace vemo::campaign {

enum class DiskOp : std::uint8_t { kCreate, kWrite, kTruncate, kSync, kRename, kUnlink, kSyncFolder, kMark };

// One entry of the recorder's file: this, the name, `size` bytes of data (of a rename: the new name).
struct TraceHeader {
  DiskOp op;
  std::uint8_t durable;  // a write that was synced when it returned
  std::uint16_t nameSize;
  std::uint32_t unused;
  std::uint64_t offset;  // of a write; the size of a truncation; the number of a mark
  std::uint64_t size;
};

struct DiskEntry {
  DiskOp op;
  bool durable;
  std::string name;
  std::uint64_t offset;
  std::string data;
};

using FolderImage = std::map<std::string, std::string>;  // contents by name

FolderImage ReadFolder(const std::filesystem::path& folder);
// Makes `folder` hold what `image` says and nothing else.
void WriteFolder(const std::filesystem::path& folder, const FolderImage& image);

// What of the writes that nobody synced has reached the disk. What was synced always has.
enum class Survival : std::uint8_t {
  kNone,
  kAll,
  kSomeWrites,        // each as a whole or not at all, in any combination
  kSomeSectors,       // of each write any of its pieces of 512 bytes
  kSomePages,         // of each write any of its pieces of 4,096 bytes
  kTornSectors,       // the writes in order up to one that is cut after some pieces of 512 bytes
  kTornPages,         // the same with 4,096
};
inline constexpr int kSurvivals = 7;

class DiskTrace {
 public:
  // `before` was on the disk, synced, before the first entry.
  DiskTrace(FolderImage before, const std::filesystem::path& traceFile);

  // A power cut at point p comes while entry p is under way; the last point is after all entries.
  std::size_t Points() const noexcept { return m_entries.size() + 1; }
  // The last mark before a point.
  std::optional<std::uint64_t> MarkBefore(std::size_t point) const;
  // The folder after a power cut.
  FolderImage After(std::size_t point, Survival survival, std::mt19937_64& random) const;

 private:
  FolderImage m_before;
  std::vector<DiskEntry> m_entries;
};

}  // namespace vemo::campaign
