// What changed from one version of a record to the next.
//
// A delta is a sequence of steps over the old version, from its start to its end:
//
//   keep (variable-length)  this many bytes are the old ones
//   drop (variable-length)  this many of the old ones are gone
//   add  (variable-length)  this many new ones follow, and then they stand here
//
// Behind the last step everything is kept. A record is a node of sorted entries, so that a change of a few entries leaves long
// stretches as they were, moved by a few bytes.
#pragma once

#include <optional>

#include "store/engine.h"

namespace vemo {

// The delta from `old` to `next`, or nothing if it would have more than `mostBytes`. Linear in the length of the versions, with a
// search of bounded width where they part; not always the shortest. Throws std::bad_alloc alone.
std::optional<Bytes> RecordDelta(ByteView old, ByteView next, std::size_t mostBytes);

// Makes of `next`, in which neither of the two lies, the version to which `delta` leads from `old`; its room is used again.
// Throws MalformedBytes when the two do not fit together, and then `next` may be anything. What it allocates is bounded by the
// sizes of both.
void ApplyRecordDelta(ByteView old, ByteView delta, Bytes& next);

}  // namespace vemo
