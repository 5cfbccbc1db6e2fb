// What is believed of the log of the LMDB engine, and what of the files beside it that contradict it.
#include <cerrno>
#include <set>
#include <string>

#include "engines/lmdb/commit_log.h"
#include "engines/lmdb/seal_file.h"
#include "engines/lmdb/space_folder.h"
#include "store/error.h"
#include "tests/engines/child_process.h"
#include "tests/engines/logged_space.h"
#include "tests/support/failing_disk.h"

namespace vemo::test {
namespace {

namespace fs = std::filesystem;

class CommitLogTrust : public LoggedSpace {
 protected:
  // An engine that has made commit 3, and behind it commit 4 of another process, with `name` as it was before that one. Null where
  // the other process failed.
  std::unique_ptr<Engine> OpenBehindAnotherProcess(const char* name) const {
    ChildProcess writer([&](const Conversation& parent) {
      parent.Hear();
      Edit(*OpenSpace(space()), 3, 3);
      return true;
    });
    auto engine = OpenSpace(space());
    Edit(*engine, 2, 2);
    const std::string before = ReadFile(file(name));
    writer.Say("go");
    if (!writer.Succeeded()) return nullptr;
    WriteFile(file(name), before);
    return engine;
  }
};

TEST_F(CommitLogTrust, AReaderDoesNotSeeACommitThatIsOnItsWayToTheDisk) {
  ChildProcess writer([&](const Conversation& parent) {
    parent.Hear();
    const auto engine = OpenSpace(space());
    Edit(*engine, 2, 2);
    Edit(*engine, 3, 3);
    const WatchedDisk disk([&](const WatchedDisk::Write& write) {
      if (write.file != kLogFile) return 0;
      parent.Say("written");
      parent.Hear();
      return 0;
    });
    Edit(*engine, 4, 4);
    parent.Say("made");
    return true;
  });
  const auto engine = OpenSpace(space());
  ASSERT_EQ(GenerationOf(*engine), 2u);
  writer.Say("go");
  ASSERT_EQ(writer.Hear(), "written");
  EXPECT_EQ(GenerationOf(*engine), 4u);
  writer.Say("on");
  ASSERT_EQ(writer.Hear(), "made");
  EXPECT_EQ(GenerationOf(*engine), 5u);
  EXPECT_TRUE(writer.Succeeded());
}

// Its process ended before it sealed it.
TEST_F(CommitLogTrust, AnEntryOfAnotherProcessThatWasNotSealedIsNotWrittenOver) {
  const auto engine = OpenBehindAnotherProcess(kSealFile);
  ASSERT_NE(engine, nullptr);
  EXPECT_THROW(Edit(*engine, 3, 77), StaleGeneration);
  EXPECT_EQ(EditedIn(*engine), EditedRecord(kEdited, 3));
}

TEST_F(CommitLogTrust, AnEntryOfAnotherProcessThatWasSealedAndIsDamagedIsNotWrittenOver) {
  const auto engine = OpenBehindAnotherProcess(kLogFile);
  ASSERT_NE(engine, nullptr);
  EXPECT_THROW(Edit(*engine, 3, 77), StaleGeneration);
  EXPECT_EQ(GenerationOf(*engine), 4u);
  EXPECT_THROW(EditedIn(*engine), DamagedStorage);
  EXPECT_THROW(Edit(*engine, 4, 77), DamagedStorage);
}

TEST_F(CommitLogTrust, ASealOfALogThatGoesBehindANewerCommitIsBelieved) {
  ASSERT_TRUE(SealFile(file(kSealFile), "space", false).Write(LogSeal{5, 5, 0}));
  const std::string message = MessageOf<DamagedStorage>([&] { OpenSpace(space()); });
  EXPECT_TRUE(Contains(message, "data.seal knows commits up to 5 behind commit 5")) << message;
}

// What is in the log must get to the tables one day.
TEST_F(CommitLogTrust, NothingGoesToTheLogWhereNothingMayGoToTheTables) {
  {
    SealFile seal(file(kSealFile), "space", false);
    CommitSeal newest = seal.Read().Of(seal.Read().Newest()).value();
    newest.freeDigest ^= 1;
    ASSERT_TRUE(seal.Write(newest));
  }
  const auto engine = OpenSpace(space());
  EXPECT_EQ(EditedIn(*engine), EditedRecord(kEdited, 1));
  const std::string log = ReadFile(file(kLogFile));
  EXPECT_THROW(Edit(*engine, 2, 2), DamagedStorage);
  EXPECT_TRUE(ReadFile(file(kLogFile)) == log);
}

// It would be lost with the commit that is made at the same time.
TEST_F(CommitLogTrust, ALogThatIsCutOffIsNotMadeAnewWhileItHasCommits) {
  {
    const auto engine = OpenSpace(space());
    Edit(*engine, 2, 2);
    Edit(*engine, 3, 3);
  }
  fs::resize_file(file(kLogFile), 10'000);
  {
    const auto engine = OpenSpace(space());
    const WatchedDisk disk([](const WatchedDisk::Write& write) { return write.file == kDataFile ? EIO : 0; });
    EXPECT_THROW(Edit(*engine, 4, 4), StoreError);
  }
  const auto engine = OpenSpace(space());
  EXPECT_EQ(GenerationOf(*engine), 4u);
  EXPECT_EQ(EditedIn(*engine), EditedRecord(kEdited, 3));
}

TEST_F(CommitLogTrust, ClosingASpaceThatDoesNotSyncSyncsItsTablesAndItsLogWithItsName) {
  auto engine = OpenSpace(space(), Syncs::kNothing);
  Edit(*engine, 2, 2);
  std::set<std::string> synced;
  const WatchedDisk disk({}, [&](const std::string& name) { synced.insert(name); });
  Edit(*engine, 3, 3);
  EXPECT_TRUE(synced.empty());
  engine.reset();
  for (const std::string name : {kDataFile, kLogFile, "space"}) EXPECT_TRUE(synced.contains(name)) << name;
}

// Entries would go to a file without a name.
TEST_F(CommitLogTrust, ALogThatIsRemovedWhileTheSpaceIsOpenIsNotWrittenToAnyMore) {
  for (const bool hasCommits : {false, true}) {
    SCOPED_TRACE(hasCommits);
    auto engine = OpenSpace(space());
    std::uint64_t generation = GenerationOf(*engine);
    AddRecord(*engine, generation++);
    if (hasCommits) Edit(*engine, generation++, 30);
    fs::remove(file(kLogFile));
    Edit(*engine, generation++, 40 + hasCommits);
    engine.reset();
    if (!fs::exists(file(kLogFile))) WriteFile(file(kLogFile), "");
    engine = OpenSpace(space());
    EXPECT_EQ(GenerationOf(*engine), generation);
    EXPECT_EQ(EditedIn(*engine), EditedRecord(kEdited, 40 + hasCommits));
    AddRecord(*engine, generation++);
    Edit(*engine, generation, 50);  // makes the log
  }
}

// What docs/operations.md has one do while the space is in use.
TEST_F(CommitLogTrust, ACopyOfTheDataAndThenOfTheLogHasAllThatWasCommittedBefore) {
  const fs::path copy = space().parent_path() / "copy";
  fs::create_directory(copy);
  const auto copyOf = [&](const char* name) { WriteFile(copy / name, ReadFile(file(name))); };
  const auto engine = OpenSpace(space());
  Edit(*engine, 2, 2);
  Edit(*engine, 3, 3);
  copyOf(kDataFile);
  Edit(*engine, 4, 4);
  copyOf(kLogFile);
  {
    const auto copied = OpenSpace(copy);
    EXPECT_EQ(GenerationOf(*copied), 5u);
    EXPECT_EQ(EditedIn(*copied), EditedRecord(kEdited, 4));
  }
  fs::remove_all(copy);
  fs::create_directory(copy);
  copyOf(kDataFile);
  AddRecord(*engine, 5);
  copyOf(kLogFile);
  EXPECT_EQ(GenerationOf(*OpenSpace(copy)), 5u) << "no entry has been written over yet";
  fs::remove_all(copy);
  fs::create_directory(copy);
  copyOf(kDataFile);
  Edit(*engine, 6, 6);
  AddRecord(*engine, 7);
  Edit(*engine, 8, 8);
  copyOf(kLogFile);
  const std::string message = MessageOf<DamagedStorage>([&] { OpenSpace(copy); });
  EXPECT_TRUE(Contains(message, "commits.log goes on behind commit 8")) << message;
  WriteFile(copy / kLogFile, "");
  EXPECT_EQ(GenerationOf(*OpenSpace(copy)), 6u) << "without what waited";
}

// It was never acknowledged: its process ended, and data.mdb got another commit of its number.
TEST_F(CommitLogTrust, AnEntryBehindAnOlderCommitThatIsNotWholeIsNoReasonToRefuseTheSpace) {
  std::string log;
  {
    const auto engine = OpenSpace(space());
    Edit(*engine, 2, 2);
    log = ReadFile(file(kLogFile));
  }
  WriteFile(file(kLogFile), "");
  fs::remove(file(kSealFile));
  AddRecord(*OpenSpace(space()), 2);
  WriteFile(file(kLogFile), log);
  fs::remove(file(kSealFile));
  EXPECT_THROW(OpenSpace(space()), DamagedStorage) << "it is whole";
  log[kLogHeaderBytes + 1] ^= 1;
  WriteFile(file(kLogFile), log);
  EXPECT_EQ(GenerationOf(*OpenSpace(space())), 3u);
}

// A log without an engine, which other threads have moved on meanwhile. There is no file: what the seal knows is damaged.
class CommitLogFollowed : public testing::Test {
 protected:
  static constexpr std::uint64_t kIdentity = 7;

  CommitLogFollowed() { m_seal.Lock(); }  // makes the file
  CommitLog::Answer Follow(std::uint64_t base, bool isNewest = true) {
    return m_log.Follow({base, kIdentity}, m_seal, [&] { return isNewest; }, m_position);
  }
  void Seal(const LogSeal& seal) { ASSERT_TRUE(m_seal.Write(seal)); }
  const LogPosition& position() const { return m_position; }

 private:
  TempFolder m_folder;
  CommitLog m_log{m_folder.path(), "space", false, true};
  SealFile m_seal{m_folder.path() / kSealFile, "space", false};
  LogPosition m_position;
};

TEST_F(CommitLogFollowed, DoesNotGoBackToAnOlderBase) {
  ASSERT_EQ(Follow(5), CommitLog::Answer::kKnown);
  EXPECT_EQ(Follow(4), CommitLog::Answer::kOvertaken);
  EXPECT_EQ(Follow(5), CommitLog::Answer::kKnown);
  EXPECT_EQ(position().commit, 5u);
}

TEST_F(CommitLogFollowed, IsOvertakenWhereTheSealKnowsANewerBase) {
  Seal({5, 5, 0});
  EXPECT_EQ(Follow(4), CommitLog::Answer::kOvertaken);
  EXPECT_EQ(Follow(5), CommitLog::Answer::kKnown);
}

TEST_F(CommitLogFollowed, IsDamagedOnlyWhileItsBaseIsTheNewest) {
  Seal({5, 7, 400});
  EXPECT_EQ(Follow(5, false), CommitLog::Answer::kOvertaken) << "it may have been written over";
  ASSERT_EQ(Follow(5, true), CommitLog::Answer::kKnown);
  EXPECT_EQ(position().commit, 7u);
  EXPECT_TRUE(position().tail->HasDamage(6));
}

}  // namespace
}  // namespace vemo::test
