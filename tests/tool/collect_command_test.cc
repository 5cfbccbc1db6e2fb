#include "store/snapshot.h"
#include "store/transaction.h"
#include "tests/support/keys.h"
#include "tests/support/production_payloads.h"
#include "tool_fixture.h"

namespace vemo::test {
namespace {

class CollectCommandTest : public ToolTest {
 protected:
  // A map of one leaf, and a leaf that nothing reaches.
  CollectCommandTest() {
    const auto space = CSpace::Open(uri(), {.create = true});
    for (std::uint64_t n = 1; n <= 2; ++n) {
      WriteTransaction transaction(*space);
      FieldIdToVectorTombstonesMap fresh;
      fresh.Insert(Key(n), PayloadNumber<VectorTombstones>::Make(n), false);
      transaction.Root<FieldIdToVectorTombstonesMap>("t") = fresh;
      transaction.Commit();
    }
  }
};

TEST_F(CollectCommandTest, RemovesWhatNothingReaches) {
  const Outcome outcome = Vemo({"collect", uri()});
  EXPECT_EQ(outcome.exitCode, 0) << outcome.err;
  EXPECT_EQ(outcome.err, "");
  EXPECT_EQ(outcome.out, "3 records, 2 in use, 0 awaiting deletion, 1 unreachable (27 bytes): 1 swept (27 bytes)\n");
  EXPECT_EQ(Vemo({"verify", uri()}).out, "1 maps, 1 entries, 1 nodes, 2 records, 0 unreachable: sound\n");
}

TEST_F(CollectCommandTest, OfADryRunRemovesNothing) {
  const Outcome outcome = Vemo({"collect", uri(), "--dry-run"});
  EXPECT_EQ(outcome.exitCode, 0) << outcome.err;
  EXPECT_EQ(outcome.out, "3 records, 2 in use, 0 awaiting deletion, 1 unreachable (27 bytes): nothing removed\n");
  EXPECT_EQ(Vemo({"verify", uri()}).out, "1 maps, 1 entries, 1 nodes, 3 records, 1 unreachable: sound\n");
}

TEST_F(CollectCommandTest, TellsHowFarItHasComeOnStandardError) {
  const Outcome outcome = Vemo({"collect", uri(), "--progress"});
  EXPECT_EQ(outcome.exitCode, 0) << outcome.err;
  EXPECT_NE(outcome.err.find("marking 2 of 3\n"), std::string::npos) << outcome.err;
  EXPECT_NE(outcome.err.find("sweeping 1 of 1\n"), std::string::npos) << outcome.err;
}

TEST_F(CollectCommandTest, RemovesNothingFromASpaceThatIsDamagedAndNamesTheObject) {
  {
    const auto space = CSpace::Open(uri());
    WriteTransaction transaction(*space);
    auto& map = transaction.Root<FieldIdToVectorTombstonesMap>("t");
    auto* leaf = map.m_firstLeaf.Get();
    leaf->m_next = leaf;
    leaf->MarkAsDirtyWithoutTrace();
    transaction.Commit();
  }
  const std::string refusal = Refusal(Vemo({"collect", uri()}), 3);
  EXPECT_NE(refusal.find("root \"t\""), std::string::npos) << refusal;
}

TEST_F(CollectCommandTest, NeverCreatesASpace) {
  Refusal(Vemo({"collect", uri("absent")}), 3);
}

}  // namespace
}  // namespace vemo::test
