// A space: a set of persistent objects with named root maps, in a storage engine.
#pragma once

#include <atomic>
#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "store/cache_statistics.h"
#include "store/engine.h"
#include "store/view.h"

namespace vemo {

class Snapshot;
class WriteTransaction;

enum class LogLevel { kInfo, kWarning };

struct SpaceOptions {
  bool create = false;  // make the space if it is not there
  // How long a transaction waits for the writer lock; 0 refuses at once with SpaceBusy.
  std::chrono::milliseconds writerTimeout{10'000};
  // Snapshots keep the pages of their commit from being used again. One that is older than this at a commit is logged.
  std::optional<std::chrono::milliseconds> readerWarningAge = std::nullopt;
  // One that is older than this lets go of its commit when it next reads from the engine, and throws SnapshotExpired.
  std::optional<std::chrono::milliseconds> readerMaxAge = std::nullopt;
  // How much memory the nodes and payloads that were loaded may take: an equal share of it for the transactions of this process
  // and for each open snapshot. Nothing: no limit, as long as the space is open. What an open transaction or snapshot loads
  // stays until it trims or ends, and comes on top (docs/architecture.md, "Bounded memory").
  std::optional<std::uint64_t> cacheBytes = std::nullopt;
  // Where the random choice of what leaves memory starts from.
  std::uint64_t cacheSeed = 1;
  // Told of what is worth knowing but no error. Called on the thread that found it; must not call the space.
  std::function<void(LogLevel level, const std::string& message)> log = nullptr;
  // What ages are measured by.
  std::function<std::chrono::steady_clock::time_point()> clock = &std::chrono::steady_clock::now;
};

// A snapshot of this process, or another process that reads the space.
struct ReaderInfo {
  std::string owner;                              // the name given to the snapshot, or "process 1234"
  std::int64_t process = 0;
  std::optional<std::uint64_t> generation;        // the commit that it sees; unknown of other processes
  std::optional<std::chrono::milliseconds> age;   // unknown of other processes
};

// Opened once per process, which a fork does not pass on: in the child every use of the space, its transactions and snapshots is
// refused with UsageError, and destroying them leaves the parent's alone. Transactions and snapshots are opened on it and must have ended before it is destroyed.
// Opening transactions and snapshots is thread-safe; what each may do beside the others stands with them.
class CSpace {
 public:
  // Opens "lmdb:PATH" or "memory:" (store/uri.h lists the options). A memory space is new and ends with the handle.
  // Throws UsageError for a URI that names no space, SpaceNotFound, SpaceBusy when this process has it open already,
  // IncompatibleSpace, or another StoreError.
  static std::unique_ptr<CSpace> Open(std::string_view uri, const SpaceOptions& options = {});
  // Opens the space in an engine of one's own, which the handle takes. A space that has no commit yet is made if
  // `options.create` says so. Throws SpaceNotFound, IncompatibleSpace, CorruptRecord, or what the engine throws.
  static std::unique_ptr<CSpace> OpenOn(std::unique_ptr<Engine> engine, const SpaceOptions& options = {});
  ~CSpace();
  CSpace(const CSpace&) = delete;
  CSpace& operator=(const CSpace&) = delete;

  const std::string& Name() const noexcept { return m_name; }
  // The options in force, as text for people.
  std::string OptionsText() const;
  EngineUsage Usage() { return m_engine->Usage(); }
  // What the objects in memory cost and bring. Thread-safe.
  struct CacheStatistics CacheStatistics() const noexcept { return m_counters.Read(); }
  // All open snapshots of this process, oldest first, then other processes that read the space now.
  std::vector<ReaderInfo> Readers();

 private:
  friend class Snapshot;
  friend class WriteTransaction;

  static constexpr std::size_t kUnbounded = static_cast<std::size_t>(-1);

  CSpace(std::string name, std::unique_ptr<Engine> engine, const SpaceOptions& options);
  void CheckFormat(bool create);
  OID NextId();
  // Throws UsageError in a forked child.
  void RequireThisProcess() const { m_writerView.Use().RequireThisProcess(m_name, "it"); }
  // The bytes that the evictable objects of one view may take now.
  std::size_t Allowance() const noexcept;
  // Takes the writer's view to its allowance; for whoever holds the writer lock.
  void TrimWriter() noexcept;
  void EnterSnapshot(Snapshot& snapshot);
  void LeaveSnapshot(Snapshot& snapshot) noexcept;

  void Log(LogLevel level, const std::string& message) const;
  // Says nothing of its own failures: it runs when a commit has been made, which must not be reported as failed.
  void WarnOfOldReaders() noexcept;

  // Ends what the mark of an object outside a transaction, or of a snapshot, has left half-changed, and throws.
  [[noreturn]] void RefuseMark(ptr<const IPersistable> object);
  friend void MarkPersistentAsDirtyWithoutTrace(ptr<const IPersistable> object);
  friend void MutationInterrupted(ptr<const IPersistable> map) noexcept;

  std::string m_name;
  std::unique_ptr<Engine> m_engine;
  SpaceOptions m_options;
  CacheCounters m_counters;
  std::timed_mutex m_writerMutex;  // held by the open transaction, as is the engine's writer lock
  View m_writerView;
  std::atomic<bool> m_disturbed{false};  // another thread has tried to change what the open transaction has in memory
  std::atomic<std::size_t> m_numViews{1};

  std::uint64_t m_nextId = 0;  // ids reserved in the engine and not yet given out: m_nextId .. m_idLimit-1
  std::uint64_t m_idLimit = 0;
  std::uint64_t m_nextIdRange = 1'024;

  std::mutex m_snapshotsMutex;
  std::set<Snapshot*> m_snapshots;
};

}  // namespace vemo
