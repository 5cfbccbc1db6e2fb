// The three production maps, with payloads made from numbers.
#pragma once

#include "tests/support/test_payload.h"
#include "vxOperation/src/WorkingSet/CompOp/VectorOT.h"

namespace vemo::test {

template <>
struct PayloadNumber<VectorInsertions> {
  static VectorInsertions Make(std::uint64_t n) {
    VectorInsertions payload;
    payload.m_u2 = static_cast<ssize_t>(n);
    VectorInsertionInterval run;
    run.m_q = static_cast<ssize_t>(n);
    payload.m_c.InsertAfter(nullptr, run);
    return payload;
  }
  static std::uint64_t Number(const VectorInsertions& payload) {
    return static_cast<std::uint64_t>(payload.m_u2);
  }
};

template <>
struct PayloadNumber<VectorTombstones> {
  static VectorTombstones Make(std::uint64_t n) {
    VectorTombstones payload;
    const auto q = static_cast<ssize_t>(n);
    payload.m_tombstones.safe_push_back({q, q + 2});
    return payload;
  }
  static std::uint64_t Number(const VectorTombstones& payload) {
    return payload.begin() == payload.end() ? 0 : static_cast<std::uint64_t>(payload.begin()->t1);
  }
};

template <>
struct PayloadNumber<VectorInsertionsAndDeletions> {
  static VectorInsertionsAndDeletions Make(std::uint64_t n) {
    VectorInsertionsAndDeletions payload;
    payload.m_insertions = PayloadNumber<VectorInsertions>::Make(n);
    VectorDeletionInterval run;
    run.m_q = static_cast<ssize_t>(n);
    run.m_n = 1;
    payload.m_deletions.InsertAfter(nullptr, run);
    return payload;
  }
  static std::uint64_t Number(const VectorInsertionsAndDeletions& payload) {
    return PayloadNumber<VectorInsertions>::Number(payload.m_insertions);
  }
};

}  // namespace vemo::test
