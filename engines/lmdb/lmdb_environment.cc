#include "engines/lmdb/lmdb_environment.h"

#include <lmdb.h>

#include <sys/resource.h>
#include <unistd.h>

#include <algorithm>
#include <bit>
#include <cerrno>
#include <chrono>
#include <memory>

#include "engines/fork_count.h"
#include "engines/lmdb/empty_data.h"
#include "engines/lmdb/lmdb_error.h"
#include "engines/lmdb/lmdb_readers.h"
#include "engines/lmdb/space_writer.h"
#include "platform/error.h"

namespace vemo {
namespace {

constexpr std::size_t kMiB = std::size_t{1} << 20;
constexpr std::size_t kPreferredMapBytes = kMiB << 20;
constexpr std::size_t kSmallestMapBytes = 16 * kMiB;
constexpr unsigned kMaxReaders = 510;
constexpr mdb_mode_t kFileMode = 0666;
// Other processes may commit twice between two steps of a reader, but not again and again.
constexpr int kMostTries = 1000;
// For another process in the middle of a commit, until one looks again whether it has done what is to be done, and in all.
constexpr std::chrono::milliseconds kOneWait(100);
constexpr std::chrono::milliseconds kLongestWait(5000);

struct AbortTransaction {
  void operator()(MDB_txn* txn) const noexcept { mdb_txn_abort(txn); }
};
using Transaction = std::unique_ptr<MDB_txn, AbortTransaction>;

class CommitLock {
 public:
  explicit CommitLock(SealedSpace& sealed) : m_sealed(sealed) { m_sealed.LockCommits(); }
  // The caller has locked commits.
  CommitLock(SealedSpace& sealed, std::adopt_lock_t) noexcept : m_sealed(sealed) {}
  ~CommitLock() { m_sealed.UnlockCommits(); }
  CommitLock(const CommitLock&) = delete;
  CommitLock& operator=(const CommitLock&) = delete;

 private:
  SealedSpace& m_sealed;
};

Transaction Begin(MDB_env* env, unsigned flags, const char* operation, const std::string& space) {
  MDB_txn* txn = nullptr;
  CheckLmdb(mdb_txn_begin(env, nullptr, flags, &txn), operation, space);
  return Transaction(txn);
}

// The address space to ask for first: where the process has a limit, half of it is left to others, and the file is mapped twice.
std::size_t FirstMapBytes() {
  rlimit limit{};
  if (::getrlimit(RLIMIT_AS, &limit) != 0 || limit.rlim_cur == RLIM_INFINITY) return kPreferredMapBytes;
  const std::size_t quarter = std::bit_floor(static_cast<std::size_t>(limit.rlim_cur) / 4);
  return std::clamp(quarter, kSmallestMapBytes, kPreferredMapBytes);
}

std::size_t RoundUpToPages(std::uint64_t bytes) {
  const auto page = static_cast<std::uint64_t>(::sysconf(_SC_PAGESIZE));
  return static_cast<std::size_t>((bytes + page - 1) / page * page);
}

void CheckOpened(int code, const std::string& space) {
  if (code == MDB_INVALID || code == MDB_VERSION_MISMATCH) {
    throw IncompatibleSpace("cannot open " + space + ": its " + kDataFile + " is not a file of LMDB " +
                            std::to_string(MDB_VERSION_MAJOR) + "." + std::to_string(MDB_VERSION_MINOR) +
                            " (" + mdb_strerror(code) +
                            "); name another folder, or restore the space from a backup");
  }
  CheckLmdb(code, "open", space);
}

LogBase LogBaseOf(const KnownState& known) { return {known.numbers.generation, known.numbers.log}; }

[[noreturn]] void ThrowUnfinished(const std::string& space) {
  throw SpaceNotFound("cannot open " + space +
                      ": there is no space yet, its creation was interrupted; open it to create it");
}

}  // namespace

LmdbEnvironment::LmdbEnvironment(const LmdbOptions& options)
    : m_options(options),
      m_name("lmdb:" + options.path.string()),
      m_path(std::filesystem::absolute(options.path)),
      m_process(::getpid()),
      m_forks(ForkCount()) {
  if (options.create && options.readOnly) {
    throw UsageError("cannot open " + m_name + ": a space cannot be created read-only");
  }
  const FolderContents contents = ExamineFolder(m_path, m_name);
  if (contents == FolderContents::kNothingYet) {
    if (!options.create) {
      throw SpaceNotFound("cannot open " + m_name +
                          ": there is no space; check the path, or open it to create it");
    }
    MakeFolder(m_path, m_name);
  }
  m_claim.emplace(m_path, m_name);
  if (contents == FolderContents::kNothingYet) MakeEmptyData(m_path, m_name);
  if (contents == FolderContents::kData) {
    LogFile::WillNeed(m_path);
    ProbeData();
  }
  OpenFlexibly();
  if (!options.create) return;
  try {
    SyncFolder(m_path, m_name);
  } catch (...) {
    Close();
    throw;
  }
}

LmdbEnvironment::~LmdbEnvironment() {
  if (!IsOwnProcess()) return;
  if (m_env != nullptr && !m_options.syncEachCommit && !m_options.readOnly) {
    m_log->SyncAll();
    mdb_env_sync(m_env, 1);
  }
  Close();
}

bool LmdbEnvironment::IsOwnProcess() const noexcept {
  return ForkCount() == m_forks;
}

void LmdbEnvironment::RequireOwnProcess(const char* operation) const {
  if (IsOwnProcess()) return;
  throw StoreError(std::string("cannot ") + operation + " " + m_name + ": it was opened by process " +
                   std::to_string(m_process) + ", which forked this one; open it anew in this process");
}

void LmdbEnvironment::RequireWritable(const char* operation) const {
  if (!m_options.readOnly) return;
  throw StoreError(std::string("cannot ") + operation + " " + m_name +
                   ": it was opened read-only; open it for writing");
}

// What LMDB takes on trust when it opens a file.
void LmdbEnvironment::RequireSoundHeader(PageFile& file) const {
  const HeaderFault header = FaultOfHeader(file);
  if (header.fault.empty()) return;
  const bool wasSpace = SealFile(m_path / kSealFile, m_name, true).Read().Newest() > 0;
  if (header.isForeign && !wasSpace) {
    throw IncompatibleSpace("cannot open " + m_name + ": " + kDataFile + ": " + header.fault +
                            "; name another folder, or restore the space from a backup");
  }
  throw DamagedStorage("cannot open " + m_name + ": " + kDataFile + ": " + header.fault +
                           "; restore the space from a backup",
                       {m_name, "", OID(), "", std::nullopt});
}

// Opening a file with its lock makes lock.mdb before LMDB looks at the file, so what is not a space is found out here,
// without a lock. Without one the tables may be read only while nobody can be writing: before lock.mdb exists.
void LmdbEnvironment::ProbeData() const {
  const auto file = std::make_shared<PageFile>(m_path / kDataFile, m_name);
  RequireSoundHeader(*file);
  std::error_code error;
  if (std::filesystem::exists(m_path / kReadersFile, error) || error) return;
  const std::size_t pageBytes = PageBytesOf(*file);
  MetaPage newest = ReadMetaPage(*file, 0, pageBytes);
  const MetaPage other = ReadMetaPage(*file, 1, pageBytes);
  if (other.transaction > newest.transaction) newest = other;
  const auto state = ReadState(file, newest, m_name);
  if (!HoldsSpace(file, *state, m_name) && !m_options.create) ThrowUnfinished(m_name);
}

void LmdbEnvironment::Open(std::size_t mapBytes) {
  CheckLmdb(mdb_env_create(&m_env), "open", m_name);
  try {
    CheckLmdb(mdb_env_set_mapsize(m_env, mapBytes), "open", m_name);
    CheckLmdb(mdb_env_set_maxdbs(m_env, kTableCount), "open", m_name);
    CheckLmdb(mdb_env_set_maxreaders(m_env, kMaxReaders), "open", m_name);
    unsigned flags = MDB_NOTLS;
    if (m_options.readOnly) flags |= MDB_RDONLY;
    if (!m_options.syncEachCommit) flags |= MDB_NOSYNC;
    CheckOpened(mdb_env_open(m_env, m_path.c_str(), flags, kFileMode), m_name);
    m_sealed = std::make_unique<SealedSpace>(m_path, m_name, m_options.readOnly, mapBytes);
    m_synced.emplace(m_sealed->file());
    m_log = std::make_unique<CommitLog>(m_path, m_name, m_options.readOnly, m_options.syncEachCommit);
    m_changes = std::make_shared<ChangeIndex>();
    RequireSoundHeader(*m_sealed->file());
    int deadReaders = 0;
    CheckLmdb(mdb_reader_check(m_env, &deadReaders), "open", m_name);
    OpenOrCreateTables();
    RecoverLog();
    MDB_envinfo info{};
    CheckLmdb(mdb_env_info(m_env, &info), "open", m_name);
    m_mapBytes = info.me_mapsize;
  } catch (...) {
    Close();
    throw;
  }
}

void LmdbEnvironment::OpenFlexibly() {
  if (m_options.mapBytes != 0) {
    Open(RoundUpToPages(m_options.mapBytes));
    return;
  }
  for (std::size_t bytes = FirstMapBytes();; bytes /= 2) {
    try {
      Open(bytes);
      return;
    } catch (const LmdbError& error) {
      if (error.lmdbCode() != ENOMEM || bytes / 2 < kSmallestMapBytes) throw;
    }
  }
}

void LmdbEnvironment::Close() noexcept {
  if (m_env == nullptr) return;
  mdb_env_close(m_env);
  m_env = nullptr;
  m_log.reset();
  m_synced.reset();
  m_sealed.reset();
}

void LmdbEnvironment::OpenOrCreateTables() {
  constexpr const char* kOperation = "open";
  const auto open = [this](Transaction txn) {
    m_tables = OpenTables(txn.get(), m_name);
    CheckLmdb(mdb_txn_commit(txn.release()), kOperation, m_name);  // keeps the handles
  };
  KnownStatePtr known;
  MDB_txn* begun = nullptr;
  CheckLmdb(TryBeginKnown(true, begun, known), kOperation, m_name);
  Transaction txn(begun);
  if (!known->state->tables.empty()) {
    open(std::move(txn));
    return;
  }
  txn.reset();
  if (!m_options.create) ThrowUnfinished(m_name);
  const CommitLock lock(*m_sealed);
  txn = Begin(m_env, 0, "make", m_name);
  const std::uint64_t transaction = mdb_txn_id(txn.get());
  known = m_sealed->RequireWritable(transaction - 1);
  if (!known->state->tables.empty()) {  // somebody has made it meanwhile
    open(std::move(txn));
    return;
  }
  const LmdbTables tables = CreateTables(txn.get(), m_name);
  CheckLmdb(mdb_txn_commit(txn.release()), "make", m_name);
  m_sealed->Committed(transaction);
  m_tables = tables;
}

LmdbEnvironment::Reading LmdbEnvironment::BeginSnapshot() {
  constexpr const char* kOperation = "open a snapshot of";
  RequireOwnProcess(kOperation);
  {
    const std::lock_guard lock(m_state);
    Reading reading;
    if (TryBeginRead(false, reading) == MDB_SUCCESS) {
      ++m_openSnapshots;
      return reading;
    }
  }
  const std::scoped_lock lock(m_writing, m_state);
  Reading reading = BeginReadOrRecover(kOperation);
  ++m_openSnapshots;
  return reading;
}

void LmdbEnvironment::EndSnapshot(const Reading& reading) noexcept {
  if (!IsOwnProcess()) return;
  const std::lock_guard lock(m_state);
  mdb_txn_abort(reading.txn);
  --m_openSnapshots;
}

void LmdbEnvironment::Write(const char* operation, const std::function<void(SpaceWriter&)>& change) {
  RequireOwnProcess(operation);
  RequireWritable(operation);
  const std::lock_guard writing(m_writing);
  for (;;) {
    try {
      if (m_env == nullptr) throw LmdbError(operation, m_name, MDB_PANIC);
      const CommitLock lock(*m_sealed);
      Transaction txn;
      KnownStatePtr known;
      const auto begin = [&] {
        txn = Begin(m_env, 0, operation, m_name);
        known = m_sealed->RequireWritable(mdb_txn_id(txn.get()) - 1);
        return txn.get();
      };
      known = m_sealed->Known(NewestTransaction());
      if (known == nullptr) begin();
      const LogBase base = LogBaseOf(*known);
      const CommitState state{known, m_log->Recover(base, m_sealed->seal())};
      // Where a meta page of a commit that failed has stayed, another one must be written over it.
      const bool isNewest = NewestTransaction() == known->state->transaction();
      CommitLog* const log = isNewest ? m_log.get() : nullptr;
      SpaceWriter writer([&] { return txn != nullptr ? txn.get() : begin(); }, m_tables, state, log, m_name);
      change(writer);
      if (writer.logged()) {
        RequireOnDisk(operation);
        m_log->Append(operation, base, writer.logged()->commit, std::move(writer.logged()->payload), m_sealed->seal());
      } else if (txn != nullptr) {
        CommitTables(txn.release(), base, operation);
      }
      return;
    } catch (const LmdbError& error) {
      const std::lock_guard state(m_state);
      Recover(error.lmdbCode(), operation);
    }
  }
}

void LmdbEnvironment::CommitTables(MDB_txn* begun, const LogBase& before, const char* operation) {
  Transaction txn(begun);
  const std::uint64_t transaction = mdb_txn_id(begun);
  if (before.identity != 0 && m_options.syncEachCommit && !m_synced->IsOnDisk()) m_log->SyncName();
  CheckLmdb(mdb_txn_commit(txn.release()), operation, m_name);
  if (m_options.syncEachCommit) m_synced->Remember();
  m_sealed->Committed(transaction);
  if (const KnownStatePtr known = m_sealed->Known(transaction)) m_log->Begin(before, LogBaseOf(*known), m_sealed->seal());
}

// What a commit in the log goes behind.
void LmdbEnvironment::RequireOnDisk(const char* operation) {
  if (!m_options.syncEachCommit) return;
  m_synced->Require([&] {
    CheckLmdb(mdb_env_sync(m_env, 1), operation, m_name);
    m_log->SyncName();
  });
}

// Of this or another process, as the meta pages tell.
std::uint64_t LmdbEnvironment::NewestTransaction() const {
  MDB_envinfo info{};
  mdb_env_info(m_env, &info);
  return info.me_last_txnid;
}

// The newest for which LMDB lets transactions begin, which comes a moment later.
bool LmdbEnvironment::IsNewestToRead(std::uint64_t transaction) {
  MDB_txn* begun = nullptr;
  if (TryBeginTransaction(&begun) != MDB_SUCCESS) return false;
  return mdb_txn_id(Transaction(begun).get()) == transaction;
}

// Takes over what processes have left that ended in the middle of a commit. False where another one stays in the middle of
// it, or has ended in one of LMDB, which the next commit takes over.
bool LmdbEnvironment::RecoverLog() {
  KnownStatePtr known;
  const auto ask = [&] { return m_sealed->Ask(NewestTransaction(), false, known) == SealedSpace::Answer::kKnown; };
  const auto start = std::chrono::steady_clock::now();
  while (std::chrono::steady_clock::now() - start < kLongestWait) {
    if (!ask()) return false;
    if (!m_log->NeedsRecovery(LogBaseOf(*known), m_sealed->seal())) return true;
    if (!m_sealed->TryLockCommits(kOneWait)) continue;
    const CommitLock lock(*m_sealed, std::adopt_lock);
    if (!ask()) return false;
    m_log->Recover(LogBaseOf(*known), m_sealed->seal());
    return true;
  }
  return false;
}

std::uint64_t LmdbEnvironment::LogBytes() {
  const std::lock_guard lock(m_state);
  return m_log != nullptr ? m_log->DiskBytes() : 0;
}

std::uint64_t LmdbEnvironment::CountRecords() {
  const Reading reading = BeginSnapshot();
  const std::uint64_t records = reading.state.data->records;
  EndSnapshot(reading);
  return records;
}

std::vector<std::int64_t> LmdbEnvironment::ReadersElsewhere() {
  RequireOwnProcess("list readers");
  const std::lock_guard lock(m_state);
  if (m_env == nullptr) return {};
  std::vector<std::int64_t> processes = ProcessesReading(m_env);
  std::erase(processes, m_process);
  return processes;
}

int LmdbEnvironment::TryBeginTransaction(MDB_txn** txn) {
  if (m_env == nullptr) return MDB_PANIC;
  const int code = mdb_txn_begin(m_env, nullptr, MDB_RDONLY, txn);
  if (code != MDB_READERS_FULL) return code;
  int deadReaders = 0;
  mdb_reader_check(m_env, &deadReaders);
  return deadReaders == 0 ? code : mdb_txn_begin(m_env, nullptr, MDB_RDONLY, txn);
}

// EAGAIN: with `mayWait` it might succeed.
int LmdbEnvironment::TryBeginKnown(bool mayWait, MDB_txn*& txn, KnownStatePtr& known) {
  for (int tries = 1;; ++tries) {
    MDB_txn* begun = nullptr;
    const int code = TryBeginTransaction(&begun);
    if (code != MDB_SUCCESS) return code;
    Transaction owned(begun);
    const std::uint64_t transaction = mdb_txn_id(begun);
    const SealedSpace::Answer answer = m_sealed->Ask(transaction, mayWait, known);
    if (answer == SealedSpace::Answer::kUnsealed) return EAGAIN;
    if (answer == SealedSpace::Answer::kKnown) {
      txn = owned.release();
      return MDB_SUCCESS;
    }
    if (tries == kMostTries) m_sealed->ThrowLostCommit(transaction);
  }
}

int LmdbEnvironment::TryBeginRead(bool mayWait, Reading& reading) {
  for (int tries = 1;; ++tries) {
    MDB_txn* begun = nullptr;
    const int code = TryBeginKnown(mayWait, begun, reading.state.data);
    if (code != MDB_SUCCESS) return code;
    Transaction txn(begun);
    const std::uint64_t transaction = mdb_txn_id(begun);
    const CommitLog::Answer answer = m_log->Follow(
        LogBaseOf(*reading.state.data), m_sealed->seal(), [&] { return IsNewestToRead(transaction); }, reading.state.log);
    if (answer == CommitLog::Answer::kKnown) {
      reading.txn = txn.release();
      return MDB_SUCCESS;
    }
    if (answer == CommitLog::Answer::kInDoubt) {
      if (!mayWait) return EAGAIN;
      if (!RecoverLog()) {
        throw SpaceBusy("cannot read " + m_name + ": whether its last commit was made is not known, and another process " +
                        "stays in the middle of a commit; try again");
      }
    }
    if (tries == kMostTries) m_sealed->ThrowLostCommit(transaction);
  }
}

LmdbEnvironment::Reading LmdbEnvironment::BeginReadOrRecover(const char* operation) {
  for (;;) {
    Reading reading;
    const int code = TryBeginRead(true, reading);
    if (code == MDB_SUCCESS) return reading;
    Recover(code, operation);
  }
}

// Returns when the operation that met `code` is worth repeating.
void LmdbEnvironment::Recover(int code, const char* operation) {
  switch (code) {
    case MDB_MAP_FULL:
      Grow(operation);
      return;
    case MDB_MAP_RESIZED:
      AdoptGrowth(operation);
      return;
    case MDB_PANIC:
      RequireNoSnapshots(code, operation);
      Close();
      if (ExamineFolder(m_path, m_name) != FolderContents::kData) {
        throw SpaceNotFound(std::string("cannot ") + operation + " " + m_name + ": it was removed");
      }
      OpenFlexibly();
      return;
    default:
      throw LmdbError(operation, m_name, code);
  }
}

void LmdbEnvironment::Grow(const char* operation) {
  int deadReaders = 0;
  if (mdb_reader_check(m_env, &deadReaders) == MDB_SUCCESS && deadReaders > 0)
    return;  // their pages are free now
  RequireNoSnapshots(MDB_MAP_FULL, operation);
  const std::size_t old = m_mapBytes;
  m_sealed->file()->Remap(2 * old);  // what is committed must be readable
  const int code = mdb_env_set_mapsize(m_env, 2 * old);
  if (code != MDB_SUCCESS) {
    Close();  // its map is gone
    Open(old);
    throw LmdbError(operation, m_name, code);
  }
  m_mapBytes = 2 * old;
}

void LmdbEnvironment::AdoptGrowth(const char* operation) {
  RequireNoSnapshots(MDB_MAP_RESIZED, operation);
  const auto remap = [this, operation] {
    MDB_envinfo info{};
    CheckLmdb(mdb_env_set_mapsize(m_env, 0), operation, m_name);
    CheckLmdb(mdb_env_info(m_env, &info), operation, m_name);
    m_sealed->file()->Remap(info.me_mapsize);
    m_mapBytes = info.me_mapsize;
  };
  try {
    remap();
  } catch (const LmdbError&) {
    Close();  // its map is gone, and the other process may map more than this one: take what there is
    OpenFlexibly();
  }
}

void LmdbEnvironment::RequireNoSnapshots(int code, const char* operation) const {
  if (m_openSnapshots == 0) return;
  throw StoreError(
      std::string("cannot ") + operation + " " + m_name + ": " + mdb_strerror(code) + ", and " +
      std::to_string(m_openSnapshots) + " open snapshots of this process keep the " +
      std::to_string(m_mapBytes) +
      " bytes of address space from being mapped anew: close them and try again, or open the space with "
      "a larger map");
}

}  // namespace vemo
