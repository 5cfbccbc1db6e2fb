// Commits of the LMDB engine that go to its log.
#include "engines/lmdb/commit_log.h"

#include <atomic>
#include <cstring>
#include <functional>
#include <map>
#include <mutex>
#include <optional>
#include <thread>
#include <utility>

#include "engines/lmdb/space_folder.h"
#include "tests/engines/child_process.h"
#include "tests/engines/lmdb_site.h"
#include "tests/support/temp_folder.h"

namespace vemo::test {
namespace {

namespace fs = std::filesystem;

// Large bounds, so that the room of the log alone decides.
std::unique_ptr<Engine> OpenSpace(const fs::path& path, bool sync = true) {
  LmdbOptions options;
  options.path = path;
  options.syncEachCommit = sync;
  options.create = true;
  options.pendingChanges = {.bytes = 1u << 30, .commits = 1u << 30, .records = 1u << 30};
  return OpenLmdbEngine(options);
}

constexpr std::uint64_t kRecords = 20;

class CommitLogs : public testing::Test {
 protected:
  // The first commit makes the records, the second one the log.
  CommitLogs() : m_engine(OpenSpace(space())) {
    BatchBuilder batch;
    for (std::uint64_t oid = 1; oid <= kRecords; ++oid) batch.Put(oid, m_expected[oid] = EditedRecord(oid, 0));
    m_engine->Commit(batch.At(m_commits++));
    Edit(1);
  }

  fs::path space() const { return m_folder.path() / "space"; }
  fs::path file(const char* name) const { return space() / name; }
  Engine& engine() { return *m_engine; }
  std::uint64_t commits() const { return m_commits; }

  void Close() { m_engine.reset(); }
  void Open(bool sync = true) { m_engine = OpenSpace(space(), sync); }

  BatchBuilder EditOf(std::uint64_t oid) {
    BatchBuilder batch;
    batch.Put(oid, m_expected[oid] = EditedRecord(oid, ++m_version));
    return batch;
  }
  void Commit(BatchBuilder& batch) { m_engine->Commit(batch.At(m_commits++)); }
  void Edit(std::uint64_t oid) {
    BatchBuilder batch = EditOf(oid);
    m_engine->Commit(batch.At(m_commits++));
  }
  // A commit that no log takes.
  void AddRecord() {
    BatchBuilder batch;
    const std::uint64_t oid = 1000 + m_commits;
    batch.Put(oid, m_expected[oid] = "new");
    m_engine->Commit(batch.At(m_commits++));
  }

  Records Expected() const { return {m_expected.begin(), m_expected.end()}; }
  void ExpectAll() {
    const auto snapshot = m_engine->OpenSnapshot();
    EXPECT_EQ(snapshot->Generation(), m_commits);
    EXPECT_EQ(AllRecords(*snapshot), Expected());
    EXPECT_TRUE(snapshot->CheckStorage().empty());
  }

  // Where the entry of a commit begins in the log, as its header tells.
  static std::size_t PlaceOf(std::uint64_t commit, const std::string& log) {
    for (std::size_t at = 0; at + kLogHeaderBytes < log.size(); at += kLogAlignment) {
      std::uint64_t numbers[2];
      std::memcpy(numbers, &log[at], sizeof numbers);
      if (numbers[0] == commit && numbers[1] < commit && commit - numbers[1] < 1000) return at;
    }
    ADD_FAILURE() << "commit " << commit << " is not in the log";
    return 0;
  }
  void ChangeLog(const std::function<void(std::string&)>& change) {
    std::string log = ReadFile(file(kLogFile));
    change(log);
    WriteFile(file(kLogFile), log);
  }

  std::map<std::uint64_t, std::string> m_expected;

 private:
  TempFolder m_folder;
  std::unique_ptr<Engine> m_engine;
  std::uint64_t m_commits = 0;
  std::uint64_t m_version = 0;
};

TEST_F(CommitLogs, TakeEditsWithoutAnyWriteToTheTables) {
  const std::string data = ReadFile(file(kDataFile));
  for (std::uint64_t i = 0; i < 50; ++i) {
    Edit(1 + i % kRecords);
    ExpectAll();
  }
  EXPECT_TRUE(ReadFile(file(kDataFile)) == data);
  Close();
  Open();
  ExpectAll();
  EXPECT_TRUE(ReadFile(file(kDataFile)) == data);
}

TEST_F(CommitLogs, ThatAreFullGoToTheTablesAndBeginAgain) {
  Close();
  Open(false);  // for the time that it takes
  std::size_t written = 0;
  std::string data = ReadFile(file(kDataFile));
  for (std::uint64_t i = 0; i < 2 * kLogBytes / kLogHeaderBytes && written < 3; ++i) {
    Edit(1 + i % kRecords);
    if (i % 64 != 0) continue;
    ExpectAll();
    if (std::string now = ReadFile(file(kDataFile)); now != data) {
      ++written;
      data = std::move(now);
    }
  }
  EXPECT_EQ(written, 3u);
  EXPECT_EQ(fs::file_size(file(kLogFile)), kLogBytes);
  Close();
  Open();
  ExpectAll();
}

TEST_F(CommitLogs, GoAlongWithTheNextCommitToTheTables) {
  for (std::uint64_t round = 0; round < 4; ++round) {
    for (std::uint64_t i = 0; i < 5; ++i) Edit(1 + (3 * round + i) % kRecords);
    AddRecord();
    ExpectAll();
    Close();
    Open();
    ExpectAll();
  }
}

TEST_F(CommitLogs, TakeTheUsersNamesAndNoOthers) {
  std::map<std::string, std::string> names;
  const auto name = [&](NamedTable table, const std::string& key, const std::optional<std::string>& value) {
    BatchBuilder batch;
    if (value) {
      batch.Name(table, key, *value);
    } else {
      batch.Unname(table, key);
    }
    Commit(batch);
    if (table != NamedTable::kMeta) return;
    if (value) {
      names[key] = *value;
    } else {
      names.erase(key);
    }
  };
  name(NamedTable::kMeta, "b", "1");
  name(NamedTable::kMeta, "d", "1");
  name(NamedTable::kMeta, "e", "1");
  AddRecord();  // these are in the table now
  const std::string data = ReadFile(file(kDataFile));
  name(NamedTable::kMeta, "a", "2");
  name(NamedTable::kMeta, "c", "2");
  name(NamedTable::kMeta, "d", "2");
  name(NamedTable::kMeta, "e", std::nullopt);
  name(NamedTable::kMeta, "f", "");
  name(NamedTable::kMeta, "a", "3");
  EXPECT_TRUE(ReadFile(file(kDataFile)) == data);
  const auto check = [&] {
    const auto snapshot = engine().OpenSnapshot();
    EXPECT_EQ(AllNamed(*snapshot, NamedTable::kMeta), Named(names.begin(), names.end()));
    EXPECT_EQ(AllNamed(*snapshot, NamedTable::kMeta, "d"), (Named{{"d", "2"}}));
    for (const char* key : {"a", "b", "c", "d", "e", "f", "g"}) {
      EXPECT_EQ(ToText(snapshot->ReadNamed(NamedTable::kMeta, key)),
                names.contains(key) ? std::optional(names[key]) : std::nullopt)
          << key;
    }
    // A scan ends where its visitor says so, whichever the value is from.
    for (std::size_t most = 1; most <= names.size(); ++most) {
      std::size_t seen = 0;
      snapshot->ScanNamed(NamedTable::kMeta, "", [&](std::string_view, ByteView) { return ++seen < most; });
      EXPECT_EQ(seen, most);
    }
  };
  check();
  Close();
  Open();
  check();
  name(NamedTable::kInfo, "other", "1");
  EXPECT_FALSE(ReadFile(file(kDataFile)) == data);
  check();
  name(NamedTable::kMeta, "b", std::nullopt);
  check();
}

TEST_F(CommitLogs, AreReadBySnapshotsAsOfTheirCommit) {
  std::vector<std::pair<std::unique_ptr<EngineSnapshot>, Contents>> open;
  for (std::uint64_t i = 0; i < 60; ++i) {
    BatchBuilder batch = EditOf(1 + i % 7);
    batch.Name(NamedTable::kMeta, "name", std::to_string(i));
    Commit(batch);
    if (i % 11 == 10) AddRecord();
    auto snapshot = engine().OpenSnapshot();
    Contents contents = ContentsOf(*snapshot);
    EXPECT_EQ(contents.records, Expected());
    if (i % 4 == 0) open.emplace_back(std::move(snapshot), std::move(contents));
    for (const auto& [old, expected] : open) ASSERT_EQ(ContentsOf(*old), expected) << i;
  }
}

TEST_F(CommitLogs, AreSeenAndWrittenByOtherProcessesInTurn) {
  for (std::uint64_t i = 0; i < 5; ++i) Edit(1 + i);
  const std::uint64_t before = commits();
  Close();  // a child must not inherit an open engine
  ChildProcess child([&](const Conversation& parent) {
    const auto other = OpenSpace(space());
    for (std::uint64_t turn = 0; turn < 6; ++turn) {
      parent.Hear();
      const auto snapshot = other->OpenSnapshot();
      if (snapshot->Generation() != before + 2 * turn + 1) return false;
      if (ToText(snapshot->Read(OID(3))) != EditedRecord(3, 100 + turn)) return false;
      BatchBuilder batch;
      batch.Put(4, EditedRecord(4, 200 + turn));
      if (turn == 3) batch.Put(500, "to the tables");
      other->Commit(batch.At(snapshot->Generation()));
      parent.Say("done");
    }
    return true;
  });
  Open();
  for (std::uint64_t turn = 0; turn < 6; ++turn) {
    BatchBuilder batch;
    batch.Put(3, EditedRecord(3, 100 + turn));
    engine().Commit(batch.At(before + 2 * turn));
    child.Say("go");
    ASSERT_EQ(child.Hear(), "done");
    const auto snapshot = engine().OpenSnapshot();
    EXPECT_EQ(snapshot->Generation(), before + 2 * turn + 2);
    EXPECT_EQ(ToText(snapshot->Read(OID(4))), EditedRecord(4, 200 + turn));
  }
  EXPECT_TRUE(child.Succeeded());
  EXPECT_TRUE(ToText(engine().OpenSnapshot()->Read(OID(500))));
}

TEST_F(CommitLogs, EndBeforeAnEntryThatIsNotWholeAndWasNotSealed) {
  Edit(2);
  const std::string seal = ReadFile(file(kSealFile));
  const auto expected = m_expected;
  Edit(3);
  Close();
  WriteFile(file(kSealFile), seal);
  ChangeLog([&](std::string& log) { log[PlaceOf(commits(), log) + kLogHeaderBytes + 1] ^= 1; });
  Open();
  EXPECT_EQ(engine().OpenSnapshot()->Generation(), commits() - 1);
  EXPECT_EQ(AllRecords(*engine().OpenSnapshot()), Records(expected.begin(), expected.end()));
  BatchBuilder batch = EditOf(3);
  EXPECT_EQ(engine().Commit(batch.At(commits() - 1)), commits());
  ExpectAll();
  Close();
  Open();
  ExpectAll();
}

// Its commit may have been acknowledged, and the seal lost with the power.
TEST_F(CommitLogs, HaveAnEntryThatIsWholeAndWasNotSealed) {
  Edit(2);
  const std::string seal = ReadFile(file(kSealFile));
  Edit(3);
  Edit(4);
  Close();
  WriteFile(file(kSealFile), seal);
  Open();
  ExpectAll();
  EXPECT_FALSE(ReadFile(file(kSealFile)) == seal) << "it is sealed by whoever finds it";
  Close();
  fs::remove(file(kSealFile));
  Open();
  ExpectAll();
  Edit(5);
  ExpectAll();
}

TEST_F(CommitLogs, ThatAreDamagedMakeDoubtfulWhatTheyMayHaveChanged) {
  for (const bool isHeader : {true, false}) {
    for (const bool isSealed : {true, false}) {
      SCOPED_TRACE(testing::Message() << isHeader << isSealed);
      const std::uint64_t first = commits() + 1;
      for (std::uint64_t oid = 1; oid <= 5; ++oid) Edit(oid);
      Close();
      const std::string before = ReadFile(file(kLogFile));
      const std::string seal = ReadFile(file(kSealFile));
      ChangeLog([&](std::string& log) {
        log[PlaceOf(first + 2, log) + (isHeader ? 20 : kLogHeaderBytes + 9)] ^= 4;
      });
      if (!isSealed) fs::remove(file(kSealFile));
      Open();
      {
        const auto snapshot = engine().OpenSnapshot();
        EXPECT_EQ(snapshot->Generation(), commits());
        for (const std::uint64_t later : {4, 5})
          EXPECT_EQ(ToText(snapshot->Read(OID(later))), m_expected[later]);
        for (const std::uint64_t doubtful : {1, 2, 3, 6})
          EXPECT_THROW(snapshot->Read(OID(doubtful)), DamagedStorage) << doubtful;
        EXPECT_THROW(snapshot->ReadNamed(NamedTable::kMeta, "name"), DamagedStorage);
        EXPECT_FALSE(snapshot->ReadNamed(NamedTable::kRoots, "name"));
        ASSERT_EQ(snapshot->CheckStorage().size(), 1u);
        EXPECT_EQ(snapshot->CheckStorage().front().what,
                  "the changes of commit " + std::to_string(first + 2) + " are damaged");
      }
      BatchBuilder batch;
      batch.Put(4, "other");
      EXPECT_THROW(engine().Commit(batch.At(commits())), DamagedStorage);
      Close();
      WriteFile(file(kLogFile), before);
      WriteFile(file(kSealFile), seal);
      Open();
      ExpectAll();
    }
  }
}

TEST_F(CommitLogs, WhoseSealedEndIsMissingAreDamaged) {
  Edit(2);
  Edit(3);
  Close();
  ChangeLog([&](std::string& log) { log.resize(PlaceOf(commits(), log)); });
  Open();
  const auto snapshot = engine().OpenSnapshot();
  EXPECT_EQ(snapshot->Generation(), commits());
  EXPECT_THROW(snapshot->Read(OID(3)), DamagedStorage);
}

TEST_F(CommitLogs, ThatAreMissingAreRefusedUnlessNothingCanHaveBeenInThem) {
  Edit(2);
  Close();
  fs::remove(file(kLogFile));
  const std::string message = MessageOf<DamagedStorage>([&] { Open(); });
  EXPECT_TRUE(Contains(message, "commits.log is missing")) << message;
  const std::string seal = ReadFile(file(kSealFile));
  fs::remove(file(kSealFile));
  EXPECT_THROW(Open(), DamagedStorage);
  // The way out that the message names.
  WriteFile(file(kLogFile), "");
  Open();
  EXPECT_EQ(engine().OpenSnapshot()->Generation(), commits() - 1);
}

TEST_F(CommitLogs, ThatAreMissingAndWereEmptyAreMadeAnew) {
  Edit(2);
  AddRecord();
  Close();
  fs::remove(file(kLogFile));
  Open();
  ExpectAll();
  for (std::uint64_t oid = 1; oid <= 4; ++oid) Edit(oid);
  EXPECT_TRUE(fs::exists(file(kLogFile)));
  Close();
  Open();
  ExpectAll();
}

TEST_F(CommitLogs, OfANewerDataFileAreRefused) {
  Edit(2);
  const std::string older = ReadFile(file(kDataFile));
  AddRecord();
  Edit(3);
  Close();
  WriteFile(file(kDataFile), older);
  EXPECT_THROW(Open(), DamagedStorage);
  fs::remove(file(kSealFile));
  const std::string message = MessageOf<DamagedStorage>([&] { Open(); });
  EXPECT_TRUE(Contains(message, "commits.log goes on behind commit")) << message;
}

TEST_F(CommitLogs, OfAnotherSpaceAreNotTaken) {
  Edit(2);
  Close();
  const fs::path other = space() / ".." / "other";
  {
    const auto engine = OpenSpace(other);
    BatchBuilder batch;
    for (std::uint64_t oid = 1; oid <= kRecords; ++oid) batch.Put(oid, EditedRecord(oid, 0));
    engine->Commit(batch.At(0));
    BatchBuilder first, second;
    engine->Commit(first.Put(1, EditedRecord(1, 7)).At(1));
    engine->Commit(second.Put(2, EditedRecord(2, 8)).At(2));
  }
  fs::copy_file(other / kLogFile, file(kLogFile), fs::copy_options::overwrite_existing);
  Open();
  EXPECT_THROW(engine().OpenSnapshot()->Read(OID(2)), DamagedStorage);
}

TEST_F(CommitLogs, OfAReadOnlyEngineAreReadAndNotWritten) {
  Edit(2);
  Close();
  fs::remove(file(kSealFile));
  const std::string log = ReadFile(file(kLogFile));
  LmdbOptions options;
  options.path = space();
  options.readOnly = true;
  EXPECT_EQ(AllRecords(*OpenLmdbEngine(options)->OpenSnapshot()), Expected());
  EXPECT_TRUE(ReadFile(file(kLogFile)) == log);
}

TEST_F(CommitLogs, HaveNoOtherKindsOfCommits) {
  const auto expectTables = [&](const char* what, BatchBuilder batch) {
    Edit(1);
    const std::string data = ReadFile(file(kDataFile));
    Commit(batch);
    EXPECT_FALSE(ReadFile(file(kDataFile)) == data) << what;
  };
  expectTables("queues", BatchBuilder().Queue(5));
  expectTables("finishes", BatchBuilder().Finish(5));
  expectTables("names", BatchBuilder().Name(NamedTable::kRoots, "root", "value"));
  m_expected.erase(9);
  expectTables("removes", BatchBuilder().Remove(9));
  m_expected[8] = std::string(3'000, 'Q');
  expectTables("replaces much", BatchBuilder().Put(8, m_expected[8]));
  BatchBuilder many;
  for (std::uint64_t oid = 10; oid <= 18; ++oid) many.Put(oid, m_expected[oid] = std::string(500, 'Q'));
  expectTables("replaces many", many);
  ExpectAll();
}

TEST_F(CommitLogs, TakeRecordsThatAreReplacedWhereTheyAreFewAndShort) {
  Edit(1);
  const std::string data = ReadFile(file(kDataFile));
  BatchBuilder batch;
  for (std::uint64_t oid = 10; oid <= 17; ++oid) batch.Put(oid, m_expected[oid] = std::string(500, 'Q'));
  Commit(batch);
  EXPECT_TRUE(ReadFile(file(kDataFile)) == data);
  ExpectAll();
  Close();
  Open();
  ExpectAll();
}

TEST_F(CommitLogs, ThatAreCutOffBehindTheirEndAreNotWrittenTo) {
  Edit(2);
  Close();
  ChangeLog([&](std::string& log) { log.resize(PlaceOf(commits(), log) + 1'000); });
  Open();
  ExpectAll();
  const std::string data = ReadFile(file(kDataFile));
  Edit(3);
  EXPECT_FALSE(ReadFile(file(kDataFile)) == data);
  Edit(4);
  EXPECT_EQ(fs::file_size(file(kLogFile)), kLogBytes) << "made anew, once it is empty";
  Edit(5);
  Close();
  Open();
  ExpectAll();
}

// A snapshot of a commit that another one keeps open, while a newer one has been taken in.
TEST_F(CommitLogs, AreReadByManyThreadsWhileOneCommits) {
  Close();
  Open(false);
  std::atomic<bool> ends{false};
  std::mutex mutex;
  std::string fault;
  std::vector<std::thread> readers;
  for (int i = 0; i < 4; ++i) {
    readers.emplace_back([&] {
      try {
        std::unique_ptr<EngineSnapshot> kept;
        while (!ends) kept = engine().OpenSnapshot();
      } catch (const std::exception& error) {
        const std::lock_guard lock(mutex);
        fault = error.what();
      }
    });
  }
  for (std::uint64_t i = 0; i < 3'000; ++i) Edit(1 + i % kRecords);
  ends = true;
  for (std::thread& reader : readers) reader.join();
  EXPECT_EQ(fault, "");
}

TEST_F(CommitLogs, AreSealedAsEmptyWhileOthersRead) {
  Close();
  Open(false);
  std::atomic<bool> ends{false};
  std::thread reader([&] {
    while (!ends) engine().OpenSnapshot();
  });
  const SealFile seal(file(kSealFile), "space", true);
  int missing = 0;
  for (int i = 0; i < 500; ++i) {
    AddRecord();
    missing += seal.Read().log->base != commits();
  }
  ends = true;
  reader.join();
  EXPECT_EQ(missing, 0);
}

TEST_F(CommitLogs, ThatAreMissingBesideASealOfBeforeAreRefused) {
  const std::string seal = ReadFile(file(kSealFile));
  AddRecord();
  Edit(2);
  Edit(3);
  Close();
  WriteFile(file(kSealFile), seal);  // which was not synced
  fs::remove(file(kLogFile));
  EXPECT_THROW(Open(), DamagedStorage);
}

TEST_F(CommitLogs, ThatAreDamagedBehindTheSealBeforeAWholeEntryAreNotCutOffThere) {
  Edit(2);
  const std::string seal = ReadFile(file(kSealFile));
  for (std::uint64_t oid = 3; oid <= 5; ++oid) Edit(oid);
  Close();
  WriteFile(file(kSealFile), seal);  // which was not synced
  ChangeLog([&](std::string& log) { log[PlaceOf(commits() - 2, log) + 20] ^= 4; });
  Open();
  EXPECT_EQ(engine().OpenSnapshot()->Generation(), commits());
}

TEST(CommitLogOfASpaceWithoutChanges, GivesItItsFirstOnes) {
  const TempFolder folder;
  const fs::path space = folder.path() / "space";
  auto engine = OpenSpace(space);
  BatchBuilder records, name, edit, added;
  for (std::uint64_t oid = 1; oid <= kRecords; ++oid) records.Put(oid, EditedRecord(oid, 0));
  engine->Commit(records.At(0));
  engine->Commit(name.Name(NamedTable::kMeta, "name", "value").At(1));  // makes the log
  engine->Commit(edit.Put(3, EditedRecord(3, 5)).At(2));
  engine->Commit(added.Put(1000, "new").At(3));
  for (const bool reopens : {false, true}) {
    if (reopens) engine.reset(), engine = OpenSpace(space);
    EXPECT_EQ(ToText(engine->OpenSnapshot()->Read(OID(3))), EditedRecord(3, 5));
    EXPECT_TRUE(engine->OpenSnapshot()->CheckStorage().empty());
  }
}

}  // namespace
}  // namespace vemo::test
