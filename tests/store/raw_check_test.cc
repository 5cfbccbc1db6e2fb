// The check of stored bytes: what it finds, where it says that it lies, and that the check of loaded nodes agrees.
#include "store/raw_check.h"

#include "store/verify.h"
#include "tests/store/store_fixture.h"

namespace vemo::test {
namespace {

using Strings = std::vector<std::string>;

class RawCheckTest : public StoreTest {
 protected:
  // "t": an internal root (4) over leaves of the keys 1-50, 51-100 and 101-160; "h": one leaf.
  RawCheckTest() {
    CommitFilled<TombstonesMap>(space(), "t", 160);
    CommitFilled<HistoriesMap>(space(), "h", 20);
    Snapshot snapshot(space());
    const auto& map = snapshot.Root<TombstonesMap>("t");
    m_map = map.GetPersistObjState().m_oid;
    m_root = map.m_root.m_oid;
    for (const auto* leaf = map.m_firstLeaf.Get(); leaf != nullptr; leaf = leaf->m_next.Get())
      m_leaves.push_back(leaf->GetPersistObjState().m_oid);
    m_stored = Stored();
  }

  RawCheckReport Check() { return CheckRawSpace(*site.engine().OpenSnapshot()); }

  // Each finding as it is printed, class names without what they have in common.
  Strings Findings() {
    Strings texts;
    for (const RawFinding& finding : Check().findings) {
      std::string text = RawFindingText(finding);
      for (std::size_t at; (at = text.find("vemo::FieldIdTo")) != std::string::npos;) text.erase(at, 15);
      texts.push_back(text);
    }
    Snapshot snapshot(space());
    const VerifyReport report = VerifySpace(snapshot);
    EXPECT_EQ(report.findings.empty(), texts.empty()) << "the two checks disagree";
    EXPECT_EQ(report.space, site.engine().Name());
    for (const Finding& finding : report.findings) {
      EXPECT_TRUE(finding.oid.IsNull() || !finding.className.empty()) << FindingText(finding);
    }
    return texts;
  }

  std::string Object(OID oid, const std::string& className) {
    return "object " + std::to_string(oid.m_value) + " (" + className + "): ";
  }
  std::string Leaf(std::size_t i) { return Object(m_leaves[i], "VectorTombstonesMapLeafNode"); }
  std::string Inner() { return Object(m_root, "VectorTombstonesMapInternalNode"); }
  std::string Map() { return Object(m_map, "VectorTombstonesMap"); }

  template <class Change>
  void ChangeMap(const Change& change) {
    WriteTransaction transaction(space());
    auto& map = transaction.Root<TombstonesMap>("t");
    change(map);
    map.MarkAsDirtyWithoutTrace();
    transaction.Commit();
  }
  template <class Change>
  void ChangeLeaf(std::size_t i, const Change& change) {
    WriteTransaction transaction(space());
    auto& map = transaction.Root<TombstonesMap>("t");
    auto* leaf = map.m_firstLeaf.Get();
    for (; i > 0; --i) leaf = leaf->m_next.Get();
    change(*leaf, map);
    leaf->MarkAsDirtyWithoutTrace();
    transaction.Commit();
  }
  template <class Change>
  void ChangeInner(const Change& change) {
    WriteTransaction transaction(space());
    auto& map = transaction.Root<TombstonesMap>("t");
    auto* node = static_cast<TombstonesMap::InternalNode*>(map.m_root.Get());
    change(*node, map);
    node->MarkAsDirtyWithoutTrace();
    transaction.Commit();
  }

  OID m_map, m_root;
  std::vector<OID> m_leaves;
  StoredState m_stored;
};
INSTANTIATE_STORE_TEST(RawCheckTest);

TEST_P(RawCheckTest, CountsWhatTheOtherCheckCounts) {
  const RawCheckReport raw = Check();
  EXPECT_EQ(Findings(), Strings());
  Snapshot snapshot(space());
  const VerifyReport report = VerifySpace(snapshot);
  EXPECT_EQ(raw.maps, report.maps);
  EXPECT_EQ(raw.entries, report.entries);
  EXPECT_EQ(raw.nodes, report.nodes);
  EXPECT_EQ(raw.records, report.records);
  EXPECT_EQ(raw.unreachable, report.unreachable);
}

TEST_P(RawCheckTest, CountsWhatNothingReachesAndNotWhatAwaitsDeletion) {
  CommitFilled<TombstonesMap>(space(), "big", 15'000);
  site.Reopen();
  WriteTransaction transaction(space());
  transaction.Root<TombstonesMap>("big").clear();
  TombstonesMap fresh;
  Fill(fresh, 1, 10);
  transaction.Root<TombstonesMap>("t") = fresh;
  transaction.Commit();
  const RawCheckReport raw = Check();
  EXPECT_TRUE(raw.findings.empty());
  EXPECT_EQ(raw.unreachable, 4u);
  EXPECT_GT(raw.records, 100u);
}

TEST_P(RawCheckTest, FindsAWrongSize) {
  ChangeMap([](auto& map) { ++map.m_size; });
  EXPECT_EQ(Findings(), Strings{"root \"t\", map, " + Map() + "it says that it has 161 entries and has 160"});
}

TEST_P(RawCheckTest, FindsAWrongLeftNeighbour) {
  ChangeLeaf(1, [](auto& leaf, auto&) { leaf.m_prev.Clear(); });
  EXPECT_EQ(Findings(), Strings{"root \"t\", root.0, " + Leaf(1) + "its left neighbour is not the tree's"});
}

TEST_P(RawCheckTest, FindsAWrongRightNeighbour) {
  ChangeLeaf(0, [](auto& leaf, auto& map) { leaf.m_next = map.m_lastLeaf.Get(); });
  EXPECT_EQ(Findings(), Strings{"root \"t\", root.0, " + Leaf(0) + "its right neighbour is not the tree's"});
}

TEST_P(RawCheckTest, FindsAChainThatGoesOnBehindTheLastLeaf) {
  ChangeLeaf(2, [](auto& leaf, auto& map) { leaf.m_next = map.m_firstLeaf.Get(); });
  EXPECT_EQ(Findings(), Strings{"root \"t\", " + Leaf(2) + "the last leaf has a right neighbour"});
}

TEST_P(RawCheckTest, FindsAWrongFirstAndAWrongLastLeaf) {
  ChangeMap([](auto& map) {
    auto* last = map.m_lastLeaf.Get();
    map.m_lastLeaf = map.m_firstLeaf.Get();
    map.m_firstLeaf = last;
  });
  EXPECT_EQ(Findings(), (Strings{"root \"t\", map, " + Map() + "its first leaf is not the tree's",
                                 "root \"t\", map, " + Map() + "its last leaf is not the tree's"}));
}

TEST_P(RawCheckTest, FindsAnUnderfullLeaf) {
  ChangeLeaf(0, [](auto& leaf, auto& map) {
    DestructLeafEntry(&leaf, --leaf.m_numKeyEntrys);
    --map.m_size;
    map.MarkAsDirtyWithoutTrace();
  });
  EXPECT_EQ(Findings(), Strings{"root \"t\", root.-1, " + Leaf(0) + "it has only 49 entries"});
}

TEST_P(RawCheckTest, FindsKeysOutsideOfTheirRange) {
  ChangeLeaf(1, [](auto& leaf, auto&) {
    const_cast<FieldId&>(leaf.GetEntry(0).first) = Key(50);
    const_cast<FieldId&>(leaf.GetEntry(49).first) = Key(101);
  });
  EXPECT_EQ(Findings(), (Strings{"root \"t\", root.0, " + Leaf(1) + "key 50: is below its range",
                                 "root \"t\", root.0, " + Leaf(1) + "key 101: is above its range"}));
}

TEST_P(RawCheckTest, FindsKeysThatDoNotAscend) {
  ChangeLeaf(1, [](auto& leaf, auto&) { const_cast<FieldId&>(leaf.GetEntry(5).first) = Key(55); });
  const Strings findings = Findings();
  ASSERT_EQ(findings.size(), 1u);
  EXPECT_EQ(findings.front().rfind("root \"t\", root.0, " + Leaf(1), 0), 0u) << findings.front();
  EXPECT_NE(findings.front().find("keys that do not ascend"), std::string::npos);
}

TEST_P(RawCheckTest, FindsANodeThatHangsInTheTreeTwice) {
  ChangeInner([](auto& node, auto&) { node.GetEntry(1).m_ptr = node.GetEntry(0).m_ptr; });
  EXPECT_EQ(Findings(), Strings{"root \"t\", root.1, " + Leaf(1) + "it hangs in the tree twice"});
}

TEST_P(RawCheckTest, FindsACycle) {
  ChangeInner([](auto& node, auto& map) { node.GetEntry(1).m_ptr = map.m_root; });
  EXPECT_EQ(Findings().size(), 1u);
}

TEST_P(RawCheckTest, FindsAHeightThatIsNotTheTrees) {
  ChangeMap([](auto& map) { map.m_height = 2; });
  const Strings findings = Findings();
  ASSERT_EQ(findings.size(), 3u);
  EXPECT_EQ(findings[1], "root \"t\", root.0, " + Leaf(1) + "a VectorTombstonesMapInternalNode should stand here");
}

TEST_P(RawCheckTest, FindsANodeOfTwoMaps) {
  {
    WriteTransaction transaction(space());
    auto& map = transaction.Root<TombstonesMap>("t");
    auto& other = transaction.Root<TombstonesMap>("u");
    other.m_root = map.m_root;
    other.m_firstLeaf = map.m_firstLeaf;
    other.m_lastLeaf = map.m_lastLeaf;
    other.m_size = map.m_size;
    other.m_height = map.m_height;
    transaction.Commit();
  }
  EXPECT_EQ(Findings().size(), 4u);
}

TEST_P(RawCheckTest, FindsAMissingRecordAndGoesOn) {
  site.Tamper(m_leaves[1], std::nullopt);
  EXPECT_EQ(Findings(), Strings{"root \"t\", root.0, " + Leaf(1) + "there is no record of it"});
  EXPECT_EQ(Check().entries, 130u);
}

TEST_P(RawCheckTest, FindsADamagedRootValueAndADamagedMetaValue) {
  {
    WriteTransaction transaction(space());
    transaction.SetMeta("m", "value");
    transaction.Commit();
  }
  for (const auto& [table, name] : {std::pair(NamedTable::kRoots, "t"), std::pair(NamedTable::kMeta, "m")}) {
    const StoredState stored = Stored();
    const Bytes sealed = table == NamedTable::kRoots ? stored.roots.at(name) : stored.meta.at(name);
    Bytes damaged = sealed;
    damaged[2] ^= 1;
    site.TamperNamed(table, name, damaged);
    const Strings findings = Findings();
    ASSERT_EQ(findings.size(), 1u);
    EXPECT_NE(findings.front().find("a checksum that does not match"), std::string::npos) << findings.front();
    EXPECT_NE(findings.front().find(std::string("\"") + name + "\""), std::string::npos) << findings.front();
    site.TamperNamed(table, name, sealed);
  }
  EXPECT_EQ(Findings(), Strings());
}

TEST_P(RawCheckTest, GoesOnWhereTheTableOfClassesIsDamaged) {
  Bytes damaged = m_stored.info.at("class/1");
  damaged[5] ^= 1;
  site.TamperNamed(NamedTable::kInfo, "class/1", damaged);
  const RawCheckReport report = Check();
  ASSERT_FALSE(report.findings.empty());
  EXPECT_NE(report.findings.front().fault.find("class/1"), std::string::npos);
  EXPECT_EQ(report.records, m_stored.records.size());
}

TEST_P(RawCheckTest, FindsAnObjectThatIsInUseAndAwaitsDeletion) {
  CommitBatch batch;
  batch.queuedDeletions.push_back(m_leaves[1]);
  batch.expectedGeneration = site.engine().OpenSnapshot()->Generation();
  site.engine().Commit(batch);
  const RawCheckReport report = Check();
  ASSERT_EQ(report.findings.size(), 1u);
  EXPECT_EQ(report.findings.front().oid, m_leaves[1]);
  Snapshot snapshot(space());
  const VerifyReport other = VerifySpace(snapshot);
  ASSERT_EQ(other.findings.size(), 1u);
  EXPECT_EQ(other.findings.front().oid, m_leaves[1]);
  EXPECT_EQ(other.findings.front().fault, report.findings.front().fault);
  EXPECT_EQ(other.unreachable, report.unreachable);
}

}  // namespace
}  // namespace vemo::test
