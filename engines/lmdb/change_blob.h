// The changes of one commit as one value.
//
//   previous (variable-length)   the commit of the blob before this one, 0 for none
//   count    (variable-length)
//   count times: the id less the one before it (ids ascend), the length of its delta (both variable-length)
//   XXH3-64 of all before, seeded with the number of the commit (8 bytes, little-endian)
//   the deltas (engines/record_delta.h), in the same order
//
// Who opens a space reads what stands before the deltas, which is some tenth of it. A damaged delta makes another record than
// was committed, which the record's own seal tells.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "store/engine.h"

namespace vemo {

class ChangeBlobBuilder {
 public:
  // Ids ascend.
  void Add(OID oid, ByteView delta);
  bool empty() const noexcept { return m_count == 0; }
  std::size_t count() const noexcept { return m_count; }
  Bytes Finish(std::uint64_t commit, std::uint64_t previous) const;

 private:
  std::size_t m_count = 0;
  OID m_lastOid;
  Bytes m_index;  // of the deltas
  Bytes m_deltas;
};

struct ChangeBlob {
  struct Change {
    OID oid;
    std::uint32_t offset;  // of the delta in the blob
    std::uint32_t length;
  };
  std::uint64_t previous = 0;
  std::vector<Change> changes;
};

// Throws MalformedBytes where the checksum or the form does not fit. Does not read the deltas.
ChangeBlob ParseChangeBlob(ByteView blob, std::uint64_t commit);

}  // namespace vemo
