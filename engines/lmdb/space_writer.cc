#include "engines/lmdb/space_writer.h"

#include <lmdb.h>

#include <cstring>
#include <utility>

#include "engines/lmdb/big_endian.h"
#include "engines/lmdb/lmdb_error.h"

namespace vemo {
namespace {

constexpr const char* kOperation = "write to";

MDB_val ToVal(std::string_view text) { return {text.size(), const_cast<char*>(text.data())}; }

}  // namespace

const char* TableNameOf(NamedTable table) noexcept {
  switch (table) {
    case NamedTable::kInfo:
      return "info";
    case NamedTable::kRoots:
      return "roots";
    case NamedTable::kMeta:
      break;
  }
  return "meta";
}

SpaceWriter::IdKey::IdKey(OID oid) noexcept {
  const BigEndian64 key = ToBigEndian(oid.m_value);
  std::memcpy(bytes, key.data(), sizeof bytes);
}

SpaceWriter::SpaceWriter(std::function<MDB_txn*()> begin, const LmdbTables& tables, const CommitState& state, CommitLog* log,
                         const std::string& space)
    : m_begin(std::move(begin)),
      m_state(state),
      m_log(log),
      m_space(space),
      m_reader(MakeReader(state.data->file, *state.data->state, space)),
      m_records(MakeTable(tables.records, kRecordsTable)),
      m_changes(MakeTable(tables.changes, kChangesTable)),
      m_info(MakeTable(tables.info, TableNameOf(NamedTable::kInfo))),
      m_roots(MakeTable(tables.roots, TableNameOf(NamedTable::kRoots))),
      m_meta(MakeTable(tables.meta, TableNameOf(NamedTable::kMeta))),
      m_deletions(MakeTable(tables.deletions, kDeletionsTable)),
      m_system(MakeTable(tables.system, kSystemTable)) {}

SpaceWriter::Table SpaceWriter::MakeTable(unsigned handle, std::string_view name) {
  const PageTable& table = *m_state.data->state->Table(name);  // a space has all of them: HoldsSpace
  return {handle, table, TreeCursor(m_reader, table)};
}

SpaceWriter::Table& SpaceWriter::Named(NamedTable table) noexcept {
  switch (table) {
    case NamedTable::kInfo:
      return m_info;
    case NamedTable::kRoots:
      return m_roots;
    case NamedTable::kMeta:
      break;
  }
  return m_meta;
}

// Whether the key is there. Its overflow run is freed with it, and so must be its own.
bool SpaceWriter::Check(Table& table, std::string_view key) {
  if (!table.cursor.Find(key)) return false;
  if (table.pages.isTagged) {
    table.cursor.Value();
  } else {
    table.cursor.StoredValue();
  }
  return true;
}

std::optional<StoredRecord> SpaceWriter::Stored(OID oid) {
  if (!m_records.cursor.Find(IdKey(oid).text())) return std::nullopt;
  return ReadStoredRecord(m_records.cursor);
}

ByteView SpaceWriter::CurrentRecord(OID oid, const ChangeIndex& index, Bytes& changed) {
  m_records.cursor.Find(IdKey(oid).text());
  return ReadRecord(oid, m_records.cursor, index, m_reader, m_state, changed);
}

bool SpaceWriter::Log(std::uint64_t commit, Bytes payload) {
  if (!m_log->HasRoom(payload.size())) return false;
  m_logged = {commit, std::move(payload)};
  return true;
}

void SpaceWriter::MakeLog() {
  if (const std::optional<std::uint64_t> identity = m_log->Make()) PutNumber(kLogKey, *identity);
}

void SpaceWriter::FailChanges(const char* fault) const {
  m_reader.Fail(m_changes.pages.root.root, m_changes.pages, fault, {});
}

void SpaceWriter::PutRecord(OID oid, std::uint64_t commit, ByteView record) {
  const IdKey key(oid);
  std::uint8_t* room = ReserveTagged(m_records, key.text(), kCommitBytes + record.size());
  std::uint64_t tag;
  std::memcpy(&tag, room - kTagBytes, kTagBytes);
  const std::uint64_t stamp = CommitStamp(tag, commit);
  std::memcpy(room, &commit, sizeof commit);
  std::memcpy(room + sizeof commit, &stamp, sizeof stamp);
  if (!record.empty()) std::memcpy(room + kCommitBytes, record.data(), record.size());
}

// Room for a value, to be filled at once.
std::uint8_t* SpaceWriter::Reserve(Table& table, std::string_view key, std::size_t bytes) {
  Check(table, key);
  MDB_val k = ToVal(key);
  MDB_val room{bytes, nullptr};
  CheckLmdb(mdb_put(Transaction(), table.handle, &k, &room, MDB_RESERVE), kOperation, m_space);
  return static_cast<std::uint8_t*>(room.mv_data);
}

// The same behind a tag.
std::uint8_t* SpaceWriter::ReserveTagged(Table& table, std::string_view key, std::size_t bytes) {
  std::uint8_t* room = Reserve(table, key, kTagBytes + bytes);
  const std::uint64_t tag = ValueTag(table.pages.seed, key);
  std::memcpy(room, &tag, kTagBytes);
  return room + kTagBytes;
}

void SpaceWriter::Put(Table& table, std::string_view key, ByteView value) {
  std::uint8_t* room = ReserveTagged(table, key, value.size());
  if (!value.empty()) std::memcpy(room, value.data(), value.size());
}

void SpaceWriter::PutNumber(std::string_view key, std::uint64_t number) {
  const StoredNumber stored = StoreNumber(key, number);
  std::memcpy(Reserve(m_system, key, stored.size()), stored.data(), stored.size());
}

void SpaceWriter::Remove(Table& table, std::string_view key) {
  if (Check(table, key)) table.cursor.CheckNeighbours();
  MDB_val k = ToVal(key);
  const int code = mdb_del(Transaction(), table.handle, &k, nullptr);
  if (code != MDB_NOTFOUND) CheckLmdb(code, kOperation, m_space);
}

}  // namespace vemo
