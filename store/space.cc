#include "store/space.h"

#include <algorithm>
#include <cstring>
#include <new>

#include "engines/lmdb/lmdb_engine.h"
#include "engines/memory/memory_engine.h"
#include "platform/assertion.h"
#include "platform/variable_length.h"
#include "store/commit_outcome.h"
#include "store/envelope.h"
#include "store/snapshot.h"
#include "store/transaction.h"
#include "store/uri.h"

namespace vemo {

namespace {

constexpr std::string_view kFormatName = "format";
constexpr std::uint32_t kSpaceFormat = 1;
constexpr std::uint64_t kMaxIdRange = 65'536;

std::string AgeText(const std::optional<std::chrono::milliseconds>& age) {
  return age ? std::to_string(age->count()) : "none";
}

std::unique_ptr<Engine> OpenEngine(const SpaceUri& uri, bool create) {
  if (uri.engine == SpaceUri::Engine::kMemory) return OpenMemoryEngine();
  LmdbOptions options;
  options.path = uri.path;
  options.create = create;
  options.mapBytes = uri.mapBytes;
  options.syncEachCommit = uri.syncEachCommit;
  if (uri.pendingBytes != 0) options.pendingChanges.bytes = uri.pendingBytes;
  return OpenLmdbEngine(options);
}

}  // namespace

std::unique_ptr<CSpace> CSpace::Open(std::string_view uri, const SpaceOptions& options) {
  RegisterMapClasses();
  const SpaceUri parsed = ParseSpaceUri(uri);
  const bool create = options.create || parsed.engine == SpaceUri::Engine::kMemory;
  std::unique_ptr<CSpace> space(new CSpace(SpaceUriText(parsed), OpenEngine(parsed, create), options));
  space->CheckFormat(create);
  return space;
}

std::unique_ptr<CSpace> CSpace::OpenOn(std::unique_ptr<Engine> engine, const SpaceOptions& options) {
  RegisterMapClasses();
  std::string name = engine->Name();
  std::unique_ptr<CSpace> space(new CSpace(std::move(name), std::move(engine), options));
  space->CheckFormat(options.create);
  return space;
}

CSpace::CSpace(std::string name, std::unique_ptr<Engine> engine, const SpaceOptions& options)
    : m_name(std::move(name)),
      m_engine(std::move(engine)),
      m_options(options),
      m_writerView(*this, m_engine->Name(), View::Kind::kWriter, m_counters, m_options.cacheSeed) {}

CSpace::~CSpace() {
  if (!m_writerView.Use().IsOfThisProcess()) return;  // what is open is the parent's
  VEMO_ASSERT_TEXT(m_snapshots.empty(), "no snapshot is open when its space is closed");
  const std::unique_lock idle(m_writerMutex, std::try_to_lock);
  VEMO_ASSERT_TEXT(idle.owns_lock(), "no transaction is open when its space is closed");
}

std::string CSpace::OptionsText() const {
  return m_name + " create=" + (m_options.create ? "yes" : "no") +
         " writer_timeout_ms=" + std::to_string(m_options.writerTimeout.count()) +
         " reader_warning_age_ms=" + AgeText(m_options.readerWarningAge) +
         " reader_max_age_ms=" + AgeText(m_options.readerMaxAge) +
         " cache_bytes=" + (m_options.cacheBytes ? std::to_string(*m_options.cacheBytes) : "none");
}

// A new space gets its format number in its first commit; an older program must not touch a newer space.
void CSpace::CheckFormat(bool create) {
  const auto state = m_engine->OpenSnapshot();
  const std::optional<ByteView> stored = state->ReadNamed(NamedTable::kInfo, kFormatName);
  if (stored) {
    std::uint32_t format = 0;
    try {
      BoundedReader reader(OpenNamed(NamedTable::kInfo, kFormatName, *stored));
      format = reader.ReadUint32();
    } catch (const MalformedBytes& malformed) {
      throw CorruptRecord(m_engine->Name() + ": its format number is damaged: " + malformed.what(),
                          m_writerView.Place(OID()));
    }
    if (format > kSpaceFormat) {
      throw IncompatibleSpace(m_engine->Name() + ": written in format " + std::to_string(format) +
                              " by a newer vemo; this one reads up to format " + std::to_string(kSpaceFormat));
    }
    return;
  }
  if (state->Generation() != 0) throw IncompatibleSpace(m_engine->Name() + ": it has commits but no format number");
  if (!create) throw SpaceNotFound(m_engine->Name() + ": the space was never finished being made; open it for writing");
  std::uint8_t number[MAX_VARIABLE_LENGTH_UINT_SIZE];
  const Bytes value(number, SerialiseVariableLengthUint32(number, kSpaceFormat));
  CommitBatch batch;
  batch.namedValues.push_back(
      {NamedTable::kInfo, std::string(kFormatName), SealNamed(NamedTable::kInfo, kFormatName, value)});
  const auto lock = m_engine->LockWriter(m_options.writerTimeout);
  if (m_engine->OpenSnapshot()->Generation() == 0) CommitAndSettle(*m_engine, batch);
}

void CSpace::Log(LogLevel level, const std::string& message) const {
  if (m_options.log) m_options.log(level, m_engine->Name() + ": " + message);
}

std::vector<ReaderInfo> CSpace::Readers() {
  std::vector<ReaderInfo> readers;
  {
    const auto now = m_options.clock();
    const std::lock_guard lock(m_snapshotsMutex);
    for (const Snapshot* snapshot : m_snapshots) readers.push_back(snapshot->Describe(now));
  }
  std::sort(readers.begin(), readers.end(), [](const auto& a, const auto& b) { return a.age > b.age; });
  for (const std::int64_t process : m_engine->ReadersElsewhere()) {
    readers.push_back({"process " + std::to_string(process), process, std::nullopt, std::nullopt});
  }
  return readers;
}

void CSpace::WarnOfOldReaders() noexcept try {
  if (!m_options.readerWarningAge || !m_options.log) return;
  for (const ReaderInfo& reader : Readers()) {
    if (!reader.age || *reader.age <= *m_options.readerWarningAge) continue;
    Log(LogLevel::kWarning, "snapshot \"" + reader.owner + "\" of commit " + std::to_string(*reader.generation) +
                                " has been open for " + std::to_string(reader.age->count()) +
                                " ms; the space cannot use the room of later changes again until it ends or is refreshed");
  }
} catch (...) {
  return;
}

// --- Bounded memory ---

std::size_t CSpace::Allowance() const noexcept {
  return m_options.cacheBytes ? *m_options.cacheBytes / m_numViews.load(std::memory_order_relaxed) : kUnbounded;
}

void CSpace::TrimWriter() noexcept {
  try {
    m_writerView.Trim(Allowance());
  } catch (const std::bad_alloc&) {
    // Nothing has left memory; the next transaction tries again.
  }
}

void CSpace::EnterSnapshot(Snapshot& snapshot) {
  {
    const std::lock_guard lock(m_snapshotsMutex);
    m_snapshots.insert(&snapshot);
    m_numViews.store(m_snapshots.size() + 1, std::memory_order_relaxed);
  }
  // The writer's share has become smaller. An open transaction sees to that itself when it ends.
  if (!m_options.cacheBytes || WriteTransaction::IsOpenOnThisThread(*this) || !m_writerMutex.try_lock()) return;
  TrimWriter();
  m_writerMutex.unlock();
}

void CSpace::LeaveSnapshot(Snapshot& snapshot) noexcept {
  const std::lock_guard lock(m_snapshotsMutex);
  m_snapshots.erase(&snapshot);
  m_numViews.store(m_snapshots.size() + 1, std::memory_order_relaxed);
}

OID CSpace::NextId() {
  if (m_nextId == m_idLimit) {
    m_nextId = m_engine->ReserveIds(m_nextIdRange).m_value;
    m_idLimit = m_nextId + m_nextIdRange;
    m_nextIdRange = std::min(m_nextIdRange * 2, kMaxIdRange);
  }
  return OID(m_nextId++);
}

void CSpace::RefuseMark(ptr<const IPersistable> object) {
  const ObjSysState& state = SysStateOf(object);
  const OID oid = PersistStateOf(object).m_oid;
  const std::string_view className = FindClass(object.Table())->Name();
  if (state.GetFlag(kSnapshotFlag)) {
    const std::string message = m_writerView.Describe(oid, className, "it belongs to a snapshot, which cannot be changed");
    const std::lock_guard lock(m_snapshotsMutex);
    // The one that holds it ends it, so it must not be looked at any more. The others may be in use by other threads.
    for (Snapshot* snapshot : m_snapshots) {
      if (snapshot->ForgetIfHolds(oid, object.m_self)) break;
    }
    throw UsageError(message);
  }
  const std::string message = m_writerView.Describe(
      oid, className,
      oid.IsNull() ? "the root was never committed or is gone; ask the transaction for it again"
                   : "it was changed outside a transaction of this thread; open a WriteTransaction first");
  // What the change has left half-done must be seen neither by the next transaction nor by one that is open.
  if (!WriteTransaction::IsOpenOnThisThread(*this)) {
    if (m_writerMutex.try_lock()) {
      m_writerView.ForgetResidents();
      m_writerMutex.unlock();
    } else {
      m_disturbed = true;
    }
  }
  throw UsageError(message);
}

}  // namespace vemo
