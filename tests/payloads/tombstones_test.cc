#include <gtest/gtest.h>

#include <cstring>
#include <type_traits>
#include <utility>

#include "tests/payloads/example_payloads.h"
#include "tests/support/assertion_death.h"
#include "tests/support/failing_allocator.h"
#include "vxUtils/ByteForms.h"

namespace vemo {
namespace {

using test::Tombstones;

static_assert(std::is_same_v<VectorTombstones, TPtoQMap<long>>);
static_assert(std::is_same_v<VectorTombstones, PtoQMap>);
static_assert(std::is_nothrow_default_constructible_v<VectorTombstones>);
static_assert(std::is_nothrow_move_constructible_v<VectorTombstones>);
static_assert(std::is_nothrow_move_assignable_v<VectorTombstones>);

// Reads without the checks that bytes from outside pass first.
[[maybe_unused]] void ReadTrusting(const Bytes& bytes) {
  VectorTombstones map;
  InputArchive ar(bytes.data());
  ar >> map;
}

TEST(Tombstones, DefaultHasNone) {
  const VectorTombstones map;
  EXPECT_EQ(map.begin(), map.end());
  EXPECT_EQ(ToText(map), "[]{}");
  EXPECT_EQ(ToBytes(map), Bytes{0});
}

TEST(Tombstones, TextDrawsLivePositionsUpToTheLastRun) {
  EXPECT_EQ(ToText(Tombstones({{1, 3}, {5, 6}})), "[.**..*]{[1,3)[5,6)}");
  EXPECT_EQ(ToText(Tombstones({{0, 1}})), "[*]{[0,1)}");
}

TEST(Tombstones, TextOfOverlappingRunsIsAnAssertion) {
  EXPECT_ASSERTION(ToText(Tombstones({{1, 3}, {2, 4}})), "dp >= 0");
}

TEST(Tombstones, TextCounts32BitsOfPositions) {
  EXPECT_EQ(ToText(Tombstones({{4294967295, 4294967297}})), "[**]{[4294967295,4294967297)}");
  EXPECT_EQ(ToText(Tombstones({{4294967298, 4294967299}})), "[..*]{[4294967298,4294967299)}");
}

TEST(Tombstones, RepeatedCharactersWriteNothingForACountOfZeroOrBelow) {
  std::ostringstream out;
  xostream os(out);
  WriteRepeatedChars(os, '*', -1);
  WriteRepeatedChars(os, '*', 0);
  EXPECT_EQ(out.str(), "");
  WriteRepeatedChars(os, '*', 3);
  EXPECT_EQ(out.str(), "***");
}

TEST(Tombstones, BytesAreCountGapsAndLengths) {
  EXPECT_EQ(ToBytes(Tombstones({{1, 3}, {5, 6}})), (Bytes{2, 1, 2, 2, 1}));
  EXPECT_EQ(ToBytes(Tombstones({{0, 1}})), (Bytes{1, 0, 1}));
  EXPECT_EQ(ToBytes(Tombstones({{200, 500}})), (Bytes{1, 0x80, 0xC8, 0x81, 0x2C}));
}

TEST(Tombstones, BytesKeepTheLow32BitsOfGapsAndLengths) {
  EXPECT_EQ(ToBytes(Tombstones({{4294967296 + 3, 4294967296 + 4}})), (Bytes{1, 3, 1}));
  EXPECT_EQ(ToBytes(Tombstones({{3, 3 + 4294967296 + 2}})), (Bytes{1, 3, 2}));
}

TEST(Tombstones, ReadsItsBytesBackOverWhatItHeld) {
  for (const VectorTombstones& map : {Tombstones({}), Tombstones({{0, 1}}), Tombstones({{1, 3}, {5, 6}}),
                                      Tombstones({{0, 4294967295}, {4294967296, 4294967297}})}) {
    VectorTombstones read = Tombstones({{7, 9}, {20, 30}});
    FromBytes(ToBytes(map), read);
    EXPECT_EQ(read, map);
    read.AssertValid();
  }
}

TEST(Tombstones, WritingAcceptsRunsThatTouchAndRefusesOverlap) {
  EXPECT_EQ(ToBytes(Tombstones({{0, 1}, {1, 2}})), (Bytes{2, 0, 1, 0, 1}));
  EXPECT_ASSERTION(ToBytes(Tombstones({{0, 2}, {1, 3}})), "t <= i->t1");
}

TEST(Tombstones, ReadingAssertsThatRunsNeitherTouchNorAreEmpty) {
  EXPECT_ASSERTION(ReadTrusting({2, 0, 1, 0, 1}), "(*this)[n-1].t2 < h.t1");
  EXPECT_ASSERTION(ReadTrusting({1, 4, 0}), "!h.empty()");
}

TEST(Tombstones, BytesFromOutsideWithSuchRunsAreRefused) {
  VectorTombstones map = Tombstones({{7, 9}});
  EXPECT_THROW(FromBytes(Bytes{2, 0, 1, 0, 1}, map), MalformedBytes);
  EXPECT_THROW(FromBytes(Bytes{1, 4, 0}, map), MalformedBytes);
  EXPECT_EQ(map, Tombstones({{7, 9}}));
}

TEST(Tombstones, EqualityIsThatOfTheRuns) {
  EXPECT_EQ(Tombstones({{1, 3}, {5, 6}}), Tombstones({{1, 3}, {5, 6}}));
  EXPECT_NE(Tombstones({{1, 3}}), Tombstones({{1, 3}, {5, 6}}));
  EXPECT_NE(Tombstones({{1, 3}}), Tombstones({{1, 4}}));
}

TEST(Tombstones, CopiesAreIndependentAndMovesTakeTheRuns) {
  VectorTombstones source = Tombstones({{1, 3}});
  const VectorTombstones copy = source;
  VectorTombstones assigned = Tombstones({{7, 9}, {11, 12}});
  assigned = source;
  source.Insert(0, 1);
  EXPECT_EQ(copy, Tombstones({{1, 3}}));
  EXPECT_EQ(assigned, Tombstones({{1, 3}}));
  const VectorTombstones moved = std::move(source);
  EXPECT_EQ(moved, Tombstones({{2, 4}}));
}

TEST(Tombstones, SwapExchangesTheRuns) {
  VectorTombstones a = Tombstones({{1, 3}}), b;
  a.swap(b);
  EXPECT_EQ(a, VectorTombstones());
  EXPECT_EQ(b, Tombstones({{1, 3}}));
}

TEST(Tombstones, CanBeRelocatedAsRawBytes) {
  const auto before = test::LiveAllocations();
  {
    alignas(VectorTombstones) std::byte slots[2][sizeof(VectorTombstones)];
    ::new (slots[0]) VectorTombstones(Tombstones({{1, 3}}));
    std::memcpy(slots[1], slots[0], sizeof(VectorTombstones));
    std::memset(slots[0], 0xEE, sizeof(VectorTombstones));
    auto* map = reinterpret_cast<VectorTombstones*>(slots[1]);
    EXPECT_EQ(*map, Tombstones({{1, 3}}));
    map->~VectorTombstones();
  }
  EXPECT_EQ(test::LiveAllocations(), before);
}

}  // namespace
}  // namespace vemo
