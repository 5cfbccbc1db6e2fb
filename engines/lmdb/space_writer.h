// Changes a space within a write transaction of LMDB.
//
// LMDB believes its pages. So before each change the pages are checked that LMDB will read for it, in the state that the
// transaction began with: the way to the key, the overflow run that is replaced, the neighbours of a leaf that loses an
// entry. Each page is checked once in a transaction.
#pragma once

#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "engines/lmdb/change_log.h"
#include "engines/lmdb/lmdb_layout.h"
#include "engines/lmdb/sealed_space.h"
#include "engines/lmdb/tree_cursor.h"
#include "store/engine.h"

struct MDB_txn;

namespace vemo {

const char* TableNameOf(NamedTable table) noexcept;

class SpaceWriter {
 public:
  // `known` is the state that `txn` began with.
  SpaceWriter(MDB_txn* txn, const LmdbTables& tables, const KnownState& known, const std::string& space);

  // Of the state that the transaction began with. Throws DamagedStorage.
  SpaceNumbers Numbers() { return ReadNumbers(m_reader, *m_known.state); }

  ChangesRange Changes() { return ReadChangesRange(m_reader, *m_known.state); }
  PageReader& reader() noexcept { return m_reader; }
  const SpaceState& state() const noexcept { return *m_known.state; }

  // The record as it was stored, and with its changes as it is, in the state that the transaction began with. The view stays
  // until that transaction ends, or `changed` does. Throws DamagedStorage.
  std::optional<StoredRecord> Stored(OID oid);
  ByteView CurrentRecord(OID oid, std::uint64_t commit, const ChangeIndex& index, Bytes& changed);
  // Throws DamagedStorage about the table of changes.
  [[noreturn]] void FailChanges(const char* fault) const;

  // Each key is put or removed at most once in a transaction, but for a removal before a put: LMDB would leave an
  // overflow run longer than its value otherwise. Removing a key that is not there does nothing. They throw
  // DamagedStorage before LMDB does anything, StoreError when it fails.
  void PutRecord(OID oid, std::uint64_t commit, ByteView record);
  void RemoveRecord(OID oid) { Remove(m_records, IdKey(oid).text()); }
  void Queue(OID oid) { Put(m_deletions, IdKey(oid).text(), {}); }
  void Unqueue(OID oid) { Remove(m_deletions, IdKey(oid).text()); }
  void PutNamed(NamedTable table, std::string_view name, ByteView value) { Put(Named(table), name, value); }
  void RemoveNamed(NamedTable table, std::string_view name) { Remove(Named(table), name); }
  void PutGeneration(std::uint64_t generation) { PutNumber(kGenerationKey, generation); }
  void PutChanges(std::uint64_t commit, ByteView changes) { Put(m_changes, IdKey(OID(commit)).text(), changes); }
  void RemoveChanges(std::uint64_t commit) { Remove(m_changes, IdKey(OID(commit)).text()); }
  void PutFirstChanges(std::uint64_t commit) { PutNumber(kFirstChangesKey, commit); }
  void PutLastChanges(std::uint64_t commit) { PutNumber(kLastChangesKey, commit); }
  void PutNextId(std::uint64_t nextId) { PutNumber(kNextIdKey, nextId); }

 private:
  struct Table {
    unsigned handle;
    const PageTable& pages;
    TreeCursor cursor;
  };
  // An object id, or the number of a commit.
  struct IdKey {
    explicit IdKey(OID oid) noexcept;
    std::string_view text() const noexcept { return {reinterpret_cast<const char*>(bytes), sizeof bytes}; }
    std::uint8_t bytes[8];
  };

  Table MakeTable(unsigned handle, std::string_view name);
  Table& Named(NamedTable table) noexcept;
  bool Check(Table& table, std::string_view key);
  std::uint8_t* Reserve(Table& table, std::string_view key, std::size_t bytes);
  std::uint8_t* ReserveTagged(Table& table, std::string_view key, std::size_t bytes);
  void Put(Table& table, std::string_view key, ByteView value);
  void Remove(Table& table, std::string_view key);
  void PutNumber(std::string_view key, std::uint64_t number);

  MDB_txn* m_txn;
  const KnownState& m_known;
  const std::string& m_space;
  PageReader m_reader;
  Table m_records, m_changes, m_info, m_roots, m_meta, m_deletions, m_system;
};

}  // namespace vemo
