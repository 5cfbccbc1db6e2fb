// Who reads a space, and for how long.
#include <sys/wait.h>
#include <unistd.h>

#include "tests/store/store_fixture.h"

namespace vemo::test {
namespace {

using std::chrono::milliseconds;

class ReadersTest : public StoreTest {
 protected:
  // Opens the space anew with a clock that the test moves.
  void OpenWith(SpaceOptions options) {
    options.create = true;
    options.clock = [this] { return std::chrono::steady_clock::time_point(m_now); };
    options.log = [this](LogLevel, const std::string& message) { m_messages.push_back(message); };
    site.Close();
    site.Open(options);
  }

  milliseconds m_now{1000};
  std::vector<std::string> m_messages;
};
INSTANTIATE_STORE_TEST(ReadersTest);

TEST_P(ReadersTest, AreListedOldestFirstWithOwnerAgeAndCommit) {
  OpenWith({});
  Snapshot first(space(), "export");
  m_now += milliseconds(300);
  CommitFilled<TombstonesMap>(space(), "t", 10);
  Snapshot second(space());
  m_now += milliseconds(20);
  const std::vector<ReaderInfo> readers = space().Readers();
  ASSERT_EQ(readers.size(), 2u);
  EXPECT_EQ(readers[0].owner, "export");
  EXPECT_EQ(readers[0].age, milliseconds(320));
  EXPECT_EQ(readers[0].process, getpid());
  EXPECT_EQ(readers[1].owner, "snapshot");
  EXPECT_EQ(readers[1].age, milliseconds(20));
  EXPECT_EQ(*readers[1].generation, *readers[0].generation + 1);
}

TEST_P(ReadersTest, ThatAreOldAreLoggedAtACommit) {
  OpenWith({.readerWarningAge = milliseconds(100)});
  Snapshot snapshot(space(), "export");
  m_now += milliseconds(100);
  CommitFilled<TombstonesMap>(space(), "t", 10);
  EXPECT_TRUE(m_messages.empty());
  m_now += milliseconds(1);
  CommitFilled<TombstonesMap>(space(), "t", 11);
  ASSERT_EQ(m_messages.size(), 1u);
  EXPECT_NE(m_messages[0].find("\"export\""), std::string::npos) << m_messages[0];
  EXPECT_NE(m_messages[0].find("101 ms"), std::string::npos) << m_messages[0];
}

TEST_P(ReadersTest, ACommitThatWasMadeIsNotReportedAsFailedWhenTheLogFails) {
  SpaceOptions options{.create = true, .readerWarningAge = milliseconds(100)};
  options.clock = [this] { return std::chrono::steady_clock::time_point(m_now); };
  options.log = [this](LogLevel, const std::string& message) {
    m_messages.push_back(message);
    throw std::runtime_error("the log is full");
  };
  site.Close();
  site.Open(options);
  Snapshot snapshot(space());
  m_now += milliseconds(101);
  EXPECT_NO_THROW(CommitFilled<TombstonesMap>(space(), "t", 10));
  EXPECT_EQ(m_messages.size(), 1u);
  EXPECT_TRUE(Snapshot(space()).HasRoot("t"));
}

TEST_P(ReadersTest, ThatAreTooOldExpireAtTheirNextReadAndLiveAgainAfterARefresh) {
  CommitFilled<TombstonesMap>(space(), "t", 1000);
  OpenWith({.readerMaxAge = milliseconds(500)});
  Snapshot snapshot(space());
  const auto& map = snapshot.Root<TombstonesMap>("t");
  EXPECT_NE(map.rFind(Key(1)), nullptr);
  m_now += milliseconds(501);
  EXPECT_NE(map.rFind(Key(1)), nullptr) << "what is in memory can be read";
  EXPECT_THROW(map.rFind(Key(999)), SnapshotExpired);
  EXPECT_THROW(snapshot.Meta("m"), SnapshotExpired);
  snapshot.Refresh();
  EXPECT_NE(map.rFind(Key(999)), nullptr);
  m_now += milliseconds(500);
  EXPECT_EQ(NumbersOf(map).size(), 1000u);
}

TEST_P(ReadersTest, OptionsInForceArePrinted) {
  OpenWith({.readerMaxAge = milliseconds(500)});
  EXPECT_NE(space().OptionsText().find("reader_warning_age_ms=none reader_max_age_ms=500"), std::string::npos)
      << space().OptionsText();
}

// Two processes, told what to do next through pipes.
class Pipe {
 public:
  Pipe() {
    if (::pipe(m_ends) != 0) throw std::runtime_error("no pipe");
  }
  ~Pipe() {
    ::close(m_ends[0]);
    ::close(m_ends[1]);
  }
  void Signal() { EXPECT_EQ(::write(m_ends[1], "x", 1), 1); }
  bool Wait() {
    char byte;
    return ::read(m_ends[0], &byte, 1) == 1;
  }

 private:
  int m_ends[2];
};

TEST(ReadersOfTwoProcesses, AreListedAndSeeCommits) {
  TempFolder folder;
  const std::string uri = "lmdb:" + (folder.path() / "space").string();
  Pipe toChild, toParent;
  const pid_t child = ::fork();
  if (child == 0) {
    toChild.Wait();
    int code = 1;
    {
      const auto space = CSpace::Open(uri);
      Snapshot snapshot(*space);
      const bool before = snapshot.Root<TombstonesMap>("t").size() == 10;
      toParent.Signal();
      toChild.Wait();
      const bool isolated = snapshot.Root<TombstonesMap>("t").size() == 10;
      snapshot.Refresh();
      const bool after = snapshot.Root<TombstonesMap>("t").size() == 20;
      code = before && isolated && after ? 0 : 2;
    }
    ::_exit(code);
  }
  const auto space = CSpace::Open(uri, {.create = true});
  CommitFilled<TombstonesMap>(*space, "t", 10);
  toChild.Signal();
  ASSERT_TRUE(toParent.Wait());
  const std::vector<ReaderInfo> readers = space->Readers();
  ASSERT_EQ(readers.size(), 1u);
  EXPECT_EQ(readers[0].process, child);
  EXPECT_EQ(readers[0].owner, "process " + std::to_string(child));
  CommitFilled<TombstonesMap>(*space, "t", 20);
  toChild.Signal();
  int status = 0;
  ASSERT_EQ(::waitpid(child, &status, 0), child);
  EXPECT_EQ(status, 0);
  EXPECT_TRUE(space->Readers().empty());
}

TEST(WritersOfTwoProcesses, TakeTurnsOrAreRefusedAtOnce) {
  TempFolder folder;
  const std::string uri = "lmdb:" + (folder.path() / "space").string();
  Pipe toChild, toParent;
  const pid_t child = ::fork();
  if (child == 0) {
    toChild.Wait();
    int code = 1;
    {
      const auto space = CSpace::Open(uri);
      WriteTransaction transaction(*space);
      transaction.Root<TombstonesMap>("t").Insert(Key(11), PayloadOf<TombstonesMap>(11), true);
      toParent.Signal();
      toChild.Wait();
      transaction.Commit();
      code = 0;
    }
    ::_exit(code);
  }
  const auto space = CSpace::Open(uri, {.create = true, .writerTimeout = milliseconds(0)});
  CommitFilled<TombstonesMap>(*space, "t", 10);
  toChild.Signal();
  ASSERT_TRUE(toParent.Wait());
  EXPECT_THROW(WriteTransaction{*space}, SpaceBusy);
  toChild.Signal();
  int status = 0;
  ASSERT_EQ(::waitpid(child, &status, 0), child);
  EXPECT_EQ(status, 0);
  WriteTransaction transaction(*space);
  EXPECT_EQ(transaction.Root<TombstonesMap>("t").size(), 11) << "the other process's commit is seen";
}

}  // namespace
}  // namespace vemo::test
