#include "engines/lmdb/change_index.h"

#include <gtest/gtest.h>

#include "platform/error.h"

namespace vemo {
namespace {

Bytes DeltaOf(std::uint8_t byte, std::size_t length) { return Bytes(length, byte); }

ChangeBlob BlobOf(std::initializer_list<std::uint64_t> ids, std::uint64_t commit) {
  ChangeBlobBuilder builder(commit);
  for (const std::uint64_t id : ids) builder.Add(OID(id), DeltaOf(static_cast<std::uint8_t>(id), id % 5));
  return ParseChangeBlob(builder.Finish(commit - 1), commit);
}

std::optional<std::uint64_t> Found(const ChangeIndex& index, std::uint64_t oid, std::uint64_t commit) {
  const auto version = index.Find(OID(oid), commit);
  return version ? std::optional(version->commit) : std::nullopt;
}

TEST(ChangeBlob, GivesBackIdsAndDeltas) {
  ChangeBlobBuilder builder(12);
  EXPECT_TRUE(builder.empty());
  builder.Add(OID(3), DeltaOf(7, 4));
  builder.Add(OID(300), {});
  builder.Add(OID(~std::uint64_t{0}), DeltaOf(9, 200));
  const Bytes bytes = builder.Finish(10);
  const ChangeBlob blob = ParseChangeBlob(bytes, 12);
  EXPECT_EQ(blob.previous, 10u);
  ASSERT_EQ(blob.changes.size(), 3u);
  const auto delta = [&](std::size_t i) {
    const auto first = bytes.begin() + blob.changes[i].offset;
    return Bytes(first, first + blob.changes[i].length);
  };
  EXPECT_EQ(blob.changes[0].oid, OID(3));
  EXPECT_EQ(delta(0), DeltaOf(7, 4));
  EXPECT_EQ(blob.changes[1].oid, OID(300));
  EXPECT_EQ(delta(1), Bytes());
  EXPECT_EQ(blob.changes[2].oid, OID(~std::uint64_t{0}));
  EXPECT_EQ(delta(2), DeltaOf(9, 200));
}

// The deltas are under the seals of the records that they make.
TEST(ChangeBlob, EveryFlippedBitBeforeTheDeltasAndEveryOtherLengthIsRefused) {
  ChangeBlobBuilder builder(4);
  builder.Add(OID(5), DeltaOf(1, 3));
  builder.Add(OID(900), DeltaOf(2, 2));
  const Bytes sound = builder.Finish(2);
  const std::size_t deltas = ParseChangeBlob(sound, 4).changes.front().offset;
  ASSERT_EQ(deltas, sound.size() - 5);
  for (std::size_t bit = 0; bit < 8 * deltas; ++bit) {
    Bytes damaged = sound;
    damaged[bit / 8] ^= static_cast<std::uint8_t>(1u << bit % 8);
    EXPECT_THROW(ParseChangeBlob(damaged, 4), MalformedBytes) << bit;
  }
  for (std::size_t length = 0; length < sound.size(); ++length) {
    EXPECT_THROW(ParseChangeBlob(ByteView(sound).first(length), 4), MalformedBytes) << length;
  }
}

TEST(ChangeBlob, OfAnotherCommitIsRefused) {
  ChangeBlobBuilder builder(4);
  builder.Add(OID(5), DeltaOf(1, 3));
  EXPECT_THROW(ParseChangeBlob(builder.Finish(2), 5), MalformedBytes);
}

TEST(ChangeIndex, FindsTheLatestChangeUpToACommit) {
  ChangeIndex index;
  index.Add(2, BlobOf({1, 4}, 2), 100);
  ASSERT_TRUE(index.Open(4));
  index.Add(5, BlobOf({4, 6}, 5), 100);
  EXPECT_EQ(index.Newest(), 5u);
  EXPECT_EQ(Found(index, 1, 1), std::nullopt);
  EXPECT_EQ(Found(index, 1, 2), 2u);
  EXPECT_EQ(Found(index, 1, 9), 2u);
  EXPECT_EQ(Found(index, 4, 4), 2u);
  EXPECT_EQ(Found(index, 4, 5), 5u);
  EXPECT_EQ(Found(index, 6, 4), std::nullopt);
  EXPECT_EQ(Found(index, 7, 9), std::nullopt);
  EXPECT_EQ(index.Records(), (std::vector<OID>{OID(1), OID(4), OID(6)}));
}

TEST(ChangeIndex, ForgetsAChangeBehindANewerOneThatNoOpenSnapshotFinds) {
  ChangeIndex index;
  index.Add(2, BlobOf({4}, 2), 100);
  ASSERT_TRUE(index.Open(2));
  index.Add(3, BlobOf({4}, 3), 100);
  index.Add(5, BlobOf({4}, 5), 100);
  EXPECT_EQ(Found(index, 4, 2), 2u);
  EXPECT_EQ(Found(index, 4, 4), 2u) << "there was no snapshot of commit 4";
  EXPECT_EQ(Found(index, 4, 5), 5u);
  index.Close(2);
  index.Add(6, BlobOf({4}, 6), 100);
  EXPECT_EQ(Found(index, 4, 5), std::nullopt);
}

TEST(ChangeIndex, ASnapshotThatComesTooLateForItsCommitIsNotOpened) {
  ChangeIndex index;
  index.Add(2, BlobOf({4}, 2), 100);
  ASSERT_TRUE(index.Open(2));
  index.Follow(3);  // which has no changes of its own
  EXPECT_TRUE(index.Open(2)) << "another one keeps what it needs";
  index.Close(2);
  index.Close(2);
  EXPECT_FALSE(index.Open(2));
  EXPECT_TRUE(index.Open(3));
}

TEST(ChangeIndex, TakesABlobInOnce) {
  ChangeIndex index;
  index.Add(5, BlobOf({4}, 5), 100);
  index.Add(5, BlobOf({4}, 5), 100);
  index.Add(3, BlobOf({9}, 3), 100);
  EXPECT_EQ(index.CurrentLoad().records, 1u);
  EXPECT_EQ(Found(index, 4, 5), 5u);
}

TEST(ChangeIndex, ForgetsWhatIsDropped) {
  ChangeIndex index;
  index.Add(2, BlobOf({1, 4}, 2), 100);
  index.Add(5, BlobOf({4, 6}, 5), 100);
  ASSERT_TRUE(index.Open(5));
  index.Drop(5, 5);
  EXPECT_EQ(Found(index, 1, 9), std::nullopt);
  EXPECT_EQ(Found(index, 4, 4), std::nullopt);
  EXPECT_EQ(Found(index, 4, 5), 5u);
  EXPECT_EQ(Found(index, 6, 5), 5u);
  index.Close(5);
  index.Drop(6, 6);
  EXPECT_EQ(index.CurrentLoad().records, 0u);
}

TEST(ChangeIndex, KnowsWhatItHolds) {
  ChangeIndex index;
  index.Add(2, BlobOf({1, 4}, 2), 100);
  index.Add(5, BlobOf({4, 6}, 5), 30);
  EXPECT_EQ(index.CurrentLoad().bytes, 130u);
  EXPECT_EQ(index.CurrentLoad().blobs, 2u);
  EXPECT_EQ(index.CurrentLoad().records, 3u);
  EXPECT_EQ(index.Commits(), (std::vector<std::uint64_t>{2, 5}));
  index.Drop(5, 6);
  EXPECT_EQ(index.CurrentLoad().bytes, 30u);
  EXPECT_EQ(index.Commits(), (std::vector<std::uint64_t>{5}));
}

TEST(ChangeIndex, DoubtsWhatADamagedBlobMayHaveChanged) {
  ChangeIndex index;
  EXPECT_FALSE(index.HasDamage());
  index.Add(2, BlobOf({1}, 2), 100);
  index.AddDamaged(4);
  EXPECT_TRUE(index.HasDamage());
  EXPECT_EQ(index.Newest(), 4u);
  EXPECT_FALSE(index.IsInDoubt(2, 3)) << "a snapshot of before";
  EXPECT_TRUE(index.IsInDoubt(2, 4));
  EXPECT_TRUE(index.IsInDoubt(3, 9));
  EXPECT_FALSE(index.IsInDoubt(4, 9)) << "a record that was written whole by that commit, or changed later";
}

TEST(ChangeIndex, KeepsForOpenSnapshotsWhatTheyWouldFind) {
  ChangeIndex index;
  index.Add(2, BlobOf({1, 4}, 2), 100);
  index.Add(3, BlobOf({4}, 3), 100);
  ASSERT_TRUE(index.Open(3));
  index.Add(5, BlobOf({4, 6}, 5), 100);
  ASSERT_TRUE(index.Open(5));
  index.Drop(8, 7);
  EXPECT_EQ(index.CurrentLoad().blobs, 0u);
  EXPECT_EQ(Found(index, 1, 3), 2u);
  EXPECT_EQ(Found(index, 4, 3), 3u);
  EXPECT_EQ(Found(index, 4, 5), 5u);
  EXPECT_EQ(Found(index, 6, 5), 5u);
  index.Close(3);
  index.Drop(8, 7);
  EXPECT_EQ(Found(index, 1, 5), 2u) << "the snapshot's records are those of before the drop";
  EXPECT_EQ(Found(index, 4, 3), std::nullopt) << "the one that would find it is closed";
  EXPECT_EQ(Found(index, 4, 5), 5u);
  index.Close(5);
  index.Drop(8, 7);
  EXPECT_EQ(index.CurrentLoad().records, 0u);
}

// Commit 7 has dropped what is before 5, after it had written all of it into records; the reader is of a commit in between.
TEST(ChangeIndex, KeepsForASnapshotOfBetweenTheFirstKeptChangesAndTheDrop) {
  ChangeIndex index;
  index.Add(2, BlobOf({1}, 2), 100);
  index.Add(5, BlobOf({6}, 5), 100);
  ASSERT_TRUE(index.Open(6));
  index.Drop(5, 7);
  EXPECT_EQ(Found(index, 1, 6), 2u);
  index.Close(6);
  index.Drop(5, 7);
  EXPECT_EQ(Found(index, 1, 6), std::nullopt);
  EXPECT_EQ(Found(index, 6, 7), 5u);
}

}  // namespace
}  // namespace vemo
