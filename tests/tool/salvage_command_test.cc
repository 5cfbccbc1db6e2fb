#include "engines/lmdb/lmdb_engine.h"
#include "store/snapshot.h"
#include "store/transaction.h"
#include "tests/support/keys.h"
#include "tests/support/production_payloads.h"
#include "tool_fixture.h"

namespace vemo::test {
namespace {

using Map = FieldIdToVectorTombstonesMap;

// A map "t" of a root and three leaves of the keys 1-50, 51-100 and 101-160.
class SalvageCommandTest : public ToolTest {
 protected:
  SalvageCommandTest() {
    const auto space = CSpace::Open(uri(), {.create = true});
    {
      WriteTransaction transaction(*space);
      for (std::uint64_t n = 1; n <= 160; ++n)
        transaction.Root<Map>("t").Insert(Key(n), PayloadNumber<VectorTombstones>::Make(n), false);
      transaction.SetMeta("m", "value");
      transaction.Commit();
    }
    Snapshot snapshot(*space);
    m_leaf = snapshot.Root<Map>("t").m_firstLeaf->m_next.m_oid;
  }

  // Flips a bit of the record of the second leaf, or of a named value.
  void Damage(const std::string& info = "") {
    LmdbOptions options;
    options.path = path("space");
    const auto engine = OpenLmdbEngine(options);
    const auto state = engine->OpenSnapshot();
    const ByteView value = info.empty() ? *state->Read(m_leaf) : *state->ReadNamed(NamedTable::kInfo, info);
    Bytes flipped(value.begin(), value.end());
    flipped[flipped.size() / 2] ^= 1;
    CommitBatch batch;
    batch.expectedGeneration = state->Generation();
    if (info.empty()) {
      batch.records.push_back({m_leaf, flipped});
    } else {
      batch.namedValues.push_back({NamedTable::kInfo, info, flipped});
    }
    const auto lock = engine->LockWriter(std::chrono::milliseconds(0));
    engine->Commit(batch);
  }

  OID m_leaf;
};

TEST_F(SalvageCommandTest, CopiesASoundSpace) {
  const Outcome outcome = Vemo({"salvage", uri(), uri("rescued")});
  EXPECT_EQ(outcome.exitCode, 0) << outcome.err;
  EXPECT_EQ(outcome.out,
            "root \"t\": 160 entries\n1 maps, 160 entries, 1 meta values copied, 0 leaves left behind: nothing lost\n");
  EXPECT_EQ(Vemo({"dump", uri("rescued"), "t"}).out, Vemo({"dump", uri(), "t"}).out);
}

TEST_F(SalvageCommandTest, NamesWhatIsLostAndMakesASoundSpace) {
  Damage();
  const Outcome outcome = Vemo({"salvage", uri(), uri("rescued")});
  EXPECT_EQ(outcome.exitCode, 1) << outcome.err;
  EXPECT_NE(outcome.out.find("lost: root \"t\", object " + std::to_string(m_leaf.m_value) + ", keys from 51: to below 101:: "),
            std::string::npos)
      << outcome.out;
  EXPECT_TRUE(outcome.out.ends_with("1 maps, 110 entries, 1 meta values copied, 0 leaves left behind: 1 losses\n"))
      << outcome.out;
  EXPECT_EQ(Vemo({"verify", uri("rescued")}).exitCode, 0);
  EXPECT_EQ(Vemo({"verify", uri("rescued"), "--raw"}).exitCode, 0);
}

TEST_F(SalvageCommandTest, WorksWhereTheSpaceCannotBeOpened) {
  Damage("format");
  EXPECT_EQ(Vemo({"dump", uri(), "t"}).exitCode, 3);
  EXPECT_EQ(Vemo({"verify", uri(), "--raw"}).exitCode, 1);
  EXPECT_NE(Vemo({"salvage", uri(), uri("rescued")}).out.find("root \"t\": 160 entries\n"), std::string::npos);
}

TEST_F(SalvageCommandTest, RefusesADestinationThatHoldsSomething) {
  ASSERT_EQ(Vemo({"salvage", uri(), uri("rescued")}).exitCode, 0);
  Refusal(Vemo({"salvage", uri(), uri("rescued")}), 2);
}

TEST_F(SalvageCommandTest, NeverCreatesItsSource) {
  Refusal(Vemo({"salvage", uri("absent"), uri("rescued")}), 3);
}

TEST_F(SalvageCommandTest, TheRawCheckFindsWhatTheOtherOneFinds) {
  const Outcome sound = Vemo({"verify", uri(), "--raw"});
  EXPECT_EQ(sound.exitCode, 0);
  EXPECT_EQ(sound.out, "1 maps, 160 entries, 4 nodes, 5 records, 0 unreachable: sound\n");
  EXPECT_EQ(Vemo({"verify", uri()}).out, sound.out);
  Damage();
  const Outcome outcome = Vemo({"verify", uri(), "--raw"});
  EXPECT_EQ(outcome.exitCode, 1);
  EXPECT_EQ(outcome.out.rfind(uri() + ": root \"t\", root.0, object " + std::to_string(m_leaf.m_value) + " (", 0), 0u) << outcome.out;
  EXPECT_TRUE(outcome.out.ends_with("unreachable: 1 findings\n")) << outcome.out;
}

}  // namespace
}  // namespace vemo::test
