#include "vxUtils/BoundedReader.h"

#include <gtest/gtest.h>

#include <functional>
#include <string>

namespace vemo {
namespace {

// Reads `bytes` with `read` and expects a refusal at `offset` for `reason`.
void ExpectRefusal(const Bytes& bytes, const std::function<void(BoundedReader&)>& read, std::size_t offset,
                   const std::string& reason) {
  BoundedReader reader(bytes);
  try {
    read(reader);
    ADD_FAILURE() << "accepted; expected: " << reason;
  } catch (const MalformedBytes& error) {
    EXPECT_EQ(error.offset(), offset) << reason;
    EXPECT_EQ(error.what(), "malformed bytes at offset " + std::to_string(offset) + ": " + reason);
  }
}

void Read32(BoundedReader& reader) {
  reader.ReadUint32();
}
void Read64(BoundedReader& reader) {
  reader.ReadUint64();
}
void ReadField(BoundedReader& reader) {
  reader.ReadField();
}

TEST(BoundedReader, ReadsNumbersOneAfterTheOther) {
  const Bytes bytes = {0x05, 0x80, 0x80, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF};
  BoundedReader reader(bytes);
  EXPECT_EQ(reader.remaining(), 12u);
  EXPECT_EQ(reader.ReadUint32(), 5u);
  EXPECT_EQ(reader.offset(), 1u);
  EXPECT_EQ(reader.ReadUint32(), 128u);
  EXPECT_EQ(reader.ReadUint64(), 0xFFFFFFFFFFFFFFFFu);
  EXPECT_EQ(reader.remaining(), 0u);
  reader.ExpectEnd();
}

TEST(BoundedReader, RefusesANumberThatIsNotThere) {
  ExpectRefusal({}, Read32, 0, "the bytes end where a number should begin");
  ExpectRefusal({}, Read64, 0, "the bytes end where a number should begin");
}

TEST(BoundedReader, RefusesANumberThatIsCutOff) {
  ExpectRefusal({0x80}, Read32, 0, "the bytes end inside a number");
  ExpectRefusal({0xF0, 0xFF, 0xFF, 0xFF}, Read32, 0, "the bytes end inside a number");
  ExpectRefusal({0xFF, 1, 2, 3, 4, 5, 6, 7}, Read64, 0, "the bytes end inside a number");
}

TEST(BoundedReader, RefusesANumberInALongerFormThanItNeeds) {
  ExpectRefusal({0x80, 0x7F}, Read32, 0, "a number is not in its shortest form");
  ExpectRefusal({0xF0, 0x00, 0x00, 0x00, 0x00}, Read32, 0, "a number is not in its shortest form");
  ExpectRefusal({0xFF, 0, 0, 0, 0, 0, 0, 0, 1}, Read64, 0, "a number is not in its shortest form");
}

TEST(BoundedReader, RefusesAWideNumberWhereANarrowOneBelongs) {
  ExpectRefusal({0xF1, 0, 0, 0, 0}, Read32, 0, "a number has more than 32 bits");
  const Bytes largest = {0xF0, 0xFF, 0xFF, 0xFF, 0xFF};
  BoundedReader reader(largest);
  EXPECT_EQ(reader.ReadUint32(), 0xFFFFFFFFu);
}

// Far from the end, where a number is read at once, as near it.
TEST(BoundedReader, RefusesTheSameNumbersWhateverFollows) {
  const auto followed = [](Bytes bytes, std::uint8_t by) {
    bytes.insert(bytes.end(), 9, by);
    return bytes;
  };
  for (const std::uint8_t by : {0x00, 0xFF}) {
    ExpectRefusal(followed({0x80, 0x7F}, by), Read32, 0, "a number is not in its shortest form");
    ExpectRefusal(followed({0xC0, 0x3F, 0xFF}, by), Read64, 0, "a number is not in its shortest form");
    ExpectRefusal(followed({0xFE, 0, 0, 0, 0, 0, 0, 1}, by), Read64, 0, "a number is not in its shortest form");
    ExpectRefusal(followed({0xFF, 0, 0, 0, 0, 0, 0, 0, 1}, by), Read64, 0, "a number is not in its shortest form");
    ExpectRefusal(followed({0xF1, 0, 0, 0, 0}, by), Read32, 0, "a number has more than 32 bits");
    const Bytes sound = followed({0xF0, 0xFF, 0xFF, 0xFF, 0xFF}, by);
    BoundedReader reader(sound);
    EXPECT_EQ(reader.ReadUint32(), 0xFFFFFFFFu);
    EXPECT_EQ(reader.offset(), 5u);
  }
}

TEST(BoundedReader, RefusesACountThatTheBytesCannotHold) {
  const auto readCount = [](BoundedReader& reader) { reader.ReadCount(3); };
  ExpectRefusal({0x02, 1, 2, 3, 4, 5}, readCount, 0, "the count 2 is more than the bytes can hold");
  const Bytes enough = {0x02, 1, 2, 3, 4, 5, 6};
  BoundedReader reader(enough);
  EXPECT_EQ(reader.ReadCount(3), 2u);
}

TEST(BoundedReader, RefusesASchemaOfZeroOrFromTheFuture) {
  const auto readSchema = [](BoundedReader& reader) { reader.ReadSchema(2); };
  ExpectRefusal({0x00}, readSchema, 0, "schema 0 is not one of 1 to 2");
  ExpectRefusal({0x03}, readSchema, 0, "schema 3 is not one of 1 to 2");
  for (const std::uint8_t schema : {std::uint8_t{1}, std::uint8_t{2}}) {
    const Bytes bytes = {schema};
    BoundedReader reader(bytes);
    reader.ReadSchema(2);
    EXPECT_EQ(reader.offset(), 1u);
  }
}

TEST(BoundedReader, ReadsAGuidAndRefusesAShortOne) {
  Bytes bytes = {0x67, 0x45, 0x23, 0x01, 0xAB, 0x89, 0xEF, 0xCD, 1, 2, 3, 4, 5, 6, 7, 8};
  BoundedReader reader(bytes);
  EXPECT_EQ(reader.ReadGuid(), (Guid{0x01234567u, 0x89AB, 0xCDEF, {1, 2, 3, 4, 5, 6, 7, 8}}));
  EXPECT_EQ(reader.remaining(), 0u);
  bytes.pop_back();
  ExpectRefusal(
      bytes, [](BoundedReader& r) { r.ReadGuid(); }, 0, "the bytes end inside a Guid");
}

TEST(BoundedReader, ReadsAFieldAndRefusesAShortOne) {
  const Bytes bytes = {0x81, 0x00, 0x02, 0x00, 0x03};
  BoundedReader reader(bytes);
  const FieldForm field = reader.ReadField();
  EXPECT_EQ(field.object, 256u);
  EXPECT_EQ(field.head, 0x0003000000000000u);
  EXPECT_EQ(field.steps, bytes.data() + 3);
  EXPECT_EQ(field.bytes, 2u);
  reader.ExpectEnd();
  ExpectRefusal({0x01}, ReadField, 1, "the bytes end where a number should begin");
  ExpectRefusal({0x01, 0x02, 0x00}, ReadField, 1, "the count 2 is more than the bytes can hold");
  ExpectRefusal({0x01, 0x02, 0x00, 0x80}, ReadField, 3, "the bytes end inside a number");
}

// Whether a word of steps can be read at once, or near the end they must be read one by one.
TEST(BoundedReader, RefusesTheSameStepsWhateverFollows) {
  for (const std::size_t following : {0u, 1u, 5u, 9u}) {
    const auto followed = [&](Bytes bytes) {
      bytes.insert(bytes.end(), following, 0);
      return bytes;
    };
    ExpectRefusal(followed({0x01, 0x02, 0x05, 0x80, 0x7F}), ReadField, 3, "a number is not in its shortest form");
    ExpectRefusal(followed({0x01, 0x02, 0x05, 0xF1, 0, 0, 0, 0}), ReadField, 3, "a number has more than 32 bits");
    const Bytes sound = followed({0x01, 0x03, 0x05, 0x80, 0x80, 0x06});
    BoundedReader reader(sound);
    const FieldForm field = reader.ReadField();
    EXPECT_EQ(field.head, 0x0580800600000000u);
    EXPECT_EQ(field.bytes, 4u);
    EXPECT_EQ(reader.offset(), 6u);
  }
}

TEST(BoundedReader, RefusesBytesBehindTheRecord) {
  ExpectRefusal(
      {0x01, 0x02},
      [](BoundedReader& reader) {
        reader.ReadUint32();
        reader.ExpectEnd();
      },
      1, "the record should end here");
}

}  // namespace
}  // namespace vemo
