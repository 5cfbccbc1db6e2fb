// Where salvage puts what it has found: a part of salvage.
#pragma once

#include <cstdint>
#include <memory>
#include <set>
#include <string>
#include <string_view>

#include "store/raw_record.h"
#include "store/transaction.h"

namespace vemo {

// Writes in bounded commits.
class SalvageSink {
 public:
  SalvageSink(CSpace& space, std::uint64_t entriesPerCommit) : m_space(space), m_entriesPerCommit(entriesPerCommit) {}

  void ReserveIdsUpTo(OID last) { Transaction().ReserveIdsUpTo(last); }
  // From now on, entries go to that root, which is made if need be. The name is as the source stored it; an owned map keeps its id.
  void OpenMap(const std::string& name, OID oid, RawFamily family);
  bool HasRoot(std::string_view name);
  // False when the map has the key already, which keeps its payload, or when the payload cannot be read.
  bool Put(const RawEntry& entry);
  std::uint64_t EntriesOfMap() const noexcept { return m_entriesOfMap; }
  void PutMeta(std::string_view name, std::string_view value);

  // Commits what is open.
  void Commit();

 private:
  WriteTransaction& Transaction();
  template <class Map>
  void OpenMapOfClass();
  template <class Map>
  bool PutInto(const RawEntry& entry);
  void Count();

  CSpace& m_space;
  std::uint64_t m_entriesPerCommit;
  std::unique_ptr<WriteTransaction> m_transaction;
  std::uint64_t m_pending = 0;
  std::string m_name;
  OID m_oid;
  RawFamily m_family = RawFamily::kInsertions;
  void* m_map = nullptr;  // root maps keep their address from one transaction to the next
  std::uint64_t m_entriesOfMap = 0;
  std::set<std::string> m_restored;  // owned maps that were made
};

}  // namespace vemo
