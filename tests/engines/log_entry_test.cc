// Entries of the log of commits, and their tail in memory.
#include "engines/lmdb/log_entry.h"

#include <gtest/gtest.h>

#include <optional>
#include <utility>
#include <vector>

#include "engines/lmdb/log_tail.h"
#include "platform/error.h"
#include "tests/engines/engine_contract.h"

namespace vemo::test {
namespace {

TEST(LogTails, TellWhichCommitsHaveChanges) {
  LogTail tail(10);
  const Bytes value = ToBytes("value");
  for (std::uint64_t commit = 11; commit <= 14; ++commit) {
    const Bytes changes = commit % 2 == 0 ? ToBytes("\x01\x01 changes") : Bytes();
    std::optional<LoggedCommit> logged = ParseLoggedCommit(PayloadOf(changes, {{"name", ByteView(value)}}));
    tail.MakeRoomFor(logged);
    tail.Add(std::move(logged), 100 * commit);
  }
  tail.Add(std::nullopt, 2'000);
  EXPECT_EQ(tail.Changing(10, 15), (std::vector<std::uint64_t>{12, 14, 15}));
  EXPECT_EQ(tail.Changing(12, 14), std::vector<std::uint64_t>{14});
  EXPECT_TRUE(tail.Changing(15, 12).empty()) << "for a snapshot that is older than what somebody has read";
  EXPECT_EQ(tail.ChangingBounds(15), std::pair(std::uint64_t{12}, std::uint64_t{15}));
  EXPECT_EQ(tail.ChangingBounds(13), std::pair(std::uint64_t{12}, std::uint64_t{12}));
  EXPECT_EQ(tail.ChangingBounds(11), std::nullopt);
  EXPECT_EQ(tail.Last(), 15u);
  EXPECT_EQ(tail.End(), 2'000u);
  EXPECT_FALSE(tail.HasDamage(14));
  EXPECT_TRUE(tail.HasDamage(15));
  EXPECT_FALSE(tail.Changes(15));
}

TEST(LoggedCommits, ComeBackFromTheirPayload) {
  const Bytes changes = ToBytes("\x01\x02 and what else there is");
  const Bytes value = ToBytes("value");
  const LoggedCommit logged =
      ParseLoggedCommit(PayloadOf(changes, {{"a", ByteView(value)}, {"b", std::nullopt}, {"c", ByteView()}}));
  EXPECT_EQ(ToText(logged.changes), ToText(ByteView(changes)));
  EXPECT_EQ(logged.numRecords, 2u);
  ASSERT_EQ(logged.meta.size(), 3u);
  EXPECT_EQ(logged.meta[0].name, "a");
  EXPECT_EQ(ToText(logged.meta[0].value), "value");
  EXPECT_FALSE(logged.meta[1].value);
  EXPECT_EQ(ToText(logged.meta[2].value), "");
}

TEST(LoggedCommits, ThatAreCutOffOrHaveMoreAreMalformed) {
  const Bytes value = ToBytes("value");
  const Bytes payload = PayloadOf(ToBytes("\x01\x02 changes"), {{"name", ByteView(value)}});
  for (std::size_t size = 0; size < payload.size(); ++size) {
    EXPECT_THROW(
        ParseLoggedCommit(Bytes(payload.begin(), payload.begin() + static_cast<std::ptrdiff_t>(size))),
        MalformedBytes)
        << size;
  }
  Bytes longer = payload;
  longer.push_back(0);
  EXPECT_THROW(ParseLoggedCommit(longer), MalformedBytes);
}

TEST(LogEntries, WithAnyBitChangedOrOfAnotherLogAreNone) {
  constexpr std::uint64_t kIdentity = 77;
  const Bytes payload = ToBytes("a payload");
  const Bytes entry = EncodeLogEntry({5, 3}, payload, kIdentity);
  const std::optional<LogEntry> read = ReadLogEntry(entry, kIdentity);
  ASSERT_TRUE(read);
  EXPECT_EQ(read->place, (LogPlace{5, 3}));
  EXPECT_EQ(ToText(read->payload), ToText(ByteView(payload)));
  EXPECT_EQ(read->bytes, entry.size());
  EXPECT_FALSE(ReadLogEntry(entry, kIdentity + 1));
  for (std::size_t bit = 0; bit < 8 * (kLogHeaderBytes + payload.size()); ++bit) {
    Bytes damaged = entry;
    damaged[bit / 8] ^= static_cast<std::uint8_t>(1 << bit % 8);
    EXPECT_FALSE(ReadLogEntry(damaged, kIdentity)) << bit;
  }
  for (std::size_t size = 0; size < kLogHeaderBytes + payload.size(); ++size) {
    EXPECT_FALSE(ReadLogEntry(ByteView(entry).first(size), kIdentity)) << size;
  }
}

TEST(LogPlaces, AreThoseOfAsManyCommitsAsALogHasRoomForBehindTheirBase) {
  constexpr std::uint64_t kBase = 10;
  constexpr std::uint64_t kMost = kLogBytes / kLogHeaderBytes;
  EXPECT_FALSE(CanBeInLog({kBase, kBase}));
  EXPECT_FALSE(CanBeInLog({kBase - 1, kBase}));
  EXPECT_TRUE(CanBeInLog({kBase + 1, kBase}));
  EXPECT_TRUE(CanBeInLog({kBase + kMost, kBase}));
  EXPECT_FALSE(CanBeInLog({kBase + kMost + 1, kBase}));
}

}  // namespace
}  // namespace vemo::test
