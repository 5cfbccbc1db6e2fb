// What a space looks like inside LMDB.
//
//   table        key                     value
//   records      object id, 8 bytes BE   tag, the commit that wrote it, 8 bytes LE, a stamp of that, the record
//   changes      commit, 8 bytes BE      tag, what the commit changed of records (change_blob.h)
//   info         name                    tag, the value
//   roots        name                    tag, the value
//   meta         name                    tag, the value
//   deletions    object id, 8 bytes BE   tag
//   system       "layout"                "vemo space", then the layout number, 8 bytes BE, then a checksum
//                "generation"            8 bytes BE, then a checksum
//                "next id"               8 bytes BE, then a checksum
//                "first changes"         8 bytes BE, then a checksum: the first commit in the table of changes, or 0
//                "last changes"          8 bytes BE, then a checksum: the last one, or 0
//                "log"                   8 bytes BE, then a checksum: the identity of commits.log, 0 before there is one
//
// A tag is the XXH3-64 of the key, seeded with the XXH3-64 of the table's name, 8 bytes LE: it tells a value that is
// reached under a wrong key or in a wrong table. A checksum is the XXH3-64 of the bytes before it, seeded with the tag
// that the key would have, and so is the stamp of a commit. One transaction makes all of it: an environment has no
// table at all, or is a whole space, or is somebody else's.
#pragma once

#include <array>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

#include "engines/lmdb/space_state.h"

struct MDB_txn;

namespace vemo {

// Handles of LMDB (MDB_dbi), good for as long as the environment is open.
struct LmdbTables {
  unsigned records = 0;
  unsigned changes = 0;
  unsigned info = 0;
  unsigned roots = 0;
  unsigned meta = 0;
  unsigned deletions = 0;
  unsigned system = 0;
};

inline constexpr std::uint64_t kLayoutNumber = 4;
inline constexpr int kTableCount = 7;
inline constexpr std::string_view kRecordsTable = "records";
inline constexpr std::string_view kChangesTable = "changes";
inline constexpr std::string_view kDeletionsTable = "deletions";
inline constexpr std::string_view kSystemTable = "system";

// Before each record stand the commit that wrote it and the stamp, which tells that this number is not damaged: a record with too
// high a number would be taken for newer than its changes. `tag` is that of its key.
inline constexpr std::size_t kCommitBytes = 2 * sizeof(std::uint64_t);
std::uint64_t CommitStamp(std::uint64_t tag, std::uint64_t commit) noexcept;

// Whether `state` holds a space: false when there is no table at all. Throws IncompatibleSpace for anything else than a
// space of this layout, DamagedStorage for a damaged one. `space` is the name for messages.
bool HoldsSpace(const std::shared_ptr<PageFile>& file, const SpaceState& state, const std::string& space);

// The handles of the tables, which are there.
LmdbTables OpenTables(MDB_txn* txn, const std::string& space);

// Makes an empty space in an environment without tables.
LmdbTables CreateTables(MDB_txn* txn, const std::string& space);

// The first and the last commit in the table of changes; both 0 where there is none.
struct ChangesRange {
  std::uint64_t first = 0;
  std::uint64_t last = 0;
};
// The numbers of the system table that all reading starts from.
struct SpaceNumbers {
  std::uint64_t generation = 0;
  ChangesRange changes;
  std::uint64_t log = 0;
};
// They throw DamagedStorage when numbers are missing or not what was written.
SpaceNumbers ReadNumbers(PageReader& reader, const SpaceState& state);
std::uint64_t ReadNextId(PageReader& reader, const SpaceState& state);

// The keys and values of the numbers, as they are stored.
inline constexpr std::string_view kGenerationKey = "generation";
inline constexpr std::string_view kNextIdKey = "next id";
inline constexpr std::string_view kFirstChangesKey = "first changes";
inline constexpr std::string_view kLastChangesKey = "last changes";
inline constexpr std::string_view kLogKey = "log";
using StoredNumber = std::array<std::uint8_t, 16>;
StoredNumber StoreNumber(std::string_view key, std::uint64_t number);

}  // namespace vemo
