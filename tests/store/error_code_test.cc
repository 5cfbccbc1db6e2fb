// What an exception's code says, and what to do about it.
#include "store/error.h"

#include <gtest/gtest.h>

#include "platform/error.h"
#include "tests/store/store_fixture.h"

namespace vemo::test {
namespace {

template <class E>
std::error_code CodeOf(const E& error) {
  try {
    throw E(error);
  } catch (const Error& caught) {
    return caught.code();
  }
}

TEST(ErrorCodes, TellClassesApartThroughTheBase) {
  EXPECT_EQ(CodeOf(UsageError("")), ErrorCode::kBadUse);
  EXPECT_EQ(CodeOf(MalformedBytes(3, "")), ErrorCode::kMalformedBytes);
  EXPECT_EQ(CodeOf(StoreError("")), ErrorCode::kStoreFailed);
  EXPECT_EQ(CodeOf(SpaceNotFound("")), ErrorCode::kSpaceNotFound);
  EXPECT_EQ(CodeOf(SpaceBusy("")), ErrorCode::kSpaceBusy);
  EXPECT_EQ(CodeOf(IncompatibleSpace("")), ErrorCode::kIncompatibleSpace);
  EXPECT_EQ(CodeOf(StaleGeneration(1, 2)), ErrorCode::kStaleGeneration);
  EXPECT_EQ(CodeOf(PoisonedTransaction("")), ErrorCode::kPoisonedTransaction);
  EXPECT_EQ(CodeOf(SnapshotExpired("")), ErrorCode::kSnapshotExpired);
  EXPECT_EQ(CodeOf(UnknownOutcome("")), ErrorCode::kUnknownOutcome);
  EXPECT_EQ(CodeOf(CorruptRecord("")), ErrorCode::kCorruptRecord);
  EXPECT_EQ(CodeOf(DanglingReference("")), ErrorCode::kDanglingReference);
}

TEST(ErrorCodes, NameTheRemedy) {
  EXPECT_EQ(CodeOf(UsageError("")), Remedy::kCorrectTheCall);
  EXPECT_EQ(CodeOf(SpaceBusy("")), Remedy::kRetry);
  EXPECT_EQ(CodeOf(SnapshotExpired("")), Remedy::kRetry);
  EXPECT_EQ(CodeOf(StaleGeneration(1, 2)), Remedy::kAbandonTransaction);
  EXPECT_EQ(CodeOf(PoisonedTransaction("")), Remedy::kAbandonTransaction);
  EXPECT_EQ(CodeOf(UnknownOutcome("")), Remedy::kAbandonTransaction);
  EXPECT_EQ(CodeOf(StoreError("")), Remedy::kCloseSpace);
  EXPECT_EQ(CodeOf(CorruptRecord("")), Remedy::kRestoreData);
  EXPECT_NE(CodeOf(SpaceBusy("")), Remedy::kCloseSpace);
  EXPECT_EQ(CodeOf(SpaceBusy("")).message(), "space busy");
  EXPECT_EQ(make_error_condition(Remedy::kRetry).message(), "try again");
}

using ErrorPlaceTest = StoreTest;
INSTANTIATE_STORE_TEST(ErrorPlaceTest);

TEST_P(ErrorPlaceTest, OfADamagedRecordNamesSpaceObjectClassAndOffset) {
  CommitFilled<TombstonesMap>(space(), "t", 10);
  const OID leaf = Stored().records.rbegin()->first;
  Bytes record = Stored().records.rbegin()->second;
  record[record.size() / 2] ^= 1;
  site.Tamper(leaf, record);
  Snapshot snapshot(space());
  try {
    snapshot.Root<TombstonesMap>("t").rFind(Key(1));
    FAIL() << "damage was not found";
  } catch (const CorruptRecord& corrupt) {
    EXPECT_EQ(corrupt.place().space, site.engine().Name());
    EXPECT_EQ(corrupt.place().oid, leaf);
    EXPECT_EQ(corrupt.place().offset, record.size() - 8) << "where the checksum stands";
    EXPECT_EQ(corrupt.code(), ErrorCode::kCorruptRecord);
  }
}

TEST_P(ErrorPlaceTest, OfARootWithoutRecordNamesTheRoot) {
  CommitFilled<TombstonesMap>(space(), "t", 10);
  site.Tamper(OID(1), std::nullopt);
  Snapshot snapshot(space());
  try {
    snapshot.Root<TombstonesMap>("t");
    FAIL() << "damage was not found";
  } catch (const DanglingReference& dangling) {
    EXPECT_EQ(dangling.place().root, "t");
    EXPECT_EQ(dangling.place().className, "vemo::FieldIdToVectorTombstonesMap");
  }
}

}  // namespace
}  // namespace vemo::test
