#include "tests/support/small_map.h"

#include "vxOperation/src/WorkingSet/CompOp/FieldMapBodies.h"

namespace vemo {

void Serialise(Archive& ar, const CountedPayload& payload) {
  SerialiseVariableLengthUint(ar, ssize_t{payload.value()});
}

void Deserialise(InputArchive& ar, CountedPayload& payload) {
  std::uint32_t value = 0;
  DeserialiseVariableLengthUint(ar, value);
  payload = CountedPayload(value);
}

void CheckForm(BoundedReader& reader, const CountedPayload*) {
  reader.ReadUint32();
}

xostream& operator<<(xostream& os, const CountedPayload& payload) {
  return os << std::int64_t{payload.value()};
}

VEMO_FIELD_MAP_REGISTRATION(SmallMap)

template class TFieldMap<SmallMapTraits>;
template class TFieldMapInternalNode<SmallMapTraits>;
template class TFieldMapLeafNode<SmallMapTraits>;

}  // namespace vemo
