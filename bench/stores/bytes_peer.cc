#include "bench/stores/bytes_peer.h"

#include "bench/common/entries.h"
#include "platform/assertion.h"
#include "platform/variable_length.h"
#include "vxUtils/ByteForms.h"

namespace vemo::bench {

namespace {

std::uint64_t ReadTombstones(InputArchive& ar) {
  std::uint64_t sum = 0;
  ssize_t position = 0;
  ssize_t count = 0;
  for (DeserialiseVariableLengthUint(ar, count); count > 0; --count) {
    ssize_t gap = 0;
    ssize_t length = 0;
    DeserialiseVariableLengthUint(ar, gap);
    DeserialiseVariableLengthUint(ar, length);
    const ssize_t begin = position + gap;
    position = begin + length;
    sum += static_cast<std::uint64_t>(begin ^ position);
  }
  return sum;
}

std::uint64_t ReadInsertions(InputArchive& ar) {
  std::uint64_t sum = 0;
  ssize_t u2 = 0;
  ssize_t count = 0;
  DeserialiseVariableLengthUint(ar, u2);
  for (DeserialiseVariableLengthUint(ar, count); count > 0; --count) {
    VectorInsertionInterval run;
    run.Deserialise(ar);
    sum += static_cast<std::uint64_t>(run.m_q ^ run.m_n ^ run.m_opid.t);
  }
  return sum;
}

template <class Payload>
std::vector<std::string> EncodePool() {
  const PayloadPool<Payload> pool;
  std::vector<std::string> encoded;
  for (std::size_t i = 0; i < PayloadPool<Payload>::kCount; ++i) {
    const Bytes bytes = ToBytes(pool[i]);
    encoded.emplace_back(bytes.begin(), bytes.end());
  }
  return encoded;
}

}  // namespace

PackedKey::PackedKey(const FieldId& key) {
  VEMO_ASSERT(key.path.size() <= 10);
  std::uint8_t* p = SerialiseVariableLengthUint64(m_bytes, key.oid.m_value);
  for (const Path::Element step : key.path.elements()) p = SerialiseVariableLengthUint32(p, step);
  m_size = static_cast<std::size_t>(p - m_bytes);
}

std::uint64_t ReadPayloadBytes(StorePayload payload, const void* bytes) {
  InputArchive ar(static_cast<const std::uint8_t*>(bytes));
  return payload == StorePayload::kTombstones ? ReadTombstones(ar) : ReadInsertions(ar);
}

BytesPeer::BytesPeer(const StoreSetup& setup)
    : m_payload(setup.payload),
      m_payloads(setup.payload == StorePayload::kTombstones ? EncodePool<VectorTombstones>()
                                                            : EncodePool<VectorInsertions>()) {}

}  // namespace vemo::bench
