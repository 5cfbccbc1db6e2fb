// Records of all nine classes, with a seal that is right and without: what the check of the form accepts is read without a fault
// and written as the same bytes, and the second reader (store/raw_record.h) accepts exactly the same.
#include <cstdlib>
#include <memory>

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

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  static const std::unique_ptr<CSpace> space = MakeSpace();
  static Snapshot snapshot(*space);
  static const RawClassTable classes(snapshot.Objects().State());
  if (size == 0) return 0;
  const OID oid(7);
  const ByteView input(data + 1, size - 1);
  Bytes record;
  if (data[0] < 250) {
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
  return 0;
}
