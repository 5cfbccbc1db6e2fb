// What the LMDB engine opens, makes and refuses.
#include <gtest/gtest.h>
#include <lmdb.h>

#include <cstdlib>

#include "engines/lmdb/empty_data.h"
#include "engines/lmdb/page_reader.h"
#include "platform/error.h"
#include "tests/engines/lmdb_site.h"
#include "tests/support/temp_folder.h"

namespace vemo::test {
namespace {

namespace fs = std::filesystem;

const std::set<std::string> kSpaceFiles{"data.mdb", "data.seal", "lock.mdb"};

class LmdbFolder : public testing::Test {
 protected:
  const fs::path& parent() const { return m_folder.path(); }
  fs::path space() const { return m_folder.path() / "space"; }

  // The space must be refused as `E` whether or not it may be created, and nothing in its folder may change.
  template <typename E>
  void ExpectUntouched(bool create) {
    const std::set<std::string> files = FilesIn(space());
    const std::string data = ReadFile(space() / "data.mdb");
    EXPECT_THROW(OpenAt(space(), create), E);
    EXPECT_EQ(FilesIn(space()), files);
    EXPECT_TRUE(ReadFile(space() / "data.mdb") == data);
  }

 private:
  TempFolder m_folder;
};

// Makes an LMDB environment at `path` and lets `fill` write into it.
template <typename Fill>
void MakeEnvironment(const fs::path& path, Fill&& fill) {
  fs::create_directories(path);
  MDB_env* env = nullptr;
  ASSERT_EQ(mdb_env_create(&env), 0);
  ASSERT_EQ(mdb_env_set_maxdbs(env, 8), 0);
  ASSERT_EQ(mdb_env_open(env, path.c_str(), 0, 0644), 0);
  MDB_txn* txn = nullptr;
  ASSERT_EQ(mdb_txn_begin(env, nullptr, 0, &txn), 0);
  fill(txn);
  ASSERT_EQ(mdb_txn_commit(txn), 0);
  mdb_env_close(env);
}

void PutText(MDB_txn* txn, const char* table, std::string key, std::string value) {
  MDB_dbi dbi = 0;
  ASSERT_EQ(mdb_dbi_open(txn, table, table != nullptr ? MDB_CREATE : 0, &dbi), 0);
  MDB_val k{key.size(), key.data()};
  MDB_val v{value.size(), value.data()};
  ASSERT_EQ(mdb_put(txn, dbi, &k, &v, 0), 0);
}

TEST_F(LmdbFolder, AMissingPathIsNoSpaceAndIsNotMade) {
  const std::string message = MessageOf<SpaceNotFound>([&] { OpenAt(space()); });
  EXPECT_TRUE(Contains(message, space().string())) << message;
  EXPECT_EQ(FilesIn(parent()), std::set<std::string>());
}

TEST_F(LmdbFolder, AnEmptyFolderIsNoSpaceUntilOneIsCreatedInIt) {
  fs::create_directory(space());
  EXPECT_THROW(OpenAt(space()), SpaceNotFound);
  EXPECT_EQ(FilesIn(space()), std::set<std::string>());
  EXPECT_EQ(NewestContents(*OpenAt(space(), true)), Contents());
  EXPECT_EQ(FilesIn(space()), kSpaceFiles);
}

TEST_F(LmdbFolder, CreatingOpensWhatIsThere) {
  BatchBuilder batch;
  batch.Put(1, "one");
  OpenAt(space(), true)->Commit(batch.At(0));
  EXPECT_EQ(NewestContents(*OpenAt(space(), true)).records, (Records{{1, "one"}}));
  EXPECT_EQ(NewestContents(*OpenAt(space(), false)).records, (Records{{1, "one"}}));
}

TEST_F(LmdbFolder, TheParentOfANewSpaceMustExist) {
  const fs::path deep = parent() / "missing" / "space";
  EXPECT_THROW(OpenAt(deep, true), StoreError);
  EXPECT_EQ(FilesIn(parent()), std::set<std::string>());
}

TEST_F(LmdbFolder, AFileIsNoSpace) {
  WriteFile(space(), "text");
  EXPECT_THROW(OpenAt(space(), false), IncompatibleSpace);
  EXPECT_THROW(OpenAt(space(), true), IncompatibleSpace);
  EXPECT_EQ(ReadFile(space()), "text");
}

TEST_F(LmdbFolder, AFolderOfOtherFilesIsNeverAdopted) {
  fs::create_directory(space());
  WriteFile(space() / "letter.txt", "dear");
  ExpectUntouched<IncompatibleSpace>(false);
  ExpectUntouched<IncompatibleSpace>(true);
  WriteFile(space() / "data.mdb", "");
  ExpectUntouched<IncompatibleSpace>(true);
}

TEST_F(LmdbFolder, AFileThatIsNotLmdbIsRefusedUntouched) {
  fs::create_directory(space());
  for (const std::string& data : {std::string("text"), std::string(100000, 'x'), std::string(8192, '\0')}) {
    WriteFile(space() / "data.mdb", data);
    ExpectUntouched<IncompatibleSpace>(false);
    ExpectUntouched<IncompatibleSpace>(true);
  }
}

TEST_F(LmdbFolder, AnEnvironmentOfAnotherProgramIsRefusedUntouched) {
  MakeEnvironment(space(), [](MDB_txn* txn) { PutText(txn, nullptr, "key", "value"); });
  ExpectUntouched<IncompatibleSpace>(false);
  ExpectUntouched<IncompatibleSpace>(true);
  fs::remove(space() / "lock.mdb");
  ExpectUntouched<IncompatibleSpace>(false);
  ExpectUntouched<IncompatibleSpace>(true);
}

TEST_F(LmdbFolder, AnEnvironmentWithATableOfTheSameNameIsRefused) {
  MakeEnvironment(space(), [](MDB_txn* txn) { PutText(txn, "system", "layout", "other"); });
  ExpectUntouched<IncompatibleSpace>(true);
}

TEST_F(LmdbFolder, ASpaceOfANewerLayoutIsRefusedWithItsNumber) {
  OpenAt(space(), true);
  MakeEnvironment(space(), [](MDB_txn* txn) {
    PutText(txn, "system", "layout", "vemo space" + std::string(7, '\0') + "\x07");
  });
  const std::string message = MessageOf<IncompatibleSpace>([&] { OpenAt(space()); });
  EXPECT_TRUE(Contains(message, "number 7")) << message;
  ExpectUntouched<IncompatibleSpace>(true);
}

TEST_F(LmdbFolder, ASpaceWithoutOneOfItsTablesIsRefused) {
  OpenAt(space(), true);
  MakeEnvironment(space(), [](MDB_txn* txn) {
    MDB_dbi dbi = 0;
    ASSERT_EQ(mdb_dbi_open(txn, "roots", 0, &dbi), 0);
    ASSERT_EQ(mdb_drop(txn, dbi, 1), 0);
  });
  const std::string message = MessageOf<DamagedStorage>([&] { OpenAt(space()); });
  EXPECT_TRUE(Contains(message, "\"roots\"")) << message;
}

TEST_F(LmdbFolder, ADataFileThatIsAFolderIsRefused) {
  fs::create_directories(space() / "data.mdb");
  EXPECT_THROW(OpenAt(space()), IncompatibleSpace);
  EXPECT_THROW(OpenAt(space(), true), IncompatibleSpace);
  EXPECT_EQ(FilesIn(space()), std::set<std::string>{"data.mdb"});
}

TEST_F(LmdbFolder, ASpaceThatLostItsNumbersIsRefusedWithTheirName) {
  OpenAt(space(), true);
  MakeEnvironment(space(), [](MDB_txn* txn) { PutText(txn, "system", "next id", ""); });
  const auto engine = OpenAt(space());
  EXPECT_EQ(NewestContents(*engine), Contents());
  const std::string nextId = MessageOf<DamagedStorage>([&] { engine->ReserveIds(1); });
  EXPECT_TRUE(Contains(nextId, "its next id is damaged")) << nextId;
  MakeEnvironment(space(), [](MDB_txn* txn) { PutText(txn, "system", "generation", "short"); });
  const std::string generation = MessageOf<DamagedStorage>([&] { engine->OpenSnapshot(); });
  EXPECT_TRUE(Contains(generation, "its generation is damaged")) << generation;
}

TEST_F(LmdbFolder, AKeyThatIsNoIdIsRefusedWhereAScanMeetsIt) {
  BatchBuilder batch;
  batch.Put(1, "one");
  OpenAt(space(), true)->Commit(batch.At(0));
  // With the tag that a value under this key would have.
  const std::uint64_t tag = ValueTag(TableSeed("records"), "short");
  const std::string value(reinterpret_cast<const char*>(&tag), sizeof tag);
  MakeEnvironment(space(), [&](MDB_txn* txn) { PutText(txn, "records", "short", value); });
  const auto engine = OpenAt(space());
  const auto snapshot = engine->OpenSnapshot();
  EXPECT_EQ(ToText(snapshot->Read(OID(1))), "one");
  EXPECT_THROW(AllRecords(*snapshot), DamagedStorage);
}

TEST_F(LmdbFolder, ACreationInterruptedBeforeItsFirstByteIsFinished) {
  fs::create_directory(space());
  WriteFile(space() / "lock.mdb", "");
  EXPECT_THROW(OpenAt(space()), SpaceNotFound);
  WriteFile(space() / "data.mdb", "");
  EXPECT_THROW(OpenAt(space()), SpaceNotFound);
  EXPECT_EQ(NewestContents(*OpenAt(space(), true)), Contents());
  EXPECT_EQ(NewestContents(*OpenAt(space())), Contents());
}

TEST_F(LmdbFolder, WhatAnInterruptedCreationHasNotFinishedIsMadeAnew) {
  for (const std::string& unfinished : {std::string(), std::string("half a page"), std::string(20'000, 'x')}) {
    fs::remove_all(space());
    fs::create_directory(space());
    WriteFile(space() / "data.mdb.new", unfinished);
    EXPECT_THROW(OpenAt(space()), SpaceNotFound);
    EXPECT_EQ(NewestContents(*OpenAt(space(), true)), Contents());
    EXPECT_EQ(FilesIn(space()), kSpaceFiles);
    EXPECT_EQ(NewestContents(*OpenAt(space())), Contents());
  }
}

TEST_F(LmdbFolder, TheFirstDataIsByteForByteWhatLmdbMakes) {
  fs::create_directory(space());
  MakeEmptyData(space(), "space");
  const fs::path other = parent() / "other";
  fs::create_directory(other);
  MDB_env* env = nullptr;
  ASSERT_EQ(mdb_env_create(&env), 0);
  ASSERT_EQ(mdb_env_open(env, other.c_str(), 0, 0644), 0);
  mdb_env_close(env);
  EXPECT_TRUE(ReadFile(space() / "data.mdb") == ReadFile(other / "data.mdb"));
}

TEST_F(LmdbFolder, ACreationInterruptedBeforeItsCommitIsFinished) {
  for (const bool keepLockFile : {true, false}) {
    fs::remove_all(space());
    MakeEnvironment(space(), [](MDB_txn*) {});
    if (!keepLockFile) fs::remove(space() / "lock.mdb");
    const std::string message = MessageOf<SpaceNotFound>([&] { OpenAt(space()); });
    EXPECT_TRUE(Contains(message, "interrupted")) << message;
    EXPECT_EQ(NewestContents(*OpenAt(space(), true)), Contents());
    EXPECT_EQ(NewestContents(*OpenAt(space())), Contents());
  }
}

TEST_F(LmdbFolder, OpensWithoutTheLockFilesOfACopy) {
  BatchBuilder batch;
  batch.Put(1, "one");
  OpenAt(space(), true)->Commit(batch.At(0));
  fs::remove(space() / "lock.mdb");
  EXPECT_EQ(NewestContents(*OpenAt(space())).records, (Records{{1, "one"}}));
}

TEST_F(LmdbFolder, IsOpenOnceInAProcess) {
  auto engine = OpenAt(space(), true);
  fs::create_directory_symlink(space(), parent() / "link");
  for (const fs::path& path : {space(), parent() / "link", space() / "." / ""}) {
    const std::string message = MessageOf<SpaceBusy>([&] { OpenAt(path); });
    EXPECT_TRUE(Contains(message, "already")) << message;
  }
  engine->Commit(CommitBatch());
  engine.reset();
  EXPECT_EQ(OpenAt(parent() / "link")->OpenSnapshot()->Generation(), 1u);
}

TEST_F(LmdbFolder, StaysOpenUntilItsLastSnapshotCloses) {
  auto engine = OpenAt(space(), true);
  auto snapshot = engine->OpenSnapshot();
  engine.reset();
  EXPECT_EQ(ContentsOf(*snapshot), Contents());
  EXPECT_THROW(OpenAt(space()), SpaceBusy);
  snapshot.reset();
  EXPECT_NE(OpenAt(space()), nullptr);
}

TEST_F(LmdbFolder, AFailedOpenLeavesNoClaim) {
  fs::create_directory(space());
  WriteFile(space() / "data.mdb", "text");
  EXPECT_THROW(OpenAt(space(), true), IncompatibleSpace);
  fs::remove(space() / "data.mdb");
  EXPECT_NE(OpenAt(space(), true), nullptr);
}

TEST_F(LmdbFolder, SurvivesAChangeOfTheWorkingFolder) {
  const fs::path before = fs::current_path();
  fs::current_path(parent());
  const auto engine = OpenAt("space", true);
  fs::current_path(before);
  EXPECT_NE(engine->LockWriter(std::chrono::milliseconds(0)), nullptr);
  EXPECT_GT(engine->Usage().bytes, 0u);
  EXPECT_EQ(engine->Name(), "lmdb:space");
}

TEST_F(LmdbFolder, ReadOnlyReadsAndRefusesToWrite) {
  BatchBuilder batch;
  batch.Put(1, "one");
  OpenAt(space(), true)->Commit(batch.At(0));
  fs::permissions(space() / "data.mdb", fs::perms::owner_read);
  LmdbOptions options;
  options.path = space();
  options.readOnly = true;
  const auto engine = OpenLmdbEngine(options);
  EXPECT_EQ(NewestContents(*engine).records, (Records{{1, "one"}}));
  EXPECT_EQ(engine->Usage().records, 1u);
  EXPECT_THROW(engine->Commit(batch.At(1)), StoreError);
  EXPECT_THROW(engine->ReserveIds(1), StoreError);
  EXPECT_THROW(engine->LockWriter(std::chrono::milliseconds(0)), StoreError);
}

TEST_F(LmdbFolder, ReadOnlyCreatesNothing) {
  LmdbOptions options;
  options.path = space();
  options.readOnly = true;
  EXPECT_THROW(OpenLmdbEngine(options), SpaceNotFound);
  options.create = true;
  EXPECT_THROW(OpenLmdbEngine(options), UsageError);
  EXPECT_EQ(FilesIn(parent()), std::set<std::string>());
}

TEST_F(LmdbFolder, CommitsWithoutSyncAreThereAfterClosing) {
  LmdbOptions options;
  options.path = space();
  options.create = true;
  options.syncEachCommit = false;
  BatchBuilder batch;
  batch.Put(1, "one");
  OpenLmdbEngine(options)->Commit(batch.At(0));
  EXPECT_EQ(NewestContents(*OpenAt(space())).records, (Records{{1, "one"}}));
}

}  // namespace
}  // namespace vemo::test
