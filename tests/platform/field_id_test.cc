#include "platform/field_id.h"

#include <gtest/gtest.h>

#include <unordered_set>
#include <vector>

#include "platform/error.h"
#include "vxUtils/ByteForms.h"

namespace vemo {
namespace {

TEST(Oid, DefaultIsNullAndHalvesAreThoseOfTheNumber) {
  EXPECT_TRUE(OID().IsNull());
  const OID oid(0x0123456789ABCDEFu);
  EXPECT_FALSE(oid.IsNull());
  EXPECT_EQ(oid.SeidHigh(), 0x01234567u);
  EXPECT_EQ(oid.SeidLow(), 0x89ABCDEFu);
}

TEST(Oid, IsOrderedAsAnUnsignedNumber) {
  EXPECT_LT(OID(1), OID(0x8000000000000000u));
  EXPECT_FALSE(OID(0x8000000000000000u) < OID(1));
  EXPECT_FALSE(OID(1) < OID(1));
}

TEST(Oid, CanBeAHashedKey) {
  const std::unordered_set<OID> ids = {OID(1), OID(2), OID(1)};
  EXPECT_EQ(ids.size(), 2u);
}

TEST(FieldId, IsOrderedByObjectThenByPath) {
  const std::vector<FieldId> ascending = {{OID(1), {}},  {OID(1), {0}}, {OID(1), {0, 5}},
                                          {OID(1), {1}}, {OID(2), {}},  {OID(0xFFFFFFFFFFFFFFFFu), {}}};
  for (std::size_t i = 0; i < ascending.size(); ++i) {
    for (std::size_t j = 0; j < ascending.size(); ++j) {
      EXPECT_EQ(ascending[i] < ascending[j], i < j) << i << " " << j;
      EXPECT_EQ(ascending[i] == ascending[j], i == j) << i << " " << j;
    }
  }
}

TEST(FieldId, TextNamesObjectAndSteps) {
  EXPECT_EQ(FieldIdText({OID(1), {0, 3}}), "1:0.3");
  EXPECT_EQ(FieldIdText({OID(12), {}}), "12:");
  EXPECT_EQ(FieldIdText({OID(18446744073709551615u), {4294967295u}}), "18446744073709551615:4294967295");
  EXPECT_EQ(ToText(FieldId{OID(7), {1, 2, 3, 4, 5}}), "7:1.2.3.4.5");
}

TEST(FieldId, ReadsItsTextBack) {
  for (const char* text : {"1:", "1:0", "1:0.3", "10:1.2.3.4.5.6", "18446744073709551615:4294967295"}) {
    EXPECT_EQ(FieldIdText(ParseFieldId(text)), text);
  }
}

TEST(FieldId, RefusesTextThatNamesNoField) {
  for (const char* text : {"",
                           "1",
                           ":",
                           ":0",
                           "0:0",
                           "01:0",
                           "1:00",
                           "1:0.",
                           "1:.0",
                           "1:0..1",
                           "1:0.x",
                           "x:0",
                           " 1:0",
                           "1: 0",
                           "1:0 ",
                           "+1:0",
                           "-1:0",
                           "1:-1",
                           "1:0:0",
                           "18446744073709551616:0",
                           "1:4294967296"}) {
    EXPECT_THROW(ParseFieldId(text), UsageError) << text;
  }
}

TEST(FieldId, TheErrorQuotesTheText) {
  try {
    ParseFieldId("abc");
    FAIL() << "accepted";
  } catch (const UsageError& error) {
    EXPECT_STREQ(error.what(), "\"abc\" is not a field of the form OBJECT:STEP.STEP, such as 1:0.3");
  }
}

TEST(FieldId, BytesAreTheObjectTheNumberOfStepsAndTheSteps) {
  EXPECT_EQ(ToBytes(FieldId{OID(1), {}}), (Bytes{0x01, 0x00}));
  EXPECT_EQ(ToBytes(FieldId{OID(300), {0, 200, 4294967295u}}),
            (Bytes{0x81, 0x2C, 0x03, 0x00, 0x80, 0xC8, 0xF0, 0xFF, 0xFF, 0xFF, 0xFF}));
  EXPECT_EQ(ToBytes(OID(0xFFFFFFFFFFFFFFFFu)), (Bytes{0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF}));
}

TEST(FieldId, ReadsItsBytesBack) {
  for (const FieldId& field :
       {FieldId{}, FieldId{OID(1), {0, 3}}, FieldId{OID(1ull << 40), {1, 2, 3, 4, 5, 6}}}) {
    FieldId read{OID(9), {9, 9, 9, 9, 9}};
    FromBytes(ToBytes(field), read);
    EXPECT_EQ(read, field);
  }
}

}  // namespace
}  // namespace vemo
