// Bytes that nobody vouches for: either they are the form of a value, which then has exactly these bytes, or
// they are refused and the target keeps what it held.
#include <gtest/gtest.h>

#include "tests/payloads/example_payloads.h"
#include "tests/support/failing_allocator.h"
#include "vxUtils/ByteForms.h"

namespace vemo {
namespace {

using test::Deletions;
using test::Insertions;
using test::kSite;
using test::Tombstones;

// Reads `bytes` and returns whether they were accepted.
template <class T>
bool Accepted(const Bytes& bytes, const T& held) {
  const Bytes heldBytes = ToBytes(held);
  T target = held;
  try {
    FromBytes(bytes, target);
  } catch (const MalformedBytes& error) {
    EXPECT_LE(error.offset(), bytes.size());
    EXPECT_EQ(ToBytes(target), heldBytes);
    return false;
  }
  EXPECT_EQ(ToBytes(target), bytes);
  return true;
}

template <class T>
void ExpectFormIsGuarded(const T& value, const T& held) {
  const Bytes form = ToBytes(value);
  EXPECT_TRUE(Accepted(form, held));
  for (std::size_t n = 0; n < form.size(); ++n) {
    EXPECT_FALSE(Accepted(Bytes(form.begin(), form.begin() + static_cast<ssize_t>(n)), held))
        << n << " bytes";
  }
  for (std::size_t i = 0; i < form.size(); ++i) {
    for (unsigned change = 1; change < 256; ++change) {
      Bytes changed = form;
      changed[i] = static_cast<std::uint8_t>(changed[i] ^ change);
      Accepted(changed, held);
    }
  }
  Bytes longer = form;
  longer.push_back(0);
  EXPECT_FALSE(Accepted(longer, held));
}

TEST(HostileBytes, Fields) {
  ExpectFormIsGuarded(FieldId{OID(300), {0, 200, 70000, 4294967295u, 1}}, FieldId{OID(7), {7}});
}

TEST(HostileBytes, Ids) {
  ExpectFormIsGuarded(OID(0xFFFFFFFFFFFFFFFFu), OID(7));
}

TEST(HostileBytes, Guids) {
  ExpectFormIsGuarded(kSite, Guid_NULL);
}

TEST(HostileBytes, TombstoneMaps) {
  ExpectFormIsGuarded(Tombstones({}), Tombstones({{7, 9}}));
  ExpectFormIsGuarded(Tombstones({{0, 1}, {2, 300}, {70000, 4294967295}}), Tombstones({{7, 9}}));
}

TEST(HostileBytes, OperationIds) {
  ExpectFormIsGuarded(Opid{kSite, 300}, Opid{Guid_NULL, 7});
}

TEST(HostileBytes, Records) {
  ExpectFormIsGuarded(VectorInsertionInterval{{kSite, 300}, 3, 70000, -1}, {{Guid_NULL, 7}, 7, 7, 7});
  ExpectFormIsGuarded(VectorDeletionInterval{{kSite, 300}, 3, 70000}, {{Guid_NULL, 7}, 7, 7});
}

TEST(HostileBytes, Insertions) {
  const VectorInsertions held = Insertions(7, {{{Guid_NULL, 7}, 7, 7, 7}});
  ExpectFormIsGuarded(Insertions(0, {}), held);
  ExpectFormIsGuarded(Insertions(9, {{{kSite, 300}, 3, 2, -1}, {{kSite, 8}, 4, 5, 6}}), held);
}

TEST(HostileBytes, Deletions) {
  const VectorDeletions held = Deletions({{{Guid_NULL, 7}, 7, 7}});
  ExpectFormIsGuarded(Deletions({}), held);
  ExpectFormIsGuarded(Deletions({{{kSite, 300}, 3, -1}, {{kSite, 8}, 4, 5}}), held);
}

TEST(HostileBytes, InsertionsAndDeletions) {
  VectorInsertionsAndDeletions held, value;
  held.m_deletions = Deletions({{{Guid_NULL, 7}, 7, 7}});
  value.m_insertions = Insertions(9, {{{kSite, 300}, 3, 2, -1}});
  value.m_deletions = Deletions({{{kSite, 8}, 4, 5}});
  ExpectFormIsGuarded(value, held);
}

TEST(HostileBytes, ACountIsBelievedOnlyAsFarAsTheBytesReach) {
  EXPECT_FALSE(Accepted(Bytes{0xF0, 0xFF, 0xFF, 0xFF, 0xFF}, Tombstones({})));
  EXPECT_FALSE(Accepted(Bytes{0xF0, 0xFF, 0xFF, 0xFF, 0xFF}, Deletions({})));
  EXPECT_FALSE(Accepted(Bytes{0, 0xF0, 0xFF, 0xFF, 0xFF, 0xFF}, Insertions(0, {})));
  EXPECT_FALSE(Accepted(Bytes{1, 0xF0, 0xFF, 0xFF, 0xFF, 0xFF}, FieldId()));
}

TEST(HostileBytes, AreCheckedWithoutAllocating) {
  VectorInsertionsAndDeletions value;
  value.m_insertions = Insertions(9, {{{kSite, 300}, 3, 2, -1}});
  value.m_deletions = Deletions({{{kSite, 8}, 4, 5}});
  const Bytes both = ToBytes(value), tombstones = ToBytes(Tombstones({{0, 1}, {2, 3}}));
  const test::FailingAllocation fail(1);
  BoundedReader bothReader(both), tombstonesReader(tombstones);
  CheckForm(bothReader, &value);
  CheckForm(tombstonesReader, static_cast<const VectorTombstones*>(nullptr));
  EXPECT_FALSE(fail.HasFailed());
  EXPECT_EQ(bothReader.remaining(), 0u);
  EXPECT_EQ(tombstonesReader.remaining(), 0u);
}

TEST(HostileBytes, TheRefusalNamesTheFault) {
  VectorTombstones map;
  try {
    FromBytes(Bytes{2, 0, 1, 0, 1}, map);
    FAIL() << "accepted";
  } catch (const MalformedBytes& error) {
    EXPECT_STREQ(error.what(), "malformed bytes at offset 4: a run of tombstones touches the one before it");
  }
  try {
    FromBytes(Bytes{1, 4, 0}, map);
    FAIL() << "accepted";
  } catch (const MalformedBytes& error) {
    EXPECT_STREQ(error.what(), "malformed bytes at offset 3: a run of tombstones is empty");
  }
}

}  // namespace
}  // namespace vemo
