// The three maps in spaces: open one, change it in a transaction, read it in a snapshot, walk it where it
// is larger than memory.
#pragma once

#include "store/peek.h"         // IWYU pragma: export
#include "store/scan.h"         // IWYU pragma: export
#include "store/scope.h"        // IWYU pragma: export
#include "store/snapshot.h"     // IWYU pragma: export
#include "store/transaction.h"  // IWYU pragma: export
#include "vemo/maps.h"          // IWYU pragma: export
