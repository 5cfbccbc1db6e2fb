// Checking a whole space from its stored bytes alone.
//
// VerifySpace (store/verify.h) loads nodes as every reader does and looks at what came out. This check reads the same commit with
// a reader of its own (store/raw_record.h), without the module and without views, so that the two can be held against each
// other: on any space, sound or damaged, they must agree.
#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "store/engine.h"

namespace vemo {

struct RawFinding {
  std::string root;       // as its name is stored; empty where the fault is the space's own
  std::string path;       // from the root's node down by child numbers, such as "root.-1.7"; "map" for the map's own record
  OID oid;                // the object at fault, or null
  // What it is, or should be where it cannot be read; of what nothing refers to, what its damaged head says. Empty where nothing
  // tells it.
  std::string className;
  std::string fault;
};

// One line for people.
std::string RawFindingText(const RawFinding& finding);

struct RawCheckReport {
  std::vector<RawFinding> findings;
  std::uint64_t maps = 0;     // whose own record is sound
  std::uint64_t entries = 0;  // in their leaves
  std::uint64_t nodes = 0;
  std::uint64_t records = 0;
  std::uint64_t unreachable = 0;  // neither reached from a root nor awaiting deletion
};

// Checks what the engine keeps the commit in, every envelope, every body, order, fill and bounds of keys, the chain of leaves both ways, sizes, heights, classes, that no
// node has two owners, that references lead to something, named values and the queue of deletions. Collects every fault, those of
// the engine too, behind which it goes on where it can. `progress` is told how many records were read.
//
// Memory: two bits for each id of the space, the nodes from a root down to a leaf, and the findings.
RawCheckReport CheckRawSpace(const EngineSnapshot& state, const std::function<void(std::uint64_t)>& progress = {});

}  // namespace vemo
