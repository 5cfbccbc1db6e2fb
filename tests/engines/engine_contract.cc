#include "tests/engines/engine_contract.h"

namespace vemo::test {

std::optional<std::string> ToText(const std::optional<ByteView>& bytes) {
  if (!bytes) return std::nullopt;
  return ToText(*bytes);
}

BatchBuilder& BatchBuilder::Put(std::uint64_t oid, std::string bytes) {
  m_records.emplace_back(OID(oid), std::move(bytes));
  return *this;
}

BatchBuilder& BatchBuilder::Remove(std::uint64_t oid) {
  m_batch.removedRecords.emplace_back(oid);
  return *this;
}

BatchBuilder& BatchBuilder::Queue(std::uint64_t oid) {
  m_batch.queuedDeletions.emplace_back(oid);
  return *this;
}

BatchBuilder& BatchBuilder::Finish(std::uint64_t oid) {
  m_batch.finishedDeletions.emplace_back(oid);
  return *this;
}

BatchBuilder& BatchBuilder::Name(NamedTable table, std::string name, std::string value) {
  m_batch.namedValues.push_back({table, std::move(name), ToBytes(value)});
  return *this;
}

BatchBuilder& BatchBuilder::Unname(NamedTable table, std::string name) {
  m_batch.namedValues.push_back({table, std::move(name), std::nullopt});
  return *this;
}

const CommitBatch& BatchBuilder::At(std::uint64_t expectedGeneration) {
  m_batch.expectedGeneration = expectedGeneration;
  m_batch.records.clear();
  for (const auto& [oid, bytes] : m_records) {
    m_batch.records.push_back({oid, {reinterpret_cast<const std::uint8_t*>(bytes.data()), bytes.size()}});
  }
  return m_batch;
}

void PrintTo(const Contents& contents, std::ostream* os) {
  *os << "generation " << contents.generation << ", records " << testing::PrintToString(contents.records)
      << ", info " << testing::PrintToString(contents.info) << ", roots "
      << testing::PrintToString(contents.roots) << ", meta " << testing::PrintToString(contents.meta)
      << ", queue " << testing::PrintToString(contents.queue);
}

Records AllRecords(const EngineSnapshot& snapshot, std::uint64_t first) {
  Records records;
  snapshot.ScanRecords(OID(first), [&](OID oid, ByteView bytes) {
    records.emplace_back(oid.m_value, ToText(bytes));
    return true;
  });
  return records;
}

Named AllNamed(const EngineSnapshot& snapshot, NamedTable table, std::string_view prefix) {
  Named named;
  snapshot.ScanNamed(table, prefix, [&](std::string_view name, ByteView bytes) {
    named.emplace_back(name, ToText(bytes));
    return true;
  });
  return named;
}

std::vector<std::uint64_t> Queue(const EngineSnapshot& snapshot, std::size_t limit) {
  std::vector<std::uint64_t> ids;
  for (const OID oid : snapshot.QueuedDeletions(limit)) ids.push_back(oid.m_value);
  return ids;
}

Contents ContentsOf(const EngineSnapshot& snapshot) {
  Contents contents;
  contents.generation = snapshot.Generation();
  contents.records = AllRecords(snapshot);
  contents.info = AllNamed(snapshot, NamedTable::kInfo);
  contents.roots = AllNamed(snapshot, NamedTable::kRoots);
  contents.meta = AllNamed(snapshot, NamedTable::kMeta);
  contents.queue = Queue(snapshot);
  return contents;
}

Contents NewestContents(Engine& engine) {
  return ContentsOf(*engine.OpenSnapshot());
}

std::vector<EngineKind> PersistentEngineKinds() {
  std::vector<EngineKind> kinds;
  for (const EngineKind& kind : AllEngineKinds()) {
    if (kind.isPersistent) kinds.push_back(kind);
  }
  return kinds;
}

std::string EngineKindName(const testing::TestParamInfo<EngineKind>& info) {
  return info.param.name;
}

}  // namespace vemo::test
