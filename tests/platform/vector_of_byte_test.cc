#include "platform/vector_of_byte.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <new>
#include <string>

#include "tests/support/failing_allocator.h"

namespace vemo {
namespace {

void Append(VectorOfByte& buffer, const std::string& text) {
  std::memcpy(buffer.appendbytes(static_cast<ssize_t>(text.size())), text.data(), text.size());
}

std::string Contents(const VectorOfByte& buffer) {
  return std::string(reinterpret_cast<const char*>(buffer.data()), static_cast<std::size_t>(buffer.size()));
}

TEST(VectorOfByte, StartsEmptyWithoutMemory) {
  const auto before = test::LiveAllocations();
  const VectorOfByte buffer;
  EXPECT_EQ(buffer.size(), 0);
  EXPECT_EQ(buffer.capacity(), 0);
  EXPECT_EQ(test::LiveAllocations(), before);
}

TEST(VectorOfByte, AppendingGrowsToTheNeededSizePlusTheOldCapacity) {
  VectorOfByte buffer;
  const ssize_t capacities[] = {16, 48, 48, 112, 112, 112, 112, 240};
  for (const ssize_t capacity : capacities) {
    buffer.appendbytes(16);
    EXPECT_EQ(buffer.capacity(), capacity) << buffer.size();
  }
  EXPECT_EQ(buffer.size(), 128);
}

TEST(VectorOfByte, GrowingKeepsTheBytes) {
  VectorOfByte buffer;
  Append(buffer, "abc");
  Append(buffer, "defghijkl");
  EXPECT_EQ(Contents(buffer), "abcdefghijkl");
}

TEST(VectorOfByte, ReserveNeverShrinks) {
  VectorOfByte buffer;
  buffer.reserve(10);
  EXPECT_EQ(buffer.capacity(), 10);
  buffer.reserve(5);
  EXPECT_EQ(buffer.capacity(), 10);
  EXPECT_EQ(buffer.size(), 0);
}

TEST(VectorOfByte, InsertingOpensAGapAnywhereAndNeedsTheExactCapacity) {
  VectorOfByte buffer;
  Append(buffer, "ad");
  std::memcpy(buffer.insertbytes(1, 2), "bc", 2);
  EXPECT_EQ(Contents(buffer), "abcd");
  EXPECT_EQ(buffer.capacity(), 4);
  std::memcpy(buffer.insertbytes(0, 1), "<", 1);
  std::memcpy(buffer.insertbytes(5, 1), ">", 1);
  EXPECT_EQ(Contents(buffer), "<abcd>");
  EXPECT_EQ(buffer.capacity(), 6);
}

TEST(VectorOfByte, InsertingNothingIntoNothingGivesNull) {
  VectorOfByte buffer;
  EXPECT_EQ(buffer.insertbytes(0, 0), nullptr);
  EXPECT_EQ(buffer.capacity(), 0);
}

TEST(VectorOfByte, ErasingClosesTheGap) {
  VectorOfByte buffer;
  buffer.erasebytes(0, 0);
  Append(buffer, "abcdef");
  buffer.erasebytes(1, 2);
  EXPECT_EQ(Contents(buffer), "adef");
  buffer.erasebytes(2, 2);
  EXPECT_EQ(Contents(buffer), "ad");
  buffer.erasebytes(0, 2);
  EXPECT_EQ(buffer.size(), 0);
  EXPECT_EQ(buffer.capacity(), 6);
}

TEST(VectorOfByte, ClearKeepsTheCapacity) {
  VectorOfByte buffer;
  Append(buffer, "abc");
  buffer.clear();
  EXPECT_EQ(buffer.size(), 0);
  EXPECT_EQ(buffer.capacity(), 3);
}

TEST(VectorOfByte, SwapExchangesContentsAndCapacities) {
  VectorOfByte a, b;
  Append(a, "abc");
  a.swap(b);
  EXPECT_EQ(Contents(b), "abc");
  EXPECT_EQ(b.capacity(), 3);
  EXPECT_EQ(a.size(), 0);
  EXPECT_EQ(a.capacity(), 0);
}

TEST(VectorOfByte, AFailedAllocationLeavesTheBufferAsItWas) {
  for (const std::string& text : {std::string(VectorOfByte::kInlineBytes, 'i'), std::string(50, 'h')}) {
    VectorOfByte buffer;
    Append(buffer, text);
    {
      const test::FailingAllocation fail(1);
      EXPECT_THROW(buffer.appendbytes(1), std::bad_alloc);
    }
    {
      const test::FailingAllocation fail(1);
      EXPECT_THROW(buffer.insertbytes(1, 1), std::bad_alloc);
    }
    EXPECT_EQ(Contents(buffer), text);
    EXPECT_EQ(buffer.capacity(), static_cast<ssize_t>(text.size()));
  }
}

TEST(VectorOfByte, AssigningTakesTheContentsAndNoMoreCapacityThanTheyNeed) {
  for (const std::size_t from : {0u, 3u, 32u, 33u, 80u}) {
    for (const std::size_t to : {0u, 5u, 32u, 40u, 100u}) {
      VectorOfByte source, target;
      Append(source, std::string(from, 's'));
      source.reserve(static_cast<ssize_t>(from) + 7);
      Append(target, std::string(to, 't'));
      target.assign(source);
      EXPECT_EQ(Contents(target), std::string(from, 's'));
      EXPECT_EQ(target.capacity(), static_cast<ssize_t>(std::max(from, to)));
      EXPECT_EQ(Contents(source), std::string(from, 's'));
    }
  }
}

TEST(VectorOfByte, AnAssignmentThatCannotBeAllocatedLeavesTheBufferEmpty) {
  VectorOfByte source, target;
  Append(source, std::string(50, 's'));
  Append(target, "abc");
  const test::FailingAllocation fail(1);
  EXPECT_THROW(target.assign(source), std::bad_alloc);
  EXPECT_EQ(target.size(), 0);
}

TEST(VectorOfByte, FewBytesNeedNoAllocation) {
  const auto before = test::LiveAllocations();
  VectorOfByte buffer;
  Append(buffer, std::string(VectorOfByte::kInlineBytes, 'x'));
  EXPECT_EQ(test::LiveAllocations(), before);
  Append(buffer, "y");
  EXPECT_EQ(test::LiveAllocations(), before + 1);
}

TEST(VectorOfByte, BytesKeepTheirOrderAcrossTheWayToTheHeap) {
  for (ssize_t piece = 1; piece <= 40; ++piece) {
    VectorOfByte buffer;
    std::string expected;
    ssize_t capacity = 0;
    for (char c = 'a'; c < 'a' + 20; ++c) {
      const std::string text(static_cast<std::size_t>(piece), c);
      Append(buffer, text);
      expected += text;
      const auto size = static_cast<ssize_t>(expected.size());
      if (capacity < size) capacity += size;
      EXPECT_EQ(buffer.capacity(), capacity);
    }
    EXPECT_EQ(Contents(buffer), expected);
    buffer.erasebytes(1, buffer.size() - 2);
    EXPECT_EQ(Contents(buffer), expected.substr(0, 1) + expected.back());
  }
}

TEST(VectorOfByte, SwapsWhereverTheBytesLie) {
  const std::string texts[] = {"", "short", std::string(100, 'l')};
  for (const std::string& left : texts) {
    for (const std::string& right : texts) {
      VectorOfByte a, b;
      Append(a, left);
      Append(b, right);
      a.swap(b);
      EXPECT_EQ(Contents(a), right);
      EXPECT_EQ(Contents(b), left);
      a.swap(a);
      EXPECT_EQ(Contents(a), right);
    }
  }
}

TEST(VectorOfByte, FreesItsMemory) {
  const auto before = test::LiveAllocations();
  {
    VectorOfByte buffer;
    buffer.appendbytes(10);
    buffer.appendbytes(1000);
    buffer.appendbytes(10'000);
  }
  EXPECT_EQ(test::LiveAllocations(), before);
}

}  // namespace
}  // namespace vemo
