// Operation ids, insertion and deletion records, and the payloads made of them.
#include <gtest/gtest.h>

#include <cstring>
#include <string>
#include <type_traits>
#include <utility>

#include "tests/payloads/example_payloads.h"
#include "tests/support/failing_allocator.h"
#include "vxUtils/ByteForms.h"

namespace vemo {
namespace {

using test::Deletions;
using test::Insertions;
using test::Joined;
using test::kSite;
using test::kSiteBytes;

const std::string kSiteText = test::kSiteText;
const Bytes kMinusOne = {0xF0, 0xFF, 0xFF, 0xFF, 0xFF};

template <class T>
constexpr bool kIsPayload = std::is_nothrow_default_constructible_v<T>&& std::is_nothrow_destructible_v<T>&&
    std::is_copy_constructible_v<T>&& std::is_copy_assignable_v<T>&& std::is_nothrow_move_constructible_v<T>&&
        std::is_nothrow_move_assignable_v<T>;
static_assert(kIsPayload<VectorInsertions>);
static_assert(kIsPayload<VectorDeletions>);
static_assert(kIsPayload<VectorInsertionsAndDeletions>);
static_assert(std::is_same_v<Opid, TOpid<Guid, long>>);
static_assert(std::is_same_v<VectorInsertions::List, TVectorCreateList<Guid, long, long>>);

// What `x` becomes by way of its bytes.
template <class T>
T Reread(const T& x) {
  T read;
  FromBytes(ToBytes(x), read);
  return read;
}

TEST(Opid, DefaultIsTheNullSiteWithNumberMinusOne) {
  EXPECT_EQ(Opid().s, Guid_NULL);
  EXPECT_EQ(Opid().t, -1);
  EXPECT_EQ(NullSiteId<Guid>(), Guid_NULL);
}

TEST(Opid, EqualityNeedsSiteAndNumber) {
  EXPECT_EQ((Opid{kSite, 7}), (Opid{kSite, 7}));
  EXPECT_NE((Opid{kSite, 7}), (Opid{kSite, 8}));
  EXPECT_NE((Opid{kSite, 7}), (Opid{Guid_NULL, 7}));
}

TEST(Opid, BytesAreTheSiteThenTheNumber) {
  EXPECT_EQ(ToBytes(Opid{kSite, 7}), Joined({kSiteBytes, {7}}));
  EXPECT_EQ(ToBytes(Opid()), Joined({Bytes(16, 0), kMinusOne}));
}

TEST(Opid, ANegativeNumberComesBackAs32Bits) {
  EXPECT_EQ(Reread(Opid{kSite, 7}), (Opid{kSite, 7}));
  EXPECT_EQ(Reread(Opid()).t, 4294967295);
}

TEST(Opid, Text) {
  EXPECT_EQ(ToText(Opid{kSite, 7}), "S" + kSiteText + ":7");
  EXPECT_EQ(ToText(Opid()), "S00000000-0000-0000-0000-000000000000:-1");
}

TEST(InsertionRecord, Defaults) {
  const VectorInsertionInterval record;
  EXPECT_EQ(record.m_opid, Opid());
  EXPECT_EQ(record.m_q, -1);
  EXPECT_EQ(record.m_n, 0);
  EXPECT_EQ(record.m_u, -1);
}

TEST(InsertionRecord, EqualityIgnoresLengthAndU) {
  const VectorInsertionInterval record{{kSite, 7}, 3, 2, 1};
  EXPECT_EQ(record, (VectorInsertionInterval{{kSite, 7}, 3, 9, 1}));
  EXPECT_EQ(record, (VectorInsertionInterval{{kSite, 7}, 3, 2, 9}));
  EXPECT_NE(record, (VectorInsertionInterval{{kSite, 7}, 4, 2, 1}));
  EXPECT_NE(record, (VectorInsertionInterval{{kSite, 8}, 3, 2, 1}));
}

TEST(InsertionRecord, BytesAreItsFieldsInOrder) {
  EXPECT_EQ(ToBytes(VectorInsertionInterval{{kSite, 7}, 3, 200, 1}),
            Joined({kSiteBytes, {7, 3, 0x80, 0xC8, 1}}));
  EXPECT_EQ(ToBytes(VectorInsertionInterval()), Joined({Bytes(16, 0), kMinusOne, kMinusOne, {0}, kMinusOne}));
}

TEST(InsertionRecord, ReadsItsBytesBack) {
  const VectorInsertionInterval read = Reread(VectorInsertionInterval{{kSite, 7}, 3, 200, 1});
  EXPECT_EQ(read, (VectorInsertionInterval{{kSite, 7}, 3, 0, 0}));
  EXPECT_EQ(read.m_n, 200);
  EXPECT_EQ(read.m_u, 1);
}

TEST(InsertionRecord, Text) {
  EXPECT_EQ(ToText(VectorInsertionInterval{{kSite, 7}, 3, 2, 1}), "(opid=S" + kSiteText + ":7 q=3 n=2 u=1)");
}

TEST(DeletionRecord, DefaultsHaveALengthOfMinusOne) {
  const VectorDeletionInterval record;
  EXPECT_EQ(record.m_opid, Opid());
  EXPECT_EQ(record.m_q, -1);
  EXPECT_EQ(record.m_n, -1);
}

TEST(DeletionRecord, EqualityNeedsEveryField) {
  const VectorDeletionInterval record{{kSite, 7}, 3, 2};
  EXPECT_EQ(record, (VectorDeletionInterval{{kSite, 7}, 3, 2}));
  EXPECT_NE(record, (VectorDeletionInterval{{kSite, 7}, 3, 9}));
  EXPECT_NE(record, (VectorDeletionInterval{{kSite, 7}, 4, 2}));
  EXPECT_NE(record, (VectorDeletionInterval{{kSite, 8}, 3, 2}));
}

TEST(DeletionRecord, BytesAreItsFieldsInOrder) {
  EXPECT_EQ(ToBytes(VectorDeletionInterval{{kSite, 7}, 3, 200}), Joined({kSiteBytes, {7, 3, 0x80, 0xC8}}));
  EXPECT_EQ(Reread(VectorDeletionInterval{{kSite, 7}, 3, 200}), (VectorDeletionInterval{{kSite, 7}, 3, 200}));
  EXPECT_EQ(Reread(VectorDeletionInterval()).m_n, 4294967295);
}

TEST(DeletionRecord, Text) {
  EXPECT_EQ(ToText(VectorDeletionInterval{{kSite, 7}, 3, 2}), "(opid=S" + kSiteText + ":7 q=3 n=2)");
}

TEST(VectorInsertions, DefaultIsEmpty) {
  const VectorInsertions insertions;
  EXPECT_EQ(insertions.m_u2, 0);
  EXPECT_EQ(insertions.m_c.size(), 0);
  EXPECT_EQ(ToText(insertions), "insertions(u2=0 c=[])");
  EXPECT_EQ(ToBytes(insertions), (Bytes{0, 0}));
}

TEST(VectorInsertions, EqualityIgnoresU2) {
  EXPECT_EQ(Insertions(1, {{{kSite, 7}, 3, 2, 1}}), Insertions(2, {{{kSite, 7}, 3, 2, 1}}));
  EXPECT_NE(Insertions(1, {{{kSite, 7}, 3, 2, 1}}), Insertions(1, {{{kSite, 7}, 4, 2, 1}}));
  EXPECT_NE(Insertions(1, {{{kSite, 7}, 3, 2, 1}}), Insertions(1, {}));
}

TEST(VectorInsertions, BytesAreU2ThenTheList) {
  const VectorInsertions insertions = Insertions(9, {{{kSite, 7}, 3, 2, 1}, {{kSite, 8}, 4, 5, 6}});
  EXPECT_EQ(ToBytes(insertions), Joined({{9, 2}, kSiteBytes, {7, 3, 2, 1}, kSiteBytes, {8, 4, 5, 6}}));
  EXPECT_EQ(ToText(Reread(insertions)), ToText(insertions));
}

TEST(VectorInsertions, Text) {
  EXPECT_EQ(ToText(Insertions(-9, {{{kSite, 7}, 3, 2, 1}, {{kSite, 8}, 4, 5, 6}})),
            "insertions(u2=-9 c=[(opid=S" + kSiteText + ":7 q=3 n=2 u=1),(opid=S" + kSiteText +
                ":8 q=4 n=5 u=6)])");
}

TEST(VectorInsertions, AssignmentTakesWhatEqualityIgnoresToo) {
  VectorInsertions target = Insertions(1, {{{kSite, 7}, 3, 9, 9}, {{kSite, 8}, 4, 5, 6}});
  const VectorInsertions source = Insertions(2, {{{kSite, 7}, 3, 2, 1}});
  target = source;
  EXPECT_EQ(ToText(target), ToText(source));
}

TEST(VectorDeletions, BytesAndTextAreThoseOfTheList) {
  EXPECT_EQ(ToBytes(VectorDeletions()), Bytes{0});
  EXPECT_EQ(ToText(VectorDeletions()), "[]");
  const VectorDeletions deletions = Deletions({{{kSite, 7}, 3, 2}});
  EXPECT_EQ(ToBytes(deletions), Joined({{1}, kSiteBytes, {7, 3, 2}}));
  EXPECT_EQ(ToText(deletions), "[(opid=S" + kSiteText + ":7 q=3 n=2)]");
  EXPECT_EQ(Reread(deletions), deletions);
}

VectorInsertionsAndDeletions Both(VectorInsertions insertions, VectorDeletions deletions) {
  VectorInsertionsAndDeletions both;
  both.m_insertions = std::move(insertions);
  both.m_deletions = std::move(deletions);
  return both;
}

TEST(VectorInsertionsAndDeletions, DefaultIsEmpty) {
  EXPECT_EQ(ToText(VectorInsertionsAndDeletions()), "(i=insertions(u2=0 c=[]) d=[])");
  EXPECT_EQ(ToBytes(VectorInsertionsAndDeletions()), (Bytes{0, 0, 0}));
}

TEST(VectorInsertionsAndDeletions, EqualityIgnoresU2AndNeedsBothLists) {
  const auto both = Both(Insertions(1, {{{kSite, 7}, 3, 2, 1}}), Deletions({{{kSite, 8}, 4, 5}}));
  EXPECT_EQ(both, Both(Insertions(2, {{{kSite, 7}, 3, 2, 1}}), Deletions({{{kSite, 8}, 4, 5}})));
  EXPECT_NE(both, Both(Insertions(1, {}), Deletions({{{kSite, 8}, 4, 5}})));
  EXPECT_NE(both, Both(Insertions(1, {{{kSite, 7}, 3, 2, 1}}), Deletions({})));
}

TEST(VectorInsertionsAndDeletions, BytesAndTextTakeInsertionsFirst) {
  const auto both = Both(Insertions(9, {{{kSite, 7}, 3, 2, 1}}), Deletions({{{kSite, 8}, 4, 5}}));
  EXPECT_EQ(ToBytes(both), Joined({{9, 1}, kSiteBytes, {7, 3, 2, 1, 1}, kSiteBytes, {8, 4, 5}}));
  EXPECT_EQ(ToText(both), "(i=insertions(u2=9 c=[(opid=S" + kSiteText + ":7 q=3 n=2 u=1)]) d=[(opid=S" +
                              kSiteText + ":8 q=4 n=5)])");
  EXPECT_EQ(ToText(Reread(both)), ToText(both));
}

TEST(VectorInsertionsAndDeletions, CopiesAreIndependent) {
  auto both = Both(Insertions(9, {{{kSite, 7}, 3, 2, 1}}), Deletions({{{kSite, 8}, 4, 5}}));
  const VectorInsertionsAndDeletions copy = both;
  VectorInsertionsAndDeletions assigned;
  assigned = both;
  const std::string text = ToText(both);
  both.m_insertions.m_c.Clear();
  both.m_deletions.m_first->m_q = 99;
  EXPECT_EQ(ToText(copy), text);
  EXPECT_EQ(ToText(assigned), text);
}

TEST(VectorInsertionsAndDeletions, ACopyThatFailsLeaksNothing) {
  const auto both = Both(Insertions(9, {{{kSite, 7}, 3, 2, 1}}), Deletions({{{kSite, 8}, 4, 5}}));
  const auto before = test::LiveAllocations();
  for (int nth = 1; nth <= 2; ++nth) {
    const test::FailingAllocation fail(nth);
    EXPECT_THROW(VectorInsertionsAndDeletions copy(both), std::bad_alloc) << nth;
  }
  EXPECT_EQ(test::LiveAllocations(), before);
}

TEST(VectorInsertionsAndDeletions, CanBeRelocatedAsRawBytes) {
  const auto before = test::LiveAllocations();
  {
    using Payload = VectorInsertionsAndDeletions;
    alignas(Payload) std::byte slots[2][sizeof(Payload)];
    const Payload original = Both(Insertions(9, {{{kSite, 7}, 3, 2, 1}}), Deletions({{{kSite, 8}, 4, 5}}));
    ::new (slots[0]) Payload(original);
    std::memcpy(slots[1], slots[0], sizeof(Payload));
    std::memset(slots[0], 0xEE, sizeof(Payload));
    auto* payload = reinterpret_cast<Payload*>(slots[1]);
    EXPECT_EQ(ToText(*payload), ToText(original));
    payload->~Payload();
  }
  EXPECT_EQ(test::LiveAllocations(), before);
}

}  // namespace
}  // namespace vemo
