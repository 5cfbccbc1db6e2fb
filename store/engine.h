// What the object store asks of a storage engine. Engines see this header and store/error.h, nothing above.
//
// A space in an engine is a table of records by object id, three tables of small named values, a queue of deletions to be
// finished later, and a generation: the number of commits since the space was made. A commit changes all of these
// together or none. Engines do not look into values: the store seals each with a checksum of its own.
//
// Threads: an Engine may be called from any thread; commits are serialised by the writer lock of the store above. An
// EngineSnapshot is used by one thread at a time, which need not be the one that opened it.
#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "platform/oid.h"
#include "platform/types.h"
#include "store/error.h"

namespace vemo {

using ByteView = std::span<const std::uint8_t>;

// Names have 1 to 400 bytes, any byte allowed, and are ordered bytewise. Values have up to 2^30 bytes.
enum class NamedTable : std::uint8_t {
  kInfo,   // the store's own: format, class names
  kRoots,  // root maps by name
  kMeta,   // the user's
};

// One atomic change. Views must stay readable until Commit returns.
struct CommitBatch {
  struct Record {
    OID oid;
    ByteView bytes;
  };
  struct NamedValue {
    NamedTable table;
    std::string name;
    std::optional<Bytes> value;  // nothing: the name is removed; one that is missing is no error
  };

  std::uint64_t expectedGeneration = 0;  // the commit is refused when the engine stands elsewhere
  std::vector<Record> records;           // put, in any order, each id at most once
  std::vector<OID> removedRecords;       // each at most once, none of `records`; one that is missing is no error
  std::vector<OID> queuedDeletions;      // joins the queue; one that is there already stays once
  std::vector<OID> finishedDeletions;    // leaves the queue; applied before queuedDeletions
  std::vector<NamedValue> namedValues;
};

// Something wrong in what an engine keeps its values in.
struct StorageFinding {
  std::string what;                   // the fault and the file, table or structure that has it
  std::optional<std::uint64_t> page;  // of the engine's file, where it has pages
};

// The state after one commit, whatever is committed meanwhile. A record that Read returns stays valid until its next call, one that
// a scan shows until the visit returns, everything else until the snapshot is destroyed.
// Every function throws StoreError when the engine fails, and DamagedStorage when what it must read is damaged: that a
// value is absent is an answer only where that is certain. The rest stays readable.
class EngineSnapshot {
 public:
  virtual ~EngineSnapshot() = default;

  virtual std::uint64_t Generation() const = 0;

  // The record of `oid`, or nothing.
  virtual std::optional<ByteView> Read(OID oid) const = 0;

  // Calls `visit` for each record in ascending order of ids from `first` on, until it returns false.
  virtual void ScanRecords(OID first, const std::function<bool(OID, ByteView)>& visit) const = 0;

  virtual std::optional<ByteView> ReadNamed(NamedTable table, std::string_view name) const = 0;

  // Calls `visit` for each value whose name starts with `prefix`, in order, until it returns false.
  virtual void ScanNamed(NamedTable table, std::string_view prefix,
                         const std::function<bool(std::string_view, ByteView)>& visit) const = 0;

  // The first `limit` entries of the deletion queue in ascending order.
  virtual std::vector<OID> QueuedDeletions(std::size_t limit) const = 0;

  // Checks all that the engine keeps this state in, apart from the values, which the store seals itself. Does not stop at
  // the first fault. Reads every page; what has no pages has nothing to check.
  virtual std::vector<StorageFinding> CheckStorage() const { return {}; }
};

// Held by the one process and transaction that may commit; released by the destructor, also when the process dies.
class WriterLock {
 public:
  virtual ~WriterLock() = default;
};

struct EngineUsage {
  std::uint64_t bytes = 0;    // taken on the medium
  std::uint64_t records = 0;  // in the newest commit
};

class Engine {
 public:
  virtual ~Engine() = default;

  // "lmdb:/path" or the like, for messages.
  virtual std::string Name() const = 0;

  // The newest commit.
  virtual std::unique_ptr<EngineSnapshot> OpenSnapshot() = 0;

  // Applies `batch` and returns the new generation, `batch.expectedGeneration` + 1. Once it has returned, the commit
  // survives the end of the process and, for engines on a disk, power loss. Throws UnknownOutcome when it cannot tell
  // whether `batch` was applied: a snapshot that is opened afterwards shows it for good. Throws StaleGeneration, or
  // another StoreError; then nothing was applied.
  virtual std::uint64_t Commit(const CommitBatch& batch) = 0;

  // The first of `count` ids (at least 1) that were never handed out before and never will be again. The first id of a
  // space is 1. Does not change the generation.
  virtual OID ReserveIds(std::uint64_t count) = 0;

  // Waits up to `timeout` for the writer lock of the space across processes; throws SpaceBusy.
  virtual std::unique_ptr<WriterLock> LockWriter(std::chrono::milliseconds timeout) = 0;

  virtual EngineUsage Usage() = 0;

  // The ids of other processes that have a snapshot open now, as far as the engine knows of them.
  virtual std::vector<std::int64_t> ReadersElsewhere() { return {}; }
};

}  // namespace vemo
