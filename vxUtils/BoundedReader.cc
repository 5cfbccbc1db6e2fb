#include "vxUtils/BoundedReader.h"

#include <cstring>
#include <limits>

#include "platform/variable_length.h"

namespace vemo {

std::uint64_t BoundedReader::ReadLongUint64() {
  if (remaining() == 0) Fail("the bytes end where a number should begin");
  const std::uint8_t* p = m_bytes.data() + m_offset;
  const std::size_t length = VariableLengthBytes(*p);
  if (length > remaining()) Fail("the bytes end inside a number");
  std::uint64_t value = 0;
  if (remaining() > sizeof(value)) [[likely]] {
    value = DeserialiseVariableLengthUint64FromNine(p, length);
  } else {
    DeserialiseVariableLengthUint64(p, value);
  }
  // A form one byte shorter holds 7 bits less.
  if (length > 1 && value >> (7 * (length - 1)) == 0) Fail("a number is not in its shortest form");
  m_offset += length;
  return value;
}

std::uint32_t BoundedReader::ReadLongUint32() {
  const std::size_t start = m_offset;
  const std::uint64_t value = ReadLongUint64();
  if (value > std::numeric_limits<std::uint32_t>::max()) {
    m_offset = start;
    Fail("a number has more than 32 bits");
  }
  return static_cast<std::uint32_t>(value);
}

void BoundedReader::FailCount(std::size_t start, std::uint32_t count) {
  m_offset = start;
  Fail("the count " + std::to_string(count) + " is more than the bytes can hold");
}

void BoundedReader::ReadSchema(std::uint32_t currentSchema) {
  const std::size_t start = m_offset;
  const std::uint32_t schema = ReadUint32();
  if (schema == 0 || schema > currentSchema) {
    m_offset = start;
    Fail("schema " + std::to_string(schema) + " is not one of 1 to " + std::to_string(currentSchema));
  }
}

Guid BoundedReader::ReadGuid() {
  if (remaining() < sizeof(Guid)) Fail("the bytes end inside a Guid");
  Guid guid;
  std::memcpy(&guid, m_bytes.data() + m_offset, sizeof(Guid));
  m_offset += sizeof(Guid);
  return guid;
}

FieldId BoundedReader::ReadFieldId() {
  FieldId field;
  field.oid = OID(ReadUint64());
  for (Path::Element& element : field.path.Resize(ReadCount(1))) element = ReadUint32();
  return field;
}

void BoundedReader::ExpectEnd() const {
  if (remaining() != 0) Fail("the record should end here");
}

}  // namespace vemo
