// The keys and payloads that every peer is given.
//
// All of it follows from fixed seeds, so that peers, rounds and revisions measure the same work.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "platform/field_id.h"
#include "vxOT/TPToQMap.h"
#include "vxOT/VectorInsertions.h"

namespace vemo::bench {

enum class KeyKind {
  kClustered,  // objects 1 to N/4 with four fields each, in random order
  kRandom,     // 64-bit object ids, paths of one to three steps, in random order
  kAscending,  // those of kClustered in ascending order
};
std::string_view KeyKindName(KeyKind kind);

// `count` different keys in the order in which they are to be inserted.
std::vector<FieldId> MakeKeys(KeyKind kind, std::size_t count);
// `count` keys that lie among those of MakeKeys and equal none of them.
std::vector<FieldId> MakeMissingKeys(KeyKind kind, std::size_t count);
// The numbers 0 to count - 1 in an order that depends on `salt`.
std::vector<std::uint32_t> MakeOrder(std::size_t count, std::uint64_t salt);

// A payload as the rows name it, and how each is made, touched and read.
template <class Payload>
struct PayloadKind;

// Two runs of tombstones.
template <>
struct PayloadKind<VectorTombstones> {
  static constexpr std::string_view kName = "P1";
  static VectorTombstones Make(std::uint64_t n);
  // A number that is the same for all payloads, read from the entry itself.
  static std::uint64_t Touch(const VectorTombstones& payload) {
    return static_cast<std::uint64_t>(payload.m_tombstones.size());
  }
  static constexpr std::uint64_t kTouched = 2;
  // A number that takes every byte of meaning, wherever it lies.
  static std::uint64_t Read(const VectorTombstones& payload) {
    std::uint64_t sum = 0;
    for (const auto& run : payload) sum += static_cast<std::uint64_t>(run.t1 ^ run.t2);
    return sum;
  }
};

// One to three records of insertions.
template <>
struct PayloadKind<VectorInsertions> {
  static constexpr std::string_view kName = "P2";
  static VectorInsertions Make(std::uint64_t n);
  static std::uint64_t Touch(const VectorInsertions& payload) {
    return static_cast<std::uint64_t>(payload.m_u2);
  }
  static constexpr std::uint64_t kTouched = 5;
  static std::uint64_t Read(const VectorInsertions& payload) {
    std::uint64_t sum = 0;
    for (const auto* run = payload.m_c.m_first; run != nullptr; run = run->m_next)
      sum += static_cast<std::uint64_t>(run->m_q ^ run->m_n ^ run->m_opid.t);
    return sum;
  }
};

// The payloads that entries get copies of: entry i that of i modulo the count.
template <class Payload>
class PayloadPool {
 public:
  static constexpr std::size_t kCount = 1'024;
  PayloadPool() {
    for (std::size_t i = 0; i < kCount; ++i) m_payloads.push_back(PayloadKind<Payload>::Make(i));
  }
  const Payload& operator[](std::size_t i) const { return m_payloads[i % kCount]; }

 private:
  std::vector<Payload> m_payloads;
};

}  // namespace vemo::bench
