// Keys made from numbers.
#pragma once

#include <cstdint>

#include "platform/field_id.h"

namespace vemo::test {

// Object `n`, the empty path. Ascending numbers give ascending keys.
inline FieldId Key(std::uint64_t n) {
  return FieldId{OID(n), Path{}};
}

// The same order, with a path so long that copying the key allocates.
inline FieldId LongKey(std::uint64_t n) {
  return FieldId{OID(n), Path{9, 8, 7, 6, 5, 4}};
}

using KeyMaker = FieldId (*)(std::uint64_t);

inline std::uint64_t NumberOf(const FieldId& key) {
  return key.oid.m_value;
}

}  // namespace vemo::test
