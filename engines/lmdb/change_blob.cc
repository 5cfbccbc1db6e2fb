#include "engines/lmdb/change_blob.h"

#define XXH_INLINE_ALL
#include <xxhash.h>

#include <limits>

#include "platform/error.h"
#include "platform/variable_length.h"
#include "vxUtils/BoundedReader.h"

namespace vemo {

namespace {

constexpr std::size_t kChecksumBytes = 8;
constexpr std::size_t kCheckBytes = 4;

void AppendNumber(Bytes& bytes, std::uint64_t number) {
  std::uint8_t form[kMaxVariableLengthUint64Bytes];
  bytes.insert(bytes.end(), form, SerialiseVariableLengthUint64(form, number));
}

std::uint64_t Checksum(ByteView bytes, std::uint64_t commit) noexcept {
  return XXH3_64bits_withSeed(bytes.data(), bytes.size(), commit);
}

}  // namespace

void ChangeBlobBuilder::Add(OID oid, ByteView delta) {
  if (!(m_lastOid < oid)) throw UsageError("the records of a commit have id " + std::to_string(oid.m_value) + " out of order");
  AppendNumber(m_index, oid.m_value - m_lastOid.m_value);
  AppendNumber(m_index, delta.size());
  const std::uint32_t check = DeltaCheck(oid, m_commit, delta);
  for (std::size_t i = 0; i < kCheckBytes; ++i) m_index.push_back(static_cast<std::uint8_t>(check >> (8 * i)));
  m_deltas.insert(m_deltas.end(), delta.begin(), delta.end());
  m_lastOid = oid;
  ++m_count;
}

std::uint32_t DeltaCheck(OID oid, std::uint64_t commit, ByteView delta) noexcept {
  const std::uint64_t seed = XXH3_64bits_withSeed(&oid.m_value, sizeof oid.m_value, commit);
  return static_cast<std::uint32_t>(XXH3_64bits_withSeed(delta.data(), delta.size(), seed));
}

Bytes ChangeBlobBuilder::Finish(std::uint64_t previous) const {
  Bytes blob;
  blob.reserve(2 * kMaxVariableLengthUint64Bytes + m_index.size() + kChecksumBytes + m_deltas.size());
  AppendNumber(blob, previous);
  AppendNumber(blob, m_count);
  blob.insert(blob.end(), m_index.begin(), m_index.end());
  const std::uint64_t checksum = Checksum(blob, m_commit);
  for (std::size_t i = 0; i < kChecksumBytes; ++i) blob.push_back(static_cast<std::uint8_t>(checksum >> (8 * i)));
  blob.insert(blob.end(), m_deltas.begin(), m_deltas.end());
  return blob;
}

ChangeBlob ParseChangeBlob(ByteView blob, std::uint64_t commit) {
  BoundedReader reader(blob);
  if (blob.size() > std::numeric_limits<std::uint32_t>::max()) reader.Fail("the changes of a commit have too many bytes");
  ChangeBlob parsed;
  parsed.previous = reader.ReadUint64();
  const std::uint64_t count = reader.ReadUint64();
  constexpr std::size_t kLeastBytesEach = 2 + kCheckBytes;
  if (count > reader.remaining() / kLeastBytesEach) reader.Fail("there are not so many changes");
  parsed.changes.reserve(count);
  std::uint64_t total = 0;
  OID oid;
  for (std::uint64_t i = 0; i < count; ++i) {
    const std::uint64_t step = reader.ReadUint64();
    if (step == 0 || step > std::numeric_limits<std::uint64_t>::max() - oid.m_value) reader.Fail("the ids do not ascend");
    oid.m_value += step;
    const std::uint64_t length = reader.ReadUint64();
    if (length > blob.size() - total) reader.Fail("a change goes beyond the end");
    const std::size_t at = reader.offset();
    reader.Skip(kCheckBytes);
    std::uint32_t check = 0;
    for (std::size_t byte = kCheckBytes; byte-- > 0;) check = check << 8 | blob[at + byte];
    parsed.changes.push_back({oid, static_cast<std::uint32_t>(total), static_cast<std::uint32_t>(length), check});
    total += length;
  }
  const std::size_t checked = reader.offset();
  reader.Skip(kChecksumBytes);
  std::uint64_t stored = 0;
  for (std::size_t i = kChecksumBytes; i-- > 0;) stored = stored << 8 | blob[checked + i];
  if (stored != Checksum(blob.first(checked), commit)) reader.Fail("the checksum of a commit's changes does not match");
  if (total != reader.remaining()) reader.Fail("the changes do not fill the bytes");
  for (ChangeBlob::Change& change : parsed.changes) change.offset += static_cast<std::uint32_t>(reader.offset());
  return parsed;
}

}  // namespace vemo
