#include "vxUtils/Archive.h"

#include <gtest/gtest.h>

#include <limits>
#include <stdexcept>
#include <vector>

#include "platform/error.h"
#include "tests/support/assertion_death.h"
#include "tests/support/failing_allocator.h"
#include "vxUtils/ByteForms.h"

namespace vemo {
namespace {

[[maybe_unused]] constexpr const char* kPosInBuffer =
    "m_writeBuffer <= m_pos && m_pos <= m_writeBuffer+ARCHIVE_BUFSIZE";

// Remembers how many bytes came with each call.
class PieceStream : public BytesOutputStream {
 public:
  void WriteStream(const void* bytes, ssize_t count) override {
    BytesOutputStream::WriteStream(bytes, count);
    m_pieces.push_back(count);
  }
  std::vector<ssize_t> m_pieces;
};

class ArchiveTest : public testing::Test {
 protected:
  // Fills the buffer with `count` bytes.
  void Fill(ssize_t count) {
    while (ar.NumBufferedWrites() < count) {
      std::uint8_t* p = ar.BeginWrite(1);
      *p = 0xAA;
      ar.EndWrite(p + 1);
    }
  }

  PieceStream stream;
  Archive ar{&stream};
};

template <class T>
Bytes Written(T value) {
  BytesOutputStream stream;
  Archive ar(&stream);
  SerialiseVariableLengthUint(ar, value);
  ar.Flush();
  return stream.m_bytes;
}

ssize_t Read(const Bytes& bytes) {
  InputArchive ar(bytes.data());
  ssize_t value = 0;
  DeserialiseVariableLengthUint(ar, value);
  EXPECT_EQ(ar.ptr(), bytes.data() + bytes.size());
  return value;
}

TEST_F(ArchiveTest, ANumberFitsBehind4091BytesWithoutAFlush) {
  Fill(4091);
  SerialiseVariableLengthUint(ar, 7);
  EXPECT_TRUE(stream.m_pieces.empty());
  EXPECT_EQ(ar.NumBufferedWrites(), 4092);
}

TEST_F(ArchiveTest, ANumberBehind4092BytesFlushesFirst) {
  Fill(4092);
  SerialiseVariableLengthUint(ar, 7);
  EXPECT_EQ(stream.m_pieces, std::vector<ssize_t>{4092});
  EXPECT_EQ(ar.NumBufferedWrites(), 1);
}

TEST_F(ArchiveTest, AGuidFitsBehind4080BytesWithoutAFlush) {
  Fill(4080);
  ar << Guid_NULL;
  EXPECT_TRUE(stream.m_pieces.empty());
  EXPECT_EQ(ar.NumBufferedWrites(), 4096);
}

TEST_F(ArchiveTest, AGuidBehind4081BytesFlushesFirst) {
  Fill(4081);
  ar << Guid_NULL;
  EXPECT_EQ(stream.m_pieces, std::vector<ssize_t>{4081});
  EXPECT_EQ(ar.NumBufferedWrites(), 16);
}

TEST_F(ArchiveTest, AFullBufferIsFlushedByTheNextWrite) {
  Fill(4096);
  EXPECT_TRUE(stream.m_pieces.empty());
  SerialiseVariableLengthUint(ar, 7);
  EXPECT_EQ(stream.m_pieces, std::vector<ssize_t>{4096});
}

TEST_F(ArchiveTest, TheWholeBufferCanBeReservedAndNoMore) {
  Fill(1);
  EXPECT_EQ(ar.BeginWrite(4096), ar.m_writeBuffer);
  EXPECT_EQ(stream.m_pieces, std::vector<ssize_t>{1});
  EXPECT_ASSERTION(ar.BeginWrite(4097), "reserveSize <= ARCHIVE_BUFSIZE");
}

TEST_F(ArchiveTest, EndWriteAssertsThatThePositionAdvancesWithinTheBuffer) {
  [[maybe_unused]] constexpr const char* kText =
      "m_writeBuffer <= m_pos && m_pos <= pos && pos <= m_writeBuffer+ARCHIVE_BUFSIZE";
  Fill(10);
  [[maybe_unused]] std::uint8_t* behind = ar.m_writeBuffer + ARCHIVE_BUFSIZE;
  ++behind;
  EXPECT_ASSERTION(ar.EndWrite(ar.m_pos - 1), kText);
  EXPECT_ASSERTION(ar.EndWrite(behind), kText);
  ar.EndWrite(ar.m_pos);
  EXPECT_EQ(ar.NumBufferedWrites(), 10);
}

TEST_F(ArchiveTest, WritingAssertsThatThePositionLiesInTheBuffer) {
  ar.m_pos = ar.m_writeBuffer + ARCHIVE_BUFSIZE;
  ++ar.m_pos;
  EXPECT_ASSERTION(ar.BeginWrite(1), kPosInBuffer);
  EXPECT_ASSERTION(ar.SerialisePod(Guid_NULL), kPosInBuffer);
}

TEST_F(ArchiveTest, FlushHandsTheBytesOnAndCountsThem) {
  ar.Flush();
  EXPECT_TRUE(stream.m_pieces.empty());
  Fill(10);
  EXPECT_EQ(ar.GetNumBytesWritten(), 10);
  EXPECT_EQ(ar.GetNumBytesWrittenToStream(), 0);
  ar.Flush();
  EXPECT_EQ(stream.m_bytes, Bytes(10, 0xAA));
  EXPECT_EQ(ar.GetNumBytesWrittenToStream(), 10);
  EXPECT_EQ(ar.NumBufferedWrites(), 0);
  Fill(3);
  EXPECT_EQ(ar.GetNumBytesWritten(), 13);
}

TEST_F(ArchiveTest, BytesSplitByFlushesArriveInOrder) {
  Bytes expected;
  for (int i = 0; i < 3000; ++i) {
    SerialiseVariableLengthUint(ar, i);
    for (const std::uint8_t byte : Written(i)) expected.push_back(byte);
  }
  ar.Flush();
  EXPECT_GT(stream.m_pieces.size(), 1u);
  EXPECT_EQ(stream.m_bytes, expected);
}

// Wherever the buffer ends, as bytes and in pieces.
TEST(Archive, SeveralValuesAtOnceAreWrittenAsOneByOne) {
  for (ssize_t filled = ARCHIVE_BUFSIZE - 20; filled <= ARCHIVE_BUFSIZE; ++filled) {
    const auto write = [&](PieceStream& stream, bool atOnce) {
      Archive ar(&stream);
      for (ssize_t i = 0; i < filled; ++i) SerialiseVariableLengthUint(ar, 1);
      if (atOnce) {
        SerialiseVariableLengthUints(ar, ssize_t{-1}, 300, ssize_t{7});
      } else {
        SerialiseVariableLengthUint(ar, ssize_t{-1});
        SerialiseVariableLengthUint(ar, 300);
        SerialiseVariableLengthUint(ar, ssize_t{7});
      }
      ar.Flush();
    };
    PieceStream atOnce, oneByOne;
    write(atOnce, true);
    write(oneByOne, false);
    EXPECT_EQ(atOnce.m_bytes, oneByOne.m_bytes) << filled;
    EXPECT_EQ(atOnce.m_pieces, oneByOne.m_pieces) << filled;
  }
}

TEST(Archive, ItsDestructorWritesNothing) {
  BytesOutputStream stream;
  {
    Archive ar(&stream);
    ar << Guid_NULL;
  }
  EXPECT_TRUE(stream.m_bytes.empty());
}

TEST(Archive, WritingAllocatesNothing) {
  class NullStream : public IOutputStream {
    void WriteStream(const void*, ssize_t) override {}
  } stream;
  Archive ar(&stream);
  const FieldId field{OID(1), {1, 2, 3, 4, 5}};
  const test::FailingAllocation fail(1);
  for (int i = 0; i < 3000; ++i) ar << Guid_NULL << field << AsCompressedInt(i);
  EXPECT_FALSE(fail.HasFailed());
}

TEST(Archive, AnErrorOfTheStreamPassesThroughAndLeavesTheBytesBuffered) {
  class BrokenStream : public IOutputStream {
    void WriteStream(const void*, ssize_t) override { throw std::runtime_error("disk full"); }
  } stream;
  Archive ar(&stream);
  SerialiseVariableLengthUint(ar, 7);
  EXPECT_THROW(ar.Flush(), std::runtime_error);
  EXPECT_EQ(ar.NumBufferedWrites(), 1);
  EXPECT_EQ(ar.GetNumBytesWrittenToStream(), 0);
}

TEST(VariableLengthUint, KeepsTheLow32BitsAlone) {
  EXPECT_EQ(Written(ssize_t{4294967296 + 5}), Bytes{5});
  EXPECT_EQ(Read(Written(ssize_t{4294967296 + 5})), 5);
  EXPECT_EQ(Written(ssize_t{-1}), (Bytes{0xF0, 0xFF, 0xFF, 0xFF, 0xFF}));
  EXPECT_EQ(Written(int{-1}), (Bytes{0xF0, 0xFF, 0xFF, 0xFF, 0xFF}));
  EXPECT_EQ(Written(std::numeric_limits<ssize_t>::min()), Bytes{0});
}

TEST(VariableLengthUint, ReadsAre32BitsZeroExtended) {
  EXPECT_EQ(Read(Written(ssize_t{-1})), 4294967295);
  EXPECT_EQ(Read(Written(std::numeric_limits<int>::min())), 2147483648);
}

TEST(VariableLengthUint, WritesAndReadsAtAPointer) {
  std::uint8_t bytes[8] = {};
  std::uint8_t* end = SerialiseVariableLengthInteger<ssize_t>(bytes, 300);
  EXPECT_EQ(end, bytes + 2);
  ssize_t value = 0;
  EXPECT_EQ(DeserialiseVariableLengthInteger<ssize_t>(bytes, value), end);
  EXPECT_EQ(value, 300);
}

TEST(CompressedInt, IsWrittenLikeTheNumber) {
  for (const int value : {0, 1, 127, 128, -1, std::numeric_limits<int>::max()}) {
    EXPECT_EQ(ToBytes(AsCompressedInt(value)), Written(value)) << value;
  }
}

Bytes SchemaBytes(int schema) {
  BytesOutputStream stream;
  Archive ar(&stream);
  SerialiseSchema(ar, schema);
  ar.Flush();
  return stream.m_bytes;
}

int ReadSchema(const Bytes& bytes, int currentSchema) {
  InputArchive ar(bytes.data());
  int schema = -1;
  DeserialiseSchema(ar, currentSchema, schema);
  return schema;
}

TEST(Schema, IsOneCompressedNumber) {
  EXPECT_EQ(SchemaBytes(1), Bytes{0x01});
  EXPECT_EQ(SchemaBytes(200), (Bytes{0x80, 0xC8}));
}

TEST(Schema, MustBePositive) {
  EXPECT_ASSERTION(SchemaBytes(0), "schema > 0");
  EXPECT_ASSERTION(SchemaBytes(-1), "schema > 0");
}

TEST(Schema, ReadsOlderAndCurrentOnesAndRefusesOthers) {
  EXPECT_EQ(ReadSchema({0x01}, 1), 1);
  EXPECT_EQ(ReadSchema({0x01}, 2), 1);
  EXPECT_THROW(ReadSchema({0x02}, 1), MalformedBytes);
  EXPECT_THROW(ReadSchema({0x00}, 1), MalformedBytes);
  EXPECT_THROW(ReadSchema({0xF0, 0xFF, 0xFF, 0xFF, 0xFF}, 1), MalformedBytes);
}

TEST_F(ArchiveTest, StreamingOperatorsChain) {
  const Guid site{1, 2, 3, {4}};
  const FieldId field{OID(5), {6, 7}};
  ar << site << field << AsCompressedInt(8);
  ar.Flush();
  InputArchive in(stream.m_bytes.data());
  Guid readSite;
  FieldId readField;
  in >> readSite >> readField;
  EXPECT_EQ(readSite, site);
  EXPECT_EQ(readField, field);
  EXPECT_EQ(in.ptr(), stream.m_bytes.data() + stream.m_bytes.size() - 1);
}

}  // namespace
}  // namespace vemo
