// What data.seal vouches for, and what lies beside data.mdb.
#include "engines/lmdb/seal_file.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstring>
#include <functional>

#include "engines/lmdb/space_folder.h"
#include "tests/engines/child_process.h"
#include "tests/engines/lmdb_site.h"
#include "tests/support/temp_folder.h"

namespace vemo::test {
namespace {

namespace fs = std::filesystem;

constexpr std::size_t kPageBytes = 4096;

class LmdbSeal : public testing::Test {
 protected:
  // Some commits, so that there are free pages.
  LmdbSeal() {
    const auto engine = OpenAt(space(), true);
    for (std::uint64_t commit = 0; commit < 6; ++commit) PutSome(*engine);
  }
  fs::path space() const { return m_folder.path() / "space"; }
  fs::path file(const char* name) const { return space() / name; }

  static void PutSome(Engine& engine) {
    const std::uint64_t generation = engine.OpenSnapshot()->Generation();
    BatchBuilder batch;
    for (std::uint64_t id = 1; id <= 40; ++id) batch.Put(id, std::string(300, static_cast<char>('a' + generation % 26)));
    engine.Commit(batch.At(generation));
  }
  static void ExpectReadable(Engine& engine) {
    const auto snapshot = engine.OpenSnapshot();
    for (std::uint64_t id = 1; id <= 40; ++id) EXPECT_TRUE(snapshot->Read(OID(id))) << id;
  }
  // Nothing is committed, for a reason with these words.
  static void ExpectNoCommit(Engine& engine, const std::string& reason) {
    BatchBuilder batch;
    batch.Put(1, "x");
    const std::string message = MessageOf<DamagedStorage>([&] { engine.Commit(batch.At(6)); });
    EXPECT_NE(message.find(reason), std::string::npos) << message;
  }

  void ChangeSeal(const std::function<void(CommitSeal&)>& change) {
    const SealFile::Slots slots = SealFile(file(kSealFile), "space", true).Read();
    CommitSeal seal = slots.Of(slots.Newest()).value();
    change(seal);
    ASSERT_TRUE(SealFile(file(kSealFile), "space", false).Write(seal));
  }

  // Calls `change` with each entry of each leaf page of data.mdb that is of a table by name or of the list of free pages, in use
  // or not, and writes what it has changed, whoever has the file open.
  void ChangeEntries(const std::function<bool(std::uint16_t flags, char* key, char* value, std::uint32_t bytes)>& change) {
    std::string data = ReadFile(file(kDataFile));
    std::size_t changes = 0;
    for (std::size_t page = 0; page + kPageBytes <= data.size(); page += kPageBytes) {
      std::uint16_t flags = 0, lower = 0;
      std::memcpy(&flags, &data[page + 10], 2);
      std::memcpy(&lower, &data[page + 12], 2);
      if (flags != 2) continue;
      for (std::size_t slot = 16; slot < lower; slot += 2) {
        std::uint16_t offset = 0, nodeFlags = 0, keyBytes = 0;
        std::memcpy(&offset, &data[page + slot], 2);
        char* const node = &data[page + offset];
        std::uint32_t bytes = 0;
        std::memcpy(&bytes, node, 4);
        std::memcpy(&nodeFlags, node + 4, 2);
        std::memcpy(&keyBytes, node + 6, 2);
        if (change(nodeFlags, node + 8, node + 8 + keyBytes, bytes)) ++changes;
      }
    }
    ASSERT_GT(changes, 0u);
    std::fstream out(file(kDataFile), std::ios::in | std::ios::out | std::ios::binary);
    out.write(data.data(), static_cast<std::streamsize>(data.size()));
  }

 private:
  TempFolder m_folder;
};

TEST_F(LmdbSeal, OfALogThatNoLogCanBeIsNone) {
  constexpr std::uint64_t kHuge = std::uint64_t{1} << 60;
  SealFile seal(file(kSealFile), "space", false);
  ASSERT_TRUE(seal.Write(LogSeal{5, 7, 400}));
  ASSERT_TRUE(seal.Write(LogSeal{5, kHuge, 500}));
  EXPECT_EQ(seal.Read().log->last, 7u);
  ASSERT_TRUE(seal.Write(LogSeal{5, 8, kHuge}));
  EXPECT_EQ(seal.Read().log->last, 7u);
  ASSERT_TRUE(seal.Write(LogSeal{9, 9, 0}));
  EXPECT_EQ(seal.Read().log->last, 9u) << "one that is empty";
}

TEST_F(LmdbSeal, RootsThatAreNotThoseThatWereSealedAreNotRead) {
  ChangeSeal([](CommitSeal& seal) { seal.rootsDigest ^= 1; });
  const std::string message = MessageOf<DamagedStorage>([this] { OpenAt(space())->OpenSnapshot(); });
  EXPECT_NE(message.find("are not those that were committed"), std::string::npos) << message;
}

TEST_F(LmdbSeal, AListOfFreePagesThatIsNotTheOneThatWasSealedIsReportedAndNothingIsWritten) {
  ChangeSeal([](CommitSeal& seal) { seal.freeDigest ^= 1; });
  const auto engine = OpenAt(space());
  ExpectReadable(*engine);
  const std::vector<StorageFinding> findings = engine->OpenSnapshot()->CheckStorage();
  ASSERT_EQ(findings.size(), 1u);
  EXPECT_NE(findings.front().what.find("the list of free pages"), std::string::npos) << findings.front().what;
  ExpectNoCommit(*engine, "the list of free pages");
  ExpectReadable(*engine);
}

TEST_F(LmdbSeal, RootsThatChangeWhileTheSpaceIsOpenAreNotWrittenFrom) {
  const auto engine = OpenAt(space());
  ExpectReadable(*engine);
  ChangeEntries([](std::uint16_t flags, char*, char* value, std::uint32_t) {
    if (flags != 2) return false;
    ++value[32];  // how many entries a table has
    return true;
  });
  ExpectNoCommit(*engine, "are not those that were committed");
}

TEST_F(LmdbSeal, AListOfFreePagesThatChangesWhileTheSpaceIsOpenIsNotWrittenFrom) {
  const auto engine = OpenAt(space());
  ExpectReadable(*engine);
  ChangeEntries([](std::uint16_t flags, char* key, char* value, std::uint32_t bytes) {
    std::uint64_t transaction = 0, count = 0;
    std::memcpy(&transaction, key, 8);
    std::memcpy(&count, value, 8);
    if (flags != 0 || value != key + 8 || transaction > 100 || count < 2 || bytes != 8 * (count + 1)) return false;
    --count;  // one page less, as of a list that has room behind it
    std::memcpy(value, &count, 8);
    return true;
  });
  ExpectNoCommit(*engine, "the list of free pages is not the one that was committed");
  ExpectReadable(*engine);
}

// Opens the space, reads and commits. True when all of it worked, false for an exception that says which space; anything else
// is a failure of the child, hanging included.
class LmdbNeighbour : public LmdbSeal {
 protected:
  enum class Outcome { kWorked, kRefused, kFailed };
  Outcome Use() {
    ChildProcess child([this](const Conversation& parent) {
      ::alarm(60);
      try {
        const auto engine = OpenAt(space());
        ExpectReadable(*engine);
        const auto lock = engine->LockWriter(std::chrono::milliseconds(100));
        PutSome(*engine);
        ExpectReadable(*engine);
        parent.Say("worked");
      } catch (const StoreError& error) {
        const bool isClear = std::string(error.what()).find(space().string()) != std::string::npos;
        if (!isClear) std::cerr << error.what() << std::endl;
        parent.Say(isClear ? "refused" : "unclear");
      }
      return !testing::Test::HasFailure();
    });
    const std::string said = child.Hear();
    if (!child.Succeeded()) return Outcome::kFailed;
    return said == "worked" ? Outcome::kWorked : said == "refused" ? Outcome::kRefused : Outcome::kFailed;
  }
};

TEST_F(LmdbNeighbour, ForeignBytesInAFileThatIsNotOpenChangeNothing) {
  std::string readers = ReadFile(file(kReadersFile));
  std::string flipped = readers;
  for (std::size_t i = 0; i < flipped.size(); i += 7) flipped[i] = static_cast<char>(flipped[i] ^ 0x5a);
  for (const char* name : {kReadersFile, kWriterLockFile}) {
    for (const std::string& bytes : {std::string(), std::string("not what belongs here"), std::string(100'000, '\xff'),
                                     std::string(8192, '\0'), flipped, readers.substr(0, readers.size() / 2)}) {
      WriteFile(file(name), bytes);
      EXPECT_EQ(Use(), Outcome::kWorked) << name << " of " << bytes.size() << " bytes";
    }
    fs::remove(file(name));
    EXPECT_EQ(Use(), Outcome::kWorked) << name << " is missing";
  }
}

TEST_F(LmdbNeighbour, WhatIsNoFileIsRefusedByNameAndTheSpaceIsUnharmed) {
  for (const char* name : {kReadersFile, kWriterLockFile}) {
    fs::remove(file(name));
    fs::create_directory(file(name));
    EXPECT_EQ(Use(), Outcome::kRefused) << name << " is a folder";
    fs::remove(file(name));
    ASSERT_EQ(::mkfifo(file(name).c_str(), 0600), 0);
    EXPECT_NE(Use(), Outcome::kFailed) << name << " is a pipe";
    fs::remove(file(name));
    EXPECT_EQ(Use(), Outcome::kWorked);
  }
}

}  // namespace
}  // namespace vemo::test
