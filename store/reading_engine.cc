#include "store/reading_engine.h"

#include "engines/lmdb/lmdb_engine.h"
#include "engines/memory/memory_engine.h"
#include "store/uri.h"

namespace vemo {

std::unique_ptr<Engine> OpenEngineForReading(std::string_view uri) {
  const SpaceUri parsed = ParseSpaceUri(uri);
  if (parsed.engine == SpaceUri::Engine::kMemory) return OpenMemoryEngine();
  LmdbOptions options;
  options.path = parsed.path;
  options.mapBytes = parsed.mapBytes;
  options.readOnly = true;
  return OpenLmdbEngine(options);
}

}  // namespace vemo
