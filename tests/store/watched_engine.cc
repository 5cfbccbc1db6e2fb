#include "tests/store/watched_engine.h"

#include <algorithm>
#include <utility>

namespace vemo::test {

namespace {

class WatchedSnapshot final : public EngineSnapshot {
 public:
  WatchedSnapshot(std::unique_ptr<EngineSnapshot> inner, EngineWatch& watch)
      : m_inner(std::move(inner)), m_watch(watch) {}

  std::uint64_t Generation() const override { return m_inner->Generation(); }
  std::optional<ByteView> Read(OID oid) const override {
    m_watch.failingRead.Pass("Read");
    ++m_watch.reads;
    // A copy that is spoilt by the next call, as the engine may do: whoever still reads it then is found out.
    std::fill(m_record.begin(), m_record.end(), std::uint8_t{0xDD});
    const std::optional<ByteView> record = m_inner->Read(oid);
    if (!record) return std::nullopt;
    m_record = Bytes(record->begin(), record->end());
    return m_record;
  }
  void ScanRecords(OID first, const std::function<bool(OID, ByteView)>& visit) const override {
    m_inner->ScanRecords(first, visit);
  }
  std::optional<ByteView> ReadNamed(NamedTable table, std::string_view name) const override {
    return m_inner->ReadNamed(table, name);
  }
  void ScanNamed(NamedTable table, std::string_view prefix,
                 const std::function<bool(std::string_view, ByteView)>& visit) const override {
    m_inner->ScanNamed(table, prefix, visit);
  }
  std::vector<OID> QueuedDeletions(std::size_t limit) const override {
    return m_inner->QueuedDeletions(limit);
  }
  std::vector<StorageFinding> CheckStorage() const override { return m_inner->CheckStorage(); }

 private:
  std::unique_ptr<EngineSnapshot> m_inner;
  EngineWatch& m_watch;
  mutable Bytes m_record;
};

class WatchedEngine final : public Engine {
 public:
  WatchedEngine(std::shared_ptr<Engine> inner, EngineWatch& watch)
      : m_inner(std::move(inner)), m_watch(watch) {}

  std::string Name() const override { return m_inner->Name(); }
  std::unique_ptr<EngineSnapshot> OpenSnapshot() override {
    return std::make_unique<WatchedSnapshot>(m_inner->OpenSnapshot(), m_watch);
  }
  std::uint64_t Commit(const CommitBatch& batch) override {
    m_watch.written.clear();
    for (const CommitBatch::Record& record : batch.records) m_watch.written.push_back(record.oid);
    m_watch.removed = batch.removedRecords;
    m_watch.queued = batch.queuedDeletions;
    m_watch.finished = batch.finishedDeletions;
    m_watch.failingCommit.Pass("Commit");
    const std::uint64_t generation = m_inner->Commit(batch);
    ++m_watch.commits;
    return generation;
  }
  OID ReserveIds(std::uint64_t count) override {
    m_watch.failingReservation.Pass("ReserveIds");
    return OID(m_inner->ReserveIds(count).m_value + m_watch.idOffset);
  }
  std::unique_ptr<WriterLock> LockWriter(std::chrono::milliseconds timeout) override {
    return m_inner->LockWriter(timeout);
  }
  EngineUsage Usage() override { return m_inner->Usage(); }

 private:
  std::shared_ptr<Engine> m_inner;
  EngineWatch& m_watch;
};

}  // namespace

std::unique_ptr<Engine> WatchEngine(std::shared_ptr<Engine> engine, EngineWatch& watch) {
  return std::make_unique<WatchedEngine>(std::move(engine), watch);
}

}  // namespace vemo::test
