// What holds for every payload.
#include <gtest/gtest.h>
#include <rapidcheck.h>

#include <cstdlib>
#include <string>
#include <utility>

#include "tests/payloads/example_payloads.h"
#include "tests/support/seed.h"
#include "vxUtils/ByteForms.h"

namespace vemo {
namespace {

// RapidCheck reads its configuration once, at the first check.
void SeedRapidCheck() {
  static const std::string parameters = "seed=" + std::to_string(test::TestSeed(20261121));
  ::setenv("RC_PARAMS", parameters.c_str(), 1);
}

// Checks a property with the seed of this run.
template <class Property>
bool Holds(const std::string& description, Property property) {
  SeedRapidCheck();
  return rc::check(description, property);
}

// What the byte form can carry; small numbers are as likely as large ones.
ssize_t AnyNumber() {
  return *rc::gen::oneOf(rc::gen::inRange<ssize_t>(0, 300), rc::gen::inRange<ssize_t>(0, 4294967296));
}

// A few sites, as in practice, so that equal ones meet.
Opid AnyOpid() {
  Guid site;
  site.Data1 = *rc::gen::inRange<std::uint32_t>(0, 3);
  site.Data4[7] = *rc::gen::arbitrary<std::uint8_t>();
  return {site, AnyNumber()};
}

int AnyCount() {
  return *rc::gen::inRange(0, 8);
}

VectorInsertions AnyInsertions() {
  VectorInsertions insertions;
  insertions.m_u2 = AnyNumber();
  for (int i = AnyCount(); i > 0; --i) {
    const VectorInsertionInterval record{AnyOpid(), AnyNumber(), AnyNumber(), AnyNumber()};
    insertions.m_c.InsertAfter(nullptr, record);
  }
  return insertions;
}

VectorDeletions AnyDeletions() {
  VectorDeletions deletions;
  for (int i = AnyCount(); i > 0; --i) {
    deletions.InsertAfter(nullptr, VectorDeletionInterval{AnyOpid(), AnyNumber(), AnyNumber()});
  }
  return deletions;
}

VectorTombstones AnyTombstones() {
  VectorTombstones map;
  ssize_t end = -1;
  for (int i = AnyCount(); i > 0; --i) {
    const ssize_t t1 = end + 1 + AnyNumber() % 4294967295;
    end = t1 + 1 + AnyNumber() % 4294967295;
    map.m_tombstones.safe_push_back({t1, end});
  }
  return map;
}

template <class T>
void ExpectRoundTrip(const T& value) {
  const Bytes bytes = ToBytes(value);
  T read;
  FromBytes(bytes, read);
  RC_ASSERT(ToBytes(read) == bytes);
  RC_ASSERT(read == value);
}

TEST(PayloadProperties, BytesBringEveryValueBack) {
  EXPECT_TRUE(Holds("insertions", [] {
    const VectorInsertions value = AnyInsertions();
    ExpectRoundTrip(value);
    VectorInsertions read;
    FromBytes(ToBytes(value), read);
    RC_ASSERT(ToText(read) == ToText(value));
  }));
  EXPECT_TRUE(Holds("deletions", [] { ExpectRoundTrip(AnyDeletions()); }));
  EXPECT_TRUE(Holds("tombstones", [] { ExpectRoundTrip(AnyTombstones()); }));
  EXPECT_TRUE(Holds("insertions and deletions", [] {
    VectorInsertionsAndDeletions value;
    value.m_insertions = AnyInsertions();
    value.m_deletions = AnyDeletions();
    ExpectRoundTrip(value);
  }));
}

TEST(PayloadProperties, CopiesAndMovesHaveTheSameBytes) {
  EXPECT_TRUE(Holds("insertions and deletions", [] {
    VectorInsertionsAndDeletions value, target;
    value.m_insertions = AnyInsertions();
    value.m_deletions = AnyDeletions();
    target.m_insertions = AnyInsertions();
    const Bytes bytes = ToBytes(value);
    const VectorInsertionsAndDeletions copy = value;
    RC_ASSERT(ToBytes(copy) == bytes);
    target = value;
    RC_ASSERT(ToBytes(target) == bytes);
    target = std::move(value);
    RC_ASSERT(ToBytes(target) == bytes);
  }));
}

FieldId AnyField() {
  FieldId field;
  field.oid = OID(*rc::gen::arbitrary<std::uint64_t>());
  for (Path::Element& element : field.path.Resize(static_cast<std::uint32_t>(AnyCount()))) {
    element = static_cast<Path::Element>(AnyNumber());
  }
  return field;
}

// Changes, inserts or removes a few bytes.
void Damage(Bytes& bytes) {
  for (int i = *rc::gen::inRange(1, 4); i > 0; --i) {
    const auto at = *rc::gen::inRange<ssize_t>(0, static_cast<ssize_t>(bytes.size()) + 1);
    const auto byte =
        static_cast<std::uint8_t>(*rc::gen::oneOf(rc::gen::inRange(0, 4), rc::gen::inRange(0, 256)));
    const int kind = *rc::gen::inRange(0, 3);
    if (kind == 0 || at == static_cast<ssize_t>(bytes.size())) {
      bytes.insert(bytes.begin() + at, byte);
    } else if (kind == 1) {
      bytes.erase(bytes.begin() + at);
    } else {
      bytes[static_cast<std::size_t>(at)] = byte;
    }
  }
}

template <class T>
void ExpectRefusedOrExact(T value) {
  Bytes bytes = ToBytes(value);
  Damage(bytes);
  bool accepted = true;
  try {
    FromBytes(bytes, value);
  } catch (const MalformedBytes&) {
    accepted = false;
  }
  RC_CLASSIFY(accepted, "accepted");
  if (accepted) RC_ASSERT(ToBytes(value) == bytes);
}

TEST(PayloadProperties, DamagedBytesAreRefusedOrAreTheFormOfAnotherValue) {
  EXPECT_TRUE(Holds("fields", [] { ExpectRefusedOrExact(AnyField()); }));
  EXPECT_TRUE(Holds("tombstones", [] { ExpectRefusedOrExact(AnyTombstones()); }));
  EXPECT_TRUE(Holds("insertions", [] { ExpectRefusedOrExact(AnyInsertions()); }));
  EXPECT_TRUE(Holds("deletions", [] { ExpectRefusedOrExact(AnyDeletions()); }));
}

}  // namespace
}  // namespace vemo
