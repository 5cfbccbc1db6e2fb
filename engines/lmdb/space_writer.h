// Changes a space: by appending to the log, or within a write transaction of LMDB, which begins with the first change of a table.
//
// LMDB believes its pages. So before each change the pages are checked that LMDB will read for it, in the state that the
// transaction began with: the way to the key, the overflow run that is replaced, the neighbours of a leaf that loses an
// entry. Each page is checked once in a transaction.
#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "engines/lmdb/change_log.h"
#include "engines/lmdb/commit_log.h"
#include "engines/lmdb/lmdb_layout.h"
#include "engines/lmdb/sealed_space.h"
#include "engines/lmdb/tree_cursor.h"
#include "store/engine.h"

struct MDB_txn;

namespace vemo {

const char* TableNameOf(NamedTable table) noexcept;

// A commit that needs no table.
struct CommitForLog {
  std::uint64_t commit = 0;
  Bytes payload;
};

class SpaceWriter {
 public:
  // Changes `state`, the newest. `begin` begins the transaction, with that state in its tables, and is called at most once.
  // `log` is null where nothing may go to it.
  SpaceWriter(std::function<MDB_txn*()> begin, const LmdbTables& tables, const CommitState& state, CommitLog* log,
              const std::string& space);

  // What the writer began with.
  const CommitState& state() const noexcept { return m_state; }
  PageReader& reader() noexcept { return m_reader; }
  std::uint64_t NextId() { return ReadNextId(m_reader, *m_state.data->state); }

  // The record as it was stored, and with its changes as it is, in the state that the writer began with. The view stays
  // until the writer ends, or `changed` does. Throws DamagedStorage.
  std::optional<StoredRecord> Stored(OID oid);
  ByteView CurrentRecord(OID oid, const ChangeIndex& index, Bytes& changed);

  // The commit with that payload, instead of any change of a table; false where the log has no room for it.
  bool Log(std::uint64_t commit, Bytes payload);
  // What Log was given.
  std::optional<CommitForLog>& logged() noexcept { return m_logged; }
  // Whether there may be a log to write to, and whether there is.
  bool MayLog() const noexcept { return m_log != nullptr; }
  bool HasLog() { return MayLog() && m_log->IsUsable({m_state.data->numbers.generation, m_state.data->numbers.log}); }
  // Makes a log, which commits after this one can use. Where that is not possible they do without.
  void MakeLog();
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

  MDB_txn* Transaction() { return m_txn != nullptr ? m_txn : m_txn = m_begin(); }
  Table MakeTable(unsigned handle, std::string_view name);
  Table& Named(NamedTable table) noexcept;
  bool Check(Table& table, std::string_view key);
  std::uint8_t* Reserve(Table& table, std::string_view key, std::size_t bytes);
  std::uint8_t* ReserveTagged(Table& table, std::string_view key, std::size_t bytes);
  void Put(Table& table, std::string_view key, ByteView value);
  void Remove(Table& table, std::string_view key);
  void PutNumber(std::string_view key, std::uint64_t number);

  const std::function<MDB_txn*()> m_begin;
  MDB_txn* m_txn = nullptr;
  const CommitState& m_state;
  CommitLog* const m_log;
  std::optional<CommitForLog> m_logged;
  const std::string& m_space;
  PageReader m_reader;
  Table m_records, m_changes, m_info, m_roots, m_meta, m_deletions, m_system;
};

}  // namespace vemo
