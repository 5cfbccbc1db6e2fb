// Checking a whole space.
#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "store/snapshot.h"

namespace vemo {

struct Finding {
  std::string root;  // as its name is stored; empty where the fault is the space's own
  std::string path;  // from the root's node down by child numbers, such as "root.-1.7"; "map" for the map's own record
  OID oid;           // the object at fault, or null
  // What it is, or should be where it cannot be read; of what nothing refers to, what its damaged head says. Empty where nothing
  // tells it.
  std::string className;
  std::string fault;
};

// One line for people.
std::string FindingText(const Finding& finding);

struct VerifyReport {
  std::string space;  // its name, such as "lmdb:/path"
  std::vector<Finding> findings;
  std::uint64_t maps = 0;
  std::uint64_t entries = 0;
  std::uint64_t nodes = 0;
  std::uint64_t records = 0;      // in the engine
  std::uint64_t unreachable = 0;  // of these, not reached from any root and not queued for deletion: space to be collected
};

// Checks every record's checksum and form, every map's structure (store/map_check.h), every named value, what the engine
// keeps them in, and counts what no root reaches. Collects every fault; throws only when the engine itself fails. Reads every node of every map once and
// keeps none of them: takes the memory of one path from the root, two bits for each record, eight bytes for each
// queued deletion, and what the findings take. `progress` is told how many of how many records are done.
VerifyReport VerifySpace(Snapshot& snapshot,
                         const std::function<void(std::uint64_t done, std::uint64_t of)>& progress = {});

}  // namespace vemo
