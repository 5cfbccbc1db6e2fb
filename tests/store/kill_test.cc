// A process that is killed while it commits.
#include <random>
#include <string>

#include "store/verify.h"
#include "tests/engines/child_process.h"
#include "tests/store/store_fixture.h"
#include "tests/support/seed.h"

namespace vemo::test {
namespace {

// Commit n of the child: what the maps hold afterwards follows from n alone.
void CommitBatchNumber(CSpace& space, std::uint64_t n) {
  WriteTransaction transaction(space);
  auto& map = transaction.Root<TombstonesMap>("t");
  auto& other = transaction.Root<InsertionsMap>("i");
  if (n % 16 == 0) {
    map.clear();
  } else {
    Fill(map, 40 * n, 40 * n + 79, n);
    other.Insert(Key(n), PayloadOf<InsertionsMap>(n), true);
  }
  transaction.SetMeta("batch", std::to_string(n));
  transaction.Commit();
}

// What batches 1 .. last make of the first map.
std::map<std::uint64_t, std::uint64_t> ExpectedAfter(std::uint64_t last) {
  std::map<std::uint64_t, std::uint64_t> expected;
  for (std::uint64_t n = 1; n <= last; ++n) {
    if (n % 16 == 0) {
      expected.clear();
      continue;
    }
    for (std::uint64_t key = 40 * n; key <= 40 * n + 79; ++key) expected[key] = key + n;
  }
  return expected;
}

std::uint64_t BatchIn(CSpace& space) {
  Snapshot snapshot(space);
  return std::stoull(snapshot.Meta("batch").value_or("0"));
}

TEST(KillTest, EveryCommitThatWasReportedIsThereAndNoneIsHalfThere) {
  TempFolder folder;
  const std::string uri = "lmdb:" + (folder.path() / "space").string();
  std::mt19937_64 random(TestSeed(11));
  std::uint64_t reported = 0;
  for (int round = 0; round < 20; ++round) {
    {
      // The child opens the space itself: an open one does not survive a fork.
      ChildProcess child([&](const Conversation& parent) {
        const auto space = CSpace::Open(uri, {.create = true});
        for (std::uint64_t n = BatchIn(*space) + 1;; ++n) {
          CommitBatchNumber(*space, n);
          parent.Say(std::to_string(n));
        }
        return false;
      });
      const std::uint64_t commits = 1 + random() % 12;
      for (std::uint64_t i = 0; i < commits; ++i) {
        const std::string heard = child.Hear();
        ASSERT_NE(heard, "");
        reported = std::stoull(heard);
      }
      child.Kill();  // while it is busy with one of the next
    }
    const auto space = CSpace::Open(uri);
    const std::uint64_t batch = BatchIn(*space);
    ASSERT_GE(batch, reported);
    Snapshot snapshot(*space);
    EXPECT_EQ(NumbersOf(snapshot.Root<TombstonesMap>("t")), ExpectedAfter(batch)) << "after batch " << batch;
    EXPECT_EQ(snapshot.Root<InsertionsMap>("i").size(), static_cast<ssize_t>(batch - batch / 16));
    const VerifyReport report = VerifySpace(snapshot);
    EXPECT_TRUE(report.findings.empty()) << report.findings.front().fault;
    EXPECT_EQ(report.unreachable, 0u) << "a crash leaks nothing";
  }
}

}  // namespace
}  // namespace vemo::test
