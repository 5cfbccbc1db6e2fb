// An open LMDB environment that holds a space: its transactions, and its address space as it grows.
//
// 1. m_writing serialises write transactions, m_state guards the count of snapshots and the beginning of read
//    transactions. Who takes both takes m_writing first.
// 2. The environment handle and the map change only under both locks and while no snapshot is open: LMDB must
//    not remap or close under a transaction of this process. m_env is null only after a failed attempt to open
//    it again.
// 3. After fork the child never calls LMDB with this environment: not to close it either, which would release
//    the parent's reader slots.
#pragma once

#include <sys/types.h>

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "engines/lmdb/change_index.h"
#include "engines/lmdb/change_log.h"
#include "engines/lmdb/commit_log.h"
#include "engines/lmdb/lmdb_engine.h"
#include "engines/lmdb/lmdb_layout.h"
#include "engines/lmdb/sealed_space.h"
#include "engines/lmdb/space_folder.h"
#include "engines/lmdb/synced_data.h"

struct MDB_env;

namespace vemo {

class SpaceWriter;

class LmdbEnvironment {
 public:
  explicit LmdbEnvironment(const LmdbOptions& options);
  ~LmdbEnvironment();
  LmdbEnvironment(const LmdbEnvironment&) = delete;
  LmdbEnvironment& operator=(const LmdbEnvironment&) = delete;

  const std::string& name() const noexcept { return m_name; }
  const std::filesystem::path& path() const noexcept { return m_path; }

  // Throws StoreError when the environment was opened by the process that forked this one.
  void RequireOwnProcess(const char* operation) const;
  // Throws StoreError when the space was opened read-only.
  void RequireWritable(const char* operation) const;

  // A read transaction, and what is known of the commit that it keeps.
  struct Reading {
    MDB_txn* txn = nullptr;
    CommitState state;
  };

  // The changes that the space keeps beside its records.
  const std::shared_ptr<ChangeIndex>& changes() const noexcept { return m_changes; }

  // Reads the newest commit; to be given back to EndSnapshot on any thread. Throws DamagedStorage where what all reading
  // starts from is damaged.
  Reading BeginSnapshot();
  void EndSnapshot(const Reading& reading) noexcept;

  // Runs `change` and commits what it has changed, in a transaction of LMDB or by the log; runs it again when the map had to
  // grow. When it or the commit throws, nothing was applied, but for UnknownOutcome. Throws DamagedStorage before anything is
  // written where that could lose data.
  void Write(const char* operation, const std::function<void(SpaceWriter&)>& change);

  // What the log takes on the disk.
  std::uint64_t LogBytes();

  // The number of records in the newest commit.
  std::uint64_t CountRecords();

  // The ids of other processes that have a read transaction open.
  std::vector<std::int64_t> ReadersElsewhere();

 private:
  // The two below need m_writing, and commits locked.
  void CommitTables(MDB_txn* begun, const LogBase& before, const char* operation);
  void RequireOnDisk(const char* operation);

  bool IsOwnProcess() const noexcept;
  void ProbeData() const;
  void RequireSoundHeader(PageFile& file) const;
  void Open(std::size_t mapBytes);
  void OpenFlexibly();
  void Close() noexcept;
  void OpenOrCreateTables();

  // The functions below need m_state; those that change the map need m_writing as well.
  int TryBeginTransaction(MDB_txn** txn);
  int TryBeginKnown(bool mayWait, MDB_txn*& txn, KnownStatePtr& known);
  int TryBeginRead(bool mayWait, Reading& reading);
  std::uint64_t NewestTransaction() const;
  bool IsNewestToRead(std::uint64_t transaction);
  bool RecoverLog();
  Reading BeginReadOrRecover(const char* operation);
  void Recover(int code, const char* operation);
  void Grow(const char* operation);
  void AdoptGrowth(const char* operation);
  void RequireNoSnapshots(int code, const char* operation) const;

  const LmdbOptions m_options;
  const std::string m_name;
  const std::filesystem::path m_path;
  const pid_t m_process;
  const std::uint64_t m_forks;  // tells m_process from its children
  std::optional<FolderClaim> m_claim;

  std::mutex m_writing;
  std::mutex m_state;
  MDB_env* m_env = nullptr;
  std::unique_ptr<SealedSpace> m_sealed;  // of the open environment
  std::unique_ptr<CommitLog> m_log;       // the same
  std::shared_ptr<ChangeIndex> m_changes = std::make_shared<ChangeIndex>();
  std::optional<SyncedData> m_synced;     // the same; guarded by m_writing
  LmdbTables m_tables;
  std::size_t m_mapBytes = 0;
  std::size_t m_openSnapshots = 0;
};

}  // namespace vemo
