// Which commits are found in the bytes of a log.
#include "engines/lmdb/log_scan.h"

#include <gtest/gtest.h>

#include <limits>
#include <string>

#include "tests/engines/engine_contract.h"

namespace vemo::test {
namespace {

constexpr std::uint64_t kIdentity = 99;
constexpr std::uint64_t kBase = 10;

// Entries of `commits`, one behind another.
Bytes LogOf(std::initializer_list<std::uint64_t> commits, std::uint64_t base = kBase) {
  Bytes log;
  for (const std::uint64_t commit : commits) {
    const Bytes value = ToBytes(std::to_string(commit));
    const Bytes entry = EncodeLogEntry({commit, base}, PayloadOf({}, {{"name", ByteView(value)}}), kIdentity);
    log.insert(log.end(), entry.begin(), entry.end());
  }
  return log;
}

// The commits as text, those that are damaged as a dash.
std::string Scan(const Bytes& log, std::uint64_t lastSealed, ScanUntil until = ScanUntil::kLastWhole) {
  std::string text;
  for (const ScannedCommit& scanned : ScanLog(log, {kBase + 1, kBase}, kIdentity, lastSealed, until)) {
    text += (text.empty() ? "" : " ") + (scanned.commit ? ToText(*scanned.commit->meta.at(0).value) : "-");
  }
  return text;
}

void Damage(Bytes& log, std::size_t entry) { log[entry * LogOf({11}).size() + 3] ^= 1; }

TEST(LogScan, EndsBehindTheLastWholeEntryOrTheLastThatIsSealed) {
  Bytes log = LogOf({11, 12, 13});
  EXPECT_EQ(Scan(log, kBase), "11 12 13");
  EXPECT_EQ(Scan(log, 12, ScanUntil::kLastSealed), "11 12");
  EXPECT_EQ(ScanLog(log, {11, kBase}, kIdentity, kBase, ScanUntil::kLastWhole).back().end, log.size());
  log.resize(log.size() + 400, 0);
  EXPECT_EQ(Scan(log, kBase), "11 12 13");
  EXPECT_EQ(Scan({}, kBase), "");
}

TEST(LogScan, TakesWhatIsNotWholeForDamagedBeforeTheSealOrAWholeEntry) {
  Bytes log = LogOf({11, 12, 13, 14});
  Damage(log, 1);
  EXPECT_EQ(Scan(log, kBase), "11 - 13 14");
  Damage(log, 2);
  EXPECT_EQ(Scan(log, kBase), "11 - - 14");
  Damage(log, 3);
  EXPECT_EQ(Scan(log, kBase), "11") << "none of them was acknowledged";
  EXPECT_EQ(Scan(log, 13), "11 - -");
  EXPECT_EQ(Scan(log, 14, ScanUntil::kLastSealed), "11 - - -");
}

TEST(LogScan, LeavesOutEntriesOfBefore) {
  Bytes log = LogOf({11});
  const Bytes older = LogOf({4, 5, 6, 12, 13}, 3);
  log.insert(log.end(), older.begin(), older.end());
  EXPECT_EQ(Scan(log, kBase), "11") << "12 did not get to the disk, and 13 is none of this base";
}

// Sums that anybody can make are no reason to count for years.
TEST(LogScan, DoesNotCountUpToNumbersThatNoLogHasRoomFor) {
  constexpr std::uint64_t kHuge = std::numeric_limits<std::uint64_t>::max() - 5;
  Bytes log = LogOf({11, 12});
  Damage(log, 1);
  const Bytes forged = LogOf({kHuge});
  log.insert(log.end(), forged.begin(), forged.end());
  EXPECT_EQ(Scan(log, kBase), "11");
  EXPECT_LE(ScanLog(log, {11, kBase}, kIdentity, kHuge, ScanUntil::kLastSealed).size(), kLogBytes / kLogHeaderBytes);
}

}  // namespace
}  // namespace vemo::test
