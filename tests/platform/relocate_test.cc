#include "platform/relocate.h"

#include <gtest/gtest.h>

#include <memory>
#include <numeric>
#include <vector>

#include "tests/support/failing_allocator.h"

namespace vemo {
namespace {

TEST(Relocate, MovesOverlappingRangesEitherWay) {
  int up[] = {1, 2, 3, 4, 0};
  Relocate(up + 1, up, 4);
  EXPECT_EQ(std::vector<int>(up, up + 5), (std::vector<int>{1, 1, 2, 3, 4}));
  int down[] = {0, 1, 2, 3, 4};
  Relocate(down, down + 1, 4);
  EXPECT_EQ(std::vector<int>(down, down + 5), (std::vector<int>{1, 2, 3, 4, 4}));
}

TEST(Relocate, ACountOfNothingTouchesNothing) {
  int number = 1;
  Relocate(&number, static_cast<const int*>(nullptr), 0);
  EXPECT_EQ(number, 1);
}

TEST(Relocate, AFieldOwnsItsPathAtItsNewPlaceAlone) {
  const auto before = test::LiveAllocations();
  {
    alignas(FieldId) std::byte slots[2][sizeof(FieldId)];
    for (const FieldId& field : {FieldId{OID(1), {1, 2}}, FieldId{OID(2), {1, 2, 3, 4, 5, 6}}}) {
      auto* source = ::new (slots[0]) FieldId(field);
      auto* target = reinterpret_cast<FieldId*>(slots[1]);
      Relocate(target, source, 1);
      EXPECT_EQ(*target, field);
      std::destroy_at(target);
    }
  }
  EXPECT_EQ(test::LiveAllocations(), before);
}

TEST(Memswap, ExchangesRangesOfAnyLength) {
  for (const std::size_t n : {std::size_t{0}, std::size_t{1}, std::size_t{63}, std::size_t{64},
                              std::size_t{65}, std::size_t{200}}) {
    std::vector<unsigned char> a(n + 1, 'x'), b(n + 1, 'y');
    std::iota(a.begin(), a.end() - 1, static_cast<unsigned char>(0));
    std::iota(b.begin(), b.end() - 1, static_cast<unsigned char>(100));
    auto expectedA = b, expectedB = a;
    expectedA.back() = 'x';
    expectedB.back() = 'y';
    memswap(a.data(), b.data(), n);
    EXPECT_EQ(a, expectedA) << n;
    EXPECT_EQ(b, expectedB) << n;
  }
}

}  // namespace
}  // namespace vemo
