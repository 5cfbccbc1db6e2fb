#include "engines/lmdb/lmdb_engine.h"

#include <lmdb.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <limits>
#include <utility>

#include "engines/batch_check.h"
#include "engines/lmdb/big_endian.h"
#include "engines/lmdb/lmdb_environment.h"
#include "engines/lmdb/lmdb_error.h"
#include "engines/lmdb/lmdb_snapshot.h"
#include "engines/lmdb/lmdb_writer_lock.h"
#include "platform/error.h"

namespace vemo {
namespace {

constexpr const char* kCommit = "commit to";
constexpr const char* kReserve = "reserve ids in";
constexpr const char* kLock = "lock for writing";

// One write transaction's view of the tables, in the words of a batch.
class BatchWriter {
 public:
  BatchWriter(MDB_txn* txn, const LmdbEnvironment& environment)
      : m_txn(txn), m_tables(environment.tables()), m_space(environment.name()) {}

  void Apply(const CommitBatch& batch) {
    const std::uint64_t generation = ReadGeneration(m_txn, m_tables, m_space);
    if (generation != batch.expectedGeneration) throw StaleGeneration(batch.expectedGeneration, generation);
    for (const OID oid : batch.removedRecords) RemoveId(m_tables.records, oid);
    PutRecords(batch.records);
    for (const OID oid : batch.finishedDeletions) RemoveId(m_tables.deletions, oid);
    for (const OID oid : batch.queuedDeletions) PutId(m_tables.deletions, oid, {});
    for (const CommitBatch::NamedValue& named : batch.namedValues) {
      const unsigned table = TableOf(named.table, m_tables);
      MDB_val key{named.name.size(), const_cast<char*>(named.name.data())};
      if (named.value) {
        Put(table, key, *named.value);
      } else {
        Remove(table, key);
      }
    }
    WriteGeneration(m_txn, m_tables, generation + 1, m_space);
  }

 private:
  // In the order of ids, so that neighbours are written while their page is at hand.
  void PutRecords(const std::vector<CommitBatch::Record>& records) {
    std::vector<const CommitBatch::Record*> sorted;
    sorted.reserve(records.size());
    for (const CommitBatch::Record& record : records) sorted.push_back(&record);
    std::sort(sorted.begin(), sorted.end(), [](const auto* a, const auto* b) { return a->oid < b->oid; });
    for (const CommitBatch::Record* record : sorted) PutId(m_tables.records, record->oid, record->bytes);
  }

  void PutId(unsigned table, OID oid, ByteView value) {
    BigEndian64 bytes = ToBigEndian(oid.m_value);
    MDB_val key{bytes.size(), bytes.data()};
    Put(table, key, value);
  }

  void RemoveId(unsigned table, OID oid) {
    BigEndian64 bytes = ToBigEndian(oid.m_value);
    MDB_val key{bytes.size(), bytes.data()};
    Remove(table, key);
  }

  void Put(unsigned table, MDB_val& key, ByteView value) {
    static const std::uint8_t kNothing = 0;  // LMDB copies no byte of an empty value, but from a valid place
    const std::uint8_t* data = value.empty() ? &kNothing : value.data();
    MDB_val val{value.size(), const_cast<std::uint8_t*>(data)};
    CheckLmdb(mdb_put(m_txn, table, &key, &val, 0), kCommit, m_space);
  }

  void Remove(unsigned table, MDB_val& key) {
    const int code = mdb_del(m_txn, table, &key, nullptr);
    if (code != MDB_NOTFOUND) CheckLmdb(code, kCommit, m_space);
  }

  MDB_txn* m_txn;
  const LmdbTables& m_tables;
  const std::string& m_space;
};

class LmdbEngine final : public Engine {
 public:
  explicit LmdbEngine(const LmdbOptions& options)
      : m_environment(std::make_shared<LmdbEnvironment>(options)) {}

  std::string Name() const override { return m_environment->name(); }

  std::unique_ptr<EngineSnapshot> OpenSnapshot() override {
    return std::make_unique<LmdbSnapshot>(m_environment);
  }

  std::uint64_t Commit(const CommitBatch& batch) override {
    CheckBatch(batch);
    m_environment->Write(kCommit, [&](MDB_txn* txn) { BatchWriter(txn, *m_environment).Apply(batch); });
    return batch.expectedGeneration + 1;
  }

  OID ReserveIds(std::uint64_t count) override {
    if (count == 0) throw UsageError(Name() + ": at least one id must be reserved");
    OID first;
    m_environment->Write(kReserve, [&](MDB_txn* txn) {
      const LmdbTables& tables = m_environment->tables();
      const std::uint64_t next = ReadNextId(txn, tables, Name());
      if (count > std::numeric_limits<std::uint64_t>::max() - next) {
        throw StoreError(Name() + ": " + std::to_string(count) +
                         " more ids do not exist: the last is 2^64 - 2");
      }
      WriteNextId(txn, tables, next + count, Name());
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
    struct stat status {};
    if (::stat((m_environment->path() / kDataFile).c_str(), &status) != 0) {
      throw LmdbError("measure", Name(), errno);
    }
    constexpr std::uint64_t kBlockBytes = 512;
    usage.bytes = static_cast<std::uint64_t>(status.st_blocks) * kBlockBytes;
    return usage;
  }

 private:
  std::shared_ptr<LmdbEnvironment> m_environment;
};

}  // namespace

std::unique_ptr<Engine> OpenLmdbEngine(const LmdbOptions& options) {
  return std::make_unique<LmdbEngine>(options);
}

}  // namespace vemo
