// A space: a set of persistent objects with named root maps, in a storage engine.
#pragma once

#include <chrono>
#include <memory>
#include <mutex>
#include <set>
#include <string>
#include <string_view>

#include "store/engine.h"
#include "store/view.h"

namespace vemo {

class Snapshot;
class WriteTransaction;

struct SpaceOptions {
  bool create = false;  // make the space if it is not there
  std::chrono::milliseconds writerTimeout{10'000};  // how long a transaction waits for the writer lock
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

 private:
  friend class Snapshot;
  friend class WriteTransaction;

  CSpace(std::string name, std::unique_ptr<Engine> engine, const SpaceOptions& options);
  void CheckFormat(bool create);
  OID NextId();

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
