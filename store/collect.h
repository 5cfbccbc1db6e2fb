// Removing the objects that nothing reaches any more.
//
// Copy assignment of a map leaves the old tree behind, and so does whoever swaps a tree into a map on the stack and lets go of
// it. Collection marks what the root maps reach in one commit (McCarthy, CACM 3:4, 1960) and removes the rest of that commit's
// records. Transactions go on beside it: it holds the writer lock for one bounded commit at a time.
//
// Why a commit that is made meanwhile cannot need what is removed. Say the marking saw commit G.
//   - A transaction that begins at G or later gets at objects by following references from the roots of its commit. What G's
//     roots did not reach, no later root can reach: a reference is copied from one that was reached, or names a new object, and
//     ids are never given out twice.
//   - A map on the stack may hold nodes that a transaction took out of a root map. If that transaction is still open at G, the
//     nodes hang below G's roots and are marked; once it has ended, the map must not be used.
//   - Nodes that are in memory without being reachable are named by other such nodes alone. They leave memory with their records.
//   - What a reachable object names without owning it, a leaf its neighbours, must be in the tree as well, or nothing is swept.
//   - A record that was written after G is not touched, whatever its id.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>

#include "store/space.h"

namespace vemo {

struct CollectProgress {
  enum class Phase : std::uint8_t {
    kMarking,   // `done` of the space's records were reached, or await deletion
    kDeleting,  // the queue of deletions is worked off: `done` of its records
    kSweeping,  // `done` of the unreachable records are gone
  };
  Phase phase = Phase::kMarking;
  std::uint64_t done = 0;
  std::uint64_t of = 0;
};

struct CollectOptions {
  bool dryRun = false;                    // only count
  std::size_t recordsPerCommit = 1'024;   // at least 1
  // Called now and then; false ends the collection, and what was removed by then stays removed.
  std::function<bool(const CollectProgress&)> progress = nullptr;
};

struct CollectReport {
  std::uint64_t records = 0;            // in the commit that was marked
  std::uint64_t marked = 0;             // of these, reached from the root maps, which count too
  std::uint64_t awaitingDeletion = 0;   // in the queue of deletions or below it
  std::uint64_t unreachable = 0;        // the rest
  std::uint64_t unreachableBytes = 0;
  std::uint64_t swept = 0;              // unreachable ones that were removed
  std::uint64_t sweptBytes = 0;
  bool cancelled = false;               // the figures are as far as it got
};

// Collects `space`; the queue of deletions is worked off as well. Throws CorruptRecord or DanglingReference that names root,
// object and class when something that a root reaches is damaged or missing: nothing was removed then, since what hangs below it
// is not known. Throws UsageError when this thread has a transaction open, SpaceBusy when another transaction does not end
// in time, and what the engine throws; what was removed by then stays removed.
//
// Reads every record once, and those to be removed once more. Memory: two bits for each id of the space, one node for each level.
CollectReport Collect(CSpace& space, const CollectOptions& options = {});

}  // namespace vemo
