#include "engines/lmdb/lmdb_environment.h"

#include <lmdb.h>

#include <sys/resource.h>
#include <unistd.h>

#include <algorithm>
#include <bit>
#include <cerrno>
#include <memory>
#include <set>
#include <sstream>

#include "engines/lmdb/lmdb_error.h"
#include "platform/error.h"

namespace vemo {
namespace {

constexpr std::size_t kMiB = std::size_t{1} << 20;
constexpr std::size_t kPreferredMapBytes = kMiB << 20;
constexpr std::size_t kSmallestMapBytes = 16 * kMiB;
constexpr unsigned kMaxReaders = 510;
constexpr mdb_mode_t kFileMode = 0666;

struct AbortTransaction {
  void operator()(MDB_txn* txn) const noexcept { mdb_txn_abort(txn); }
};
using Transaction = std::unique_ptr<MDB_txn, AbortTransaction>;

struct CloseEnvironment {
  void operator()(MDB_env* env) const noexcept { mdb_env_close(env); }
};

Transaction Begin(MDB_env* env, unsigned flags, const char* operation, const std::string& space) {
  MDB_txn* txn = nullptr;
  CheckLmdb(mdb_txn_begin(env, nullptr, flags, &txn), operation, space);
  return Transaction(txn);
}

// The address space to ask for first: where the process has a limit, half of it is left to others.
std::size_t FirstMapBytes() {
  rlimit limit{};
  if (::getrlimit(RLIMIT_AS, &limit) != 0 || limit.rlim_cur == RLIM_INFINITY) return kPreferredMapBytes;
  const std::size_t half = std::bit_floor(static_cast<std::size_t>(limit.rlim_cur) / 2);
  return std::clamp(half, kSmallestMapBytes, kPreferredMapBytes);
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

[[noreturn]] void ThrowUnfinished(const std::string& space) {
  throw SpaceNotFound("cannot open " + space +
                      ": there is no space yet, its creation was interrupted; open it to create it");
}

}  // namespace

LmdbEnvironment::LmdbEnvironment(const LmdbOptions& options)
    : m_options(options),
      m_name("lmdb:" + options.path.string()),
      m_path(std::filesystem::absolute(options.path)),
      m_process(::getpid()) {
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
  if (contents == FolderContents::kData) ProbeData();
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
  if (m_env != nullptr && !m_options.syncEachCommit && !m_options.readOnly) mdb_env_sync(m_env, 1);
  Close();
}

bool LmdbEnvironment::IsOwnProcess() const noexcept {
  return ::getpid() == m_process;
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

// Opening a file with its lock makes lock.mdb before LMDB looks at the file, so what is not a space is found
// out here, without a lock. Without one the tables may be read only while nobody can be writing: before
// lock.mdb exists.
void LmdbEnvironment::ProbeData() const {
  MDB_env* created = nullptr;
  CheckLmdb(mdb_env_create(&created), "open", m_name);
  const std::unique_ptr<MDB_env, CloseEnvironment> env(created);
  CheckLmdb(mdb_env_set_mapsize(env.get(), kMiB), "open",
            m_name);  // LMDB maps all that is there nevertheless
  CheckLmdb(mdb_env_set_maxdbs(env.get(), kTableCount), "open", m_name);
  CheckOpened(mdb_env_open(env.get(), m_path.c_str(), MDB_RDONLY | MDB_NOLOCK | MDB_NOTLS, kFileMode),
              m_name);
  std::error_code error;
  if (std::filesystem::exists(m_path / kReadersFile, error) || error) return;
  const Transaction txn = Begin(env.get(), MDB_RDONLY, "open", m_name);
  if (!OpenTables(txn.get(), m_name) && !m_options.create) ThrowUnfinished(m_name);
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
    int deadReaders = 0;
    CheckLmdb(mdb_reader_check(m_env, &deadReaders), "open", m_name);
    OpenOrCreateTables();
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
}

void LmdbEnvironment::OpenOrCreateTables() {
  Transaction reading = Begin(m_env, MDB_RDONLY, "open", m_name);
  if (const auto tables = OpenTables(reading.get(), m_name)) {
    CheckLmdb(mdb_txn_commit(reading.release()), "open", m_name);  // keeps the handles
    m_tables = *tables;
    return;
  }
  reading.reset();
  if (!m_options.create) ThrowUnfinished(m_name);
  Transaction writing = Begin(m_env, 0, "make", m_name);
  const auto madeMeanwhile = OpenTables(writing.get(), m_name);
  const LmdbTables tables = madeMeanwhile ? *madeMeanwhile : CreateTables(writing.get(), m_name);
  CheckLmdb(mdb_txn_commit(writing.release()), "make", m_name);
  m_tables = tables;
}

MDB_txn* LmdbEnvironment::BeginSnapshot() {
  constexpr const char* kOperation = "open a snapshot of";
  RequireOwnProcess(kOperation);
  {
    const std::lock_guard lock(m_state);
    MDB_txn* txn = nullptr;
    if (TryBeginRead(&txn) == MDB_SUCCESS) {
      ++m_openSnapshots;
      return txn;
    }
  }
  const std::scoped_lock lock(m_writing, m_state);
  MDB_txn* txn = BeginReadOrRecover(kOperation);
  ++m_openSnapshots;
  return txn;
}

void LmdbEnvironment::EndSnapshot(MDB_txn* txn) noexcept {
  if (!IsOwnProcess()) return;
  const std::lock_guard lock(m_state);
  mdb_txn_abort(txn);
  --m_openSnapshots;
}

void LmdbEnvironment::Write(const char* operation, const std::function<void(MDB_txn*)>& change) {
  RequireOwnProcess(operation);
  RequireWritable(operation);
  const std::lock_guard writing(m_writing);
  for (;;) {
    try {
      if (m_env == nullptr) throw LmdbError(operation, m_name, MDB_PANIC);
      Transaction txn = Begin(m_env, 0, operation, m_name);
      change(txn.get());
      CheckLmdb(mdb_txn_commit(txn.release()), operation, m_name);
      return;
    } catch (const LmdbError& error) {
      const std::lock_guard state(m_state);
      Recover(error.lmdbCode(), operation);
    }
  }
}

std::uint64_t LmdbEnvironment::CountRecords() {
  constexpr const char* kOperation = "measure";
  RequireOwnProcess(kOperation);
  const std::scoped_lock lock(m_writing, m_state);
  const Transaction txn(BeginReadOrRecover(kOperation));
  MDB_stat stat{};
  CheckLmdb(mdb_stat(txn.get(), m_tables.records, &stat), kOperation, m_name);
  return stat.ms_entries;
}

// LMDB prints its reader table as text: process id, thread, and the transaction or a dash.
std::vector<std::int64_t> LmdbEnvironment::ReadersElsewhere() {
  RequireOwnProcess("list readers");
  std::string table;
  {
    const std::scoped_lock lock(m_state);
    if (m_env == nullptr) return {};
    const auto append = [](const char* line, void* text) {
      *static_cast<std::string*>(text) += line;
      return 0;
    };
    mdb_reader_list(m_env, append, &table);
  }
  std::set<std::int64_t> processes;
  std::istringstream lines(table);
  for (std::string line; std::getline(lines, line);) {
    std::istringstream words(line);
    std::int64_t process = 0;
    std::string thread, transaction;
    if (words >> process >> thread >> transaction && transaction != "-" && process != m_process)
      processes.insert(process);
  }
  return {processes.begin(), processes.end()};
}

int LmdbEnvironment::TryBeginRead(MDB_txn** txn) {
  if (m_env == nullptr) return MDB_PANIC;
  const int code = mdb_txn_begin(m_env, nullptr, MDB_RDONLY, txn);
  if (code != MDB_READERS_FULL) return code;
  int deadReaders = 0;
  mdb_reader_check(m_env, &deadReaders);
  return deadReaders == 0 ? code : mdb_txn_begin(m_env, nullptr, MDB_RDONLY, txn);
}

MDB_txn* LmdbEnvironment::BeginReadOrRecover(const char* operation) {
  for (;;) {
    MDB_txn* txn = nullptr;
    const int code = TryBeginRead(&txn);
    if (code == MDB_SUCCESS) return txn;
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
  if (mdb_env_set_mapsize(m_env, 0) != MDB_SUCCESS) {
    Close();  // its map is gone, and the other process may map more than this one: take what there is
    OpenFlexibly();
    return;
  }
  MDB_envinfo info{};
  CheckLmdb(mdb_env_info(m_env, &info), operation, m_name);
  m_mapBytes = info.me_mapsize;
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
