// The engines that the contract runs over.
#include "engines/faulty/faulty_engine.h"
#include "engines/lmdb/lmdb_engine.h"
#include "engines/memory/memory_engine.h"
#include "tests/engines/engine_contract.h"
#include "tests/support/temp_folder.h"

namespace vemo::test {
namespace {

class MemorySite final : public EngineSite {
 public:
  std::unique_ptr<Engine> Open() override { return OpenMemoryEngine(); }
};

class LmdbSite : public EngineSite {
 public:
  explicit LmdbSite(SettlingBounds pendingChanges = {}) : m_pendingChanges(pendingChanges) {}

  std::unique_ptr<Engine> Open() override {
    LmdbOptions options;
    options.path = m_folder.path() / "space";
    options.create = true;
    options.pendingChanges = m_pendingChanges;
    return OpenLmdbEngine(options);
  }

 private:
  TempFolder m_folder;
  const SettlingBounds m_pendingChanges;
};

// Has few changes pending, so that some are written into their records with nearly every commit.
class SettlingLmdbSite final : public LmdbSite {
 public:
  SettlingLmdbSite() : LmdbSite({.bytes = 4'096, .commits = 8, .records = 16}) {}
};

// What fails on demand is an engine like any other as long as nothing is demanded.
class FaultySite final : public EngineSite {
 public:
  std::unique_ptr<Engine> Open() override { return MakeFaultyEngine(OpenMemoryEngine(), m_plan); }

 private:
  FaultPlan m_plan;
};

}  // namespace

const std::vector<EngineKind>& AllEngineKinds() {
  static const std::vector<EngineKind> kinds{{"memory", false, [] { return std::make_unique<MemorySite>(); }},
                                             {"lmdb", true, [] { return std::make_unique<LmdbSite>(); }},
                                             {"settling", true, [] { return std::make_unique<SettlingLmdbSite>(); }},
                                             {"faulty", false, [] { return std::make_unique<FaultySite>(); }}};
  return kinds;
}

}  // namespace vemo::test
