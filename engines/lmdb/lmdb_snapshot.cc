#include "engines/lmdb/lmdb_snapshot.h"

#include <map>
#include <utility>

#include "engines/batch_check.h"
#include "engines/lmdb/big_endian.h"
#include "engines/lmdb/space_writer.h"
#include "engines/lmdb/storage_check.h"

namespace vemo {
namespace {

constexpr const char* kOperation = "read";

std::string_view KeyText(const BigEndian64& key) {
  return {reinterpret_cast<const char*>(key.data()), key.size()};
}

OID ToOid(const TreeCursor& cursor) {
  if (cursor.Key().size() != sizeof(BigEndian64)) cursor.Fail("a key stands there that is no id");
  return OID(FromBigEndian(cursor.Key().data()));
}

}  // namespace

LmdbSnapshot::LmdbSnapshot(std::shared_ptr<LmdbEnvironment> environment)
    : m_environment(std::move(environment)),
      m_reading(*m_environment),
      m_reader(MakeReader(State().data->file, *State().data->state, m_environment->name())),
      m_records(m_reader, Table(kRecordsTable)),
      m_changes(m_environment->changes(), m_reader, State()) {}

std::optional<ByteView> LmdbSnapshot::Read(OID oid) const {
  m_environment->RequireOwnProcess(kOperation);
  if (!m_records.Find(KeyText(ToBigEndian(oid.m_value)))) return std::nullopt;
  return RecordAt(oid, m_records, m_changed);
}

ByteView LmdbSnapshot::RecordAt(OID oid, const TreeCursor& cursor, Bytes& changed) const {
  return ReadRecord(oid, cursor, m_changes.Index(), m_reader, State(), changed);
}

void LmdbSnapshot::ScanRecords(OID first, const std::function<bool(OID, ByteView)>& visit) const {
  const BigEndian64 key = ToBigEndian(first.m_value);
  Bytes changed;
  Scan(kRecordsTable, KeyText(key), [&](TreeCursor& cursor) {
    const OID oid = ToOid(cursor);
    return visit(oid, RecordAt(oid, cursor, changed));
  });
}

std::optional<ByteView> LmdbSnapshot::ReadNamed(NamedTable table, std::string_view name) const {
  m_environment->RequireOwnProcess(kOperation);
  if (!IsPossibleName(name)) return std::nullopt;
  if (table == NamedTable::kMeta) {
    RequireMetaOfLog();
    if (const auto logged = State().log.tail->FindMeta(name, Generation())) return *logged;
  }
  TreeCursor cursor(m_reader, Table(TableNameOf(table)));
  if (!cursor.Find(name)) return std::nullopt;
  return cursor.Value();
}

void LmdbSnapshot::ScanNamed(NamedTable table, std::string_view prefix,
                             const std::function<bool(std::string_view, ByteView)>& visit) const {
  if (prefix.size() > kMaxNameBytes) return;
  std::map<std::string_view, std::optional<ByteView>> logged;
  if (table == NamedTable::kMeta) {
    RequireMetaOfLog();
    logged = State().log.tail->Meta(Generation());
  }
  auto next = logged.lower_bound(prefix);
  // Visits what the log has before `name`.
  const auto visitLogged = [&](const std::string_view* name) {
    for (; next != logged.end() && next->first.starts_with(prefix) && (name == nullptr || next->first < *name); ++next) {
      if (next->second && !visit(next->first, *next->second)) return false;
    }
    return true;
  };
  bool isEnough = false;
  Scan(TableNameOf(table), prefix, [&](TreeCursor& cursor) {
    // The value first: what is no name of the table must not end the scan.
    const ByteView value = cursor.Value();
    const std::string_view name = cursor.Key();
    if (!name.starts_with(prefix)) return false;
    isEnough = !visitLogged(&name) || (!logged.contains(name) && !visit(name, value));
    return !isEnough;
  });
  if (!isEnough) visitLogged(nullptr);
}

// A commit of the log that is damaged may have had any of the user's names.
void LmdbSnapshot::RequireMetaOfLog() const {
  if (!State().log.tail->HasDamage(Generation())) return;
  m_reader.Fail(Table(TableNameOf(NamedTable::kMeta)).root.root, Table(TableNameOf(NamedTable::kMeta)),
                "a commit in commits.log is damaged that may have changed values of it", {});
}

std::vector<OID> LmdbSnapshot::QueuedDeletions(std::size_t limit) const {
  std::vector<OID> queued;
  if (limit == 0) return queued;
  Scan(kDeletionsTable, {}, [&](TreeCursor& cursor) {
    cursor.Value();
    queued.push_back(ToOid(cursor));
    return queued.size() < limit;
  });
  return queued;
}

std::vector<StorageFinding> LmdbSnapshot::CheckStorage() const {
  m_environment->RequireOwnProcess("check");
  std::vector<StorageFinding> findings =
      CheckPages(State().data->file, *State().data->state, m_environment->name()).findings;
  for (const std::uint64_t commit : m_changes.Index().Damaged()) {
    if (commit > Generation()) break;
    findings.push_back({"the changes of commit " + std::to_string(commit) + " are damaged", std::nullopt});
  }
  if (findings.empty() && !State().data->doubt.empty()) findings.push_back({State().data->doubt, std::nullopt});
  return findings;
}

// Visits the entries from the key `first` on.
void LmdbSnapshot::Scan(std::string_view table, std::string_view first,
                        const std::function<bool(TreeCursor&)>& visit) const {
  m_environment->RequireOwnProcess(kOperation);
  TreeCursor cursor(m_reader, Table(table));
  for (bool found = cursor.Seek(first); found && visit(cursor); found = cursor.Next()) {
  }
}

}  // namespace vemo
