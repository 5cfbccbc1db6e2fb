#include "engines/lmdb/lmdb_snapshot.h"

#include <lmdb.h>

#include <utility>

#include "engines/batch_check.h"
#include "engines/lmdb/big_endian.h"
#include "engines/lmdb/lmdb_error.h"

namespace vemo {
namespace {

constexpr const char* kOperation = "read";

MDB_val ToVal(std::string_view text) {
  return {text.size(), const_cast<char*>(text.data())};
}
std::string_view ToText(const MDB_val& val) {
  return {static_cast<const char*>(val.mv_data), val.mv_size};
}
ByteView ToView(const MDB_val& val) {
  return {static_cast<const std::uint8_t*>(val.mv_data), val.mv_size};
}

std::string_view KeyText(const BigEndian64& key) {
  return {reinterpret_cast<const char*>(key.data()), key.size()};
}

struct CloseCursor {
  void operator()(MDB_cursor* cursor) const noexcept { mdb_cursor_close(cursor); }
};

OID ToOid(std::string_view key, const std::string& space) {
  if (key.size() != sizeof(BigEndian64)) {
    throw IncompatibleSpace("cannot read " + space + ": a key of " + std::to_string(key.size()) +
                            " bytes stands where object ids have 8; restore the space from a backup");
  }
  return OID(FromBigEndian(key.data()));
}

}  // namespace

unsigned TableOf(NamedTable table, const LmdbTables& tables) {
  switch (table) {
    case NamedTable::kInfo:
      return tables.info;
    case NamedTable::kRoots:
      return tables.roots;
    case NamedTable::kMeta:
      break;
  }
  return tables.meta;
}

LmdbSnapshot::LmdbSnapshot(std::shared_ptr<LmdbEnvironment> environment)
    : m_environment(std::move(environment)), m_txn(m_environment->BeginSnapshot()) {
  try {
    m_generation = ReadGeneration(m_txn, m_environment->tables(), m_environment->name());
  } catch (...) {
    m_environment->EndSnapshot(m_txn);
    throw;
  }
}

LmdbSnapshot::~LmdbSnapshot() {
  m_environment->EndSnapshot(m_txn);
}

std::optional<ByteView> LmdbSnapshot::Read(OID oid) const {
  return Get(m_environment->tables().records, KeyText(ToBigEndian(oid.m_value)));
}

void LmdbSnapshot::ScanRecords(OID first, const std::function<bool(OID, ByteView)>& visit) const {
  const BigEndian64 key = ToBigEndian(first.m_value);
  Scan(m_environment->tables().records, KeyText(key), [&](std::string_view found, ByteView value) {
    return visit(ToOid(found, m_environment->name()), value);
  });
}

std::optional<ByteView> LmdbSnapshot::ReadNamed(NamedTable table, std::string_view name) const {
  if (!IsPossibleName(name)) return std::nullopt;
  return Get(TableOf(table, m_environment->tables()), name);
}

void LmdbSnapshot::ScanNamed(NamedTable table, std::string_view prefix,
                             const std::function<bool(std::string_view, ByteView)>& visit) const {
  if (prefix.size() > kMaxNameBytes) return;
  Scan(TableOf(table, m_environment->tables()), prefix, [&](std::string_view name, ByteView value) {
    return name.substr(0, prefix.size()) == prefix && visit(name, value);
  });
}

std::vector<OID> LmdbSnapshot::QueuedDeletions(std::size_t limit) const {
  std::vector<OID> queued;
  if (limit == 0) return queued;
  Scan(m_environment->tables().deletions, {}, [&](std::string_view key, ByteView) {
    queued.push_back(ToOid(key, m_environment->name()));
    return queued.size() < limit;
  });
  return queued;
}

std::optional<ByteView> LmdbSnapshot::Get(unsigned table, std::string_view key) const {
  MDB_val k = ToVal(key);
  MDB_val value{};
  const int code = mdb_get(m_txn, table, &k, &value);
  if (code == MDB_NOTFOUND) return std::nullopt;
  CheckLmdb(code, kOperation, m_environment->name());
  return ToView(value);
}

// Visits the keys from `first` on; an empty one is before all.
void LmdbSnapshot::Scan(unsigned table, std::string_view first,
                        const std::function<bool(std::string_view, ByteView)>& visit) const {
  MDB_cursor* opened = nullptr;
  CheckLmdb(mdb_cursor_open(m_txn, table, &opened), kOperation, m_environment->name());
  const std::unique_ptr<MDB_cursor, CloseCursor> cursor(opened);
  MDB_val key = ToVal(first);
  MDB_val value{};
  int code = mdb_cursor_get(cursor.get(), &key, &value, first.empty() ? MDB_FIRST : MDB_SET_RANGE);
  while (code == MDB_SUCCESS && visit(ToText(key), ToView(value))) {
    code = mdb_cursor_get(cursor.get(), &key, &value, MDB_NEXT);
  }
  if (code != MDB_NOTFOUND) CheckLmdb(code, kOperation, m_environment->name());
}

}  // namespace vemo
