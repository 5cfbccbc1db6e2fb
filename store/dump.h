// The text form of a map that is larger than memory.
#pragma once

#include "platform/xostream.h"
#include "store/snapshot.h"

namespace vemo {

// Writes what Map::Write writes of the root map of that name, whatever its class, and keeps no node in memory: takes the memory
// of one path from the root. Throws UsageError where there is no such root, and where a node cannot be read, CorruptRecord
// with the nodes before it written.
void DumpMap(Snapshot& snapshot, std::string_view root, xostream& os);

}  // namespace vemo
