#include "vxUtils/Archive.h"

#include "platform/error.h"

namespace vemo {

void Archive::FlushBuffer() {
  const ssize_t count = NumBufferedWrites();
  if (count > 0) m_oStream->WriteStream(m_writeBuffer, count);
  m_numBytesWrittenToStream += count;
  m_pos = m_writeBuffer;
}

void SerialiseSchema(Archive& ar, int schema) {
  VEMO_ASSERT(schema > 0);
  ar << AsCompressedInt(schema);
}

void DeserialiseSchema(InputArchive& ar, int currentSchema, int& schema) {
  DeserialiseVariableLengthUint(ar, schema);
  if (schema <= 0 || schema > currentSchema) {
    throw MalformedBytes(0, "schema " + std::to_string(schema) + " is newer than this program, which knows up to " +
                                std::to_string(currentSchema));
  }
}

void Serialise(Archive& ar, const OID& oid) {
  ar.EndWrite(SerialiseVariableLengthUint64(ar.BeginWrite(kMaxVariableLengthUint64Bytes), oid.m_value));
}

void Serialise(Archive& ar, const FieldId& field) {
  const std::size_t mostBytes = kMaxVariableLengthUint64Bytes + (1 + std::size_t{field.path.size()}) * MAX_VARIABLE_LENGTH_UINT_SIZE;
  if (std::uint8_t* p = ar.BeginWriteIfRoom(mostBytes)) {
    p = SerialiseVariableLengthUint64(p, field.oid.m_value);
    p = SerialiseVariableLengthUint32(p, field.path.size());
    for (const Path::Element element : field.path.elements()) p = SerialiseVariableLengthUint32(p, element);
    ar.EndWrite(p);
    return;
  }
  Serialise(ar, field.oid);
  SerialiseVariableLengthUint(ar, ssize_t{field.path.size()});
  for (const Path::Element element : field.path.elements()) SerialiseVariableLengthUint(ar, ssize_t{element});
}

}  // namespace vemo
