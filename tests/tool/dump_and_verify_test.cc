#include "engines/lmdb/lmdb_engine.h"
#include "engines/lmdb/seal_file.h"
#include "engines/lmdb/space_folder.h"
#include "history/replay.h"
#include "history/site.h"
#include "store/snapshot.h"
#include "store/transaction.h"
#include "tool_fixture.h"
#include "vxOperation/src/WorkingSet/CompOp/VectorOT.h"

namespace vemo::test {
namespace {

class ReadingCommandTest : public ToolTest {
 protected:
  ReadingCommandTest() {
    const Outcome outcome =
        Vemo({"replay", "--store", uri(), SmallRecording(), "--field", "1:0", "--author", "Ada"});
    EXPECT_EQ(outcome.exitCode, 0) << outcome.err;
  }

  template <class Change>
  void Damage(const Change& change) {
    const auto space = CSpace::Open(uri());
    WriteTransaction transaction(*space);
    change(transaction);
    transaction.Commit();
  }
};

using DumpCommandTest = ReadingCommandTest;
using VerifyCommandTest = ReadingCommandTest;

TEST_F(DumpCommandTest, PrintsTheTextFormOfTheMap) {
  const Outcome outcome = Vemo({"dump", uri(), "tombstones"});
  EXPECT_EQ(outcome.exitCode, 0);
  EXPECT_EQ(outcome.err, "");
  EXPECT_EQ(outcome.out, "Height = 0\n{\n    1:0 --> [.....******]{[5,11)}\n}\n");
  const std::string site = "S" + GuidText(SiteOfAuthor("Ada"));
  const auto run = [&](const std::string& rest) { return "(opid=" + site + ":" + rest + ")"; };
  const std::string insertions = "insertions(u2=18 c=[" + run("19 q=0 n=5 u=23") + "," +
                                 run("0 q=5 n=1 u=0") + "," + run("12 q=6 n=1 u=12") + "," +
                                 run("1 q=7 n=4 u=4") + "," + run("13 q=11 n=1 u=13") + "," +
                                 run("5 q=12 n=6 u=10") + "])";
  EXPECT_EQ(Vemo({"dump", uri(), "insertions"}).out, "Height = 0\n{\n    1:0 --> " + insertions + "\n}\n");
  EXPECT_EQ(Vemo({"dump", uri(), "history"}).out, "Height = 0\n{\n    1:0 --> (i=" + insertions + " d=[" +
                                                      run("14 q=5 n=2") + "," + run("11 q=7 n=1") + "," +
                                                      run("16 q=8 n=3") + "])\n}\n");
}

TEST_F(DumpCommandTest, ChangesNothing) {
  const auto commits = [this] { return Snapshot(*CSpace::Open(uri())).Generation(); };
  const std::uint64_t before = commits();
  Vemo({"dump", uri(), "tombstones"});
  Vemo({"verify", uri()});
  EXPECT_EQ(commits(), before);
}

TEST_F(VerifyCommandTest, FindsNothingInASoundSpace) {
  const Outcome outcome = Vemo({"verify", uri()});
  EXPECT_EQ(outcome.exitCode, 0);
  EXPECT_EQ(outcome.err, "");
  EXPECT_EQ(outcome.out, "3 maps, 3 entries, 3 nodes, 6 records, 0 unreachable: sound\n");
}

TEST_F(VerifyCommandTest, OfASpaceInMemoryFindsAnEmptyOne) {
  const Outcome outcome = Vemo({"verify", "memory:"});
  EXPECT_EQ(outcome.exitCode, 0);
  EXPECT_EQ(outcome.out, "0 maps, 0 entries, 0 nodes, 0 records, 0 unreachable: sound\n");
}

TEST_F(VerifyCommandTest, FindsATreeThatIsWrong) {
  OID map;
  Damage([&map](WriteTransaction& transaction) {
    auto& tombstones = transaction.Root<FieldIdToVectorTombstonesMap>(kTombstonesRoot);
    map = tombstones.GetPersistObjState().m_oid;
    ++tombstones.m_size;
    tombstones.MarkAsDirtyWithoutTrace();
  });
  const Outcome outcome = Vemo({"verify", uri()});
  EXPECT_EQ(outcome.exitCode, 1);
  EXPECT_EQ(outcome.err, "");
  EXPECT_EQ(outcome.out,
            uri() + ": root \"tombstones\", map, object " + std::to_string(map.m_value) +
                " (vemo::FieldIdToVectorTombstonesMap): the size is 2, but there are 1 entries\n"
                "3 maps, 4 entries, 3 nodes, 6 records, 0 unreachable: 1 findings\n");
}

TEST_F(VerifyCommandTest, FindsMapsThatDisagree) {
  Damage([](WriteTransaction& transaction) {
    transaction.Root<FieldIdToVectorTombstonesMap>(kTombstonesRoot).erase(ParseFieldId("1:0"));
  });
  const Outcome outcome = Vemo({"verify", uri()});
  EXPECT_EQ(outcome.exitCode, 1);
  EXPECT_EQ(outcome.out,
            "field 1:0: it has insertions, but no tombstones entry\n"
            "3 maps, 2 entries, 3 nodes, 6 records, 0 unreachable: 1 findings\n");
}

TEST_F(VerifyCommandTest, FindsAFlippedByteOfARecord) {
  OID leaf;
  {
    const auto space = CSpace::Open(uri());
    Snapshot snapshot(*space);
    leaf = snapshot.Root<FieldIdToVectorTombstonesMap>(kTombstonesRoot).m_root.m_oid;
  }
  {
    LmdbOptions options;
    options.path = path("space");
    const auto engine = OpenLmdbEngine(options);
    const auto state = engine->OpenSnapshot();
    const ByteView record = *state->Read(leaf);
    Bytes flipped(record.begin(), record.end());
    flipped[flipped.size() / 2] ^= 1;
    CommitBatch batch;
    batch.expectedGeneration = state->Generation();
    batch.records.push_back({leaf, flipped});
    const auto lock = engine->LockWriter(std::chrono::milliseconds(0));
    engine->Commit(batch);
  }
  const Outcome outcome = Vemo({"verify", uri()});
  EXPECT_EQ(outcome.exitCode, 1);
  EXPECT_EQ(outcome.out.rfind(uri() + ": root \"tombstones\", root, object " + std::to_string(leaf.m_value) +
                                  " (vemo::FieldIdToVectorTombstonesMapLeafNode): malformed bytes at offset ",
                              0),
            0u)
      << outcome.out;
  EXPECT_TRUE(outcome.out.ends_with("unreachable: 1 findings\n")) << outcome.out;
  const Outcome dump = Vemo({"dump", uri(), "tombstones"});
  EXPECT_EQ(dump.exitCode, 3);
  EXPECT_NE(dump.err.find("object " + std::to_string(leaf.m_value)), std::string::npos) << dump.err;
  EXPECT_EQ(Vemo({"dump", uri(), "insertions"}).exitCode, 0) << "the rest stays readable";
}

TEST_F(VerifyCommandTest, PrintsWhatTheEngineFindsInItsFiles) {
  {
    const SealFile file(path("space") / kSealFile, uri(), true);
    CommitSeal seal = *file.Read().Of(file.Read().Newest());
    seal.freeDigest ^= 1;
    SealFile(path("space") / kSealFile, uri(), false).Write(seal);
  }
  for (const bool isRaw : {false, true}) {
    const Outcome outcome = isRaw ? Vemo({"verify", uri(), "--raw"}) : Vemo({"verify", uri()});
    EXPECT_EQ(outcome.exitCode, 1);
    EXPECT_NE(outcome.out.find("the list of free pages in data.mdb is not the one that was committed\n"), std::string::npos)
        << outcome.out;
    EXPECT_TRUE(outcome.out.ends_with("3 maps, 3 entries, 3 nodes, 6 records, 0 unreachable: 1 findings\n")) << outcome.out;
  }
}

}  // namespace
}  // namespace vemo::test
