#include "engines/faulty/undo_log.h"

#include <algorithm>
#include <utility>

namespace vemo {

namespace {

std::optional<Bytes> Copy(const std::optional<ByteView>& bytes) {
  if (!bytes) return std::nullopt;
  return Bytes(bytes->begin(), bytes->end());
}

}  // namespace

void UndoLog::Remember(const EngineSnapshot& before, const CommitBatch& batch, std::size_t kept) {
  Undo undo;
  for (const CommitBatch::Record& record : batch.records) undo.records.emplace_back(record.oid, Copy(before.Read(record.oid)));
  for (const OID oid : batch.removedRecords) undo.records.emplace_back(oid, Copy(before.Read(oid)));
  for (const CommitBatch::NamedValue& value : batch.namedValues) {
    undo.namedValues.push_back({value.table, value.name, Copy(before.ReadNamed(value.table, value.name))});
  }
  undo.queue = before.QueuedDeletions(SIZE_MAX);
  undo.joined = batch.queuedDeletions;
  m_undos.push_back(std::move(undo));
  while (m_undos.size() > kept) m_undos.pop_front();
}

void UndoLog::Forget() noexcept {
  if (!m_undos.empty()) m_undos.pop_back();
}

void UndoLog::TakeBack(Engine& engine, std::size_t commits) {
  for (; commits > 0 && !m_undos.empty(); --commits) {
    const Undo& undo = m_undos.back();
    CommitBatch batch;
    batch.expectedGeneration = engine.OpenSnapshot()->Generation();
    for (const auto& [oid, bytes] : undo.records) {
      if (bytes) {
        batch.records.push_back({oid, *bytes});
      } else {
        batch.removedRecords.push_back(oid);
      }
    }
    batch.namedValues = undo.namedValues;
    batch.finishedDeletions = undo.joined;
    batch.queuedDeletions = undo.queue;
    engine.Commit(batch);
    m_offset += 2;  // the commit and the one that takes it back
    m_undos.pop_back();
  }
}

}  // namespace vemo
