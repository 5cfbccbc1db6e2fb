// The log of the LMDB engine where processes end or stay in the middle of a commit, and where the disk or the
// memory fails.
#include <fcntl.h>
#include <sys/file.h>
#include <unistd.h>

#include <cerrno>
#include <fstream>
#include <iterator>
#include <optional>
#include <vector>

#include "engines/lmdb/log_file.h"
#include "engines/lmdb/space_folder.h"
#include "tests/engines/child_process.h"
#include "tests/engines/logged_space.h"
#include "tests/support/failing_allocator.h"
#include "tests/support/failing_disk.h"

namespace vemo::test {
namespace {

namespace fs = std::filesystem;

bool IsMetaPage(const WatchedDisk::Write& write) {
  constexpr off_t kEndOfMetaPages = 2 * 4096;
  return write.file == kDataFile && write.offset < kEndOfMetaPages && write.size < 4096;
}

class CommitLogFaults : public LoggedSpace {};

// LMDB's table of readers has the transaction before then, and the meta page the new one.
TEST_F(CommitLogFaults, AKillWithinACommitOfLmdbLeavesASpaceThatCanBeRead) {
  ChildProcess reader([&](const Conversation& parent) {
    const auto engine = OpenSpace(space());
    parent.Say("open");
    parent.Hear();
    try {
      parent.Say(std::to_string(GenerationOf(*engine)));
    } catch (const std::exception& error) {
      parent.Say(error.what());
    }
    parent.Hear();
    return true;
  });
  ASSERT_EQ(reader.Hear(), "open");
  ChildProcess writer([&](const Conversation&) {
    const auto engine = OpenSpace(space());
    Edit(*engine, 2, 2);
    Edit(*engine, 3, 3);
    const WatchedDisk disk(
        [](const WatchedDisk::Write& write) { return IsMetaPage(write) ? ::kill(::getpid(), SIGKILL) : 0; });
    AddRecord(*engine, 4);
    return true;
  });
  EXPECT_FALSE(writer.Succeeded());
  reader.Say("go");
  EXPECT_EQ(reader.Hear(), "4") << "or 5";
  ChildProcess again([&](const Conversation&) { return GenerationOf(*OpenSpace(space())) >= 4; });
  EXPECT_TRUE(again.Succeeded()) << "while the reader has it open";
  reader.Say("end");
  EXPECT_TRUE(reader.Succeeded());
  const auto engine = OpenSpace(space());
  const std::uint64_t generation = GenerationOf(*engine);
  Edit(*engine, generation, 9);
  EXPECT_EQ(EditedIn(*engine), EditedRecord(kEdited, 9));
}

TEST_F(CommitLogFaults, ACommitOfLmdbThatTakesLongLeavesReadersAlone) {
  ChildProcess reader([&](const Conversation& parent) {
    const auto engine = OpenSpace(space());
    parent.Say("open");
    parent.Hear();
    parent.Say(std::to_string(GenerationOf(*engine)));
    return true;
  });
  ASSERT_EQ(reader.Hear(), "open");
  ChildProcess writer([&](const Conversation& parent) {
    const auto engine = OpenSpace(space());
    Edit(*engine, 2, 2);
    const WatchedDisk disk([&](const WatchedDisk::Write& write) {
      if (!IsMetaPage(write)) return 0;
      parent.Say("in the write");
      parent.Hear();
      return 0;
    });
    AddRecord(*engine, 3);
    return true;
  });
  ASSERT_EQ(writer.Hear(), "in the write");
  reader.Say("go");
  EXPECT_EQ(reader.Hear(), "3");
  EXPECT_TRUE(reader.Succeeded());
  writer.Say("on");
  EXPECT_TRUE(writer.Succeeded());
}

TEST_F(CommitLogFaults, OpeningDoesNotWaitForACommit) {
  { Edit(*OpenSpace(space()), 2, 2); }
  const int seal = ::open(file(kSealFile).c_str(), O_RDWR);
  ASSERT_EQ(::flock(seal, LOCK_EX), 0);
  EXPECT_EQ(GenerationOf(*OpenSpace(space(), Syncs::kEachCommit, Access::kReading)), 3u);
  ::close(seal);
}

// The write of the meta page reaches the disk and fails all the same; what LMDB writes over it then is not
// flushed.
TEST_F(CommitLogFaults, AFailedCommitOfLmdbThatTheDiskHasDoesNotHideTheLog) {
  for (const bool reopens : {false, true}) {
    auto engine = OpenSpace(space());
    Edit(*engine, GenerationOf(*engine), 76);  // what is there before is known to be on the disk
    const std::uint64_t generation = GenerationOf(*engine);
    std::string onDisk;
    {
      const WatchedDisk disk(
          [&](const WatchedDisk::Write& write) {
            if (!IsMetaPage(write) || !onDisk.empty()) return 0;
            onDisk = ReadFile(file(kDataFile));
            return EIO;
          },
          [&](const std::string& name) {
            if (!onDisk.empty() && name == kDataFile) onDisk = ReadFile(file(kDataFile));
          });
      EXPECT_THROW(AddRecord(*engine, generation), StoreError);
      if (reopens) {
        engine.reset();
        engine = OpenSpace(space());
        ASSERT_EQ(GenerationOf(*engine), generation);
      }
      Edit(*engine, generation, 77);
      Edit(*engine, generation + 1, 78);
      engine.reset();
    }
    WriteFile(file(kDataFile), onDisk);  // the power is lost
    engine = OpenSpace(space());
    EXPECT_EQ(GenerationOf(*engine), generation + 2);
    EXPECT_EQ(EditedIn(*engine), EditedRecord(kEdited, 78));
    AddRecord(*engine, generation + 2);
  }
}

// As the above leaves it where nobody looks after that.
TEST_F(CommitLogFaults, ALogBesideAnotherCommitOfItsNumberIsRefused) {
  std::string log, seal;
  {
    const auto engine = OpenSpace(space());
    Edit(*engine, 2, 2);
    log = ReadFile(file(kLogFile));
    seal = ReadFile(file(kSealFile));
  }
  {
    fs::resize_file(file(kLogFile), 0);
    fs::remove(file(kSealFile));
    const auto engine = OpenSpace(space());
    AddRecord(*engine, 2);  // data.mdb has a commit 3 as well
  }
  WriteFile(file(kSealFile), seal);
  EXPECT_THROW(OpenSpace(space()), DamagedStorage) << "which is what the seal tells";
  WriteFile(file(kLogFile), log);
  fs::remove(file(kSealFile));
  EXPECT_THROW(OpenSpace(space()), DamagedStorage) << "which is what the log tells";
}

TEST_F(CommitLogFaults, WhatIsAcknowledgedBehindAnUnsyncedCommitIsOnTheDisk) {
  ChildProcess unsynced([&](const Conversation& parent) {
    const auto engine = OpenSpace(space(), Syncs::kNothing);
    AddRecord(*engine, 2);
    parent.Say("done");
    parent.Hear();
    return true;
  });
  EXPECT_EQ(unsynced.Hear(), "done");
  unsynced.Kill();
  int syncedData = 0, syncedLog = 0, syncedFolder = 0;
  const auto engine = OpenSpace(space());
  const WatchedDisk disk({}, [&](const std::string& name) {
    if (name == kDataFile) ++syncedData;
    if (name == kLogFile) ++syncedLog;
    if (name == "space") ++syncedFolder;
  });
  Edit(*engine, 3, 5);
  EXPECT_GT(syncedLog, 0);
  EXPECT_EQ(syncedData, 1);
  EXPECT_EQ(syncedFolder, 1) << "which has the name of the log";
  syncedLog = syncedData = 0;
  Edit(*engine, 4, 6);
  EXPECT_EQ(syncedLog, 1);
  EXPECT_EQ(syncedData, 0);
}

TEST_F(CommitLogFaults, AReadOnlyEngineThatFoundNoSealSeesLaterCommits) {
  fs::remove(file(kSealFile));
  ChildProcess reader([&](const Conversation& parent) {
    const auto engine = OpenSpace(space(), Syncs::kEachCommit, Access::kReading);
    parent.Say(std::to_string(GenerationOf(*engine)));
    parent.Hear();
    parent.Say(std::to_string(GenerationOf(*engine)));
    return true;
  });
  ASSERT_EQ(reader.Hear(), "2");
  {
    const auto engine = OpenSpace(space());
    Edit(*engine, 2, 2);
    Edit(*engine, 3, 3);
  }
  reader.Say("go");
  EXPECT_EQ(reader.Hear(), "4");
}

TEST_F(CommitLogFaults, ALogThatAnotherProcessHasMadeAnewIsFollowed) {
  { AddRecord(*OpenSpace(space()), 2); }
  ChildProcess reader([&](const Conversation& parent) {
    const auto engine = OpenSpace(space(), Syncs::kEachCommit, Access::kReading);
    parent.Say(std::to_string(GenerationOf(*engine)));
    for (int i = 0; i < 2; ++i) {
      parent.Hear();
      parent.Say(EditedIn(*engine).value());
    }
    return true;
  });
  ASSERT_EQ(reader.Hear(), "3");
  auto engine = OpenSpace(space());
  Edit(*engine, 3, 4);
  reader.Say("go");
  EXPECT_EQ(reader.Hear(), EditedRecord(kEdited, 4)) << "it has the file open now";
  AddRecord(*engine, 4);
  engine.reset();
  fs::remove(file(kLogFile));
  engine = OpenSpace(space());
  Edit(*engine, 5, 5);  // makes the log
  Edit(*engine, 6, 6);
  reader.Say("go");
  EXPECT_EQ(reader.Hear(), EditedRecord(kEdited, 6));
}

TEST_F(CommitLogFaults, AnAllocationThatFailsLeavesTheLastCommit) {
  auto engine = OpenSpace(space());
  std::uint64_t generation = 2;
  bool hasFailed = true;
  for (int nth = 1; hasFailed; ++nth) {
    SCOPED_TRACE(nth);
    bool isMade = false;
    {
      BatchBuilder batch;
      batch.Put(kEdited, EditedRecord(kEdited, static_cast<std::uint64_t>(nth)));
      batch.Name(NamedTable::kMeta, "name" + std::to_string(nth), "value");
      const CommitBatch& ready = batch.At(generation);
      const FailingAllocation allocation(nth);
      try {
        engine->Commit(ready);
        isMade = true;
      } catch (const std::bad_alloc&) {
        isMade = false;
      }
      hasFailed = allocation.HasFailed();
    }
    if (isMade) ++generation;
    ASSERT_EQ(GenerationOf(*engine), generation);
    Edit(*engine, generation++, 900);
    engine.reset();
    engine = OpenSpace(space());
    const auto snapshot = engine->OpenSnapshot();
    ASSERT_EQ(snapshot->Generation(), generation);
    ASSERT_TRUE(snapshot->CheckStorage().empty());
    ASSERT_EQ(ToText(snapshot->Read(OID(kEdited))), EditedRecord(kEdited, 900));
  }
}

// What was not acknowledged is there for good or not at all, as the next look shows; commits go on.
TEST_F(CommitLogFaults, ADiskThatFailsLeavesTheLastCommit) {
  auto engine = OpenSpace(space());
  std::uint64_t generation = 2, version = 1;
  for (const bool staysBroken : {false, true}) {
    for (const bool writesAllTheSame : {false, true}) {
      bool hasFailed = true;
      for (int nth = 1; hasFailed; ++nth) {
        SCOPED_TRACE(testing::Message() << nth << staysBroken << writesAllTheSame);
        ASSERT_LT(nth, 20);
        bool isAcknowledged = false, isRefused = false;
        {
          const FailingDisk disk(nth, staysBroken, writesAllTheSame);
          try {
            Edit(*engine, generation, version + 1);
            isAcknowledged = true;
          } catch (const UnknownOutcome&) {
          } catch (const StoreError&) {
            isRefused = true;
          }
          hasFailed = disk.HasFailed();
        }
        const bool isMade = GenerationOf(*engine) == generation + 1;
        ASSERT_TRUE(isMade || GenerationOf(*engine) == generation);
        ASSERT_TRUE(isMade || !isAcknowledged);
        ASSERT_TRUE(!isMade || !isRefused);
        if (isMade) ++generation, ++version;
        EXPECT_EQ(EditedIn(*engine), EditedRecord(kEdited, version));
        Edit(*engine, generation++, ++version);
        EXPECT_EQ(EditedIn(*engine), EditedRecord(kEdited, version));
        engine.reset();
        engine = OpenSpace(space());
        EXPECT_EQ(GenerationOf(*engine), generation);
        EXPECT_EQ(EditedIn(*engine), EditedRecord(kEdited, version));
        EXPECT_TRUE(engine->OpenSnapshot()->CheckStorage().empty());
      }
    }
  }
}

// The system may believe that pages are written which are not.
TEST_F(CommitLogFaults, AfterAFlushThatFailedCommitsGoToTheTables) {
  const auto engine = OpenSpace(space());
  Edit(*engine, 2, 2);  // the first flush is of the tables
  const std::string data = ReadFile(file(kDataFile));
  {
    const FailingDisk disk(2, false);
    EXPECT_THROW(Edit(*engine, 3, 3), StoreError);
  }
  EXPECT_EQ(EditedIn(*engine), EditedRecord(kEdited, 2));
  EXPECT_TRUE(ReadFile(file(kDataFile)) == data);
  Edit(*engine, 3, 4);
  EXPECT_FALSE(ReadFile(file(kDataFile)) == data);
  EXPECT_EQ(EditedIn(*engine), EditedRecord(kEdited, 4));
}

TEST_F(CommitLogFaults, AnEntryThatWasNotFlushedIsTakenBackOnTheDiskAndNotLookedForAgain) {
  const auto engine = OpenSpace(space());
  Edit(*engine, 2, 2);
  int written = 0, synced = 0;
  const WatchedDisk disk(
      [&](const WatchedDisk::Write& write) {
        written += write.file == kLogFile;
        return 0;
      },
      [&](const std::string& name) { synced += name == kLogFile; });
  {
    const FailingDisk failing(2, false);
    EXPECT_THROW(Edit(*engine, 3, 3), StoreError);
  }
  EXPECT_EQ(written, 2);
  EXPECT_EQ(synced, 2);
  EXPECT_EQ(GenerationOf(*engine), 3u);
  EXPECT_EQ(written, 2) << "who reads writes nothing";
}

// Other processes hear of it by the next one.
TEST_F(CommitLogFaults, AfterASealThatCannotBeWrittenCommitsGoToTheTables) {
  const auto engine = OpenSpace(space());
  Edit(*engine, 2, 2);
  const std::string data = ReadFile(file(kDataFile));
  {
    const WatchedDisk disk([](const WatchedDisk::Write& write) { return write.file == kSealFile ? EIO : 0; });
    Edit(*engine, 3, 3);
  }
  EXPECT_TRUE(ReadFile(file(kDataFile)) == data);
  EXPECT_EQ(EditedIn(*engine), EditedRecord(kEdited, 3));
  Edit(*engine, 4, 4);
  EXPECT_FALSE(ReadFile(file(kDataFile)) == data);
  EXPECT_EQ(EditedIn(*engine), EditedRecord(kEdited, 4));
}

// The flush fails, and so does the write that takes the commit back.
TEST_F(CommitLogFaults, AnEntryThatWasNotFlushedIsWrittenAgainBeforeItIsBelieved) {
  const auto engine = OpenSpace(space());
  Edit(*engine, 2, 2);
  {
    const FailingDisk disk(2, true);
    EXPECT_THROW(Edit(*engine, 3, 3), UnknownOutcome);
  }
  bool isWrittenAgain = false, isFlushed = false;
  const WatchedDisk disk(
      [&](const WatchedDisk::Write& write) {
        if (write.file == kLogFile) isWrittenAgain = true;
        return 0;
      },
      [&](const std::string& name) { isFlushed = isFlushed || (isWrittenAgain && name == kLogFile); });
  EXPECT_EQ(GenerationOf(*engine), 4u);
  EXPECT_TRUE(isWrittenAgain && isFlushed);
}

// As AFailedCommitOfLmdbThatTheDiskHasDoesNotHideTheLog, with the edits in a process that has synced before.
TEST_F(CommitLogFaults, AFailedCommitOfAnotherProcessThatTheDiskHasDoesNotHideTheLog) {
  ChildProcess editor([&](const Conversation& parent) {
    const auto engine = OpenSpace(space());
    Edit(*engine, 2, 2);
    std::size_t synced = 0;
    const WatchedDisk disk({}, [&](const std::string& name) { synced += name == kDataFile; });
    parent.Say("synced");
    parent.Hear();
    Edit(*engine, 3, 77);
    parent.Say(synced != 0 ? "and again" : "and no more");
    parent.Hear();
    return true;
  });
  ASSERT_EQ(editor.Hear(), "synced");
  ChildProcess failing([&](const Conversation& parent) {
    const auto engine = OpenSpace(space());
    bool isDone = false;
    const WatchedDisk disk([&](const WatchedDisk::Write& write) {
      if (!IsMetaPage(write) || isDone) return 0;
      isDone = true;
      WriteFile(space().parent_path() / "onDisk", ReadFile(file(kDataFile)));
      return EIO;
    });
    try {
      AddRecord(*engine, 3);
      parent.Say("made");
    } catch (const StoreError&) {
      parent.Say("failed");
    }
    parent.Hear();
    return true;
  });
  ASSERT_EQ(failing.Hear(), "failed");
  editor.Say("go");
  const std::string again = editor.Hear();
  editor.Kill();
  failing.Kill();
  // The power is lost.
  if (again == "and no more") WriteFile(file(kDataFile), ReadFile(space().parent_path() / "onDisk"));
  const auto engine = OpenSpace(space());
  EXPECT_EQ(GenerationOf(*engine), 4u);
  EXPECT_EQ(EditedIn(*engine), EditedRecord(kEdited, 77));
}

// The meta page of the failed commit stays, since what LMDB writes over it fails as well. No power is lost.
TEST_F(CommitLogFaults, AMetaPageOfAFailedCommitThatStaysDoesNotHideTheLog) {
  ChildProcess reader([&](const Conversation& parent) {
    const auto engine = OpenSpace(space());
    parent.Say("open");
    parent.Hear();
    return true;
  });
  ASSERT_EQ(reader.Hear(), "open");
  auto engine = OpenSpace(space());
  {
    std::string onDisk;
    const WatchedDisk disk([&](const WatchedDisk::Write& write) {
      if (!IsMetaPage(write)) return 0;
      if (onDisk.empty()) {
        onDisk = ReadFile(file(kDataFile));
      } else {
        std::fstream(file(kDataFile), std::ios::in | std::ios::out | std::ios::binary).write(onDisk.data(), 2 * 4096);
      }
      return EIO;
    });
    EXPECT_THROW(AddRecord(*engine, 2), StoreError);
  }
  const std::uint64_t generation = GenerationOf(*engine);
  Edit(*engine, generation, 77);
  EXPECT_EQ(GenerationOf(*engine), generation + 1);
  engine.reset();
  reader.Say("end");
  EXPECT_TRUE(reader.Succeeded());
  engine = OpenSpace(space());
  EXPECT_EQ(GenerationOf(*engine), generation + 1);
  EXPECT_EQ(EditedIn(*engine), EditedRecord(kEdited, 77));
}

// The flush fails though the disk has it, and so does that of the header that takes it back.
TEST_F(CommitLogFaults, AnEntryThatWasTakenBackIsGoneForGoodBeforeAnotherProcessCommits) {
  ChildProcess failing([&](const Conversation& parent) {
    const auto engine = OpenSpace(space());
    int logWrites = 0;
    std::optional<FailingDisk> broken;
    const WatchedDisk watched([&](const WatchedDisk::Write& write) {
      if (write.file != kLogFile) return 0;
      if (++logWrites == 2) {  // behind what a process writes again at its first look
        broken.emplace(1, true, true);  // all from the flush on; the file of before has the header that takes it back
      }
      return 0;
    });
    try {
      Edit(*engine, 2, 2);
      parent.Say("made");
    } catch (const UnknownOutcome&) {
      parent.Say("unknown");
    }
    parent.Hear();
    return true;
  });
  ASSERT_EQ(failing.Hear(), "unknown");
  failing.Kill();
  bool isWritten = false, isFlushed = false;
  const WatchedDisk disk(
      [&](const WatchedDisk::Write& write) {
        if (write.file == kLogFile) isWritten = true;
        EXPECT_TRUE(isFlushed || !IsMetaPage(write)) << "the next commit of that number is made";
        return 0;
      },
      [&](const std::string& name) { isFlushed = isFlushed || (isWritten && name == kLogFile); });
  const auto engine = OpenSpace(space());
  ASSERT_EQ(GenerationOf(*engine), 2u);
  AddRecord(*engine, 2);
  EXPECT_TRUE(isFlushed);
}

// The disk has room for it then, and a commit in it is found by its name.
TEST_F(CommitLogFaults, ALogIsOnTheDiskBeforeTheCommitThatMakesIt) {
  { AddRecord(*OpenSpace(space()), 2); }
  fs::remove(file(kLogFile));
  const auto engine = OpenSpace(space());
  AddRecord(*engine, 3);
  std::vector<std::string> synced;
  const WatchedDisk disk(
      [&](const WatchedDisk::Write& write) {
        if (IsMetaPage(write)) synced.push_back("the commit");
        return 0;
      },
      [&](const std::string& name) {
        if (name != kDataFile) synced.push_back(name);
      });
  Edit(*engine, 4, 2);
  const std::string parent = space().parent_path().filename().string();
  EXPECT_EQ(synced, (std::vector<std::string>{kUnfinishedLogFile, "space", parent, "the commit"}));
}

// Without it the space would be refused, which might have had commits there.
TEST_F(CommitLogFaults, ALogThatWasMadeWithoutSyncingIsOnTheDiskBeforeTheNextCommit) {
  { AddRecord(*OpenSpace(space()), 2); }
  fs::remove(file(kLogFile));
  ChildProcess unsynced([&](const Conversation& parent) {
    const auto engine = OpenSpace(space(), Syncs::kNothing);
    Edit(*engine, 3, 3);  // makes the log
    parent.Say("made");
    parent.Hear();
    return true;
  });
  ASSERT_EQ(unsynced.Hear(), "made");
  unsynced.Kill();
  const auto engine = OpenSpace(space());
  bool isNameSynced = false;
  const WatchedDisk disk(
      [&](const WatchedDisk::Write& write) {
        EXPECT_TRUE(isNameSynced || !IsMetaPage(write));
        return 0;
      },
      [&](const std::string& name) { isNameSynced = isNameSynced || name == "space"; });
  AddRecord(*engine, 4);
  EXPECT_TRUE(isNameSynced);
}

TEST_F(CommitLogFaults, ALogThatCannotBeMadeIsDoneWithout) {
  const auto openFiles = [] {
    return std::distance(fs::directory_iterator("/proc/self/fd"), fs::directory_iterator());
  };
  for (int nth = 1; nth <= 3; ++nth) {  // the write, the flush of the file and that of its folder
    SCOPED_TRACE(nth);
    { AddRecord(*OpenSpace(space()), 2 * static_cast<std::uint64_t>(nth)); }
    fs::remove(file(kLogFile));
    const auto engine = OpenSpace(space());
    const auto before = openFiles();
    const std::uint64_t generation = GenerationOf(*engine);
    {
      const FailingDisk disk(nth, false);
      Edit(*engine, generation, 10 + static_cast<std::uint64_t>(nth));
      EXPECT_TRUE(disk.HasFailed());
    }
    EXPECT_EQ(openFiles(), before);
    EXPECT_FALSE(fs::exists(file(kUnfinishedLogFile)));
    EXPECT_EQ(EditedIn(*engine), EditedRecord(kEdited, 10 + static_cast<std::uint64_t>(nth)));
  }
}

}  // namespace
}  // namespace vemo::test
