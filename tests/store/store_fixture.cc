#include "tests/store/store_fixture.h"

#include "engines/lmdb/lmdb_engine.h"
#include "engines/memory/memory_engine.h"
#include "store/envelope.h"

namespace vemo::test {

namespace {

Bytes Copy(ByteView bytes) {
  return {bytes.begin(), bytes.end()};
}

std::map<std::string, Bytes> NamedValues(const EngineSnapshot& state, NamedTable table) {
  std::map<std::string, Bytes> values;
  state.ScanNamed(table, "", [&](std::string_view name, ByteView value) {
    values.emplace(name, Copy(value));
    return true;
  });
  return values;
}

}  // namespace

void PrintTo(EngineKind kind, std::ostream* os) {
  *os << (IsLmdb(kind) ? "lmdb" : "memory") << (Evicts(kind) ? "_evicting" : "");
}

std::string EngineKindName(const testing::TestParamInfo<EngineKind>& info) {
  return testing::PrintToString(info.param);
}

void PrintTo(const StoredState& state, std::ostream* os) {
  *os << "generation " << state.generation << ", " << state.info.size() << " infos, " << state.roots.size()
      << " roots, " << state.meta.size() << " metas, " << state.queue.size() << " queued, records";
  for (const auto& [oid, bytes] : state.records) *os << ' ' << oid.m_value << " (" << bytes.size() << ')';
}

StoredState StoredStateOf(Engine& engine) {
  const auto snapshot = engine.OpenSnapshot();
  StoredState state;
  state.generation = snapshot->Generation();
  snapshot->ScanRecords(OID(), [&](OID oid, ByteView record) {
    state.records.emplace(oid, Copy(record));
    return true;
  });
  state.info = NamedValues(*snapshot, NamedTable::kInfo);
  state.roots = NamedValues(*snapshot, NamedTable::kRoots);
  state.meta = NamedValues(*snapshot, NamedTable::kMeta);
  state.queue = snapshot->QueuedDeletions(1'000'000);
  return state;
}

void SpaceSite::Open(SpaceOptions options) {
  if (Evicts(m_kind) && !options.cacheBytes) options.cacheBytes = 0;
  if (IsLmdb(m_kind)) {
    LmdbOptions lmdb;
    lmdb.path = m_folder.path() / "space";
    lmdb.create = true;
    lmdb.syncEachCommit = false;  // these tests cut no power
    if (Evicts(m_kind)) lmdb.pendingChanges = {.bytes = 2'048, .commits = 6, .records = 24};
    m_engine = OpenLmdbEngine(lmdb);
  } else if (m_engine == nullptr) {
    m_engine = OpenMemoryEngine();
  }
  m_space = CSpace::OpenOn(WatchEngine(m_engine, m_watch), options);
}

void SpaceSite::Close() {
  m_space.reset();
  if (IsLmdb(m_kind)) m_engine.reset();
}

void SpaceSite::CommitBehind(CommitBatch& batch) {
  batch.expectedGeneration = m_engine->OpenSnapshot()->Generation();
  m_engine->Commit(batch);
}

void SpaceSite::Tamper(OID oid, const std::optional<Bytes>& record) {
  CommitBatch batch;
  if (record) {
    batch.records.push_back({oid, *record});
  } else {
    batch.removedRecords.push_back(oid);
  }
  CommitBehind(batch);
}

void SpaceSite::TamperNamed(NamedTable table, const std::string& name, const std::optional<Bytes>& value) {
  CommitBatch batch;
  batch.namedValues.push_back({table, name, value});
  CommitBehind(batch);
}

std::uint32_t SpaceSite::ClassNumber(const std::string& className) {
  for (const auto& [name, sealed] : StoredStateOf(*m_engine).info) {
    const ByteView value = OpenNamed(NamedTable::kInfo, name, sealed);
    if (std::string(value.begin(), value.end()) == className) {
      return static_cast<std::uint32_t>(std::stoul(name.substr(name.find('/') + 1)));
    }
  }
  ADD_FAILURE() << "no record is of class " << className;
  return 0;
}

}  // namespace vemo::test
