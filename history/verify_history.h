// Checking that the three root maps of a recorder tell the same story.
#pragma once

#include <functional>
#include <string>
#include <vector>

#include "platform/field_id.h"
#include "store/snapshot.h"

namespace vemo {

struct HistoryFinding {
  FieldId field;
  std::string fault;
};

// True when the space has the root maps "insertions", "tombstones" and "history".
bool HasHistory(const Snapshot& snapshot);

// Every departure from what recorder.h says of the maps: fields that are not in all three; runs that do not tile the field,
// that could be one, or whose numbers do not add up; insertions that differ between two maps; tombstones that nobody
// deleted, or deletions without tombstones; operation numbers used twice. Linear in the number of runs, of whose numbers it keeps
// a range each in memory; nodes take no more than the snapshot's share of SpaceOptions::cacheBytes, which trims it (store/scan.h).
// Exceptions of the store pass through.
std::vector<HistoryFinding> VerifyHistory(Snapshot& snapshot);

}  // namespace vemo
