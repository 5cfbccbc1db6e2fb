#include "platform/variable_length.h"

#include <gtest/gtest.h>

#include <random>
#include <vector>

#include "platform/types.h"
#include "tests/support/seed.h"

namespace vemo {
namespace {

struct Golden {
  std::uint64_t value;
  Bytes bytes;
};

// The last value of every length and the first of the next.
const std::vector<Golden> kGolden = {
    {0, {0x00}},
    {1, {0x01}},
    {0x7F, {0x7F}},
    {0x80, {0x80, 0x80}},
    {0x3FFF, {0xBF, 0xFF}},
    {0x4000, {0xC0, 0x40, 0x00}},
    {0x1FFFFF, {0xDF, 0xFF, 0xFF}},
    {0x200000, {0xE0, 0x20, 0x00, 0x00}},
    {0xFFFFFFF, {0xEF, 0xFF, 0xFF, 0xFF}},
    {0x10000000, {0xF0, 0x10, 0x00, 0x00, 0x00}},
    {0xFFFFFFFF, {0xF0, 0xFF, 0xFF, 0xFF, 0xFF}},
    {0x100000000, {0xF1, 0x00, 0x00, 0x00, 0x00}},
    {0x7FFFFFFFF, {0xF7, 0xFF, 0xFF, 0xFF, 0xFF}},
    {0x800000000, {0xF8, 0x08, 0x00, 0x00, 0x00, 0x00}},
    {0x3FFFFFFFFFF, {0xFB, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF}},
    {0x40000000000, {0xFC, 0x04, 0x00, 0x00, 0x00, 0x00, 0x00}},
    {0x1FFFFFFFFFFFF, {0xFD, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF}},
    {0x2000000000000, {0xFE, 0x02, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00}},
    {0xFFFFFFFFFFFFFF, {0xFE, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF}},
    {0x100000000000000, {0xFF, 0x01, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00}},
    {0xFFFFFFFFFFFFFFFF, {0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF}},
};

Bytes Written32(std::uint32_t value) {
  std::uint8_t bytes[MAX_VARIABLE_LENGTH_UINT_SIZE];
  return Bytes(bytes, SerialiseVariableLengthUint32(bytes, value));
}

Bytes Written64(std::uint64_t value) {
  std::uint8_t bytes[kMaxVariableLengthUint64Bytes];
  return Bytes(bytes, SerialiseVariableLengthUint64(bytes, value));
}

TEST(VariableLength, WritesTheBytesOfTheFormatIn64Bits) {
  for (const Golden& golden : kGolden)
    EXPECT_EQ(Written64(golden.value), golden.bytes) << std::hex << golden.value;
}

TEST(VariableLength, WritesTheSameBytesIn32Bits) {
  for (const Golden& golden : kGolden) {
    if (golden.value > 0xFFFFFFFF) continue;
    EXPECT_EQ(Written32(static_cast<std::uint32_t>(golden.value)), golden.bytes) << std::hex << golden.value;
  }
}

TEST(VariableLength, ReadsValueAndLengthBack) {
  for (const Golden& golden : kGolden) {
    std::uint64_t wide = 99;
    EXPECT_EQ(DeserialiseVariableLengthUint64(golden.bytes.data(), wide),
              golden.bytes.data() + golden.bytes.size());
    EXPECT_EQ(wide, golden.value);
    if (golden.value > 0xFFFFFFFF) continue;
    std::uint32_t narrow = 99;
    EXPECT_EQ(DeserialiseVariableLengthUint32(golden.bytes.data(), narrow),
              golden.bytes.data() + golden.bytes.size());
    EXPECT_EQ(narrow, golden.value);
  }
}

TEST(VariableLength, ReadsTheValueFromNineBytesWhateverFollows) {
  for (Golden golden : kGolden) {
    const std::size_t length = golden.bytes.size();
    for (const std::uint8_t behind : {0x00, 0xFF}) {
      golden.bytes.resize(length);
      golden.bytes.resize(9, behind);
      EXPECT_EQ(DeserialiseVariableLengthUint64FromNine(golden.bytes.data(), length), golden.value);
    }
  }
}

TEST(VariableLength, TheFirstByteTellsTheLength) {
  for (const Golden& golden : kGolden) EXPECT_EQ(VariableLengthBytes(golden.bytes[0]), golden.bytes.size());
}

TEST(VariableLength, BothWidthsAgreeOnRandomValues) {
  std::mt19937_64 random(test::TestSeed(20261121));
  for (int i = 0; i < 20000; ++i) {
    const std::uint64_t value = random() >> (random() % 64);
    std::uint64_t read = 0;
    const Bytes bytes = Written64(value);
    DeserialiseVariableLengthUint64(bytes.data(), read);
    ASSERT_EQ(read, value);
    if (value <= 0xFFFFFFFF) {
      ASSERT_EQ(Written32(static_cast<std::uint32_t>(value)), bytes);
    }
  }
}

}  // namespace
}  // namespace vemo
