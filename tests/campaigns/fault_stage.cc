// The space that the scenarios work on.
#include "engines/lmdb/lmdb_engine.h"
#include "engines/memory/memory_engine.h"
#include "tests/campaigns/fault_scenarios.h"

namespace vemo::campaign {

Stage::Stage(EngineSort sort) : m_sort(sort) {
  if (sort == EngineSort::kLmdb) m_folder.emplace();
}

void Stage::Open() {
  if (m_sort == EngineSort::kLmdb) {
    LmdbOptions options;
    options.path = m_folder->path() / "space";
    options.create = true;
    options.pendingChanges = {.bytes = 4'096, .commits = 8, .records = 32};
    m_engine.reset();                // left by an attempt to open that failed
    m_engine = OpenLmdbEngine(options);
  } else if (m_engine == nullptr) {
    m_engine = OpenMemoryEngine();
  }
  SpaceOptions options;
  options.create = true;
  options.readerWarningAge = std::chrono::milliseconds(0);
  options.log = [](LogLevel, const std::string&) {};
  m_space = CSpace::OpenOn(MakeFaultyEngine(m_engine, plan), options);
}

void Stage::Close() noexcept {
  m_space.reset();
  if (m_sort == EngineSort::kLmdb) m_engine.reset();
}

void Stage::Mutate(WriteTransaction& transaction, const std::function<void()>& change) {
  try {
    change();
  } catch (...) {
    if (!transaction.IsPoisoned()) m_missedPoison = true;
    throw;
  }
}

}  // namespace vemo::campaign
