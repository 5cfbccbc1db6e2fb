// Damage to the files of the LMDB engine: bits, runs of bytes, truncation.
#include <gtest/gtest.h>
#include <lmdb.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cstdlib>

#include "tests/engines/child_process.h"
#include "tests/engines/damaged_space.h"
#include "tests/engines/lmdb_site.h"
#include "tests/support/seed.h"
#include "tests/support/temp_folder.h"

namespace vemo::test {
namespace {

namespace fs = std::filesystem;

// What the children have done, seen by their parent when one dies.
struct Progress {
  std::uint64_t trial = 0;
  std::uint64_t refused = 0;
  char damage[200] = "";
};

class SharedProgress {
 public:
  SharedProgress()
      : m_progress(new (::mmap(nullptr, sizeof(Progress), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0))
                       Progress) {}
  ~SharedProgress() { ::munmap(m_progress, sizeof(Progress)); }
  SharedProgress(const SharedProgress&) = delete;
  SharedProgress& operator=(const SharedProgress&) = delete;
  Progress* operator->() const noexcept { return m_progress; }

 private:
  Progress* m_progress;
};

// VEMO_DAMAGE_TRIALS: how many; VEMO_DAMAGE_FIRST: where to begin, to repeat one.
std::uint64_t FromEnvironment(const char* name, std::uint64_t standard) {
  const char* const given = std::getenv(name);
  return given == nullptr ? standard : std::strtoull(given, nullptr, 10);
}

class LmdbDamage : public testing::TestWithParam<std::size_t> {
 protected:
  fs::path space() const { return m_folder.path() / "space"; }

  // A space after `commits` commits, and some more in the log where these are many.
  SpaceModel MakeSpace(std::size_t commits, std::mt19937_64& random) const {
    SpaceModel model;
    LmdbOptions options;
    options.path = space();
    options.create = true;
    options.syncEachCommit = false;
    const auto engine = OpenLmdbEngine(options);
    for (std::size_t i = 0; i < commits; ++i) model.Commit(*engine, random, 1 + random() % 80);
    for (std::size_t i = 0; i < commits / 4; ++i) model.CommitEdits(*engine, random, 1 + random() % 8);
    return model;
  }

 private:
  TempFolder m_folder;
};
INSTANTIATE_TEST_SUITE_P(Commits, LmdbDamage, testing::Values(1, 4, 30), testing::PrintToStringParamName());

TEST_P(LmdbDamage, IsFoundOrChangesNoAnswerAndLosesNothingElse) {
  const std::uint64_t seed = TestSeed(20261121);
  std::mt19937_64 building(seed + GetParam());
  const SpaceModel model = MakeSpace(GetParam(), building);
  const SpaceFiles files = SpaceFiles::Read(space());
  SharedProgress progress;
  const std::uint64_t first = FromEnvironment("VEMO_DAMAGE_FIRST", 0);
  const std::uint64_t trials = first + FromEnvironment("VEMO_DAMAGE_TRIALS", 120);
  progress->trial = first;
  while (progress->trial < trials) {
    // One child runs many trials; after one that dies the next goes on behind it.
    ChildProcess child([&](const Conversation&) {
      for (; progress->trial < trials; ++progress->trial) {
        ::alarm(60);
        std::mt19937_64 random(seed * 1'000'003 + progress->trial);
        SpaceFiles damaged = files;
        const std::string damage = Damage(damaged, random);
        std::snprintf(progress->damage, sizeof progress->damage, "%s", damage.c_str());
        damaged.Write(space());
        if (ExamineDamagedSpace(space(), model, random)) ++progress->refused;
      }
      return true;
    });
    if (child.Succeeded()) break;
    ADD_FAILURE() << "trial " << progress->trial << ": " << progress->damage;
    ++progress->trial;
  }
  std::cout << progress->refused << " of " << trials - first << " were refused somewhere" << std::endl;
  EXPECT_GE(progress->refused, (trials - first) / 100 * 25) << "most damage is to something that is in use";
}

TEST_P(LmdbDamage, NothingIsFoundWhereNothingIsDamaged) {
  std::mt19937_64 random(TestSeed(7) + GetParam());
  SpaceModel model = MakeSpace(GetParam(), random);
  for (const bool hasSeal : {true, false}) {
    if (!hasSeal) fs::remove(space() / "data.seal");
    EXPECT_FALSE(ExamineDamagedSpace(space(), model, random));
    const SpaceFiles after = SpaceFiles::Read(space());
    EXPECT_FALSE(after.seal.empty());
    for (int i = 0; i < 3; ++i) ++model.generation;
    fs::remove_all(space());
    model = MakeSpace(GetParam(), random);
  }
}

// All entries of a table, read by LMDB itself.
Named EntriesByLmdb(const fs::path& folder, const char* table) {
  Named entries;
  MDB_env* env = nullptr;
  MDB_txn* txn = nullptr;
  MDB_cursor* cursor = nullptr;
  MDB_dbi dbi = 0;
  EXPECT_EQ(mdb_env_create(&env), 0);
  EXPECT_EQ(mdb_env_set_maxdbs(env, 8), 0);
  EXPECT_EQ(mdb_env_open(env, folder.c_str(), MDB_RDONLY | MDB_NOLOCK, 0), 0);
  EXPECT_EQ(mdb_txn_begin(env, nullptr, MDB_RDONLY, &txn), 0);
  EXPECT_EQ(mdb_dbi_open(txn, table, 0, &dbi), 0);
  EXPECT_EQ(mdb_cursor_open(txn, dbi, &cursor), 0);
  MDB_val key{}, value{};
  while (mdb_cursor_get(cursor, &key, &value, MDB_NEXT) == 0) {
    entries.emplace_back(std::string(static_cast<char*>(key.mv_data), key.mv_size),
                         std::string(static_cast<char*>(value.mv_data), value.mv_size).substr(8));
  }
  mdb_cursor_close(cursor);
  mdb_txn_abort(txn);
  mdb_env_close(env);
  return entries;
}

// A record has the number of its commit before it, and may have changed since: its key is what LMDB can tell.
std::vector<std::string> Keys(const Named& entries) {
  std::vector<std::string> keys;
  for (const auto& [key, value] : entries) keys.push_back(key);
  return keys;
}

TEST_P(LmdbDamage, PagesAreReadAsLmdbReadsThem) {
  std::mt19937_64 random(TestSeed(11) + GetParam());
  MakeSpace(GetParam(), random);
  const std::vector<std::string> records = Keys(EntriesByLmdb(space(), "records"));
  const Named info = EntriesByLmdb(space(), "info");
  const Named queue = EntriesByLmdb(space(), "deletions");
  const auto engine = OpenAt(space());
  const auto snapshot = engine->OpenSnapshot();
  Named found;
  snapshot->ScanRecords(OID(), [&](OID oid, ByteView value) {
    std::string key(8, '\0');
    for (int i = 0; i < 8; ++i) key[static_cast<std::size_t>(i)] = static_cast<char>(oid.m_value >> (56 - 8 * i));
    found.emplace_back(key, ToText(value));
    EXPECT_EQ(ToText(snapshot->Read(oid)), ToText(value));
    return true;
  });
  EXPECT_EQ(Keys(found), records);
  EXPECT_EQ(AllNamed(*snapshot, NamedTable::kInfo), info);
  EXPECT_EQ(Queue(*snapshot, SIZE_MAX).size(), queue.size());
  EXPECT_TRUE(snapshot->CheckStorage().empty());
}

}  // namespace
}  // namespace vemo::test
