// The address space of the LMDB engine as it fills, and failures of the disk below it.
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/resource.h>

#include "tests/engines/lmdb_site.h"
#include "tests/support/failing_disk.h"
#include "tests/support/temp_folder.h"

namespace vemo::test {
namespace {

constexpr std::uint64_t kMiB = 1 << 20;

class LmdbMap : public testing::Test {
 protected:
  std::filesystem::path space() const { return m_folder.path() / "space"; }

 private:
  TempFolder m_folder;
};

BatchBuilder Megabytes(std::uint64_t count, char fill = 'x') {
  BatchBuilder batch;
  for (std::uint64_t oid = 1; oid <= count; ++oid) batch.Put(oid, std::string(kMiB, fill));
  return batch;
}

TEST_F(LmdbMap, GrowsAsOftenAsACommitNeeds) {
  const auto engine = OpenAt(space(), true, kMiB);
  BatchBuilder batch = Megabytes(9);
  EXPECT_EQ(engine->Commit(batch.At(0)), 1u);
  EXPECT_EQ(engine->Usage().records, 9u);
  EXPECT_EQ(engine->OpenSnapshot()->Read(OID(9))->size(), kMiB);
}

TEST_F(LmdbMap, GrowsForReservedIdsAndSmallCommitsToo) {
  const auto engine = OpenAt(space(), true, 64 << 10);
  std::uint64_t generation = 0;
  for (std::uint64_t i = 0; i < 100; ++i) {
    EXPECT_EQ(engine->ReserveIds(1), OID(i + 1));
    BatchBuilder batch;
    batch.Put(i + 1, std::string(1000, 'x'));
    generation = engine->Commit(batch.At(generation));
  }
  EXPECT_EQ(engine->Usage().records, 100u);
}

TEST_F(LmdbMap, GrowthIsRefusedWhileASnapshotIsOpenAndSucceedsAfterwards) {
  const auto engine = OpenAt(space(), true, kMiB);
  auto snapshot = engine->OpenSnapshot();
  BatchBuilder batch = Megabytes(3);
  const std::string message = MessageOf<StoreError>([&] { engine->Commit(batch.At(0)); });
  EXPECT_TRUE(Contains(message, space().string())) << message;
  EXPECT_TRUE(Contains(message, "1 open snapshots of this process")) << message;
  EXPECT_TRUE(Contains(message, "close them and try again")) << message;
  EXPECT_EQ(NewestContents(*engine), Contents());
  EXPECT_EQ(ContentsOf(*snapshot), Contents());
  snapshot.reset();
  EXPECT_EQ(engine->Commit(batch.At(0)), 1u);
}

TEST_F(LmdbMap, AFullSpaceOpensWithASmallerMapAndGrows) {
  BatchBuilder batch = Megabytes(4);
  OpenAt(space(), true)->Commit(batch.At(0));
  const auto engine = OpenAt(space(), false, kMiB);
  EXPECT_EQ(engine->OpenSnapshot()->Read(OID(4))->size(), kMiB);
  BatchBuilder next;
  next.Put(5, std::string(2 * kMiB, 'y'));
  EXPECT_EQ(engine->Commit(next.At(1)), 2u);
  EXPECT_EQ(engine->Usage().records, 5u);
}

TEST_F(LmdbMap, AMapThatCannotBeHadIsAnErrorAndLeavesNoClaim) {
  const std::string message = MessageOf<StoreError>([&] { OpenAt(space(), true, std::uint64_t{1} << 60); });
  EXPECT_TRUE(Contains(message, space().string())) << message;
  EXPECT_EQ(NewestContents(*OpenAt(space(), true)), Contents());
}

TEST_F(LmdbMap, TooManySnapshotsAreRefusedWithAdvice) {
  const auto engine = OpenAt(space(), true);
  std::vector<std::unique_ptr<EngineSnapshot>> snapshots;
  for (int i = 0; i < 510; ++i) snapshots.push_back(engine->OpenSnapshot());
  const std::string message = MessageOf<StoreError>([&] { engine->OpenSnapshot(); });
  EXPECT_TRUE(Contains(message, "too many snapshots")) << message;
  snapshots.pop_back();
  EXPECT_EQ(engine->OpenSnapshot()->Generation(), 0u);
}

CommitBatch CommitBatchAt(std::uint64_t generation) {
  CommitBatch batch;
  batch.expectedGeneration = generation;
  return batch;
}

bool CommitFails(Engine& engine, const CommitBatch& batch) {
  try {
    engine.Commit(batch);
    return false;
  } catch (const StoreError&) {
    return true;
  }
}

// Lets no file of this process grow beyond `bytes`: a disk that is full.
class FileSizeLimit {
 public:
  explicit FileSizeLimit(std::uint64_t bytes) {
    m_signal = ::signal(SIGXFSZ, SIG_IGN);
    ::getrlimit(RLIMIT_FSIZE, &m_before);
    rlimit limited = m_before;
    limited.rlim_cur = bytes;
    ::setrlimit(RLIMIT_FSIZE, &limited);
  }
  ~FileSizeLimit() {
    ::setrlimit(RLIMIT_FSIZE, &m_before);
    ::signal(SIGXFSZ, m_signal);
  }
  FileSizeLimit(const FileSizeLimit&) = delete;
  FileSizeLimit& operator=(const FileSizeLimit&) = delete;

 private:
  rlimit m_before{};
  void (*m_signal)(int) = nullptr;
};

TEST_F(LmdbMap, ACommitThatTheDiskRefusesAppliesNothingAndCanBeRepeated) {
  const auto engine = OpenAt(space(), true);
  BatchBuilder first;
  first.Put(1, "one");
  engine->Commit(first.At(0));
  const Contents before = NewestContents(*engine);
  BatchBuilder second = Megabytes(4);
  {
    const FileSizeLimit limit(kMiB);
    EXPECT_THROW(engine->Commit(second.At(1)), StoreError);
    EXPECT_EQ(NewestContents(*engine), before);
  }
  EXPECT_EQ(engine->Commit(second.At(1)), 2u);
  EXPECT_EQ(engine->OpenSnapshot()->Read(OID(4))->size(), kMiB);
}

// Lets each write and sync of a commit fail in turn, once or from then on.
class LmdbDisk : public LmdbMap, public testing::WithParamInterface<bool> {
 protected:
  bool StaysBroken() const { return GetParam(); }
};
INSTANTIATE_TEST_SUITE_P(Failing, LmdbDisk, testing::Bool(),
                         [](const testing::TestParamInfo<bool>& parameter) {
                           return parameter.param ? "FromThenOn" : "Once";
                         });

TEST_P(LmdbDisk, ACommitThatFailsAnywhereAppliesNothingAndCanBeRepeated) {
  auto engine = OpenAt(space(), true);
  BatchBuilder batch = Megabytes(2);
  batch.Name(NamedTable::kRoots, "root", "value").Queue(7);
  std::uint64_t generation = 0;
  bool failed = true;
  bool sealFailed = false;
  int failures = 0;
  for (int nth = 1; failed || sealFailed; ++nth) {
    const Contents before = NewestContents(*engine);
    {
      const FailingDisk disk(nth, StaysBroken());
      failed = CommitFails(*engine, batch.At(generation));
      // What is written last of all, and not synced, is the seal: the commit does not depend on it.
      sealFailed = !failed && disk.HasFailed();
    }
    if (failed) {
      ++failures;
      ASSERT_EQ(NewestContents(*engine), before) << "call " << nth;
      ASSERT_EQ(engine->Commit(batch.At(generation)), generation + 1) << "call " << nth;
    }
    ++generation;
    ASSERT_EQ(NewestContents(*engine).generation, generation);
    // Without its seal the commit is checked when the space is opened.
    if (sealFailed) {
      engine.reset();
      engine = OpenAt(space());
      ASSERT_EQ(NewestContents(*engine).generation, generation);
    }
  }
  EXPECT_GE(failures, 3) << "pages, a sync and the page that makes them count";
}

// A failure of the last write of a commit stops LMDB until the environment is opened again, for which the
// snapshots must be closed.
TEST_P(LmdbDisk, SnapshotsStayReadableWhateverFailsAndTheEngineGoesOnAfterThem) {
  const auto engine = OpenAt(space(), true);
  BatchBuilder batch;
  batch.Put(1, "one");
  engine->Commit(batch.At(0));
  int stopped = 0;
  int survived = 0;  // commits in a row that the fault did not reach
  constexpr int kCommitsEach = 4;  // they differ in how many writes they take
  for (int call = 0; survived < kCommitsEach; ++call) {
    const int nth = 1 + call / kCommitsEach;
    auto snapshot = engine->OpenSnapshot();
    const Contents before = ContentsOf(*snapshot);
    bool failed = false;
    {
      const FailingDisk disk(nth, StaysBroken());
      failed = CommitFails(*engine, batch.At(before.generation));
      survived = disk.HasFailed() ? 0 : survived + 1;
    }
    const bool again = failed && !CommitFails(*engine, batch.At(before.generation));
    if (failed && !again) {
      ++stopped;
      const std::string message = MessageOf<StoreError>([&] { engine->OpenSnapshot(); });
      EXPECT_TRUE(Contains(message, "close them and try again")) << message;
    }
    ASSERT_EQ(ContentsOf(*snapshot), before) << "call " << nth;
    snapshot.reset();
    ASSERT_EQ(NewestContents(*engine).generation, before.generation + (failed && !again ? 0 : 1)) << "call " << nth;
  }
  EXPECT_GE(stopped, 1);
}

TEST_P(LmdbDisk, ASpaceRemovedUnderAStoppedEngineIsNotMadeAnew) {
  const auto engine = OpenAt(space(), true);
  auto snapshot = engine->OpenSnapshot();
  std::uint64_t generation = 0;
  for (int nth = 1; !CommitFails(*engine, CommitBatchAt(generation)); ++nth) {
    ++generation;
    const FailingDisk disk(nth, StaysBroken());
    if (!CommitFails(*engine, CommitBatchAt(generation))) ++generation;
  }
  snapshot.reset();
  std::filesystem::remove_all(space());
  EXPECT_THROW(engine->Commit(CommitBatchAt(generation)), SpaceNotFound);
  EXPECT_FALSE(std::filesystem::exists(space()));
}

TEST_P(LmdbDisk, ACreationThatFailsAnywhereCanBeRepeated) {
  bool hasFailed = true;
  int failures = 0;
  for (int nth = 1; hasFailed; ++nth) {
    {
      const FailingDisk disk(nth, StaysBroken());
      try {
        OpenAt(space(), true);  // also where what failed was the write of a seal, which a commit does not need
      } catch (const StoreError&) {
        ++failures;
      }
      hasFailed = disk.HasFailed();
    }
    ASSERT_EQ(NewestContents(*OpenAt(space(), true)), Contents()) << "call " << nth;
    std::filesystem::remove_all(space());
  }
  EXPECT_GE(failures, 4);
}

}  // namespace
}  // namespace vemo::test
