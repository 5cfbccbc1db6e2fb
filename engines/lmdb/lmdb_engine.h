// The embedded engine: a space is a folder with an LMDB environment in it.
#pragma once

#include <cstdint>
#include <filesystem>
#include <memory>

#include "store/engine.h"

namespace vemo {

// Commits write what changed of records; later ones write it into the records, so that hardly more is pending than this, or than a
// fifth of what the records take.
struct SettlingBounds {
  std::uint64_t bytes = std::uint64_t{32} << 20;
  std::uint64_t commits = 4'096;
  std::uint64_t records = 200'000;
};

struct LmdbOptions {
  // The folder of the space, which holds data.mdb, data.seal, commits.log, lock.mdb and writer.lock. It must be on a local
  // file system.
  std::filesystem::path path;

  // Make the space when `path` is absent (its parent must exist) or an empty folder. A creation that was
  // interrupted is finished. Other files are never adopted.
  bool create = false;

  // The most that the space can grow to while a snapshot is open, as address space: no memory or disk is
  // taken by it. 0: 1 TiB, or as much below it as the process may map. Otherwise exactly this many bytes
  // (rounded up to pages).
  std::uint64_t mapBytes = 0;

  // When false, commits are left to the system to write: they survive the end of the process, but a power
  // loss may DAMAGE THE WHOLE SPACE, not only lose its last commits. For spaces that can be made again.
  // Closing syncs.
  bool syncEachCommit = true;

  // How much may be pending. Opening the space reads it.
  SettlingBounds pendingChanges;

  // Refuse commits, reservations and the writer lock, and need no write permission on data.mdb (only on
  // lock.mdb).
  bool readOnly = false;
};

// Opens the space at `options.path`. Throws SpaceNotFound (nothing was created), IncompatibleSpace (what is
// there was not touched), SpaceBusy (it is open in this process already: LMDB cannot open it twice),
// UsageError, StoreError.
//
// - A commit that only changes records and values of NamedTable::kMeta costs one flush of the disk as long as it fits the log
//   (commit_log.h), every other one two; opening one snapshot costs a microsecond or two and blocks nobody.
// - A snapshot that stays open keeps the pages it sees from being used again: the file grows with every
// commit.
// - The address space is enlarged when it is full and no snapshot of this process is open; otherwise the
// commit fails
//   with a StoreError and can be repeated after the snapshots were closed.
// - The engine belongs to the process that opened it. In a forked child every call throws StoreError and
// destructors
//   leave the parent's space alone; the child opens the space anew. A child that is forked while the writer
//   lock is held shares it until the holder releases it or the child ends or calls exec.
// - Snapshots and writer locks may outlive the engine; the space is closed after the last of them.
std::unique_ptr<Engine> OpenLmdbEngine(const LmdbOptions& options);

}  // namespace vemo
