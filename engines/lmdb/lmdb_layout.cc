#include "engines/lmdb/lmdb_layout.h"

#include <lmdb.h>

#define XXH_INLINE_ALL
#include <xxhash.h>

#include <cstring>

#include "engines/lmdb/big_endian.h"
#include "engines/lmdb/lmdb_error.h"
#include "engines/lmdb/tree_cursor.h"

namespace vemo {
namespace {

constexpr std::string_view kMagic = "vemo space";
constexpr std::string_view kLayoutKey = "layout";
constexpr std::size_t kUnsealedLayoutBytes = kMagic.size() + sizeof(BigEndian64);  // of layout 1

struct TableName {
  unsigned LmdbTables::*handle;
  const char* name;
};
constexpr std::array<TableName, kTableCount> kTables{{{&LmdbTables::records, kRecordsTable.data()},
                                                      {&LmdbTables::changes, kChangesTable.data()},
                                                      {&LmdbTables::info, "info"},
                                                      {&LmdbTables::roots, "roots"},
                                                      {&LmdbTables::meta, "meta"},
                                                      {&LmdbTables::deletions, kDeletionsTable.data()},
                                                      {&LmdbTables::system, kSystemTable.data()}}};

std::string_view TextOf(ByteView bytes) {
  return {reinterpret_cast<const char*>(bytes.data()), bytes.size()};
}

std::uint64_t Checksum(std::string_view key, std::string_view bytes) {
  return XXH3_64bits_withSeed(bytes.data(), bytes.size(), ValueTag(TableSeed(kSystemTable), key));
}

std::string Seal(std::string_view key, std::string_view bytes) {
  const std::uint64_t checksum = Checksum(key, bytes);
  std::string sealed(bytes);
  sealed.append(reinterpret_cast<const char*>(&checksum), sizeof checksum);
  return sealed;
}

bool IsSealed(std::string_view key, std::string_view value) {
  if (value.size() < sizeof(std::uint64_t)) return false;
  const std::string_view bytes = value.substr(0, value.size() - sizeof(std::uint64_t));
  return LoadAs<std::uint64_t>(value.data() + bytes.size()) == Checksum(key, bytes);
}

void Put(MDB_txn* txn, unsigned table, std::string_view key, std::string_view value, const std::string& space) {
  MDB_val k{key.size(), const_cast<char*>(key.data())};
  MDB_val v{value.size(), const_cast<char*>(value.data())};
  CheckLmdb(mdb_put(txn, table, &k, &v, 0), "write to", space);
}

std::uint64_t ReadNumber(PageReader& reader, const SpaceState& state, std::string_view key) {
  const PageTable* system = state.Table(kSystemTable);
  const auto fail = [&](const char* what) {
    const std::string fault = "its " + std::string(key) + " is " + what;
    reader.Fail(system->root.root, *system, fault.c_str(), {});
  };
  TreeCursor cursor(reader, *system);
  if (!cursor.Find(key)) fail("missing");
  const std::string_view value = TextOf(cursor.StoredValue());
  if (value.size() != sizeof(StoredNumber) || !IsSealed(key, value)) fail("damaged");
  return FromBigEndian(value.data());
}

[[noreturn]] void ThrowForeign(const std::string& space) {
  throw IncompatibleSpace("cannot open " + space + ": it is an LMDB environment of another program, not a space");
}

void CheckLayout(PageReader& reader, const PageTable& system, const std::string& space) {
  TreeCursor cursor(reader, system);
  if (!cursor.Find(kLayoutKey)) ThrowForeign(space);
  const std::string_view value = TextOf(cursor.StoredValue());
  const bool isSealed = IsSealed(kLayoutKey, value);
  if (!isSealed && value.size() != kUnsealedLayoutBytes) {
    if (value.size() != kUnsealedLayoutBytes + sizeof(std::uint64_t)) ThrowForeign(space);
    cursor.Fail("its layout number is damaged");
  }
  if (value.size() < kUnsealedLayoutBytes || !value.starts_with(kMagic)) ThrowForeign(space);
  const std::uint64_t layout = FromBigEndian(value.data() + kMagic.size());
  if (layout == kLayoutNumber && isSealed) return;
  if (layout == kLayoutNumber) cursor.Fail("its layout number is damaged");
  throw IncompatibleSpace("cannot open " + space + ": its layout is number " + std::to_string(layout) +
                          ", and this version of vemo knows " + std::to_string(kLayoutNumber) +
                          " only; open it with a version that knows the other");
}

}  // namespace

bool HoldsSpace(const std::shared_ptr<PageFile>& file, const SpaceState& state, const std::string& space) {
  if (state.main.root.flags != 0) ThrowForeign(space);
  if (state.tables.empty() && !state.hasOtherEntries) return false;
  const PageTable* system = state.Table(kSystemTable);
  if (system == nullptr || system->root.flags != 0) ThrowForeign(space);
  PageReader reader = MakeReader(file, state, space);
  CheckLayout(reader, *system, space);
  for (const TableName& name : kTables) {
    const PageTable* table = state.Table(name.name);
    if (table == nullptr || table->root.flags != 0) {
      reader.Fail(state.main.root.root, state.main,
                  ("the table \"" + std::string(name.name) + "\" is missing or damaged").c_str(), {});
    }
  }
  return true;
}

LmdbTables OpenTables(MDB_txn* txn, const std::string& space) {
  LmdbTables tables;
  for (const TableName& table : kTables) {
    CheckLmdb(mdb_dbi_open(txn, table.name, 0, &(tables.*table.handle)), "open", space);
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
  Put(txn, tables.system, kLayoutKey, Seal(kLayoutKey, layout), space);
  const auto putNumber = [&](std::string_view key, std::uint64_t value) {
    const StoredNumber stored = StoreNumber(key, value);
    Put(txn, tables.system, key, TextOf(stored), space);
  };
  putNumber(kGenerationKey, 0);
  putNumber(kNextIdKey, 1);
  putNumber(kFirstChangesKey, 0);
  putNumber(kLastChangesKey, 0);
  putNumber(kLogKey, 0);
  return tables;
}

std::uint64_t CommitStamp(std::uint64_t tag, std::uint64_t commit) noexcept {
  return XXH3_64bits_withSeed(&commit, sizeof commit, tag);
}

StoredNumber StoreNumber(std::string_view key, std::uint64_t number) {
  const BigEndian64 bytes = ToBigEndian(number);
  const std::string sealed = Seal(key, TextOf(bytes));
  StoredNumber stored;
  std::memcpy(stored.data(), sealed.data(), stored.size());
  return stored;
}

SpaceNumbers ReadNumbers(PageReader& reader, const SpaceState& state) {
  return {ReadNumber(reader, state, kGenerationKey),
          {ReadNumber(reader, state, kFirstChangesKey), ReadNumber(reader, state, kLastChangesKey)},
          ReadNumber(reader, state, kLogKey)};
}

std::uint64_t ReadNextId(PageReader& reader, const SpaceState& state) { return ReadNumber(reader, state, kNextIdKey); }

}  // namespace vemo
