#include "vxUtils/BoundedReader.h"

#include <cstring>
#include <limits>

namespace vemo {

std::uint64_t BoundedReader::ReadUint64Slowly() {
  if (remaining() == 0) Fail("the bytes end where a number should begin");
  const std::size_t bytes = VariableLengthBytes(*m_at);
  if (bytes > remaining()) Fail("the bytes end inside a number");
  std::uint64_t value = 0;
  DeserialiseVariableLengthUint64(m_at, value);
  if (bytes > 1 && !IsShortest(value, bytes)) Fail("a number is not in its shortest form");
  m_at += bytes;
  return value;
}

std::uint32_t BoundedReader::ReadUint32Slowly() {
  const std::uint8_t* const start = m_at;
  const std::uint64_t value = ReadUint64Slowly();
  if (value > std::numeric_limits<std::uint32_t>::max()) {
    m_at = start;
    Fail("a number has more than 32 bits");
  }
  return static_cast<std::uint32_t>(value);
}

void BoundedReader::FailCount(const std::uint8_t* start, std::uint32_t count) {
  m_at = start;
  Fail("the count " + std::to_string(count) + " is more than the bytes can hold");
}

void BoundedReader::ReadSchema(std::uint32_t currentSchema) {
  const std::uint8_t* const start = m_at;
  const std::uint32_t schema = ReadUint32();
  if (schema == 0 || schema > currentSchema) {
    m_at = start;
    Fail("schema " + std::to_string(schema) + " is not one of 1 to " + std::to_string(currentSchema));
  }
}

Guid BoundedReader::ReadGuid() {
  if (remaining() < sizeof(Guid)) Fail("the bytes end inside a Guid");
  Guid guid;
  std::memcpy(&guid, m_at, sizeof(Guid));
  m_at += sizeof(Guid);
  return guid;
}

void BoundedReader::ReadFieldId(FieldId& field) {
  field.oid = OID(ReadUint64());
  for (Path::Element& element : field.path.Resize(ReadCount(1))) element = ReadUint32();
}

void BoundedReader::ExpectEnd() const {
  if (remaining() != 0) Fail("the record should end here");
}

}  // namespace vemo
