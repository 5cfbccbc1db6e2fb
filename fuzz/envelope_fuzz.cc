// Sealed values: bytes that were not sealed are refused by both readers, and bytes that were are read as they were given.
#include <algorithm>
#include <cstdlib>
#include <string>

#include "platform/error.h"
#include "store/envelope.h"
#include "store/raw_record.h"

namespace {

using namespace vemo;

bool Opens(ByteView bytes, OID oid) {
  try {
    OpenRecord(bytes, oid);
    return true;
  } catch (const MalformedBytes&) {
    return false;
  }
}

bool RawOpens(ByteView bytes, OID oid) {
  try {
    OpenRawRecord(bytes, oid);
    return true;
  } catch (const RawFault&) {
    return false;
  }
}

bool OpensNamed(std::string_view name, ByteView bytes) {
  try {
    OpenNamed(NamedTable::kMeta, name, bytes);
    return true;
  } catch (const MalformedBytes&) {
    return false;
  }
}

bool RawOpensNamed(std::string_view name, ByteView bytes) {
  try {
    OpenRawNamed(NamedTable::kMeta, name, bytes);
    return true;
  } catch (const RawFault&) {
    return false;
  }
}

void Require(bool holds) {
  if (!holds) std::abort();
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const ByteView input(data, size);
  const OID oid(size + 1);
  const std::string name(data, data + std::min<std::size_t>(size, 5));
  Require(Opens(input, oid) == RawOpens(input, oid));
  Require(OpensNamed(name, input) == RawOpensNamed(name, input));
  CommitOfRecord(input);

  Bytes sealed(input.begin(), input.end());  // anything, with the right checksum
  SealRecord(sealed, 0, oid);
  Require(Opens(sealed, oid) == RawOpens(sealed, oid));
  Require(!Opens(sealed, OID(oid.m_value + 1)));

  const Bytes value = SealNamed(NamedTable::kMeta, name, input);
  const ByteView opened = OpenNamed(NamedTable::kMeta, name, value);
  Require(std::equal(opened.begin(), opened.end(), input.begin(), input.end()));
  Require(RawOpensNamed(name, value) && !RawOpensNamed(name + "x", value));
  try {
    ReadRawRoot(opened);
  } catch (const RawFault&) {
    return 0;
  }
  return 0;
}
