// The field map with four entries a node and a payload that owns memory: every repair happens within a few
// dozen keys, and every entry that is lost or dies twice is noticed.
#pragma once

#include <cstdint>

#include "tests/support/test_payload.h"
#include "vxOperation/src/WorkingSet/CompOp/FieldMapInstance.h"
#include "vxOperation/src/WorkingSet/CompOp/FieldMapRecords.h"
#include "vxUtils/Archive.h"
#include "vxUtils/BoundedReader.h"

namespace vemo {

// A number on the heap; none reads as 0. Counts its living instances.
class CountedPayload {
 public:
  CountedPayload() noexcept { ++s_live; }
  explicit CountedPayload(std::uint32_t value) : m_value(new std::uint32_t(value)) { ++s_live; }
  CountedPayload(const CountedPayload& other) : m_value(Copy(other.m_value)) { ++s_live; }
  CountedPayload& operator=(const CountedPayload& other) {
    std::uint32_t* const copy = Copy(other.m_value);
    delete m_value;
    m_value = copy;
    return *this;
  }
  ~CountedPayload() {
    delete m_value;
    --s_live;
  }

  std::uint32_t value() const noexcept { return m_value == nullptr ? 0 : *m_value; }
  static std::int64_t NumLive() noexcept { return s_live; }

  friend bool operator==(const CountedPayload& a, const CountedPayload& b) noexcept {
    return a.value() == b.value();
  }

 private:
  static std::uint32_t* Copy(const std::uint32_t* value) {
    return value == nullptr ? nullptr : new std::uint32_t(*value);
  }

  inline static std::int64_t s_live = 0;
  std::uint32_t* m_value = nullptr;
};
template <>
inline constexpr bool kIsRelocatable<CountedPayload> = true;

void Serialise(Archive& ar, const CountedPayload& payload);
void Deserialise(InputArchive& ar, CountedPayload& payload);
void CheckForm(BoundedReader& reader, const CountedPayload*);
xostream& operator<<(xostream& os, const CountedPayload& payload);

VEMO_FIELD_MAP_INSTANCE(SmallMap, CountedPayload, 4)

extern template class TFieldMap<SmallMapTraits>;
extern template class TFieldMapInternalNode<SmallMapTraits>;
extern template class TFieldMapLeafNode<SmallMapTraits>;

namespace test {

template <>
struct PayloadNumber<CountedPayload> {
  static CountedPayload Make(std::uint64_t n) { return CountedPayload(static_cast<std::uint32_t>(n)); }
  static std::uint64_t Number(const CountedPayload& payload) { return payload.value(); }
};

}  // namespace test
}  // namespace vemo
