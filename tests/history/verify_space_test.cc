// What the check of a whole space makes of damage in one of its maps, its named values or its table of
// records.
#include <gtest/gtest.h>

#include "engines/memory/memory_engine.h"
#include "store/transaction.h"
#include "store/verify.h"
#include "tests/support/keys.h"
#include "tests/support/production_payloads.h"

namespace vemo::test {
namespace {

using Strings = std::vector<std::string>;
using Tombstones = FieldIdToVectorTombstonesMap;
using Insertions = FieldIdToVectorInsertionsMap;

// Two maps: "t" has a root and three leaves, "i" the same. Ten records.
class VerifySpaceTest : public ::testing::Test {
 protected:
  VerifySpaceTest() {
    std::unique_ptr<Engine> engine = OpenMemoryEngine();
    m_engine = engine.get();
    m_space = CSpace::OpenOn(std::move(engine), {.create = true});
    Change([](WriteTransaction& transaction) {
      for (std::uint64_t n = 1; n <= 160; ++n) {
        transaction.Root<Tombstones>("t").Insert(Key(n), PayloadNumber<VectorTombstones>::Make(n), false);
        transaction.Root<Insertions>("i").Insert(Key(n), PayloadNumber<VectorInsertions>::Make(n), false);
      }
      transaction.SetMeta("named", "value");
    });
  }

  void Change(const std::function<void(WriteTransaction&)>& change) {
    WriteTransaction transaction(*m_space);
    change(transaction);
    transaction.Commit();
  }

  // A commit that the store knows nothing of.
  void ChangeBehind(CommitBatch& batch) {
    batch.expectedGeneration = m_engine->OpenSnapshot()->Generation();
    m_engine->Commit(batch);
  }

  VerifyReport Verify() {
    Snapshot snapshot(*m_space);
    return VerifySpace(snapshot);
  }
  // Each finding as "ROOT OBJECT PATH: fault".
  static Strings Texts(const VerifyReport& report) {
    Strings texts;
    for (const Finding& finding : report.findings)
      texts.push_back(finding.root + " " + std::to_string(finding.oid.m_value) + " " + finding.path + ": " + finding.fault);
    return texts;
  }

  OID MapT() { return Snapshot(*m_space).Root<Tombstones>("t").GetPersistObjState().m_oid; }
  OID LeafOfT(int i) {
    Snapshot snapshot(*m_space);
    const auto* leaf = snapshot.Root<Tombstones>("t").m_firstLeaf.Get();
    for (; i > 0; --i) leaf = leaf->m_next.Get();
    return leaf->GetPersistObjState().m_oid;
  }

  Engine* m_engine;
  std::unique_ptr<CSpace> m_space;
};

TEST_F(VerifySpaceTest, FindsNothingInASoundSpace) {
  const VerifyReport report = Verify();
  EXPECT_EQ(Texts(report), Strings());
  EXPECT_EQ(report.maps, 2u);
  EXPECT_EQ(report.entries, 320u);
  EXPECT_EQ(report.nodes, 8u);
  EXPECT_EQ(report.records, 10u);
  EXPECT_EQ(report.unreachable, 0u);
}

TEST_F(VerifySpaceTest, FindsStructuralDamageAndNamesItsRoot) {
  Change([](WriteTransaction& transaction) {
    auto& map = transaction.Root<Tombstones>("t");
    ++map.m_size;
    map.MarkAsDirtyWithoutTrace();
  });
  EXPECT_EQ(Texts(Verify()), Strings{"t " + std::to_string(MapT().m_value) + " map: the size is 161, but there are 160 entries"});
}

TEST_F(VerifySpaceTest, NamesTheNodeOfAFault) {
  Change([](WriteTransaction& transaction) {
    auto* leaf = transaction.Root<Tombstones>("t").m_firstLeaf->m_next.Get();
    leaf->m_prev.Clear();
    leaf->MarkAsDirtyWithoutTrace();
  });
  EXPECT_EQ(Texts(Verify()), Strings{"t " + std::to_string(LeafOfT(1).m_value) +
                                     " leaf 1: its left neighbour is not the tree's"});
}

TEST_F(VerifySpaceTest, FindsAFlippedByteOfANode) {
  const OID leaf = LeafOfT(1);
  const auto state = m_engine->OpenSnapshot();
  const ByteView record = *state->Read(leaf);
  Bytes flipped(record.begin(), record.end());
  flipped[flipped.size() / 2] ^= 4;
  CommitBatch batch;
  batch.records.push_back({leaf, flipped});
  ChangeBehind(batch);
  const VerifyReport report = Verify();
  ASSERT_EQ(report.findings.size(), 1u) << testing::PrintToString(Texts(report));
  EXPECT_EQ(report.findings[0].root, "t");
  EXPECT_EQ(report.findings[0].oid, leaf);
  EXPECT_NE(report.findings[0].fault.find("checksum"), std::string::npos) << report.findings[0].fault;
  EXPECT_EQ(report.nodes, 8u);
  EXPECT_EQ(report.unreachable, 0u);
}

TEST_F(VerifySpaceTest, FindsAMissingNode) {
  const OID leaf = LeafOfT(2);
  CommitBatch batch;
  batch.removedRecords.push_back(leaf);
  ChangeBehind(batch);
  const VerifyReport report = Verify();
  ASSERT_EQ(report.findings.size(), 1u) << testing::PrintToString(Texts(report));
  EXPECT_EQ(report.findings[0].oid, leaf);
  EXPECT_EQ(report.records, 9u);
}

TEST_F(VerifySpaceTest, FindsNodesThatBelongToTwoMaps) {
  Change([](WriteTransaction& transaction) {
    auto& map = transaction.Root<Tombstones>("t");
    auto& other = transaction.Root<Tombstones>("u");
    other.m_root = map.m_root;
    other.m_firstLeaf = map.m_firstLeaf;
    other.m_lastLeaf = map.m_lastLeaf;
    other.m_size = map.m_size;
    other.m_height = map.m_height;
    other.MarkAsDirtyWithoutTrace();
  });
  const VerifyReport report = Verify();
  EXPECT_EQ(report.findings.size(), 4u);
  for (const Finding& finding : report.findings) {
    EXPECT_EQ(finding.root, "u");
    EXPECT_EQ(finding.fault, "the node belongs to two maps");
  }
}

TEST_F(VerifySpaceTest, CountsWhatNoRootReaches) {
  CommitBatch batch;
  batch.namedValues.push_back({NamedTable::kRoots, "t", std::nullopt});
  ChangeBehind(batch);
  const VerifyReport report = Verify();
  EXPECT_EQ(Texts(report), Strings());
  EXPECT_EQ(report.maps, 1u);
  EXPECT_EQ(report.records, 10u);
  EXPECT_EQ(report.unreachable, 5u);
}

TEST_F(VerifySpaceTest, FindsDamageInWhatNoRootReaches) {
  const OID leaf = LeafOfT(0);
  const auto state = m_engine->OpenSnapshot();
  const ByteView record = *state->Read(leaf);
  const Bytes cut(record.begin(), record.end() - 1);
  CommitBatch batch;
  batch.namedValues.push_back({NamedTable::kRoots, "t", std::nullopt});
  batch.records.push_back({leaf, cut});
  ChangeBehind(batch);
  const VerifyReport report = Verify();
  ASSERT_EQ(report.findings.size(), 1u) << testing::PrintToString(Texts(report));
  EXPECT_EQ(report.findings[0].root, "");
  EXPECT_EQ(report.findings[0].oid, leaf);
  EXPECT_EQ(report.unreachable, 5u);
}

TEST_F(VerifySpaceTest, FindsADamagedNamedValue) {
  const auto state = m_engine->OpenSnapshot();
  const ByteView sealed = *state->ReadNamed(NamedTable::kMeta, "named");
  Bytes flipped(sealed.begin(), sealed.end());
  flipped[0] ^= 1;
  CommitBatch batch;
  batch.namedValues.push_back({NamedTable::kMeta, "named", flipped});
  ChangeBehind(batch);
  const VerifyReport report = Verify();
  ASSERT_EQ(report.findings.size(), 1u) << testing::PrintToString(Texts(report));
  EXPECT_EQ(report.findings[0].fault.rfind("named value \"named\": ", 0), 0u) << report.findings[0].fault;
}

TEST_F(VerifySpaceTest, FindsADamagedRootAndGoesOnWithTheOthers) {
  const auto state = m_engine->OpenSnapshot();
  const ByteView sealed = *state->ReadNamed(NamedTable::kRoots, "i");
  Bytes flipped(sealed.begin(), sealed.end());
  flipped.back() ^= 1;
  CommitBatch batch;
  batch.namedValues.push_back({NamedTable::kRoots, "i", flipped});
  ChangeBehind(batch);
  const VerifyReport report = Verify();
  ASSERT_EQ(report.findings.size(), 1u) << testing::PrintToString(Texts(report));
  EXPECT_EQ(report.findings[0].root, "i");
  EXPECT_EQ(report.entries, 160u) << "those of t";
}

}  // namespace
}  // namespace vemo::test
