#include "store/root_value.h"

#include "platform/variable_length.h"
#include "store/envelope.h"
#include "vxUtils/BoundedReader.h"

namespace vemo {

Bytes EncodeRootValue(std::string_view name, const RootValue& value) {
  std::uint8_t oid[kMaxVariableLengthUint64Bytes];
  Bytes bytes(oid, SerialiseVariableLengthUint64(oid, value.oid.m_value));
  bytes.insert(bytes.end(), value.className.begin(), value.className.end());
  return SealNamed(NamedTable::kRoots, name, bytes);
}

RootValue DecodeRootValue(std::string_view name, ByteView sealed) {
  const ByteView value = OpenNamed(NamedTable::kRoots, name, sealed);
  BoundedReader reader(value);
  RootValue root;
  root.oid = OID(reader.ReadUint64());
  root.className.assign(value.begin() + static_cast<std::ptrdiff_t>(reader.offset()), value.end());
  return root;
}

}  // namespace vemo
