#include "engines/memory/memory_engine.h"

#include <algorithm>
#include <array>
#include <condition_variable>
#include <limits>
#include <mutex>
#include <string>
#include <utility>

#include "engines/batch_check.h"
#include "engines/memory/versioned_table.h"
#include "platform/error.h"

namespace vemo {
namespace {

// All of a space. Snapshots and writer locks share it with the engine.
struct MemorySpace {
  std::mutex mutex;  // guards everything below
  VersionedTable<OID> records;
  VersionedTable<OID> deletions;                     // the queue: ids with empty values
  std::array<VersionedTable<std::string>, 3> named;  // by NamedTable
  std::uint64_t generation = 0;
  std::uint64_t nextId = 1;
  OpenGenerations open;
  bool writerLocked = false;
  std::condition_variable writerUnlocked;

  VersionedTable<std::string>& Named(NamedTable table) { return named[static_cast<std::size_t>(table)]; }

  void Stage(const CommitBatch& batch);
  void DropStaged() noexcept;
  void Publish() noexcept;
  void Sweep(bool all) noexcept;
};

void MemorySpace::Stage(const CommitBatch& batch) {
  for (const OID oid : batch.removedRecords) records.Stage(oid, std::nullopt);
  for (const CommitBatch::Record& record : batch.records) {
    records.Stage(record.oid, Bytes(record.bytes.begin(), record.bytes.end()));
  }
  for (const OID oid : batch.finishedDeletions) deletions.Stage(oid, std::nullopt);
  for (const OID oid : batch.queuedDeletions) deletions.Stage(oid, Bytes());
  for (const CommitBatch::NamedValue& value : batch.namedValues) {
    Named(value.table).Stage(value.name, value.value);
  }
}

void MemorySpace::DropStaged() noexcept {
  records.DropStaged();
  deletions.DropStaged();
  for (auto& table : named) table.DropStaged();
}

void MemorySpace::Publish() noexcept {
  ++generation;
  records.Publish(generation, open);
  deletions.Publish(generation, open);
  for (auto& table : named) table.Publish(generation, open);
}

void MemorySpace::Sweep(bool all) noexcept {
  records.Sweep(open, all);
  deletions.Sweep(open, all);
  for (auto& table : named) table.Sweep(open, all);
}

class MemorySnapshot final : public EngineSnapshot {
 public:
  explicit MemorySnapshot(std::shared_ptr<MemorySpace> space) : m_space(std::move(space)) {
    const std::lock_guard lock(m_space->mutex);
    m_generation = m_space->generation;
    ++m_space->open[m_generation];
  }
  ~MemorySnapshot() override {
    const std::lock_guard lock(m_space->mutex);
    const auto own = m_space->open.find(m_generation);
    if (--own->second != 0) return;
    const bool wasOldest = own == m_space->open.begin();
    m_space->open.erase(own);
    m_space->Sweep(wasOldest);
  }
  MemorySnapshot(const MemorySnapshot&) = delete;
  MemorySnapshot& operator=(const MemorySnapshot&) = delete;

  std::uint64_t Generation() const override { return m_generation; }

  std::optional<ByteView> Read(OID oid) const override { return ReadFrom(m_space->records, oid); }

  void ScanRecords(OID first, const std::function<bool(OID, ByteView)>& visit) const override {
    auto found = NextIn(m_space->records, first, false);
    while (found && visit(found->key, found->value)) found = NextIn(m_space->records, found->key, true);
  }

  std::optional<ByteView> ReadNamed(NamedTable table, std::string_view name) const override {
    return ReadFrom(m_space->Named(table), name);
  }

  void ScanNamed(NamedTable table, std::string_view prefix,
                 const std::function<bool(std::string_view, ByteView)>& visit) const override {
    auto found = NextIn(m_space->Named(table), prefix, false);
    while (found && found->key.substr(0, prefix.size()) == prefix && visit(found->key, found->value)) {
      found = NextIn(m_space->Named(table), found->key, true);
    }
  }

  std::vector<OID> QueuedDeletions(std::size_t limit) const override {
    std::vector<OID> queued;
    auto found = NextIn(m_space->deletions, OID(), false);
    while (found && queued.size() < limit) {
      queued.push_back(found->key);
      found = NextIn(m_space->deletions, found->key, true);
    }
    return queued;
  }

 private:
  template <typename K>
  struct Found {
    K key;
    ByteView value;
  };

  template <typename Table, typename K>
  std::optional<ByteView> ReadFrom(const Table& table, const K& key) const {
    const std::lock_guard lock(m_space->mutex);
    const Bytes* value = table.Find(key, m_generation);
    if (value == nullptr) return std::nullopt;
    return ByteView(*value);
  }

  // Takes the lock for one step, so that a visitor may do as it likes.
  template <typename Table, typename K>
  std::optional<Found<K>> NextIn(const Table& table, const K& key, bool afterKey) const {
    const std::lock_guard lock(m_space->mutex);
    const auto entry = table.Next(key, afterKey, m_generation);
    if (!entry) return std::nullopt;
    return Found<K>{K(*entry->key), ByteView(*entry->value)};
  }

  std::shared_ptr<MemorySpace> m_space;
  std::uint64_t m_generation = 0;
};

class MemoryWriterLock final : public WriterLock {
 public:
  MemoryWriterLock(std::shared_ptr<MemorySpace> space, std::chrono::milliseconds timeout)
      : m_space(std::move(space)) {
    std::unique_lock lock(m_space->mutex);
    if (!m_space->writerUnlocked.wait_for(lock, timeout, [this] { return !m_space->writerLocked; })) {
      throw SpaceBusy("cannot lock memory: for writing within " + std::to_string(timeout.count()) +
                      " ms: another transaction of this process is open; commit or end it first");
    }
    m_space->writerLocked = true;
  }
  ~MemoryWriterLock() override {
    {
      const std::lock_guard lock(m_space->mutex);
      m_space->writerLocked = false;
    }
    m_space->writerUnlocked.notify_one();
  }
  MemoryWriterLock(const MemoryWriterLock&) = delete;
  MemoryWriterLock& operator=(const MemoryWriterLock&) = delete;

 private:
  std::shared_ptr<MemorySpace> m_space;
};

class MemoryEngine final : public Engine {
 public:
  std::string Name() const override { return "memory:"; }

  std::unique_ptr<EngineSnapshot> OpenSnapshot() override {
    return std::make_unique<MemorySnapshot>(m_space);
  }

  std::uint64_t Commit(const CommitBatch& batch) override {
    const std::lock_guard lock(m_space->mutex);
    if (batch.expectedGeneration != m_space->generation) {
      throw StaleGeneration(batch.expectedGeneration, m_space->generation);
    }
    CheckBatch(batch);
    try {
      m_space->Stage(batch);
    } catch (...) {
      m_space->DropStaged();
      throw;
    }
    m_space->Publish();
    return m_space->generation;
  }

  OID ReserveIds(std::uint64_t count) override {
    if (count == 0) throw UsageError("memory: at least one id must be reserved");
    const std::lock_guard lock(m_space->mutex);
    if (count > std::numeric_limits<std::uint64_t>::max() - m_space->nextId) {
      throw StoreError("memory: " + std::to_string(count) + " more ids do not exist: the last is 2^64 - 2");
    }
    const OID first(m_space->nextId);
    m_space->nextId += count;
    return first;
  }

  std::unique_ptr<WriterLock> LockWriter(std::chrono::milliseconds timeout) override {
    // Later points in time than the longest wait overflow the clock.
    constexpr std::chrono::milliseconds kLongestWait = std::chrono::hours(24 * 365);
    return std::make_unique<MemoryWriterLock>(
        m_space, std::clamp(timeout, std::chrono::milliseconds(0), kLongestWait));
  }

  EngineUsage Usage() override {
    const std::lock_guard lock(m_space->mutex);
    EngineUsage usage;
    usage.bytes = m_space->records.bytes() + m_space->deletions.bytes();
    for (const auto& table : m_space->named) usage.bytes += table.bytes();
    usage.records = m_space->records.liveKeys();
    return usage;
  }

 private:
  std::shared_ptr<MemorySpace> m_space = std::make_shared<MemorySpace>();
};

}  // namespace

std::unique_ptr<Engine> OpenMemoryEngine() {
  return std::make_unique<MemoryEngine>();
}

}  // namespace vemo
