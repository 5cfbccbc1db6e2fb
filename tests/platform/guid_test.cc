#include "platform/guid.h"

#include <gtest/gtest.h>

#include <cstring>

#include "platform/error.h"
#include "platform/types.h"
#include "vxUtils/ByteForms.h"

namespace vemo {
namespace {

const Guid kGuid{0x01234567u, 0x89AB, 0xCDEF, {0x01, 0x23, 0x45, 0x67, 0x89, 0xAB, 0xCD, 0xEF}};
const char* const kText = "01234567-89ab-cdef-0123-456789abcdef";

TEST(Guid, NullIsSixteenZeroBytes) {
  const std::array<std::uint8_t, 16> zeros{};
  EXPECT_EQ(std::memcmp(&Guid_NULL, zeros.data(), 16), 0);
  EXPECT_EQ(Guid(), Guid_NULL);
  EXPECT_EQ(GuidText(Guid_NULL), "00000000-0000-0000-0000-000000000000");
}

TEST(Guid, LiesInMemoryWithItsNumbersLittleEndian) {
  const Bytes expected = {0x67, 0x45, 0x23, 0x01, 0xAB, 0x89, 0xEF, 0xCD,
                          0x01, 0x23, 0x45, 0x67, 0x89, 0xAB, 0xCD, 0xEF};
  EXPECT_EQ(std::memcmp(&kGuid, expected.data(), 16), 0);
  EXPECT_EQ(ToBytes(kGuid), expected);
  Guid read;
  FromBytes(expected, read);
  EXPECT_EQ(read, kGuid);
}

TEST(Guid, NetworkBytesAreInTheOrderOfTheText) {
  const std::array<std::uint8_t, 16> expected = {0x01, 0x23, 0x45, 0x67, 0x89, 0xAB, 0xCD, 0xEF,
                                                 0x01, 0x23, 0x45, 0x67, 0x89, 0xAB, 0xCD, 0xEF};
  EXPECT_EQ(GuidToNetworkBytes(kGuid), expected);
  EXPECT_EQ(GuidFromNetworkBytes(expected), kGuid);
}

TEST(Guid, EveryByteCountsInEquality) {
  for (std::size_t i = 0; i < 16; ++i) {
    auto bytes = GuidToNetworkBytes(kGuid);
    bytes[i] ^= 1;
    EXPECT_NE(GuidFromNetworkBytes(bytes), kGuid) << i;
  }
}

TEST(Guid, TextIsLowerCaseWithDashes) {
  EXPECT_EQ(GuidText(kGuid), kText);
  EXPECT_EQ(ToText(kGuid), kText);
}

TEST(Guid, ReadsItsTextInEitherCase) {
  EXPECT_EQ(ParseGuid(kText), kGuid);
  EXPECT_EQ(ParseGuid("01234567-89AB-CDEF-0123-456789ABCDEF"), kGuid);
}

TEST(Guid, RefusesOtherText) {
  for (const char* text :
       {"", "0", "01234567-89ab-cdef-0123-456789abcde", "01234567-89ab-cdef-0123-456789abcdef0",
        "0123456789ab-cdef-0123-456789abcdef--", "{1234567-89ab-cdef-0123-456789abcde}",
        "01234567089ab-cdef-0123-456789abcdef", "01234567-89ab-cdef-0123-456789abcdeg",
        "01234567-89ab-cdef-0123+456789abcdef", "0123456-789ab-cdef-0123-456789abcdef"}) {
    EXPECT_THROW(ParseGuid(text), UsageError) << text;
  }
}

}  // namespace
}  // namespace vemo
