#include "engines/lmdb/lmdb_layout.h"

#include <lmdb.h>

#include <array>
#include <cstring>
#include <string_view>

#include "engines/lmdb/big_endian.h"
#include "engines/lmdb/lmdb_error.h"

namespace vemo {
namespace {

constexpr std::string_view kMagic = "vemo space";
constexpr std::string_view kLayoutKey = "layout";
constexpr std::string_view kGenerationKey = "generation";
constexpr std::string_view kNextIdKey = "next id";
constexpr const char* kSystemTable = "system";

struct TableName {
  unsigned LmdbTables::*handle;
  const char* name;
};
constexpr std::array<TableName, kTableCount> kTables{{{&LmdbTables::records, "records"},
                                                      {&LmdbTables::info, "info"},
                                                      {&LmdbTables::roots, "roots"},
                                                      {&LmdbTables::meta, "meta"},
                                                      {&LmdbTables::deletions, "deletions"},
                                                      {&LmdbTables::system, kSystemTable}}};

MDB_val ToVal(std::string_view text) {
  return {text.size(), const_cast<char*>(text.data())};
}

void Put(MDB_txn* txn, const LmdbTables& tables, std::string_view key, std::string_view value,
         const std::string& space) {
  MDB_val k = ToVal(key);
  MDB_val v = ToVal(value);
  CheckLmdb(mdb_put(txn, tables.system, &k, &v, 0), "write to", space);
}

void PutNumber(MDB_txn* txn, const LmdbTables& tables, std::string_view key, std::uint64_t number,
               const std::string& space) {
  const BigEndian64 bytes = ToBigEndian(number);
  Put(txn, tables, key, {reinterpret_cast<const char*>(bytes.data()), bytes.size()}, space);
}

std::uint64_t ReadNumber(MDB_txn* txn, const LmdbTables& tables, std::string_view key,
                         const std::string& space) {
  MDB_val k = ToVal(key);
  MDB_val v{};
  const int code = mdb_get(txn, tables.system, &k, &v);
  if (code != MDB_NOTFOUND) CheckLmdb(code, "read", space);
  if (code == MDB_NOTFOUND || v.mv_size != sizeof(BigEndian64)) {
    throw IncompatibleSpace("cannot read " + space + ": its " + std::string(key) +
                            " is missing or damaged; restore the space from a backup");
  }
  return FromBigEndian(v.mv_data);
}

[[noreturn]] void ThrowForeign(const std::string& space) {
  throw IncompatibleSpace("cannot open " + space +
                          ": it is an LMDB environment of another program, not a space");
}

void CheckLayout(MDB_txn* txn, unsigned system, const std::string& space) {
  MDB_val key = ToVal(kLayoutKey);
  MDB_val value{};
  const int code = mdb_get(txn, system, &key, &value);
  if (code == MDB_NOTFOUND) ThrowForeign(space);
  CheckLmdb(code, "open", space);
  if (value.mv_size != kMagic.size() + sizeof(BigEndian64) ||
      std::memcmp(value.mv_data, kMagic.data(), kMagic.size()) != 0) {
    ThrowForeign(space);
  }
  const std::uint64_t layout = FromBigEndian(static_cast<const char*>(value.mv_data) + kMagic.size());
  if (layout == kLayoutNumber) return;
  throw IncompatibleSpace("cannot open " + space + ": its layout is number " + std::to_string(layout) +
                          ", and this version of vemo knows " + std::to_string(kLayoutNumber) +
                          " only; open it with the version that wrote it or a newer one");
}

}  // namespace

std::optional<LmdbTables> OpenTables(MDB_txn* txn, const std::string& space) {
  MDB_dbi main = 0;
  CheckLmdb(mdb_dbi_open(txn, nullptr, 0, &main), "open", space);
  MDB_stat stat{};
  CheckLmdb(mdb_stat(txn, main, &stat), "open", space);
  if (stat.ms_entries == 0) return std::nullopt;

  LmdbTables tables;
  int code = mdb_dbi_open(txn, kSystemTable, 0, &tables.system);
  if (code == MDB_NOTFOUND || code == MDB_INCOMPATIBLE) ThrowForeign(space);
  CheckLmdb(code, "open", space);
  CheckLayout(txn, tables.system, space);
  for (const TableName& table : kTables) {
    code = mdb_dbi_open(txn, table.name, 0, &(tables.*table.handle));
    if (code == MDB_NOTFOUND || code == MDB_INCOMPATIBLE) {
      throw IncompatibleSpace("cannot open " + space + ": its table \"" + table.name +
                              "\" is missing or damaged; restore the space from a backup");
    }
    CheckLmdb(code, "open", space);
  }
  return tables;
}

LmdbTables CreateTables(MDB_txn* txn, const std::string& space) {
  LmdbTables tables;
  for (const TableName& table : kTables) {
    CheckLmdb(mdb_dbi_open(txn, table.name, MDB_CREATE, &(tables.*table.handle)), "make", space);
  }
  const BigEndian64 number = ToBigEndian(kLayoutNumber);
  std::string layout(kMagic);
  layout.append(number.begin(), number.end());
  Put(txn, tables, kLayoutKey, layout, space);
  WriteGeneration(txn, tables, 0, space);
  WriteNextId(txn, tables, 1, space);
  return tables;
}

std::uint64_t ReadGeneration(MDB_txn* txn, const LmdbTables& tables, const std::string& space) {
  return ReadNumber(txn, tables, kGenerationKey, space);
}

std::uint64_t ReadNextId(MDB_txn* txn, const LmdbTables& tables, const std::string& space) {
  return ReadNumber(txn, tables, kNextIdKey, space);
}

void WriteGeneration(MDB_txn* txn, const LmdbTables& tables, std::uint64_t generation,
                     const std::string& space) {
  PutNumber(txn, tables, kGenerationKey, generation, space);
}

void WriteNextId(MDB_txn* txn, const LmdbTables& tables, std::uint64_t nextId, const std::string& space) {
  PutNumber(txn, tables, kNextIdKey, nextId, space);
}

}  // namespace vemo
