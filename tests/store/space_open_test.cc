// Opening a space: its names, what is made and what is left alone.
#include <filesystem>

#include "engines/lmdb/lmdb_engine.h"
#include "engines/memory/memory_engine.h"
#include "platform/variable_length.h"
#include "store/envelope.h"
#include "store/uri.h"
#include "tests/store/store_fixture.h"

namespace vemo::test {
namespace {

using std::filesystem::exists;

std::string RefusalOf(const std::string& uri) {
  return MessageOf<UsageError>([&] { ParseSpaceUri(uri); });
}

TEST(SpaceUri, NamesTheEngineAndItsOptions) {
  EXPECT_EQ(ParseSpaceUri("memory:").engine, SpaceUri::Engine::kMemory);
  const SpaceUri plain = ParseSpaceUri("lmdb:/some/where");
  EXPECT_EQ(plain.engine, SpaceUri::Engine::kLmdb);
  EXPECT_EQ(plain.path, "/some/where");
  EXPECT_EQ(plain.mapBytes, 0u);
  EXPECT_TRUE(plain.syncEachCommit);
  const SpaceUri full = ParseSpaceUri("lmdb:here?map_bytes=1048576&pending_bytes=9&sync=none_risking_loss");
  EXPECT_EQ(full.path, "here");
  EXPECT_EQ(full.mapBytes, 1048576u);
  EXPECT_EQ(full.pendingBytes, 9u);
  EXPECT_FALSE(full.syncEachCommit);
}

TEST(SpaceUri, RefusesWhatItDoesNotKnowAndSaysWhat) {
  for (const char* uri :
       {"", "lmdb", "memory", "memory:x", "memory:?sync=commit", "file:/x", "LMDB:/x", "/x"}) {
    EXPECT_NE(RefusalOf(uri).find("lmdb:PATH or memory:"), std::string::npos) << uri;
  }
  EXPECT_NE(RefusalOf("lmdb:").find("path is missing"), std::string::npos);
  EXPECT_NE(RefusalOf("lmdb:?sync=commit").find("path is missing"), std::string::npos);
  EXPECT_NE(RefusalOf("lmdb:/x?nosync=1").find("no option \"nosync\""), std::string::npos);
  EXPECT_NE(RefusalOf("lmdb:/x?").find("no option \"\""), std::string::npos);
  EXPECT_NE(RefusalOf("lmdb:/x?sync=commit&").find("no option \"\""), std::string::npos);
  EXPECT_NE(RefusalOf("lmdb:/x?sync=none").find("sync is"), std::string::npos);
  for (const char* bytes : {"", "0", "-1", "1k", "99999999999999999999999"}) {
    for (const std::string option : {"map_bytes", "pending_bytes"}) {
      EXPECT_NE(RefusalOf("lmdb:/x?" + option + "=" + bytes).find(option + " wants a number of bytes"), std::string::npos) << bytes;
    }
  }
}

TEST(SpaceUri, TextWithAllOptionsReadsBackAsTheSame) {
  EXPECT_EQ(SpaceUriText(ParseSpaceUri("memory:")), "memory:");
  EXPECT_EQ(SpaceUriText(ParseSpaceUri("lmdb:/x")), "lmdb:/x?sync=commit");
  const std::string full = "lmdb:/x?sync=none_risking_loss&map_bytes=5&pending_bytes=6";
  EXPECT_EQ(SpaceUriText(ParseSpaceUri(full)), full);
}

class LmdbSpaceOpen : public testing::Test {
 protected:
  std::string Uri(const std::string& options = "") const { return "lmdb:" + path.string() + options; }

  TempFolder folder;
  std::filesystem::path path = folder.path() / "space";
};

TEST_F(LmdbSpaceOpen, ASpaceThatIsNotThereIsNotFoundAndLeavesNothing) {
  const std::string message = MessageOf<SpaceNotFound>([&] { CSpace::Open(Uri()); });
  EXPECT_NE(message.find(path.string()), std::string::npos);
  EXPECT_FALSE(exists(path));
}

TEST_F(LmdbSpaceOpen, AnEmptyFolderIsNoSpaceUntilOneIsMade) {
  std::filesystem::create_directory(path);
  EXPECT_THROW(CSpace::Open(Uri()), SpaceNotFound);
  EXPECT_TRUE(std::filesystem::is_empty(path));
  CSpace::Open(Uri(), {.create = true});
  CSpace::Open(Uri());
}

TEST_F(LmdbSpaceOpen, CreatingMakesASpaceThatIsThereAfterwards) {
  CSpace::Open(Uri(), {.create = true});
  const auto space = CSpace::Open(Uri());
  EXPECT_EQ(Snapshot(*space).Generation(), 1u);
  EXPECT_TRUE(Snapshot(*space).RootNames().empty());
}

TEST_F(LmdbSpaceOpen, CreatingWhatIsThereOpensItUnchanged) {
  CommitFilled<TombstonesMap>(*CSpace::Open(Uri(), {.create = true}), "t", 10);
  const auto space = CSpace::Open(Uri(), {.create = true});
  EXPECT_EQ(Snapshot(*space).Root<TombstonesMap>("t").size(), 10);
}

TEST_F(LmdbSpaceOpen, TheSameSpaceCannotBeOpenedTwiceInOneProcess) {
  const auto space = CSpace::Open(Uri(), {.create = true});
  EXPECT_THROW(CSpace::Open(Uri()), SpaceBusy);
  EXPECT_THROW(CSpace::Open("lmdb:" + (folder.path() / "." / "space").string()), SpaceBusy);
  CommitFilled<TombstonesMap>(*space, "t", 1);
}

TEST_F(LmdbSpaceOpen, ASpaceThatANewerProgramMadeIsRefusedUntouched) {
  CSpace::Open(Uri(), {.create = true});
  LmdbOptions options;
  options.path = path;
  {
    const auto engine = OpenLmdbEngine(options);
    std::uint8_t number[MAX_VARIABLE_LENGTH_UINT_SIZE];
    const Bytes newer(number, SerialiseVariableLengthUint32(number, 2));
    CommitBatch batch;
    batch.expectedGeneration = 1;
    batch.namedValues.push_back({NamedTable::kInfo, "format", SealNamed(NamedTable::kInfo, "format", newer)});
    engine->Commit(batch);
  }
  for (const bool create : {false, true}) {
    const std::string message =
        MessageOf<IncompatibleSpace>([&] { CSpace::Open(Uri(), {.create = create}); });
    EXPECT_NE(message.find("format 2"), std::string::npos) << message;
  }
  EXPECT_EQ(OpenLmdbEngine(options)->OpenSnapshot()->Generation(), 2u);
}

TEST_F(LmdbSpaceOpen, ADamagedFormatNumberIsSaidToBeDamaged) {
  CSpace::Open(Uri(), {.create = true});
  LmdbOptions options;
  options.path = path;
  {
    CommitBatch batch;
    batch.expectedGeneration = 1;
    batch.namedValues.push_back({NamedTable::kInfo, "format", Bytes{1, 1, 0, 0, 0, 0, 0, 0, 0, 0}});
    OpenLmdbEngine(options)->Commit(batch);
  }
  const std::string message = MessageOf<CorruptRecord>([&] { CSpace::Open(Uri()); });
  EXPECT_NE(message.find("format number is damaged"), std::string::npos) << message;
}

TEST_F(LmdbSpaceOpen, AnEngineWithCommitsOfSomebodyElseIsNoSpace) {
  LmdbOptions options;
  options.path = path;
  options.create = true;
  {
    CommitBatch batch;
    batch.namedValues.push_back({NamedTable::kMeta, "x", Bytes{1}});
    OpenLmdbEngine(options)->Commit(batch);
  }
  EXPECT_THROW(CSpace::Open(Uri(), {.create = true}), IncompatibleSpace);
}

TEST_F(LmdbSpaceOpen, ASpaceWhoseMakingWasInterruptedIsFinishedWhenOpenedForWriting) {
  LmdbOptions options;
  options.path = path;
  options.create = true;
  OpenLmdbEngine(options);
  EXPECT_THROW(CSpace::Open(Uri()), SpaceNotFound);
  CommitFilled<TombstonesMap>(*CSpace::Open(Uri(), {.create = true}), "t", 1);
  CSpace::Open(Uri());
}

TEST_F(LmdbSpaceOpen, TheOptionsInForceAreToldAsText) {
  const auto space =
      CSpace::Open(Uri("?map_bytes=16777216"), {.create = true, .writerTimeout = std::chrono::seconds(3)});
  EXPECT_EQ(space->OptionsText(),
            "lmdb:" + path.string() + "?sync=commit&map_bytes=16777216 create=yes writer_timeout_ms=3000 reader_warning_age_ms=none reader_max_age_ms=none cache_bytes=none");
  EXPECT_NE(CSpace::Open("memory:", {.cacheBytes = 4096})->OptionsText().find(" cache_bytes=4096"), std::string::npos);
  EXPECT_EQ(CSpace::Open("memory:")->OptionsText(), "memory: create=no writer_timeout_ms=10000 reader_warning_age_ms=none reader_max_age_ms=none cache_bytes=none");
}

TEST_F(LmdbSpaceOpen, ASpaceGrowsBeyondItsMapByItself) {
  const auto space = CSpace::Open(Uri("?map_bytes=262144&sync=none_risking_loss"), {.create = true});
  CommitFilled<TombstonesMap>(*space, "large", 60'000);  // more than twice the map in one commit
  EXPECT_GT(space->Usage().bytes, 2 * 262'144u);
  for (std::uint64_t round = 0; round < 20; ++round) {  // and little by little
    WriteTransaction transaction(*space);
    Fill(transaction.Root<TombstonesMap>("large"), 60'001 + round * 1'000, 61'000 + round * 1'000);
    transaction.Commit();
  }
  EXPECT_EQ(Snapshot(*space).Root<TombstonesMap>("large").size(), 80'000);
}

TEST_F(LmdbSpaceOpen, ATransactionGetsIdsAlsoWhenTheMapIsFull) {
  std::uint64_t key = 0;
  for (std::size_t round = 0; round < 60; ++round) {
    // The engine maps at least the file, and at times no more than that; a fresh handle reserves ids at its
    // first need.
    const auto space = CSpace::Open(Uri("?map_bytes=131072&sync=none_risking_loss"), {.create = true});
    WriteTransaction transaction(*space);
    transaction.SetMeta("filling " + std::to_string(round), std::string(round % 7 * 1'000, 'x'));
    Fill(transaction.Root<TombstonesMap>("t"), key + 1, key + 400);
    key += 400;
    transaction.Commit();
  }
  const auto space = CSpace::Open(Uri());
  EXPECT_EQ(Snapshot(*space).Root<TombstonesMap>("t").size(), 24'000);
}

TEST(MemorySpaceOpen, IsNewEachTimeAndNeedsNoPermissionToBeMade) {
  CommitFilled<TombstonesMap>(*CSpace::Open("memory:"), "t", 10);
  const auto first = CSpace::Open("memory:");
  const auto second = CSpace::Open("memory:");
  CommitFilled<TombstonesMap>(*first, "t", 10);
  EXPECT_FALSE(Snapshot(*second).HasRoot("t"));
}

TEST(OwnEngineOpen, MakesASpaceOnlyWhereAllowed) {
  EngineWatch watch;
  const std::shared_ptr<Engine> engine = OpenMemoryEngine();
  EXPECT_THROW(CSpace::OpenOn(WatchEngine(engine, watch)), SpaceNotFound);
  EXPECT_EQ(engine->OpenSnapshot()->Generation(), 0u);
  EXPECT_EQ(CSpace::OpenOn(WatchEngine(engine, watch), {.create = true})->Name(), "memory:");
  EXPECT_NO_THROW(CSpace::OpenOn(WatchEngine(engine, watch)));
}

}  // namespace
}  // namespace vemo::test
