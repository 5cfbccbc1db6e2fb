// What became of a commit whose answer was lost.
#pragma once

#include <cstdint>

#include "store/engine.h"

namespace vemo {

// Engine::Commit, and where that does not tell whether `batch` was applied, a look at the space that does. A batch counts as
// applied when the newest commit is the one after `batch.expectedGeneration` and shows what the batch says: a record carries
// the number of its commit and a checksum, so that nobody else's commit looks like it. A batch that an engine delivered twice
// is refused the second time and found in the same way.
//
// Returns the new generation. Throws what the engine throws when nothing was applied (StoreError in place of UnknownOutcome),
// and UnknownOutcome when the space cannot be read, when it has gone further, or when it shows a commit that the engine has
// reported as failed, which may not outlive a power cut. The caller holds the writer lock. Costs nothing unless it fails, then
// reading back what the batch names.
std::uint64_t CommitAndSettle(Engine& engine, const CommitBatch& batch);

}  // namespace vemo
