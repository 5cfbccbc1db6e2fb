// How many changes wait in the log and in the table of changes of the LMDB engine, together.
#include <algorithm>
#include <cstdint>

#include "engines/lmdb/sealed_space.h"
#include "tests/engines/lmdb_site.h"
#include "tests/support/temp_folder.h"

namespace vemo::test {
namespace {

constexpr std::uint64_t kRecords = 20;
constexpr std::uint64_t kMostCommits = 40;
constexpr SettlingBounds kCommitsAlone{.bytes = 1u << 30, .commits = kMostCommits, .records = 1u << 30};

// The first commit makes the records, the second one the log; each further one changes a record.
class CommitLogBounds : public testing::Test {
 protected:
  CommitLogBounds() {
    BatchBuilder batch;
    for (std::uint64_t oid = 1; oid <= kRecords; ++oid) batch.Put(oid, EditedRecord(oid, 0));
    Open()->Commit(batch.At(m_commits++));
    Edit(*Open());
  }

  std::unique_ptr<Engine> Open(const SettlingBounds& bounds = kCommitsAlone) const {
    LmdbOptions options;
    options.path = space();
    options.create = true;
    options.pendingChanges = bounds;
    return OpenLmdbEngine(options);
  }
  void Edit(Engine& engine) {
    BatchBuilder batch;
    const std::uint64_t oid = 1 + m_commits % kRecords;
    engine.Commit(batch.Put(oid, EditedRecord(oid, m_commits)).At(m_commits));
    ++m_commits;
  }

  // The commits whose changes are not all in their records, and those of them that are in the log.
  struct Waiting {
    std::uint64_t commits;
    std::uint64_t logged;
  };
  Waiting CurrentlyWaiting() const {
    SealedSpace sealed(space(), "space", true, 1u << 30);
    KnownStatePtr known;
    const SealFile::Slots seals = sealed.seal().Read();
    EXPECT_EQ(sealed.Ask(seals.Newest(), true, known), SealedSpace::Answer::kKnown);
    const SpaceNumbers& numbers = known->numbers;
    const std::uint64_t logged = m_commits - numbers.generation;
    const std::uint64_t first = numbers.changes.first;
    EXPECT_EQ(known->state->Table(kChangesTable)->root.entries, first != 0 ? numbers.generation - first + 1 : 0)
        << "what has been written into the records is not kept";
    return {first != 0 ? m_commits - first + 1 : logged, logged};
  }

 private:
  std::filesystem::path space() const { return m_folder.path() / "space"; }

  TempFolder m_folder;
  std::uint64_t m_commits = 0;
};

TEST_F(CommitLogBounds, TheLogHoldsAQuarterOfWhatMayWaitAndARoundEndsInTime) {
  const auto engine = Open();
  std::uint64_t mostLogged = 0, most = 0;
  for (std::uint64_t i = 0; i < 5 * kMostCommits; ++i) {
    Edit(*engine);
    const Waiting waiting = CurrentlyWaiting();
    mostLogged = std::max(mostLogged, waiting.logged);
    most = std::max(most, waiting.commits);
  }
  EXPECT_EQ(mostLogged, kMostCommits / 4);
  EXPECT_LT(most, kMostCommits * 9 / 10) << "from where on one commit would settle all at once";
}

TEST_F(CommitLogBounds, TheLogHoldsAQuarterOfTheRecordsAndOfTheBytesThatMayWait) {
  constexpr std::uint64_t kBytesOfOneCommit = 24;  // about
  constexpr SettlingBounds kRecordsAlone{.bytes = 1u << 30, .commits = 1u << 30, .records = kMostCommits};
  constexpr SettlingBounds kBytesAlone{.bytes = kMostCommits * kBytesOfOneCommit, .commits = 1u << 30, .records = 1u << 30};
  for (const SettlingBounds& bounds : {kRecordsAlone, kBytesAlone}) {
    const auto engine = Open(bounds);
    std::uint64_t mostLogged = 0;
    for (std::uint64_t i = 0; i < 3 * kMostCommits; ++i) {
      Edit(*engine);
      mostLogged = std::max(mostLogged, CurrentlyWaiting().logged);
    }
    EXPECT_GT(mostLogged, kMostCommits / 8);
    EXPECT_LT(mostLogged, kMostCommits / 2);
  }
}

// Each of them settles a slice from the beginning at first.
TEST_F(CommitLogBounds, WhatWaitsStaysWithinThemWhereEachCommitHasAnEngineOfItsOwn) {
  for (std::uint64_t i = 0; i < 3 * kMostCommits; ++i) {
    Edit(*Open());
    ASSERT_LE(CurrentlyWaiting().commits, kMostCommits) << i;
  }
}

}  // namespace
}  // namespace vemo::test
