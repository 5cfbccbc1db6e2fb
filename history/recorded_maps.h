// How large the three root maps of a recorder are.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "store/snapshot.h"

namespace vemo {

struct RecordedMap {
  std::string root;  // "insertions", "tombstones" or "history"
  std::uint64_t fields = 0;
  std::uint64_t nodes = 0;
  ssize_t height = -1;     // -1: no node at all; 0: the root is a leaf
  std::uint64_t runs = 0;  // of all fields, of inserted and of deleted elements
};

// The maps in the order above, all of which must be there. Reads every record of the space once and the maps' leaves once
// more; what it loads stays within the snapshot's share of SpaceOptions::cacheBytes, which a trim gives back in between.
// Exceptions of the store pass through.
std::vector<RecordedMap> MeasureRecordedMaps(Snapshot& snapshot);

}  // namespace vemo
