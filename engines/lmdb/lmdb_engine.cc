#include "engines/lmdb/lmdb_engine.h"

#include <algorithm>
#include <cerrno>
#include <limits>
#include <map>
#include <mutex>
#include <optional>
#include <string_view>
#include <utility>

#include "engines/batch_check.h"
#include "engines/lmdb/change_log.h"
#include "engines/lmdb/file_status.h"
#include "engines/lmdb/lmdb_environment.h"
#include "engines/lmdb/lmdb_error.h"
#include "engines/lmdb/lmdb_snapshot.h"
#include "engines/lmdb/lmdb_writer_lock.h"
#include "engines/lmdb/record_writer.h"
#include "engines/lmdb/space_writer.h"
#include "platform/error.h"

namespace vemo {
namespace {

constexpr const char* kCommit = "commit to";
constexpr const char* kReserve = "reserve ids in";
constexpr const char* kLock = "lock for writing";

void Apply(const CommitBatch& batch, SpaceWriter& writer, ChangeIndex& changes, const SettlingBounds& bounds,
           SettlingRound& round) {
  const std::uint64_t generation = writer.state().Commit();
  if (generation != batch.expectedGeneration) throw StaleGeneration(batch.expectedGeneration, generation);
  FollowChanges(changes, writer.reader(), writer.state());
  RecordWriter records(writer, changes, bounds, round);
  records.Write(batch);
  if (writer.logged()) return;
  round = records.round();
  for (const OID oid : batch.finishedDeletions) writer.Unqueue(oid);
  for (const OID oid : batch.queuedDeletions) writer.Queue(oid);
  // Of a name that is there more than once the last value counts, those of the log being before.
  std::map<std::pair<NamedTable, std::string_view>, std::optional<ByteView>> named;
  for (const auto& [name, value] : writer.state().log.tail->Meta(generation)) named[{NamedTable::kMeta, name}] = value;
  for (const CommitBatch::NamedValue& value : batch.namedValues) {
    named[{value.table, value.name}] = value.value ? std::optional(ByteView(*value.value)) : std::nullopt;
  }
  for (const auto& [name, value] : named) {
    if (value) {
      writer.PutNamed(name.first, name.second, *value);
    } else {
      writer.RemoveNamed(name.first, name.second);
    }
  }
  writer.PutGeneration(generation + 1);
}

class LmdbEngine final : public Engine {
 public:
  explicit LmdbEngine(const LmdbOptions& options)
      : m_environment(std::make_shared<LmdbEnvironment>(options)), m_bounds(options.pendingChanges) {}

  std::string Name() const override { return m_environment->name(); }

  std::unique_ptr<EngineSnapshot> OpenSnapshot() override {
    for (;;) {
      auto snapshot = std::make_unique<LmdbSnapshot>(m_environment);
      if (snapshot->IsCurrent()) return snapshot;
    }
  }

  std::uint64_t Commit(const CommitBatch& batch) override {
    CheckBatch(batch);
    const std::lock_guard lock(m_committing);
    SettlingRound round;
    m_environment->Write(kCommit, [&](SpaceWriter& writer) {
      round = m_round;
      Apply(batch, writer, *m_environment->changes(), m_bounds, round);
    });
    m_round = std::move(round);
    return batch.expectedGeneration + 1;
  }

  OID ReserveIds(std::uint64_t count) override {
    if (count == 0) throw UsageError(Name() + ": at least one id must be reserved");
    OID first;
    m_environment->Write(kReserve, [&](SpaceWriter& writer) {
      const std::uint64_t next = writer.NextId();
      if (count > std::numeric_limits<std::uint64_t>::max() - next) {
        throw StoreError(Name() + ": " + std::to_string(count) +
                         " more ids do not exist: the last is 2^64 - 2");
      }
      writer.PutNextId(next + count);
      first = OID(next);
    });
    return first;
  }

  std::unique_ptr<WriterLock> LockWriter(std::chrono::milliseconds timeout) override {
    m_environment->RequireOwnProcess(kLock);
    m_environment->RequireWritable(kLock);
    return std::make_unique<LmdbWriterLock>(m_environment->path(), m_environment->name(), timeout);
  }

  std::vector<std::int64_t> ReadersElsewhere() override { return m_environment->ReadersElsewhere(); }

  EngineUsage Usage() override {
    EngineUsage usage;
    usage.records = m_environment->CountRecords();
    const std::optional<FileStatus> status = StatusOf(m_environment->path() / kDataFile);
    if (!status) throw LmdbError("measure", Name(), errno);
    usage.bytes = status->diskBytes + m_environment->LogBytes();
    return usage;
  }

 private:
  std::shared_ptr<LmdbEnvironment> m_environment;
  const SettlingBounds m_bounds;
  std::mutex m_committing;  // guards m_round
  SettlingRound m_round;
};

}  // namespace

std::unique_ptr<Engine> OpenLmdbEngine(const LmdbOptions& options) {
  return std::make_unique<LmdbEngine>(options);
}

}  // namespace vemo
