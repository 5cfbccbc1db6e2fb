// The checked counterpart of InputArchive, for bytes that nobody vouches for.
#pragma once

#include <cstdint>
#include <cstring>
#include <span>
#include <string_view>

#include "platform/error.h"
#include "platform/field_id.h"
#include "platform/guid.h"
#include "platform/types.h"
#include "platform/variable_length.h"
#include "vxUtils/FieldForm.h"

namespace vemo {

// Walks a record without building anything. Every type that can be read from an InputArchive has a `CheckForm(reader,
// const T*)` beside its `Deserialise`; bytes that CheckForm accepts are bytes on which Deserialise neither reads past
// the end nor fails an assertion. Each function throws MalformedBytes with the offset of what does not fit. Nothing is
// allocated by what the bytes claim, so hostile counts cost nothing.
//
// A reader may be copied. Its functions are inlined, and what they call is not given its address: the copy that a loop keeps to
// itself then stays in registers.
class BoundedReader {
 public:
  explicit BoundedReader(std::span<const std::uint8_t> bytes) noexcept
      : m_begin(bytes.data()), m_at(bytes.data()), m_end(bytes.data() + bytes.size()) {}

  std::size_t offset() const noexcept { return static_cast<std::size_t>(m_at - m_begin); }
  std::size_t remaining() const noexcept { return static_cast<std::size_t>(m_end - m_at); }
  // Where it has got to: an InputArchive reads from there what a copy of the reader has accepted.
  const std::uint8_t* at() const noexcept { return m_at; }

  // Variable-length values; a form that is longer than its value needs is refused.
  std::uint32_t ReadUint32() { return static_cast<std::uint32_t>(ReadNumber(UINT32_MAX)); }
  std::uint64_t ReadUint64() { return ReadNumber(UINT64_MAX); }

  // A count of items that take at least `minBytesEach` bytes each.
  std::uint32_t ReadCount(std::size_t minBytesEach) {
    const std::uint8_t* const start = m_at;
    const std::uint32_t count = ReadUint32();
    if (count > remaining() / minBytesEach) [[unlikely]] {
      m_at = start;
      FailCount(offset(), count);
    }
    return count;
  }

  void ReadSchema(std::uint32_t currentSchema) {
    const std::uint8_t* const start = m_at;
    const std::uint32_t schema = ReadUint32();
    if (schema == 0 || schema > currentSchema) [[unlikely]] {
      m_at = start;
      FailSchema(offset(), schema, currentSchema);
    }
  }
  Guid ReadGuid() {
    if (remaining() < sizeof(Guid)) [[unlikely]] Fail("the bytes end inside a Guid");
    Guid guid;
    std::memcpy(&guid, m_at, sizeof(Guid));
    m_at += sizeof(Guid);
    return guid;
  }
  // A field, which is not built.
  [[gnu::always_inline]] FieldForm ReadField() {
    const std::uint64_t object = ReadUint64();
    const std::uint32_t numSteps = ReadCount(1);
    const std::uint8_t* const steps = m_at;
    if (numSteps < sizeof(std::uint64_t) && remaining() >= sizeof(std::uint64_t)) [[likely]] {
      const std::uint64_t head = FieldForm::HeadFromEight(steps, numSteps);
      if ((head & 0x8080808080808080u) == 0) [[likely]] {  // each step has a byte
        m_at += numSteps;
        return {object, head, steps, numSteps};
      }
    }
    for (std::uint32_t i = 0; i < numSteps; ++i) ReadUint32();
    const auto bytes = static_cast<std::size_t>(m_at - steps);
    return {object, FieldForm::Head(steps, bytes), steps, bytes};
  }

  // Passes over `count` bytes.
  void Skip(std::size_t count) {
    if (count > remaining()) [[unlikely]] Fail("the bytes end too early");
    m_at += count;
  }

  void ExpectEnd() const {
    if (remaining() != 0) Fail("the record should end here");
  }
  [[noreturn]] void Fail(std::string_view reason) const { FailAt(offset(), reason); }

 private:
  struct Number {
    std::uint64_t value;
    std::size_t bytes;  // of its form
  };

  [[gnu::always_inline]] std::uint64_t ReadNumber(std::uint64_t greatest) {
    if (m_at != m_end) [[likely]] {
      const std::uint64_t first = *m_at;
      if (first < 0x80) {
        ++m_at;
        return first;
      }
      if (first < 0xC0 && remaining() >= 2) {
        const std::uint64_t value = (first & 0x3F) << 8 | m_at[1];
        if (IsShortest(value, 2)) [[likely]] {
          m_at += 2;
          return value;
        }
      }
    }
    const Number number = ReadLong(m_begin, m_at, m_end, greatest);
    m_at += number.bytes;
    return number.value;
  }
  // A form of two bytes and more: one that is a byte shorter holds 7 bits less.
  static bool IsShortest(std::uint64_t value, std::size_t bytes) noexcept { return value >> (7 * (bytes - 1)) != 0; }

  // For three bytes and more, and for what must be refused.
  static Number ReadLong(const std::uint8_t* begin, const std::uint8_t* at, const std::uint8_t* end, std::uint64_t greatest);
  static Number ReadNearEnd(const std::uint8_t* begin, const std::uint8_t* at, const std::uint8_t* end, std::uint64_t greatest);

  [[noreturn]] static void FailAt(std::size_t offset, std::string_view reason);
  [[noreturn]] static void FailCount(std::size_t offset, std::uint32_t count);
  [[noreturn]] static void FailSchema(std::size_t offset, std::uint32_t schema, std::uint32_t currentSchema);

  const std::uint8_t* m_begin;
  const std::uint8_t* m_at;
  const std::uint8_t* m_end;
};

inline void CheckForm(BoundedReader& reader, const Guid*) { reader.ReadGuid(); }
inline void CheckForm(BoundedReader& reader, const FieldId*) { reader.ReadField(); }
inline void CheckForm(BoundedReader& reader, const OID*) { reader.ReadUint64(); }

}  // namespace vemo
