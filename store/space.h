// A space: a set of persistent objects with named root maps, in a storage engine.
#pragma once

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

// Opened once per process; transactions and snapshots are opened on it and must have ended before it is destroyed.
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
  // All open snapshots of this process, oldest first, then other processes that read the space now.
  std::vector<ReaderInfo> Readers();

 private:
  friend class Snapshot;
  friend class WriteTransaction;

  CSpace(std::string name, std::unique_ptr<Engine> engine, const SpaceOptions& options);
  void CheckFormat(bool create);
  OID NextId();
  void Log(LogLevel level, const std::string& message) const;
  // Says nothing of its own failures: it runs when a commit has been made, which must not be reported as failed.
  void WarnOfOldReaders() noexcept;

  // Ends what the mark of an object outside a transaction, or of a snapshot, has left half-changed, and throws.
  [[noreturn]] void RefuseMark(ptr<const IPersistable> object);
  friend void MarkPersistentAsDirtyWithoutTrace(ptr<const IPersistable> object);

  std::string m_name;
  std::unique_ptr<Engine> m_engine;
  SpaceOptions m_options;
  std::timed_mutex m_writerMutex;  // held by the open transaction, as is the engine's writer lock
  View m_writerView;

  std::uint64_t m_nextId = 0;  // ids reserved in the engine and not yet given out: m_nextId .. m_idLimit-1
  std::uint64_t m_idLimit = 0;
  std::uint64_t m_nextIdRange = 1'024;

  std::mutex m_snapshotsMutex;
  std::set<Snapshot*> m_snapshots;
};

}  // namespace vemo
