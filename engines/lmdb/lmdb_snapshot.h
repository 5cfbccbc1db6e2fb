// A read transaction of LMDB as a snapshot of a space.
#pragma once

#include <cstdint>
#include <memory>
#include <utility>

#include "engines/fork_count.h"
#include "engines/lmdb/change_log.h"
#include "engines/lmdb/lmdb_environment.h"
#include "engines/lmdb/tree_cursor.h"
#include "store/engine.h"

namespace vemo {

// A read of the environment that ends with this object, whatever else fails.
class OpenReading {
 public:
  explicit OpenReading(LmdbEnvironment& environment)
      : m_environment(environment), m_reading(environment.BeginSnapshot()) {}
  ~OpenReading() { m_environment.EndSnapshot(m_reading); }
  OpenReading(const OpenReading&) = delete;
  OpenReading& operator=(const OpenReading&) = delete;

  const CommitState& State() const noexcept { return m_reading.state; }

 private:
  LmdbEnvironment& m_environment;
  const LmdbEnvironment::Reading m_reading;
};

// Keeps in the index, while this object lives, the changes that a snapshot of `state` needs; IsOpen is false where
// they may have been forgotten already. A forked child leaves the index alone, which may have been copied while it was locked.
class SnapshotChanges {
 public:
  SnapshotChanges(std::shared_ptr<ChangeIndex> index, PageReader& reader, const CommitState& state)
      : m_index(std::move(index)),
        m_commit(state.Commit()),
        m_forks(ForkCount()),
        m_isOpen(OpenChanges(*m_index, reader, state)) {}
  ~SnapshotChanges() {
    if (m_isOpen && m_forks == ForkCount()) m_index->Close(m_commit);
  }
  SnapshotChanges(const SnapshotChanges&) = delete;
  SnapshotChanges& operator=(const SnapshotChanges&) = delete;

  bool IsOpen() const noexcept { return m_isOpen; }
  ChangeIndex& Index() const noexcept { return *m_index; }

 private:
  const std::shared_ptr<ChangeIndex> m_index;
  const std::uint64_t m_commit;
  const std::uint64_t m_forks;
  const bool m_isOpen;
};

// Reads without LMDB (page_reader.h), whose transaction keeps the pages. Views point into the map of data.mdb, which
// stays while the snapshot is open.
class LmdbSnapshot final : public EngineSnapshot {
 public:
  explicit LmdbSnapshot(std::shared_ptr<LmdbEnvironment> environment);

  // Whether it can be read: false for one that was opened while the changes that it needs were forgotten. Open another.
  bool IsCurrent() const noexcept { return m_changes.IsOpen(); }

  std::uint64_t Generation() const override { return State().Commit(); }
  std::optional<ByteView> Read(OID oid) const override;
  void ScanRecords(OID first, const std::function<bool(OID, ByteView)>& visit) const override;
  std::optional<ByteView> ReadNamed(NamedTable table, std::string_view name) const override;
  void ScanNamed(NamedTable table, std::string_view prefix,
                 const std::function<bool(std::string_view, ByteView)>& visit) const override;
  std::vector<OID> QueuedDeletions(std::size_t limit) const override;
  std::vector<StorageFinding> CheckStorage() const override;

 private:
  const CommitState& State() const noexcept { return m_reading.State(); }
  const PageTable& Table(std::string_view name) const noexcept { return *State().data->state->Table(name); }
  void RequireMetaOfLog() const;
  ByteView RecordAt(OID oid, const TreeCursor& cursor, Bytes& changed) const;
  void Scan(std::string_view table, std::string_view first,
            const std::function<bool(TreeCursor&)>& visit) const;

  std::shared_ptr<LmdbEnvironment> m_environment;
  OpenReading m_reading;
  mutable PageReader m_reader;  // remembers the pages that it has checked
  mutable TreeCursor m_records;
  mutable Bytes m_changed;  // the record that Read has put together last
  const SnapshotChanges m_changes;
};

}  // namespace vemo
