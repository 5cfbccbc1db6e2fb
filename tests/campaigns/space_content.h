// What a space holds, as text in which no object id occurs.
#pragma once

#include <string>

#include "store/snapshot.h"
#include "store/transaction.h"

namespace vemo::campaign {

// All that the snapshot's commit holds, and its number.
std::string ContentOf(Snapshot& snapshot);

// Whether the maps that the transaction sees, which has changed nothing, are those of the snapshot, entry by entry.
bool SeesTheSame(WriteTransaction& transaction, Snapshot& snapshot);

}  // namespace vemo::campaign
