// Records of all nine classes, with a seal that is right and without: what the check of the form accepts is read without a fault
// and written as the same bytes, and the second reader (store/raw_record.h) accepts exactly the same, as does whoever reads the entries
// of a leaf one by one.
#include <algorithm>
#include <cstdlib>
#include <memory>
#include <optional>
#include <string_view>

#include "platform/error.h"
#include "store/envelope.h"
#include "store/raw_record.h"
#include "store/snapshot.h"
#include "store/transaction.h"
#include "vxOperation/src/WorkingSet/CompOp/VectorOT.h"
#include "vxUtils/ByteForms.h"

namespace {

using namespace vemo;

// A space whose records have all nine class numbers: a map has internal nodes from 101 entries on.
std::unique_ptr<CSpace> MakeSpace() {
  auto space = CSpace::Open("memory:");
  WriteTransaction transaction(*space);
  for (std::uint64_t n = 1; n <= 101; ++n) {
    const FieldId key{OID(n), Path{}};
    transaction.Root<FieldIdToVectorInsertionsMap>("i")[key];
    transaction.Root<FieldIdToVectorTombstonesMap>("t")[key];
    transaction.Root<FieldIdToVectorInsertionsAndDeletionsMap>("h")[key];
  }
  transaction.Commit();
  return space;
}

bool RawAccepts(ByteView record, OID oid, const RawClassTable& classes) {
  try {
    const RawEnvelope envelope = OpenRawRecord(record, oid);
    const auto rawClass = classes.Find(envelope.classNumber);
    if (!rawClass) return false;
    ReadRawBody(envelope.body, *rawClass);
    return true;
  } catch (const RawFault&) {
    return false;
  }
}

// Whether all entries can be read; what they are must be written as the bytes of `body` behind its head.
template <class Traits>
bool EntriesAccept(ByteView body) {
  Bytes entries;
  try {
    LeafFormReader<Traits> reader{BoundedReader(body)};
    FieldId key;
    typename Traits::Payload payload;
    while (reader.NextKey()) {
      reader.Read(key, payload);
      if (reader.CompareKeyWith(key) != 0) std::abort();
      for (const Bytes& bytes : {ToBytes(key), ToBytes(payload)}) entries.insert(entries.end(), bytes.begin(), bytes.end());
    }
  } catch (const MalformedBytes&) {
    return false;
  }
  if (entries.size() > body.size() || !std::equal(entries.rbegin(), entries.rend(), body.rbegin())) std::abort();
  return true;
}

// Nothing for a class that is no leaf's.
std::optional<bool> LeafEntriesAccept(std::string_view className, ByteView body) {
  if (className == "vemo::FieldIdToVectorInsertionsMapLeafNode")
    return EntriesAccept<FieldIdToVectorInsertionsMapTraits>(body);
  if (className == "vemo::FieldIdToVectorTombstonesMapLeafNode")
    return EntriesAccept<FieldIdToVectorTombstonesMapTraits>(body);
  if (className == "vemo::FieldIdToVectorInsertionsAndDeletionsMapLeafNode")
    return EntriesAccept<FieldIdToVectorInsertionsAndDeletionsMapTraits>(body);
  return std::nullopt;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  static const std::unique_ptr<CSpace> space = MakeSpace();
  static Snapshot snapshot(*space);
  static const RawClassTable classes(snapshot.Objects().State());
  if (size == 0) return 0;
  const OID oid(7);
  const ByteView input(data + 1, size - 1);
  Bytes record;
  const bool isSealed = data[0] < 250;
  if (isSealed) {
    BeginRecord(record, 1 + data[0] % 9u, 3);
    record.insert(record.end(), input.begin(), input.end());
    SealRecord(record, 0, oid);
  } else {
    record.assign(input.begin(), input.end());
  }
  bool isAccepted = true;
  try {
    const ptr<IPersistable> object = snapshot.Objects().Decode(oid, record);
    BytesOutputStream stream;
    Archive archive(&stream);
    object.Table()->Serialise(object.m_self, archive);
    archive.Flush();
    DestroyObject(object);
    const ByteView body = OpenRecord(record, oid).body;
    if (!std::equal(body.begin(), body.end(), stream.m_bytes.begin(), stream.m_bytes.end())) std::abort();
  } catch (const CorruptRecord&) {
    isAccepted = false;
  }
  if (RawAccepts(record, oid, classes) != isAccepted) std::abort();
  if (isSealed) {
    const auto leaf = LeafEntriesAccept(snapshot.Objects().ClassInHead(record), OpenRecord(record, oid).body);
    if (leaf && *leaf != isAccepted) std::abort();
  }
  return 0;
}
