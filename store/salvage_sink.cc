#include "store/salvage_sink.h"

#include "platform/error.h"
#include "vxOperation/src/WorkingSet/CompOp/VectorOT.h"
#include "vxUtils/ByteForms.h"

namespace vemo {

WriteTransaction& SalvageSink::Transaction() {
  if (m_transaction == nullptr) m_transaction = std::make_unique<WriteTransaction>(m_space);
  return *m_transaction;
}

void SalvageSink::Commit() {
  if (m_transaction != nullptr) m_transaction->Commit();
  m_transaction.reset();
  m_pending = 0;
}

void SalvageSink::Count() {
  if (++m_pending >= m_entriesPerCommit) Commit();
}

bool SalvageSink::HasRoot(std::string_view name) {
  for (const std::string& root : Transaction().RootNames()) {
    if (root == name) return true;
  }
  return false;
}

void SalvageSink::OpenMap(const std::string& name, OID oid, RawFamily family) {
  m_name = name;
  m_oid = oid;
  m_family = family;
  m_entriesOfMap = 0;
  switch (family) {
    case RawFamily::kInsertions: return OpenMapOfClass<FieldIdToVectorInsertionsMap>();
    case RawFamily::kTombstones: return OpenMapOfClass<FieldIdToVectorTombstonesMap>();
    case RawFamily::kInsertionsAndDeletions: return OpenMapOfClass<FieldIdToVectorInsertionsAndDeletionsMap>();
  }
}

template <class Map>
void SalvageSink::OpenMapOfClass() {
  if (!IsOwnedRootName(m_name)) {
    m_map = &Transaction().Root<Map>(m_name);
  } else if (m_restored.insert(m_name).second) {
    m_map = &Transaction().RestoreOwned<Map>(m_oid);
  } else {
    m_map = &Transaction().Owned<Map>(m_oid);
  }
  Count();
}

bool SalvageSink::Put(const RawEntry& entry) {
  Transaction();
  switch (m_family) {
    case RawFamily::kInsertions: return PutInto<FieldIdToVectorInsertionsMap>(entry);
    case RawFamily::kTombstones: return PutInto<FieldIdToVectorTombstonesMap>(entry);
    case RawFamily::kInsertionsAndDeletions: return PutInto<FieldIdToVectorInsertionsAndDeletionsMap>(entry);
  }
  return false;
}

template <class Map>
bool SalvageSink::PutInto(const RawEntry& entry) {
  typename Map::Payload payload;
  try {
    FromBytes(entry.payload, payload);
  } catch (const MalformedBytes&) {
    return false;
  }
  if (!static_cast<Map*>(m_map)->Insert(entry.key, std::move(payload), false)) return false;
  ++m_entriesOfMap;
  Count();
  return true;
}

void SalvageSink::PutMeta(std::string_view name, std::string_view value) {
  Transaction().SetMeta(name, value);
  Count();
}

}  // namespace vemo
