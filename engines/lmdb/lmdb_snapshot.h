// A read transaction of LMDB as a snapshot of a space.
#pragma once

#include <memory>

#include "engines/lmdb/lmdb_environment.h"
#include "store/engine.h"

namespace vemo {

// Views point into the map of the environment, which stays as it is while the transaction is open.
class LmdbSnapshot final : public EngineSnapshot {
 public:
  explicit LmdbSnapshot(std::shared_ptr<LmdbEnvironment> environment);
  ~LmdbSnapshot() override;
  LmdbSnapshot(const LmdbSnapshot&) = delete;
  LmdbSnapshot& operator=(const LmdbSnapshot&) = delete;

  std::uint64_t Generation() const override { return m_generation; }
  std::optional<ByteView> Read(OID oid) const override;
  void ScanRecords(OID first, const std::function<bool(OID, ByteView)>& visit) const override;
  std::optional<ByteView> ReadNamed(NamedTable table, std::string_view name) const override;
  void ScanNamed(NamedTable table, std::string_view prefix,
                 const std::function<bool(std::string_view, ByteView)>& visit) const override;
  std::vector<OID> QueuedDeletions(std::size_t limit) const override;

 private:
  std::optional<ByteView> Get(unsigned table, std::string_view key) const;
  void Scan(unsigned table, std::string_view first,
            const std::function<bool(std::string_view, ByteView)>& visit) const;

  std::shared_ptr<LmdbEnvironment> m_environment;
  MDB_txn* m_txn;
  std::uint64_t m_generation = 0;
};

// The handle of a table of named values.
unsigned TableOf(NamedTable table, const LmdbTables& tables);

}  // namespace vemo
