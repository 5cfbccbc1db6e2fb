// The checked counterpart of InputArchive, for bytes that nobody vouches for.
#pragma once

#include <cstdint>
#include <span>

#include "platform/error.h"
#include "platform/field_id.h"
#include "platform/guid.h"
#include "platform/types.h"

namespace vemo {

// Walks a record without building anything. Every type that can be read from an InputArchive has a `CheckForm(reader,
// const T*)` beside its `Deserialise`; bytes that CheckForm accepts are bytes on which Deserialise neither reads past
// the end nor fails an assertion. Each function throws MalformedBytes with the offset of what does not fit. Nothing is
// allocated by what the bytes claim, so hostile counts cost nothing.
class BoundedReader {
 public:
  explicit BoundedReader(std::span<const std::uint8_t> bytes) noexcept : m_bytes(bytes) {}

  std::size_t offset() const noexcept { return m_offset; }
  std::size_t remaining() const noexcept { return m_bytes.size() - m_offset; }

  // Variable-length values; a form that is longer than its value needs is refused.
  std::uint32_t ReadUint32() {
    if (IsShort()) return m_bytes[m_offset++];
    return ReadLongUint32();
  }
  std::uint64_t ReadUint64() {
    if (IsShort()) return m_bytes[m_offset++];
    return ReadLongUint64();
  }

  // A count of items that take at least `minBytesEach` bytes each.
  std::uint32_t ReadCount(std::size_t minBytesEach) {
    const std::size_t start = m_offset;
    const std::uint32_t count = ReadUint32();
    if (count > remaining() / minBytesEach) [[unlikely]] FailCount(start, count);
    return count;
  }

  void ReadSchema(std::uint32_t currentSchema);
  Guid ReadGuid();
  FieldId ReadFieldId();

  // Passes over `count` bytes.
  void Skip(std::size_t count) {
    if (count > remaining()) Fail("the bytes end too early");
    m_offset += count;
  }

  void ExpectEnd() const;
  [[noreturn]] void Fail(const std::string& reason) const { throw MalformedBytes(m_offset, reason); }

 private:
  bool IsShort() const noexcept { return m_offset < m_bytes.size() && m_bytes[m_offset] < 0x80; }
  std::uint32_t ReadLongUint32();
  std::uint64_t ReadLongUint64();
  [[noreturn]] void FailCount(std::size_t start, std::uint32_t count);

  std::span<const std::uint8_t> m_bytes;
  std::size_t m_offset = 0;
};

inline void CheckForm(BoundedReader& reader, const Guid*) { reader.ReadGuid(); }
inline void CheckForm(BoundedReader& reader, const FieldId*) { reader.ReadFieldId(); }
inline void CheckForm(BoundedReader& reader, const OID*) { reader.ReadUint64(); }

}  // namespace vemo
