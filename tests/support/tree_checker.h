// The checker of whole trees as the tests of the module use it.
#pragma once

#include <string>

#include "store/map_check.h"

namespace vemo::test {

// Every departure from the invariants of FieldMap.h, one a line; empty for a sound tree. Loads every node.
template <class Map>
std::string CheckTree(const Map& map) {
  std::string findings;
  for (const MapFinding& finding : MapCheck<Map>(map).Run()) findings += finding.where + ": " + finding.fault + '\n';
  return findings;
}

}  // namespace vemo::test
