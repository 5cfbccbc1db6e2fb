// The checked counterpart of InputArchive, for bytes that nobody vouches for.
#pragma once

#include <cstdint>
#include <span>

#include "platform/error.h"
#include "platform/field_id.h"
#include "platform/guid.h"
#include "platform/types.h"
#include "platform/variable_length.h"

namespace vemo {

// Walks a record without building anything. Every type that can be read from an InputArchive has a `CheckForm(reader,
// const T*)` beside its `Deserialise`; bytes that CheckForm accepts are bytes on which Deserialise neither reads past
// the end nor fails an assertion. Each function throws MalformedBytes with the offset of what does not fit. Nothing is
// allocated by what the bytes claim, so hostile counts cost nothing.
class BoundedReader {
 public:
  explicit BoundedReader(std::span<const std::uint8_t> bytes) noexcept
      : m_begin(bytes.data()), m_at(bytes.data()), m_end(bytes.data() + bytes.size()) {}

  std::size_t offset() const noexcept { return static_cast<std::size_t>(m_at - m_begin); }
  std::size_t remaining() const noexcept { return static_cast<std::size_t>(m_end - m_at); }

  // Variable-length values; a form that is longer than its value needs is refused.
  std::uint32_t ReadUint32() {
    const Number number = LookAtNumber();
    if (number.bytes == 0 || number.value > UINT32_MAX) [[unlikely]] return ReadUint32Slowly();
    m_at += number.bytes;
    return static_cast<std::uint32_t>(number.value);
  }
  std::uint64_t ReadUint64() {
    const Number number = LookAtNumber();
    if (number.bytes == 0) [[unlikely]] return ReadUint64Slowly();
    m_at += number.bytes;
    return number.value;
  }

  // A count of items that take at least `minBytesEach` bytes each.
  std::uint32_t ReadCount(std::size_t minBytesEach) {
    const std::uint8_t* const start = m_at;
    const std::uint32_t count = ReadUint32();
    if (count > remaining() / minBytesEach) [[unlikely]] FailCount(start, count);
    return count;
  }

  void ReadSchema(std::uint32_t currentSchema);
  Guid ReadGuid();
  // Replaces `field` by what is read, and leaves it valid where that fails.
  void ReadFieldId(FieldId& field);

  // Passes over `count` bytes.
  void Skip(std::size_t count) {
    if (count > remaining()) Fail("the bytes end too early");
    m_at += count;
  }

  void ExpectEnd() const;
  [[noreturn]] void Fail(const std::string& reason) const { throw MalformedBytes(offset(), reason); }

 private:
  struct Number {
    std::uint64_t value;
    std::size_t bytes;  // of its form; 0 where it was not read
  };

  // The next number, which is not passed over, where it is sound and no form could reach beyond the end.
  Number LookAtNumber() const noexcept {
    constexpr Number kNone{0, 0};
    if (remaining() < kMaxVariableLengthUint64Bytes) [[unlikely]] return kNone;
    if (*m_at < 0x80) return {*m_at, 1};
    const std::size_t bytes = VariableLengthBytes(*m_at);
    const std::uint64_t value = DeserialiseVariableLengthUint64FromNine(m_at, bytes);
    return IsShortest(value, bytes) ? Number{value, bytes} : kNone;
  }
  // A form of two bytes and more: one that is a byte shorter holds 7 bits less.
  static bool IsShortest(std::uint64_t value, std::size_t bytes) noexcept { return value >> (7 * (bytes - 1)) != 0; }

  // For what LookAtNumber does not give.
  std::uint32_t ReadUint32Slowly();
  std::uint64_t ReadUint64Slowly();
  [[noreturn]] void FailCount(const std::uint8_t* start, std::uint32_t count);

  const std::uint8_t* m_begin;
  const std::uint8_t* m_at;
  const std::uint8_t* m_end;
};

inline void CheckForm(BoundedReader& reader, const Guid*) { reader.ReadGuid(); }
inline void CheckForm(BoundedReader& reader, const FieldId*) {
  FieldId field;
  reader.ReadFieldId(field);
}
inline void CheckForm(BoundedReader& reader, const OID*) { reader.ReadUint64(); }

}  // namespace vemo
