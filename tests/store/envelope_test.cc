// The bytes around stored values.
#include "store/envelope.h"

#include <gtest/gtest.h>
#define XXH_INLINE_ALL
#include <xxhash.h>

#include <initializer_list>

#include "platform/error.h"

namespace vemo::test {
namespace {

Bytes Concatenate(std::initializer_list<Bytes> parts) {
  Bytes all;
  for (const Bytes& part : parts) all.insert(all.end(), part.begin(), part.end());
  return all;
}

Bytes LittleEndian(std::uint64_t value) {
  Bytes bytes;
  for (int i = 0; i < 8; ++i) bytes.push_back(static_cast<std::uint8_t>(value >> 8 * i));
  return bytes;
}

TEST(Envelope, OfARecordHasItsGoldenBytes) {
  Bytes record{0xEE};  // what was in the buffer before
  BeginRecord(record, 300, 0x1122334455667788);
  const Bytes body{'b', 'o', 'd', 'y'};
  record.insert(record.end(), body.begin(), body.end());
  SealRecord(record, 1, OID(0xABCDEF));
  const Bytes sealed{0x01,                                            // format
                     0x81, 0x2C,                                      // class 300
                     0x88, 0x77, 0x66, 0x55, 0x44, 0x33, 0x22, 0x11,  // commit
                     'b',  'o',  'd',  'y'};
  const std::uint64_t checksum = XXH3_64bits_withSeed(sealed.data(), sealed.size(), 0xABCDEF);
  EXPECT_EQ(checksum, 0x3B9D94FD605C910Du);
  EXPECT_EQ(record, Concatenate({{0xEE}, sealed, LittleEndian(checksum)}));

  const RecordEnvelope envelope = OpenRecord(ByteView(record).subspan(1), OID(0xABCDEF));
  EXPECT_EQ(envelope.classNumber, 300u);
  EXPECT_EQ(envelope.commit, 0x1122334455667788u);
  EXPECT_EQ(Bytes(envelope.body.begin(), envelope.body.end()), body);
}

TEST(Envelope, OfANamedValueHasItsGoldenBytes) {
  const Bytes value{'v', 'a', 'l'};
  const Bytes sealed{0x01, 'v', 'a', 'l'};
  const std::uint64_t seed = XXH3_64bits_withSeed("name", 4, 2);  // the meta table
  const std::uint64_t checksum = XXH3_64bits_withSeed(sealed.data(), sealed.size(), seed);
  EXPECT_EQ(checksum, 0xB765A58D4E2DE99u);
  EXPECT_EQ(SealNamed(NamedTable::kMeta, "name", value), Concatenate({sealed, LittleEndian(checksum)}));
}

TEST(Envelope, ARecordIsBoundToItsId) {
  Bytes record;
  BeginRecord(record, 1, 2);
  SealRecord(record, 0, OID(7));
  EXPECT_TRUE(OpenRecord(record, OID(7)).body.empty());
  EXPECT_THROW(OpenRecord(record, OID(8)), MalformedBytes);
}

TEST(Envelope, ANamedValueIsBoundToItsNameAndTable) {
  const Bytes sealed = SealNamed(NamedTable::kMeta, "a", Bytes{1, 2});
  EXPECT_EQ(OpenNamed(NamedTable::kMeta, "a", sealed).size(), 2u);
  EXPECT_THROW(OpenNamed(NamedTable::kMeta, "b", sealed), MalformedBytes);
  EXPECT_THROW(OpenNamed(NamedTable::kMeta, "", sealed), MalformedBytes);
  EXPECT_THROW(OpenNamed(NamedTable::kRoots, "a", sealed), MalformedBytes);
  EXPECT_TRUE(OpenNamed(NamedTable::kInfo, "n", SealNamed(NamedTable::kInfo, "n", {})).empty());
}

TEST(Envelope, AnotherFormatIsNamedWhereTheChecksumIsRight) {
  Bytes record;
  BeginRecord(record, 1, 2);
  record[0] = 9;
  SealRecord(record, 0, OID(7));
  try {
    OpenRecord(record, OID(7));
    ADD_FAILURE();
  } catch (const MalformedBytes& malformed) {
    EXPECT_EQ(malformed.offset(), 0u);
    EXPECT_NE(std::string(malformed.what()).find("format 9"), std::string::npos);
  }
}

// Sealed, so that what is refused is the shape and not the checksum.
TEST(Envelope, AHeadThatIsTooShortIsRefusedAtItsOffset) {
  const Bytes whole{1, 0x81, 0x2C, 1, 2, 3, 4, 5, 6, 7, 8};
  for (std::size_t length = 1; length < whole.size(); ++length) {
    Bytes record(whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(length));
    SealRecord(record, 0, OID(7));
    EXPECT_THROW(OpenRecord(record, OID(7)), MalformedBytes) << length;
  }
  for (std::size_t length = 0; length < 9; ++length)
    EXPECT_THROW(OpenRecord(Bytes(length, 1), OID(7)), MalformedBytes);
  EXPECT_THROW(OpenNamed(NamedTable::kMeta, "n", Bytes(8, 1)), MalformedBytes);
}

}  // namespace
}  // namespace vemo::test
