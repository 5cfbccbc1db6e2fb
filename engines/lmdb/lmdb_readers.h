// Who reads an environment of LMDB, as its table of readers has it.
#pragma once

#include <cstdint>
#include <vector>

struct MDB_env;

namespace vemo {

// The ids of the processes that have a read transaction open, in ascending order, this one among them. Linear in the table.
std::vector<std::int64_t> ProcessesReading(MDB_env* env);

}  // namespace vemo
