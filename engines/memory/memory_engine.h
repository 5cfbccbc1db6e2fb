// The reference engine: a space that lives as long as the engine.
#pragma once

#include <memory>

#include "store/engine.h"

namespace vemo {

// A new, empty space. Every value is kept in as many versions as the open snapshots can see; a commit copies
// what it is given. Snapshots and the writer lock may outlive the engine. EngineUsage::bytes counts the keys
// and values of all versions. A read costs one lock and one search; a scan does so for each entry, and the
// visitor may use the engine.
std::unique_ptr<Engine> OpenMemoryEngine();

}  // namespace vemo
