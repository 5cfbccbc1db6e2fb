// The changes of one commit as one value.
//
//   previous (variable-length)   the commit of the blob before this one, 0 for none
//   count    (variable-length)
//   count times: the id less the one before it (ids ascend), the length of its delta (both variable-length), the check of the delta
//       (4 bytes, little-endian)
//   XXH3-64 of all before, seeded with the number of the commit (8 bytes, little-endian)
//   the deltas (engines/record_delta.h), in the same order
//
// Who opens a space reads what stands before the deltas, and not these. The check tells a damaged delta when it is
// applied: it might lead to an older version of the record, whose own seal is sound.
#pragma once

#include <cstdint>
#include <vector>

#include "store/engine.h"

namespace vemo {

class ChangeBlobBuilder {
 public:
  explicit ChangeBlobBuilder(std::uint64_t commit) : m_commit(commit) {}

  // Throws UsageError where `oid` is not above the one before.
  void Add(OID oid, ByteView delta);
  bool empty() const noexcept { return m_count == 0; }
  std::size_t count() const noexcept { return m_count; }
  std::size_t bytes() const noexcept { return m_index.size() + m_deltas.size(); }
  Bytes Finish(std::uint64_t previous) const;

 private:
  const std::uint64_t m_commit;
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
    std::uint32_t check;
  };
  std::uint64_t previous = 0;
  std::vector<Change> changes;
};

// Throws MalformedBytes where the checksum or the form does not fit. Does not read the deltas.
ChangeBlob ParseChangeBlob(ByteView blob, std::uint64_t commit);

// The check of a delta: the low half of its XXH3-64, seeded with one of its id and the commit.
std::uint32_t DeltaCheck(OID oid, std::uint64_t commit, ByteView delta) noexcept;

}  // namespace vemo
