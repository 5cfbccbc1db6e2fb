// The engine of a space, for those who read below the store: checks and rescue of spaces that CSpace::Open may refuse.
#pragma once

#include <memory>
#include <string_view>

#include "store/engine.h"

namespace vemo {

// Opens the engine of a space that is there, for reading alone: nothing is made or changed, and commits are refused. Throws
// UsageError, SpaceNotFound, SpaceBusy, or what the engine throws. A memory engine is new and empty.
std::unique_ptr<Engine> OpenEngineForReading(std::string_view uri);

}  // namespace vemo
