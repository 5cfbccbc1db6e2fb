// What others do to commits.log while a space is open whose newest commits are in it.
#include <map>
#include <memory>
#include <string>

#include "engines/lmdb/log_entry.h"
#include "engines/lmdb/space_folder.h"
#include "tests/engines/logged_space.h"

namespace vemo::test {
namespace {

namespace fs = std::filesystem;

class CommitLogsInUse : public LoggedSpace {
 protected:
  CommitLogsInUse() : m_engine(OpenSpace(space())) {
    for (std::uint64_t oid = 4; oid <= 8; ++oid) EXPECT_TRUE(IsLogged(oid)) << oid;
  }

  void EditRecord(std::uint64_t oid) {
    BatchBuilder batch;
    batch.Put(oid, m_expected[oid] = EditedRecord(oid, m_commits));
    m_engine->Commit(batch.At(m_commits));
    ++m_commits;
  }
  // Whether that commit left the tables alone.
  bool IsLogged(std::uint64_t oid) {
    const std::string data = ReadFile(file(kDataFile));
    EditRecord(oid);
    return ReadFile(file(kDataFile)) == data;
  }

  void ExpectAll() {
    const auto snapshot = m_engine->OpenSnapshot();
    EXPECT_EQ(snapshot->Generation(), m_commits);
    for (const auto& [oid, record] : m_expected) EXPECT_EQ(ToText(snapshot->Read(OID(oid))), record) << oid;
    EXPECT_TRUE(snapshot->CheckStorage().empty());
  }
  void ExpectAllHereAndReopened() {
    ExpectAll();
    m_engine.reset();
    m_engine = OpenSpace(space());
    ExpectAll();
  }

  // What was in the log is in the tables with the next commit, so that a log can be made anew.
  void ExpectNextCommitInTablesAndThenALogAgain() {
    EXPECT_FALSE(IsLogged(9));
    ExpectAllHereAndReopened();
    EditRecord(10);
    EXPECT_TRUE(IsLogged(11));
    EXPECT_EQ(fs::file_size(file(kLogFile)), kLogBytes);
    ExpectAllHereAndReopened();
  }

 private:
  std::map<std::uint64_t, std::string> m_expected;  // the records that were edited
  std::uint64_t m_commits = 2;
  std::unique_ptr<Engine> m_engine;
};

TEST_F(CommitLogsInUse, ThatAreCutOffBehindTheirEndLoseNothing) {
  fs::resize_file(file(kLogFile), 10'000);
  ExpectNextCommitInTablesAndThenALogAgain();
}

TEST_F(CommitLogsInUse, ThatAreEmptiedLoseNothing) {
  fs::resize_file(file(kLogFile), 0);
  ExpectNextCommitInTablesAndThenALogAgain();
}

TEST_F(CommitLogsInUse, ThatAreRemovedLoseNothing) {
  fs::remove(file(kLogFile));
  ExpectNextCommitInTablesAndThenALogAgain();
}

TEST_F(CommitLogsInUse, ThatACopyReplacesGoOnInTheCopy) {
  const fs::path copy = file("copy");
  fs::copy_file(file(kLogFile), copy);
  fs::rename(copy, file(kLogFile));
  EXPECT_TRUE(IsLogged(9));
  ExpectAllHereAndReopened();
}

}  // namespace
}  // namespace vemo::test
