#include "engines/lmdb/commit_log.h"

#include <algorithm>
#include <random>
#include <utility>

#include "engines/lmdb/lmdb_error.h"
#include "engines/lmdb/space_folder.h"

namespace vemo {

namespace {

bool IsOf(const std::optional<LogSeal>& sealed, const LogBase& base) {
  return sealed && sealed->base == base.commit;
}

}  // namespace

CommitLog::CommitLog(const std::filesystem::path& folder, const std::string& space, bool readOnly, bool sync)
    : m_space(space), m_file(folder, space, readOnly, sync) {}

LogTail& CommitLog::TailBehind(std::uint64_t commit) {
  if (m_tail == nullptr || m_tail->base() != commit) {
    m_tail = std::make_shared<LogTail>(commit);
    m_isSearched = false;
  }
  return *m_tail;
}

void CommitLog::Begin(const LogBase& before, const LogBase& base, SealFile& seal) noexcept {
  if (before.commit == base.commit) return;
  const std::lock_guard lock(m_mutex);
  try {
    TailBehind(base.commit);
    m_isSearched = true;  // no entry goes behind a commit that has just been made
    if (base.identity != 0) seal.Write(LogSeal{base.commit, base.commit, 0});
  } catch (const std::exception&) {
    // Whoever comes next looks for entries and finds none.
  }
}

// What the header there says.
std::optional<LogPlace> CommitLog::PlaceAt(std::uint64_t offset, const LogBase& base) const {
  return PlaceOfLogHeader(m_file.Read(offset, offset + kLogHeaderBytes), base.identity);
}

// Those that were scanned from the end of the tail on.
void CommitLog::TakeIn(std::vector<ScannedCommit> commits) {
  const std::uint64_t from = m_tail->End();
  for (ScannedCommit& scanned : commits) {
    m_tail->MakeRoomFor(scanned.commit);
    m_tail->Add(std::move(scanned.commit), from + scanned.end);
  }
}

CommitLog::Answer CommitLog::Follow(const LogBase& base, const SealFile& seal,
                                    const std::function<bool()>& isNewest, LogPosition& position) {
  const std::lock_guard lock(m_mutex);
  if (m_isInDoubt) return Answer::kInDoubt;
  if (m_tail != nullptr && m_tail->base() > base.commit) return Answer::kOvertaken;
  const std::optional<LogSeal> sealed = base.identity != 0 ? seal.Read().log : std::nullopt;
  if (sealed && sealed->base > base.commit) return Answer::kOvertaken;
  TailBehind(base.commit);
  if (IsOf(sealed, base) && sealed->last > m_tail->Last()) {
    m_file.Open();
    const Bytes log = m_file.Read(m_tail->End(), sealed->end);
    std::vector<ScannedCommit> commits = ScanLog(log, Next(), base.identity, sealed->last, ScanUntil::kLastSealed);
    const auto isDamaged = [](const ScannedCommit& scanned) { return !scanned.commit; };
    if (std::any_of(commits.begin(), commits.end(), isDamaged) && !isNewest()) return Answer::kOvertaken;
    TakeIn(std::move(commits));
  }
  position = Position();
  return Answer::kKnown;
}

void CommitLog::ThrowDamaged(const std::string& fault, const LogBase& base) const {
  throw DamagedStorage(m_space + ": " + fault + "; restore the space from a backup, whole, or remove " +
                           kSealFile + " and put an empty file in place of " + kLogFile +
                           " to go on with commit " + std::to_string(base.commit),
                       {m_space, "", OID(), "", std::nullopt});
}

// Throws where the file cannot be the one that goes behind `base`.
void CommitLog::RequireRightFile(const LogBase& base, const std::optional<LogSeal>& sealed) const {
  const std::string data = std::string(kDataFile) + " is of commit " + std::to_string(base.commit);
  if (sealed && (sealed->base > base.commit || (sealed->base < base.commit && sealed->last >= base.commit))) {
    ThrowDamaged(data + ", and " + kSealFile + " knows commits up to " + std::to_string(sealed->last) + " behind commit " +
                     std::to_string(sealed->base),
                 base);
  }
  const bool isSealedAsEmpty = IsOf(sealed, base) && sealed->last == base.commit;
  if (!m_file.IsOpen() && !isSealedAsEmpty) {
    ThrowDamaged(std::string(kLogFile) + " is missing, which may have the newest commits", base);
  }
  const Bytes log = m_file.Read(0, kLogBytes);
  const std::optional<LogPlace> first = PlaceOfLogHeader(log, base.identity);
  // A first entry that is not whole was never acknowledged, and data.mdb may have got another commit of its number.
  const bool isNewer = first && first->base > base.commit;
  const bool isOther = first && first->base < base.commit && first->commit >= base.commit;
  if (isNewer || (isOther && ReadLogEntry(log, base.identity))) {
    ThrowDamaged(data + ", and " + kLogFile + " goes on behind commit " + std::to_string(first->base), base);
  }
}

bool CommitLog::NeedsRecovery(const LogBase& base, const SealFile& seal) {
  const std::lock_guard lock(m_mutex);
  if (base.identity == 0) return false;
  const std::optional<LogSeal> sealed = seal.Read().log;
  if (m_isInDoubt || !IsOf(sealed, base)) return true;
  m_file.Open();
  if (!m_file.IsOpen()) return true;
  const Bytes rest = m_file.Read(sealed->end, kLogBytes);
  return FindLogEntry(rest, {sealed->last + 1, base.commit}, base.identity).has_value();
}

LogPosition CommitLog::Recover(const LogBase& base, SealFile& seal) {
  const std::lock_guard lock(m_mutex);
  TailBehind(base.commit);
  if (base.identity == 0) return Position();
  m_file.Open();
  const std::optional<LogSeal> sealed = seal.Read().log;
  const std::uint64_t lastSealed = IsOf(sealed, base) ? sealed->last : base.commit;
  const bool isFollowed =
      m_isSearched && !m_isInDoubt && m_tail->Last() >= lastSealed && PlaceAt(m_tail->End(), base) != Next();
  if (!isFollowed) Search(base, sealed, lastSealed, seal);
  return Position();
}

// Takes in all that is behind the tail. At the first look at a base, and where a commit is in doubt, what there is and is not
// gets to the disk for certain: a process that ended may have taken an entry back, and not have got as far.
void CommitLog::Search(const LogBase& base, const std::optional<LogSeal>& sealed, std::uint64_t lastSealed, SealFile& seal) {
  RequireRightFile(base, sealed);
  const Bytes log = m_file.Read(m_tail->End(), kLogBytes);
  std::vector<ScannedCommit> commits = ScanLog(log, Next(), base.identity, lastSealed, ScanUntil::kLastWhole);
  const std::size_t end = commits.empty() ? 0 : commits.back().end;
  const bool isNews = m_tail->Last() + commits.size() > lastSealed;
  const bool isCertain = m_isSearched && !m_isInDoubt && !isNews;
  if (!isCertain && m_file.IsOpen() && !m_file.readOnly()) WriteAgain(ByteView(log).first(end));
  TakeIn(std::move(commits));
  m_isSearched = true;
  m_isInDoubt = false;
  if (isNews) seal.Write(LogSeal{base.commit, m_tail->Last(), m_tail->End()});
}

// The entries behind the tail, and that there is none behind them. After a flush that failed the system may take for written
// what is not, and the next flush would tell nothing of it.
void CommitLog::WriteAgain(ByteView entries) {
  Bytes bytes(entries.begin(), entries.end());
  if (m_tail->End() + bytes.size() + kLogHeaderBytes <= kLogBytes) bytes.resize(bytes.size() + kLogHeaderBytes);
  int failure = m_file.Write(bytes, m_tail->End());
  if (failure == 0) failure = m_file.Flush();
  if (failure != 0) throw LmdbError(std::string("write ") + kLogFile + " of", m_space, failure);
}

bool CommitLog::IsUsable(const LogBase& base) {
  const std::lock_guard lock(m_mutex);
  return base.identity != 0 && !m_hasFailed && m_file.IsWhole();
}

bool CommitLog::HasRoom(std::size_t payloadBytes) {
  const std::lock_guard lock(m_mutex);
  return m_tail->End() + LogEntryBytes(payloadBytes) <= kLogBytes;
}

std::optional<std::uint64_t> CommitLog::Make() {
  const std::lock_guard lock(m_mutex);
  if (m_hasFailed || m_tail->Last() != m_tail->base()) return std::nullopt;
  std::random_device random;
  std::uint64_t identity = 0;
  while (identity == 0) identity = std::uint64_t{random()} << 32 | random();
  m_hasFailed = !m_file.Make();
  return m_hasFailed ? std::nullopt : std::optional(identity);
}

// Snapshots are opened meanwhile: what is read here without the lock is not changed while commits are locked.
void CommitLog::Append(const char* operation, const LogBase& base, std::uint64_t commit, Bytes payload,
                       SealFile& seal) {
  const Bytes entry = EncodeLogEntry({commit, base.commit}, payload, base.identity);
  std::optional<LoggedCommit> logged = ParseLoggedCommit(std::move(payload));
  m_tail->MakeRoomFor(logged);  // nothing may fail once the disk has it
  const std::uint64_t at = m_tail->End();
  if (const int failure = m_file.Write(entry, at); failure != 0) TakeBack(at, operation, failure);
  if (const int failure = m_file.Flush(); failure != 0) TakeBack(at, operation, failure);
  m_tail->Add(std::move(logged), at + entry.size());
  const std::lock_guard lock(m_mutex);
  // Others hear of it by the seal: without one, what comes next goes to data.mdb.
  if (!seal.Write(LogSeal{base.commit, commit, m_tail->End()})) m_hasFailed = true;
}

// Commits go to data.mdb from then on: what the system has of the file after a failed flush need not be what
// the disk has.
void CommitLog::TakeBack(std::uint64_t offset, const char* operation, int failure) {
  const std::lock_guard lock(m_mutex);
  m_hasFailed = true;
  m_isInDoubt = true;
  const std::uint8_t noHeader[kLogHeaderBytes]{};
  if (m_file.Write(noHeader, offset) != 0 || m_file.Flush() != 0) {
    throw UnknownOutcome(LmdbError(operation, m_space, failure).what());
  }
  m_isInDoubt = false;
  throw LmdbError(operation, m_space, failure);
}

void CommitLog::SyncName() {
  const std::lock_guard lock(m_mutex);
  m_file.SyncName();
}

void CommitLog::SyncAll() noexcept {
  const std::lock_guard lock(m_mutex);
  try {
    m_file.SyncAll();
  } catch (const std::exception&) {
    // Whoever closes a space that does not sync has been promised no more.
  }
}

std::uint64_t CommitLog::DiskBytes() {
  const std::lock_guard lock(m_mutex);
  return m_file.DiskBytes();
}

}  // namespace vemo
