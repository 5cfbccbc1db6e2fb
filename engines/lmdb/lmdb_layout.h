// What a space looks like inside LMDB.
//
//   table        key                     value
//   records      object id, 8 bytes BE   the record
//   info         name                    the value
//   roots        name                    the value
//   meta         name                    the value
//   deletions    object id, 8 bytes BE   nothing
//   system       "layout"                "vemo space", then the layout number, 8 bytes BE
//                "generation"            8 bytes BE
//                "next id"               8 bytes BE
//
// One transaction makes all of it: an environment has no table at all, or is a whole space, or is somebody
// else's.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

struct MDB_txn;

namespace vemo {

// Handles of LMDB (MDB_dbi), good for as long as the environment is open.
struct LmdbTables {
  unsigned records = 0;
  unsigned info = 0;
  unsigned roots = 0;
  unsigned meta = 0;
  unsigned deletions = 0;
  unsigned system = 0;
};

inline constexpr std::uint64_t kLayoutNumber = 1;
inline constexpr int kTableCount = 6;

// Opens the tables of the space that `txn` sees; nothing when its environment has no table at all. Throws
// IncompatibleSpace for anything else than a space of this layout. `space` is the name for messages.
std::optional<LmdbTables> OpenTables(MDB_txn* txn, const std::string& space);

// Makes an empty space in an environment without tables.
LmdbTables CreateTables(MDB_txn* txn, const std::string& space);

// The numbers of the system table. Reading throws IncompatibleSpace when they are missing.
std::uint64_t ReadGeneration(MDB_txn* txn, const LmdbTables& tables, const std::string& space);
std::uint64_t ReadNextId(MDB_txn* txn, const LmdbTables& tables, const std::string& space);
void WriteGeneration(MDB_txn* txn, const LmdbTables& tables, std::uint64_t generation,
                     const std::string& space);
void WriteNextId(MDB_txn* txn, const LmdbTables& tables, std::uint64_t nextId, const std::string& space);

}  // namespace vemo
