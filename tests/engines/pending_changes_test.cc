// Changes that the LMDB engine keeps beside its records until it has written them there.
#include <lmdb.h>

#include <map>
#include <random>
#include <utility>

#include "store/error.h"
#include "tests/engines/child_process.h"
#include "tests/engines/lmdb_site.h"
#include "tests/support/temp_folder.h"

namespace vemo::test {
namespace {

constexpr SettlingBounds kFew{.bytes = 4'096, .commits = 8, .records = 16};
constexpr SettlingBounds kAny{.bytes = 1u << 30, .commits = 1u << 30, .records = 1u << 30};

class PendingChanges : public testing::Test {
 protected:
  std::unique_ptr<Engine> Open(const SettlingBounds& bounds) {
    LmdbOptions options;
    options.path = space();
    options.create = true;
    options.pendingChanges = bounds;
    return OpenLmdbEngine(options);
  }
  std::filesystem::path space() const { return m_folder.path() / "space"; }

  // Does `act` with the value of each entry of a table, by LMDB; where it returns true, what it has made of it is stored, and an
  // empty one is removed.
  template <typename Act>
  void EachStored(const char* table, const Act& act) {
    MDB_env* env = nullptr;
    MDB_txn* txn = nullptr;
    MDB_dbi dbi = 0;
    MDB_cursor* cursor = nullptr;
    ASSERT_EQ(mdb_env_create(&env), 0);
    ASSERT_EQ(mdb_env_set_maxdbs(env, 8), 0);
    ASSERT_EQ(mdb_env_open(env, space().c_str(), 0, 0644), 0);
    ASSERT_EQ(mdb_txn_begin(env, nullptr, 0, &txn), 0);
    ASSERT_EQ(mdb_dbi_open(txn, table, 0, &dbi), 0);
    ASSERT_EQ(mdb_cursor_open(txn, dbi, &cursor), 0);
    MDB_val key{}, value{};
    while (mdb_cursor_get(cursor, &key, &value, MDB_NEXT) == 0) {
      std::string bytes(static_cast<char*>(value.mv_data), value.mv_size);
      if (!act(bytes)) continue;
      if (bytes.empty()) {
        ASSERT_EQ(mdb_cursor_del(cursor, 0), 0);
        continue;
      }
      value.mv_data = bytes.data();
      ASSERT_EQ(mdb_cursor_put(cursor, &key, &value, MDB_CURRENT), 0);
    }
    mdb_cursor_close(cursor);
    ASSERT_EQ(mdb_txn_commit(txn), 0);
    mdb_env_close(env);
  }
  std::size_t CountStored(const char* table) {
    std::size_t count = 0;
    EachStored(table, [&](const std::string&) { return ++count == 0; });
    return count;
  }

 private:
  TempFolder m_folder;
};

std::string RecordOf(std::uint64_t oid) {
  std::mt19937_64 random(oid);
  std::string text(400 + oid % 300, ' ');
  for (char& c : text) c = static_cast<char>(random());
  return text;
}

// A batch that changes a few bytes of every record.
BatchBuilder EditOfAll(std::map<std::uint64_t, std::string>& records, std::size_t place) {
  BatchBuilder batch;
  for (auto& [oid, text] : records) {
    ++text[place % text.size()];
    batch.Put(oid, text);
  }
  return batch;
}

std::map<std::uint64_t, std::string> MakeRecords(Engine& engine, std::uint64_t count) {
  std::map<std::uint64_t, std::string> records;
  BatchBuilder batch;
  for (std::uint64_t oid = 1; oid <= count; ++oid) batch.Put(oid, records[oid] = RecordOf(oid));
  engine.Commit(batch.At(0));
  return records;
}

Records AsList(const std::map<std::uint64_t, std::string>& records) { return {records.begin(), records.end()}; }

TEST_F(PendingChanges, AreReadTogetherWithTheirRecords) {
  const auto engine = Open(kAny);
  auto records = MakeRecords(*engine, 30);
  for (std::uint64_t commit = 1; commit < 20; ++commit) {
    engine->Commit(EditOfAll(records, 17 * commit).At(commit));
    EXPECT_EQ(NewestContents(*engine).records, AsList(records)) << commit;
  }
}

TEST_F(PendingChanges, AreThereAfterOpeningAgain) {
  std::map<std::uint64_t, std::string> records;
  {
    const auto engine = Open(kAny);
    records = MakeRecords(*engine, 30);
    for (std::uint64_t commit = 1; commit < 20; ++commit) {
      BatchBuilder batch = EditOfAll(records, 17 * commit);
      batch.Put(100 + commit, records[100 + commit] = "new");  // which no log takes
      engine->Commit(batch.At(commit));
    }
  }
  EXPECT_EQ(CountStored("changes"), 19u);
  EXPECT_EQ(NewestContents(*Open(kAny)).records, AsList(records));
}

TEST_F(PendingChanges, StayWithinTheirBounds) {
  {
    const auto engine = Open(kFew);
    auto records = MakeRecords(*engine, 10);
    for (std::uint64_t commit = 1; commit < 200; ++commit) engine->Commit(EditOfAll(records, commit).At(commit));
    EXPECT_EQ(NewestContents(*engine).records, AsList(records));
  }
  EXPECT_LE(CountStored("changes"), kFew.commits);
}

TEST_F(PendingChanges, OfARecordThatIsRemovedGoWithIt) {
  const auto engine = Open(kFew);
  auto records = MakeRecords(*engine, 10);
  for (std::uint64_t commit = 1; commit < 40; ++commit) {
    BatchBuilder batch;
    if (commit % 4 == 0) {
      batch.Remove(records.begin()->first);
      records.erase(records.begin());
    } else {
      batch = EditOfAll(records, commit);
    }
    engine->Commit(batch.At(commit));
    ASSERT_EQ(NewestContents(*engine).records, AsList(records)) << commit;
  }
}

TEST_F(PendingChanges, ASnapshotReadsThoseOfItsCommitWhateverIsWrittenIntoRecordsMeanwhile) {
  const auto engine = Open(kFew);
  auto records = MakeRecords(*engine, 12);
  std::vector<std::pair<std::unique_ptr<EngineSnapshot>, Records>> open;
  for (std::uint64_t commit = 1; commit < 120; ++commit) {
    engine->Commit(EditOfAll(records, 5 * commit).At(commit));
    if (commit % 3 == 0) open.emplace_back(engine->OpenSnapshot(), AsList(records));
    if (open.size() > 9) open.erase(open.begin() + static_cast<std::ptrdiff_t>(commit % 9));
    for (const auto& [snapshot, expected] : open) ASSERT_EQ(AllRecords(*snapshot), expected) << commit;
  }
}

TEST_F(PendingChanges, ThoseOfAnotherProcessAreFollowed) {
  for (const SettlingBounds& bounds : {kAny, kFew}) {
    std::filesystem::remove_all(space());
    ChildProcess writer([&](const Conversation& parent) {
      const auto engine = Open(bounds);
      auto records = MakeRecords(*engine, 12);
      std::uint64_t commit = 1;
      for (parent.Say("made"); parent.Hear() == "on"; parent.Say("done")) {
        for (int i = 0; i < 7; ++i, ++commit) engine->Commit(EditOfAll(records, 5 * commit).At(commit));
      }
      return true;
    });
    ASSERT_EQ(writer.Hear(), "made");
    const auto engine = Open(bounds);
    std::map<std::uint64_t, std::string> records;
    for (const auto& [oid, text] : NewestContents(*engine).records) records[oid] = text;
    std::uint64_t commit = 1;
    for (int round = 0; round < 10; ++round) {
      const auto before = engine->OpenSnapshot();
      const Records expectedBefore = AsList(records);
      writer.Say("on");
      ASSERT_EQ(writer.Hear(), "done");
      for (int i = 0; i < 7; ++i, ++commit) EditOfAll(records, 5 * commit);
      ASSERT_EQ(NewestContents(*engine).records, AsList(records)) << round;
      ASSERT_EQ(AllRecords(*before), expectedBefore) << round;
    }
    writer.Say("end");
    EXPECT_TRUE(writer.Succeeded());
  }
}

// Of the two commits with changes, the first has them of records 1 to 5, the second of 4 to 8.
TEST_F(PendingChanges, DamageMakesDoubtfulWhatItMayConcernAndNothingElse) {
  std::map<std::uint64_t, std::string> records;
  {
    const auto engine = Open(kAny);
    records = MakeRecords(*engine, 10);
    for (std::uint64_t commit = 1; commit <= 2; ++commit) {
      BatchBuilder batch;
      for (std::uint64_t oid = 3 * commit - 2; oid <= 3 * commit + 2; ++oid) {
        ++records[oid][40];
        batch.Put(oid, records[oid]);
      }
      batch.Put(20 + commit, records[20 + commit] = "new");
      engine->Commit(batch.At(commit));
    }
  }
  // The ids of the first stand behind the tag, the number of the blob before and the count.
  bool isFirst = true;
  EachStored("changes", [&](std::string& blob) {
    blob[8 + 2] ^= 1;
    return std::exchange(isFirst, false);
  });
  const auto engine = Open(kAny);
  const auto snapshot = engine->OpenSnapshot();
  for (const std::uint64_t sound : {4, 5, 6, 7, 8, 21, 22}) {
    EXPECT_EQ(ToText(snapshot->Read(OID(sound))), records[sound]) << sound;
  }
  for (const std::uint64_t doubtful : {1, 2, 3, 9, 10}) {
    EXPECT_THROW(snapshot->Read(OID(doubtful)), DamagedStorage) << doubtful;
  }
  ASSERT_EQ(snapshot->CheckStorage().size(), 1u);
  EXPECT_EQ(snapshot->CheckStorage().front().what, "the changes of commit 2 are damaged");
  BatchBuilder batch;
  batch.Put(4, "other");
  EXPECT_THROW(engine->Commit(batch.At(3)), DamagedStorage);
  EXPECT_EQ(engine->OpenSnapshot()->Generation(), 3u);
}

// Each of them settles a slice from the beginning at first.
TEST_F(PendingChanges, StayWithinTheirBoundsWhereEachCommitHasAnEngineOfItsOwn) {
  SettlingBounds bounds = kAny;
  bounds.commits = 32;  // a slice is one record of ten
  std::map<std::uint64_t, std::string> records = MakeRecords(*Open(bounds), 10);
  for (std::uint64_t commit = 1; commit < 80; ++commit) Open(bounds)->Commit(EditOfAll(records, commit).At(commit));
  EXPECT_EQ(NewestContents(*Open(bounds)).records, AsList(records));
  EXPECT_LE(CountStored("changes"), bounds.commits);
}

// An engine does not know the seals of records.
TEST_F(PendingChanges, AChangeThatIsDamagedIsRefusedForItsRecordAlone) {
  std::map<std::uint64_t, std::string> records;
  {
    const auto engine = Open(kAny);
    records = MakeRecords(*engine, 5);
    engine->Commit(EditOfAll(records, 40).At(1));
  }
  EachStored("changes", [&](std::string& blob) {
    blob.back() ^= 1;  // the byte that the last record gets
    return true;
  });
  const auto engine = Open(kAny);
  const auto snapshot = engine->OpenSnapshot();
  for (const std::uint64_t sound : {1, 2, 3, 4}) EXPECT_EQ(ToText(snapshot->Read(OID(sound))), records[sound]) << sound;
  EXPECT_THROW(snapshot->Read(OID(5)), DamagedStorage);
}

TEST_F(PendingChanges, ThatAreMissingMakeDoubtfulWhatTheyMayConcern) {
  for (const std::size_t missing : {0, 1, 2}) {
    std::filesystem::remove_all(space());
    std::map<std::uint64_t, std::string> records;
    {
      const auto engine = Open(kAny);
      records = MakeRecords(*engine, 3);
      for (std::uint64_t commit = 1; commit <= 3; ++commit) {
        BatchBuilder batch;
        ++records[commit][9];
        batch.Put(commit, records[commit]);
        batch.Put(100 + commit, "new");  // which no log takes
        engine->Commit(batch.At(commit));
      }
    }
    std::size_t place = 0;
    EachStored("changes", [&](std::string& blob) {
      if (place++ != missing) return false;
      blob.clear();
      return true;
    });
    const auto engine = Open(kAny);
    const auto snapshot = engine->OpenSnapshot();
    EXPECT_THROW(snapshot->Read(OID(missing + 1)), DamagedStorage) << missing;
    EXPECT_EQ(snapshot->CheckStorage().size(), 1u) << missing;
    for (std::uint64_t later = missing + 2; later <= 3; ++later) {
      EXPECT_EQ(ToText(snapshot->Read(OID(later))), records[later]) << missing;
    }
  }
}

TEST_F(PendingChanges, OfACommitThatChangesMoreThanMayWaitAreFew) {
  {
    const auto engine = Open(kFew);
    auto records = MakeRecords(*engine, 200);
    engine->Commit(EditOfAll(records, 3).At(1));
    EXPECT_EQ(NewestContents(*engine).records, AsList(records));
  }
  constexpr std::size_t kBytesOfOneChange = 16;
  std::size_t bytes = 0;
  EachStored("changes", [&](const std::string& blob) {
    bytes += blob.size();
    return false;
  });
  EXPECT_GT(bytes, 0u);
  EXPECT_LT(bytes, kFew.records * kBytesOfOneChange);
}

// Were it believed, the record would be taken for newer than its changes.
TEST_F(PendingChanges, ARecordWhoseCommitIsDamagedIsRefused) {
  {
    const auto engine = Open(kAny);
    auto records = MakeRecords(*engine, 3);
    for (std::uint64_t commit = 1; commit < 40; ++commit) engine->Commit(EditOfAll(records, commit).At(commit));
  }
  constexpr std::size_t kCommitAt = 8;  // behind the tag
  EachStored("records", [](std::string& record) {
    record[kCommitAt] |= 32;
    return true;
  });
  const auto engine = Open(kAny);
  const auto snapshot = engine->OpenSnapshot();
  for (const std::uint64_t oid : {1, 2, 3}) EXPECT_THROW(snapshot->Read(OID(oid)), DamagedStorage) << oid;
}

}  // namespace
}  // namespace vemo::test
