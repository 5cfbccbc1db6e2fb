#include "bench/common/entries.h"

#include <algorithm>
#include <random>

namespace vemo::bench {

namespace {

constexpr std::uint64_t kSeed = 20'260'314;

// The four fields of each object of the clustered keys.
FieldId ClusteredKey(std::size_t i) {
  const OID object(1 + i / 4);
  switch (i % 4) {
    case 0:
      return {object, Path{0}};
    case 1:
      return {object, Path{1}};
    case 2:
      return {object, Path{1, 3}};
    default:
      return {object, Path{2, 0, 1}};
  }
}

FieldId RandomKey(std::mt19937_64& random) {
  const OID object(random() | 1);
  switch (random() % 3) {
    case 0:
      return {object, Path{static_cast<std::uint32_t>(random() % 8)}};
    case 1:
      return {object,
              Path{static_cast<std::uint32_t>(random() % 8), static_cast<std::uint32_t>(random() % 8)}};
    default:
      return {object,
              Path{static_cast<std::uint32_t>(random() % 8), 1, static_cast<std::uint32_t>(random() % 8)}};
  }
}

// Path {7} follows all fields of a clustered object; a random object id is even only where it is missing.
FieldId MissingKey(KeyKind kind, std::size_t i, std::mt19937_64& random) {
  if (kind != KeyKind::kRandom) return {OID(1 + i / 4), Path{7, static_cast<std::uint32_t>(i % 4)}};
  FieldId key = RandomKey(random);
  key.oid = OID(key.oid.m_value & ~std::uint64_t{1});
  return key;
}

}  // namespace

std::string_view KeyKindName(KeyKind kind) {
  switch (kind) {
    case KeyKind::kClustered:
      return "clustered";
    case KeyKind::kRandom:
      return "random";
    default:
      return "ascending";
  }
}

std::vector<FieldId> MakeKeys(KeyKind kind, std::size_t count) {
  std::mt19937_64 random(kSeed);
  std::vector<FieldId> keys;
  keys.reserve(count);
  for (std::size_t i = 0; i < count; ++i)
    keys.push_back(kind == KeyKind::kRandom ? RandomKey(random) : ClusteredKey(i));
  if (kind == KeyKind::kClustered) std::shuffle(keys.begin(), keys.end(), random);
  return keys;
}

std::vector<FieldId> MakeMissingKeys(KeyKind kind, std::size_t count) {
  std::mt19937_64 random(kSeed + 1);
  std::vector<FieldId> keys;
  keys.reserve(count);
  for (std::size_t i = 0; i < count; ++i) keys.push_back(MissingKey(kind, i, random));
  std::shuffle(keys.begin(), keys.end(), random);
  return keys;
}

std::vector<std::uint32_t> MakeOrder(std::size_t count, std::uint64_t salt) {
  std::mt19937_64 random(kSeed + 2 + salt);
  std::vector<std::uint32_t> order(count);
  for (std::size_t i = 0; i < count; ++i) order[i] = static_cast<std::uint32_t>(i);
  std::shuffle(order.begin(), order.end(), random);
  return order;
}

VectorTombstones PayloadKind<VectorTombstones>::Make(std::uint64_t n) {
  const auto q = static_cast<ssize_t>(n % 200);
  VectorTombstones payload;
  payload.m_tombstones.safe_push_back({q, q + 2});
  payload.m_tombstones.safe_push_back({q + 5, q + 6 + static_cast<ssize_t>(n % 7)});
  return payload;
}

VectorInsertions PayloadKind<VectorInsertions>::Make(std::uint64_t n) {
  VectorInsertions payload;
  payload.m_u2 = static_cast<ssize_t>(kTouched);
  auto* last = payload.m_c.m_first;
  for (std::uint64_t i = 0; i < 1 + n % 3; ++i) {
    VectorInsertionInterval run;
    run.m_opid.s.Data1 = static_cast<std::uint32_t>(n % 5 + 1);
    run.m_opid.t = static_cast<ssize_t>(n * 3 + i);
    run.m_q = static_cast<ssize_t>(10 * i);
    run.m_n = static_cast<ssize_t>(1 + n % 4);
    run.m_u = static_cast<ssize_t>(10 * i + 1);
    last = payload.m_c.InsertAfter(last, run);
  }
  return payload;
}

}  // namespace vemo::bench
