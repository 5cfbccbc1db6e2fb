// Recording edits of sequence fields in the maps of a space, and replaying recorded ones.
#pragma once

#include "history/recorder.h"  // IWYU pragma: export
#include "history/replay.h"    // IWYU pragma: export
#include "vemo/store.h"        // IWYU pragma: export
