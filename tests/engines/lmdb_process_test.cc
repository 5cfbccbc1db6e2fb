// The LMDB engine among several processes.
#include <gtest/gtest.h>
#include <sys/resource.h>

#include <cerrno>
#include <chrono>
#include <fstream>
#include <system_error>

#include "tests/engines/child_process.h"
#include "tests/engines/lmdb_site.h"
#include "tests/support/temp_folder.h"

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
#define VEMO_TEST_HAS_SHADOW_MEMORY 1
#elif defined(__has_feature)
#if __has_feature(address_sanitizer) || __has_feature(thread_sanitizer)
#define VEMO_TEST_HAS_SHADOW_MEMORY 1
#endif
#endif

namespace vemo::test {
namespace {

using namespace std::chrono_literals;

constexpr std::uint64_t kMiB = 1 << 20;

class LmdbProcess : public testing::Test {
 protected:
  std::filesystem::path space() const { return m_folder.path() / "space"; }
  void MakeSpace() const { OpenAt(space(), true); }

 private:
  TempFolder m_folder;
};

BatchBuilder OneRecord(std::uint64_t oid, const std::string& bytes) {
  BatchBuilder batch;
  batch.Put(oid, bytes);
  return batch;
}

template <typename E, typename Act>
bool Throws(Act&& act) {
  try {
    act();
  } catch (const E&) {
    return true;
  }
  return false;
}

TEST_F(LmdbProcess, OneProcessHoldsTheWriterLock) {
  MakeSpace();
  ChildProcess child([&](const Conversation& parent) {
    const auto engine = OpenAt(space());
    auto lock = engine->LockWriter(0ms);
    parent.Say("locked");
    parent.Hear();
    lock.reset();
    parent.Say("released");
    parent.Hear();
    return true;
  });
  const auto engine = OpenAt(space());
  ASSERT_EQ(child.Hear(), "locked");
  const std::string message = MessageOf<SpaceBusy>([&] { engine->LockWriter(0ms); });
  EXPECT_TRUE(Contains(message, "process " + std::to_string(child.pid()) + " ")) << message;
  EXPECT_EQ(engine->OpenSnapshot()->Generation(), 0u);
  child.Say("release");
  ASSERT_EQ(child.Hear(), "released");
  EXPECT_NE(engine->LockWriter(0ms), nullptr);
  child.Say("end");
  EXPECT_TRUE(child.Succeeded());
}

TEST_F(LmdbProcess, TheWriterLockEndsWithItsProcess) {
  MakeSpace();
  ChildProcess child([&](const Conversation& parent) {
    const auto engine = OpenAt(space());
    const auto lock = engine->LockWriter(0ms);
    parent.Say("locked");
    parent.Hear();
    return true;
  });
  const auto engine = OpenAt(space());
  ASSERT_EQ(child.Hear(), "locked");
  EXPECT_THROW(engine->LockWriter(0ms), SpaceBusy);
  child.Kill();
  EXPECT_NE(engine->LockWriter(0ms), nullptr);
}

TEST_F(LmdbProcess, AForkedChildDoesNotReleaseTheWriterLock) {
  const auto engine = OpenAt(space(), true);
  auto lock = engine->LockWriter(0ms);
  ChildProcess child([&](const Conversation&) {
    lock.reset();
    return true;
  });
  EXPECT_TRUE(child.Succeeded());
  EXPECT_THROW(engine->LockWriter(0ms), SpaceBusy);
}

TEST_F(LmdbProcess, AReleaseIsNotHeldUpByAChildForkedMeanwhile) {
  const auto engine = OpenAt(space(), true);
  auto lock = engine->LockWriter(0ms);
  ChildProcess child([&](const Conversation& parent) {
    parent.Hear();
    return true;
  });
  lock.reset();
  EXPECT_NE(engine->LockWriter(0ms), nullptr);
  child.Say("end");
  EXPECT_TRUE(child.Succeeded());
}

TEST_F(LmdbProcess, WhatIsCommittedSurvivesAKill) {
  MakeSpace();
  ChildProcess child([&](const Conversation& parent) {
    const auto engine = OpenAt(space());
    const auto lock = engine->LockWriter(0ms);
    const auto snapshot = engine->OpenSnapshot();
    for (std::uint64_t i = 0; i < 20; ++i) {
      BatchBuilder batch = OneRecord(engine->ReserveIds(1).m_value, "record " + std::to_string(i));
      engine->Commit(batch.At(i));
    }
    parent.Say(std::to_string(engine->OpenSnapshot()->Generation()));
    parent.Hear();
    return true;
  });
  ASSERT_EQ(child.Hear(), "20");
  child.Kill();
  const auto engine = OpenAt(space());
  const Contents contents = NewestContents(*engine);
  EXPECT_EQ(contents.generation, 20u);
  ASSERT_EQ(contents.records.size(), 20u);
  EXPECT_EQ(contents.records.back(), (Records::value_type{20, "record 19"}));
  EXPECT_EQ(engine->ReserveIds(1), OID(21));
  BatchBuilder batch = OneRecord(21, "next");
  EXPECT_EQ(engine->Commit(batch.At(20)), 21u);
}

TEST_F(LmdbProcess, PagesKeptByAKilledReaderAreUsedAgain) {
  MakeSpace();
  ChildProcess child([&](const Conversation& parent) {
    const auto engine = OpenAt(space());
    const auto snapshot = engine->OpenSnapshot();
    parent.Say("reading");
    parent.Hear();
    return true;
  });
  ASSERT_EQ(child.Hear(), "reading");
  child.Kill();
  const auto engine = OpenAt(space());
  std::uint64_t generation = 0;
  for (int i = 0; i < 20; ++i) {
    BatchBuilder batch = OneRecord(1, std::string(kMiB, static_cast<char>('a' + i)));
    generation = engine->Commit(batch.At(generation));
  }
  EXPECT_LT(engine->Usage().bytes, 8 * kMiB);
}

TEST_F(LmdbProcess, SeesTheCommitsOfAnotherProcess) {
  const auto engine = OpenAt(space(), true);
  const auto before = engine->OpenSnapshot();
  ChildProcess child([&](const Conversation&) {
    const auto own = OpenAt(space());
    BatchBuilder batch = OneRecord(1, "from the child");
    return own->Commit(batch.At(0)) == 1 && own->ReserveIds(4) == OID(1);
  });
  ASSERT_TRUE(child.Succeeded());
  EXPECT_EQ(ContentsOf(*before), Contents());
  EXPECT_EQ(NewestContents(*engine).records, (Records{{1, "from the child"}}));
  BatchBuilder batch = OneRecord(2, "stale");
  EXPECT_THROW(engine->Commit(batch.At(0)), StaleGeneration);
  EXPECT_EQ(engine->ReserveIds(1), OID(5));
}

TEST_F(LmdbProcess, AdoptsTheGrowthOfAnotherProcessOnceItsSnapshotsAreClosed) {
  const auto engine = OpenAt(space(), true, kMiB);
  auto snapshot = engine->OpenSnapshot();
  ChildProcess child([&](const Conversation&) {
    BatchBuilder batch = OneRecord(1, std::string(8 * kMiB, 'x'));
    return OpenAt(space())->Commit(batch.At(0)) == 1;
  });
  ASSERT_TRUE(child.Succeeded());
  BatchBuilder next = OneRecord(2, "two");
  for (const std::string& message : {MessageOf<StoreError>([&] { engine->OpenSnapshot(); }),
                                     MessageOf<StoreError>([&] { engine->Commit(next.At(1)); })}) {
    EXPECT_TRUE(Contains(message, "close them and try again")) << message;
  }
  EXPECT_EQ(ContentsOf(*snapshot), Contents());
  snapshot.reset();
  EXPECT_EQ(engine->OpenSnapshot()->Read(OID(1))->size(), 8 * kMiB);
  EXPECT_EQ(engine->Commit(next.At(1)), 2u);
}

TEST_F(LmdbProcess, ACommitAdoptsTheGrowthOfAnotherProcess) {
  const auto engine = OpenAt(space(), true, kMiB);
  ChildProcess child([&](const Conversation&) {
    BatchBuilder batch = OneRecord(1, std::string(8 * kMiB, 'x'));
    return OpenAt(space())->Commit(batch.At(0)) == 1;
  });
  ASSERT_TRUE(child.Succeeded());
  BatchBuilder next = OneRecord(2, "two");
  EXPECT_EQ(engine->Commit(next.At(1)), 2u);
  EXPECT_EQ(engine->Usage().records, 2u);
}

TEST_F(LmdbProcess, TwoProcessesMayCreateItAtOnce) {
  const auto create = [&](const Conversation& parent) {
    parent.Hear();
    const auto engine = OpenAt(space(), true);
    engine->ReserveIds(1);
    return true;
  };
  ChildProcess one(create), two(create);
  one.Say("go");
  two.Say("go");
  EXPECT_TRUE(one.Succeeded());
  EXPECT_TRUE(two.Succeeded());
  EXPECT_EQ(OpenAt(space())->ReserveIds(1), OID(3));
}

TEST_F(LmdbProcess, AForkedChildIsRefusedAndDoesNotHarmItsParent) {
  auto engine = OpenAt(space(), true);
  auto snapshot = engine->OpenSnapshot();
  ChildProcess child([&](const Conversation&) {
    bool refused = Throws<StoreError>([&] { engine->OpenSnapshot(); });
    refused = Throws<StoreError>([&] { engine->Commit(CommitBatch()); }) && refused;
    refused = Throws<StoreError>([&] { engine->ReserveIds(1); }) && refused;
    refused = Throws<StoreError>([&] { engine->LockWriter(0ms); }) && refused;
    refused = Throws<StoreError>([&] { engine->Usage(); }) && refused;
    snapshot.reset();
    engine.reset();
    return refused;
  });
  ASSERT_TRUE(child.Succeeded());
  // The parent's snapshot still keeps its pages from being written over.
  std::uint64_t generation = 0;
  for (int i = 0; i < 20; ++i) {
    BatchBuilder batch = OneRecord(1, std::string(5000, static_cast<char>('a' + i)));
    generation = engine->Commit(batch.At(generation));
  }
  EXPECT_EQ(ContentsOf(*snapshot), Contents());
  EXPECT_EQ(NewestContents(*engine).generation, 20u);
}

TEST_F(LmdbProcess, AForkedChildMayOpenTheSpaceAnew) {
  auto engine = OpenAt(space(), true);
  const auto snapshot = engine->OpenSnapshot();
  ChildProcess child([&](const Conversation&) {
    const auto own = OpenAt(space());
    engine.reset();
    BatchBuilder batch = OneRecord(1, "from the child");
    const bool committed = own->Commit(batch.At(0)) == 1;
    return committed && Throws<SpaceBusy>([&] { OpenAt(space()); });
  });
  ASSERT_TRUE(child.Succeeded());
  EXPECT_EQ(ContentsOf(*snapshot), Contents());
  EXPECT_EQ(NewestContents(*engine).records, (Records{{1, "from the child"}}));
}

TEST_F(LmdbProcess, PagesKeptByAReaderKilledMeanwhileAreUsedAgainBeforeTheMapGrows) {
  constexpr std::uint64_t kMapBytes = 4 * kMiB;
  const auto engine = OpenAt(space(), true, kMapBytes);
  ChildProcess child([&](const Conversation& parent) {
    const auto own = OpenAt(space());
    const auto snapshot = own->OpenSnapshot();
    parent.Say("reading");
    parent.Hear();
    return true;
  });
  ASSERT_EQ(child.Hear(), "reading");
  child.Kill();
  std::uint64_t generation = 0;
  for (int i = 0; i < 20; ++i) {
    BatchBuilder batch = OneRecord(1, std::string(kMiB, static_cast<char>('a' + i)));
    generation = engine->Commit(batch.At(generation));
  }
  EXPECT_LE(engine->Usage().bytes, kMapBytes);
}

TEST_F(LmdbProcess, AProcessWithoutPermissionIsToldSo) {
  MakeSpace();
  namespace fs = std::filesystem;
  for (const auto& file : fs::directory_iterator(space())) fs::permissions(file, fs::perms::none);
  fs::permissions(space().parent_path(),
                  fs::perms::owner_all | fs::perms::others_exec | fs::perms::others_read);
  ChildProcess child([&](const Conversation&) {
    constexpr uid_t kNobody = 65534;
    if (::getuid() == 0 && ::setresuid(kNobody, kNobody, kNobody) != 0) return false;
    const std::string refused = MessageOf<StoreError>([&] { OpenAt(space()); });
    const std::string uncreated =
        MessageOf<StoreError>([&] { OpenAt("/vemo-test-without-permission", true); });
    return Contains(refused, "write permission") && Contains(uncreated, "write permission");
  });
  EXPECT_TRUE(child.Succeeded());
}

// Under a limit of address space that leaves little beyond what the process has mapped already. The
// sanitizers map more than any limit.
class LmdbLimitedProcess : public LmdbProcess {
 protected:
  void SetUp() override {
#if defined(VEMO_TEST_HAS_SHADOW_MEMORY)
    GTEST_SKIP() << "the sanitizer itself maps more than the limit";
#endif
  }

  static void LimitAddressSpace(std::uint64_t moreBytes) {
    std::uint64_t pages = 0;
    std::ifstream("/proc/self/statm") >> pages;
    rlimit limit{};
    limit.rlim_cur = pages * static_cast<std::uint64_t>(::sysconf(_SC_PAGESIZE)) + moreBytes;
    limit.rlim_max = limit.rlim_cur;
    if (::setrlimit(RLIMIT_AS, &limit) != 0)
      throw std::system_error(errno, std::generic_category(), "setrlimit");
  }
};

TEST_F(LmdbLimitedProcess, OpensWithWhatItMayMap) {
  MakeSpace();
  ChildProcess child([&](const Conversation&) {
    LimitAddressSpace(64 * kMiB);
    const auto engine = OpenAt(space());
    BatchBuilder batch = OneRecord(1, std::string(kMiB, 'x'));
    return engine->Commit(batch.At(0)) == 1;
  });
  EXPECT_TRUE(child.Succeeded());
}

TEST_F(LmdbLimitedProcess, GoesOnAfterAGrowthThatIsBeyondItsLimit) {
  MakeSpace();
  ChildProcess child([&](const Conversation&) {
    LimitAddressSpace(64 * kMiB);
    const auto engine = OpenAt(space(), false, 16 * kMiB);
    const std::string half(5 * kMiB, 'x');
    bool refused = false;
    std::uint64_t generation = 0;
    for (std::uint64_t oid = 1; !refused && oid < 20; ++oid) {
      BatchBuilder batch = OneRecord(oid, half);
      refused = Throws<StoreError>([&] { generation = engine->Commit(batch.At(generation)); });
    }
    const bool isWhole =
        engine->Usage().records == generation && engine->OpenSnapshot()->Read(OID(1))->size() == half.size();
    BatchBuilder removal;
    removal.Remove(1).Remove(2);
    return refused && isWhole && engine->Commit(removal.At(generation)) == generation + 1;
  });
  EXPECT_TRUE(child.Succeeded());
}

TEST_F(LmdbLimitedProcess, AdoptsAsMuchOfTheGrowthOfAnotherProcessAsItMay) {
  const auto engine = OpenAt(space(), true);
  ChildProcess child([&](const Conversation& parent) {
    LimitAddressSpace(64 * kMiB);
    const auto own = OpenAt(space(), false, kMiB);
    parent.Say("open");
    parent.Hear();
    BatchBuilder batch = OneRecord(2, "two");
    return own->Commit(batch.At(1)) == 2 && own->OpenSnapshot()->Read(OID(1))->size() == 4 * kMiB;
  });
  ASSERT_EQ(child.Hear(), "open");
  BatchBuilder batch = OneRecord(1, std::string(4 * kMiB, 'x'));
  engine->Commit(batch.At(0));
  child.Say("go");
  EXPECT_TRUE(child.Succeeded());
  EXPECT_EQ(engine->Usage().records, 2u);
}

}  // namespace
}  // namespace vemo::test
