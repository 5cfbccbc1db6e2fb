// Each kind of damage to a tree, and the one finding that it causes.
#include "store/map_check.h"

#include <gtest/gtest.h>

#include <set>

#include "store/transaction.h"
#include "tests/support/keys.h"
#include "tests/support/production_payloads.h"

namespace vemo::test {
namespace {

using Strings = std::vector<std::string>;
using Map = FieldIdToVectorTombstonesMap;
using Leaf = Map::LeafNode;
using Inner = Map::InternalNode;

// A map with the keys 1 .. `entries`, inserted in that order: leaves of 50 entries and a last one with the
// rest, and at most one level but the root's above them up to some 5,000 entries.
class TreeToDamage {
 public:
  explicit TreeToDamage(std::uint64_t entries) : m_space(CSpace::Open("memory:")), m_transaction(*m_space) {
    for (std::uint64_t n = 1; n <= entries; ++n)
      map().Insert(Key(n), PayloadNumber<VectorTombstones>::Make(n), false);
  }

  Map& map() { return m_transaction.Root<Map>("t"); }
  Inner& root() { return *static_cast<Inner*>(map().m_root.Get()); }
  // Child `i` of the root, -1 being the first.
  Inner& inner(ssize_t i) { return *static_cast<Inner*>(root().ChildReference(i).Get()); }
  // Leaf `i` of the chain.
  Leaf& leaf(int i) {
    Leaf* found = map().m_firstLeaf.Get();
    for (; i > 0; --i) found = found->m_next.Get();
    return *found;
  }

  Strings Findings() {
    Strings findings;
    for (const MapFinding& finding : MapCheck<Map>(map()).Run())
      findings.push_back(finding.where + ": " + finding.fault);
    return findings;
  }

 private:
  std::unique_ptr<CSpace> m_space;
  WriteTransaction m_transaction;
};

void SetKey(Leaf& leaf, ssize_t i, std::uint64_t n) {
  const_cast<FieldId&>(leaf.GetEntry(i).first) = Key(n);
}

void DropLastEntry(Leaf& leaf) {
  DestructLeafEntry(&leaf, --leaf.m_numKeyEntrys);
}

// Leaves 0, 1 and 2 with the keys 1 .. 50, 51 .. 100 and 101 .. 160.
class MapCheckTest : public ::testing::Test {
 protected:
  TreeToDamage m_tree{160};
};

TEST(MapCheckOfAnySizeTest, FindsNothingInSoundTrees) {
  for (const std::uint64_t entries : {0u, 1u, 100u, 101u, 160u, 6'000u}) {
    TreeToDamage tree(entries);
    EXPECT_EQ(tree.Findings(), Strings()) << entries << " entries";
  }
  TreeToDamage emptied(1);
  emptied.map().erase(Key(1));
  EXPECT_EQ(emptied.Findings(), Strings()) << "an empty root leaf";
}

TEST_F(MapCheckTest, VisitsEveryNode) {
  std::set<OID> reached;
  MapCheck<Map> check(m_tree.map(), {}, [&reached](OID oid, const std::string&) { reached.insert(oid); });
  check.Run();
  EXPECT_EQ(check.NumVisited(), 4u);
  EXPECT_EQ(reached.size(), 4u);
  EXPECT_TRUE(reached.contains(m_tree.map().m_root.m_oid));
}

TEST_F(MapCheckTest, FindsAWrongSize) {
  ++m_tree.map().m_size;
  EXPECT_EQ(m_tree.Findings(), Strings{"map: the size is 161, but there are 160 entries"});
}

TEST_F(MapCheckTest, FindsAWrongLeftNeighbour) {
  m_tree.leaf(1).m_prev.Clear();
  EXPECT_EQ(m_tree.Findings(), Strings{"leaf 1: its left neighbour is not the tree's"});
}

TEST_F(MapCheckTest, FindsAWrongRightNeighbour) {
  m_tree.leaf(0).m_next = &m_tree.leaf(2);
  EXPECT_EQ(m_tree.Findings(), Strings{"leaf 0: its right neighbour is not the tree's"});
}

TEST_F(MapCheckTest, FindsAChainThatGoesRound) {
  m_tree.leaf(2).m_next = &m_tree.leaf(0);
  EXPECT_EQ(m_tree.Findings(), Strings{"leaf 2: its right neighbour is not the tree's"});
}

TEST_F(MapCheckTest, FindsAWrongFirstLeaf) {
  m_tree.map().m_firstLeaf = &m_tree.leaf(1);
  EXPECT_EQ(m_tree.Findings(), Strings{"map: its first leaf is not the tree's"});
}

TEST_F(MapCheckTest, FindsAWrongLastLeaf) {
  m_tree.map().m_lastLeaf = &m_tree.leaf(1);
  EXPECT_EQ(m_tree.Findings(), Strings{"map: its last leaf is not the tree's"});
}

TEST_F(MapCheckTest, FindsAnUnderfullLeaf) {
  DropLastEntry(m_tree.leaf(0));
  --m_tree.map().m_size;
  EXPECT_EQ(m_tree.Findings(), Strings{"root.-1: it has 49 entries"});
}

TEST(MapCheckOfAnySizeTest, FindsAnUnderfullInternalNode) {
  TreeToDamage deep(6'000);
  Inner& left = deep.inner(-1);
  ASSERT_EQ(left.m_numKeyEntrys, 50);
  Leaf& dropped = *static_cast<Leaf*>(left.ChildReference(49).Get());
  dropped.m_prev.Get()->m_next = dropped.m_next.Get();
  dropped.m_next.Get()->m_prev = dropped.m_prev.Get();
  deep.map().m_size -= dropped.m_numKeyEntrys;
  DestructInternalEntry(&left, --left.m_numKeyEntrys);
  EXPECT_EQ(deep.Findings(), Strings{"root.-1: it has 49 entries"});
}

TEST_F(MapCheckTest, FindsAnInternalRootWithoutEntries) {
  m_tree.map().m_lastLeaf = &m_tree.leaf(0);
  m_tree.leaf(0).m_next.Clear();
  m_tree.map().m_size = 50;
  while (m_tree.root().m_numKeyEntrys > 0)
    DestructInternalEntry(&m_tree.root(), --m_tree.root().m_numKeyEntrys);
  EXPECT_EQ(m_tree.Findings(), Strings{"root: it has 0 entries"});
}

TEST_F(MapCheckTest, FindsKeysThatDoNotAscend) {
  SetKey(m_tree.leaf(1), 5, 55);
  EXPECT_EQ(m_tree.Findings(), Strings{"root.0: keys do not ascend at 55:"}) << "key 55 is there twice";
}

TEST_F(MapCheckTest, FindsSeparatorsThatDoNotAscend) {
  m_tree.root().GetEntry(1).m_key = Key(51);
  const Strings findings = m_tree.Findings();
  ASSERT_FALSE(findings.empty());
  EXPECT_EQ(findings.front(), "root.0: key 51: is above its range");
  EXPECT_NE(std::find(findings.begin(), findings.end(), "root: keys do not ascend at 51:"), findings.end());
}

TEST_F(MapCheckTest, FindsAKeyAboveItsRange) {
  SetKey(m_tree.leaf(0), 49, 51);
  EXPECT_EQ(m_tree.Findings(), Strings{"root.-1: key 51: is above its range"});
}

TEST_F(MapCheckTest, FindsAKeyBelowItsRange) {
  SetKey(m_tree.leaf(1), 0, 50);
  EXPECT_EQ(m_tree.Findings(), Strings{"root.0: key 50: is below its range"});
}

// Only a bound that was handed down can tell: the parent has no separator on that side.
TEST(MapCheckOfAnySizeTest, FindsAKeyOutsideTheRangeOfItsGrandparent) {
  TreeToDamage deep(6'000);
  const std::uint64_t separator = NumberOf(deep.root().GetEntry(0).m_key);
  Leaf& outermost = *static_cast<Leaf*>(deep.inner(-1).ChildReference(49).Get());
  SetKey(outermost, outermost.m_numKeyEntrys - 1, separator);
  deep.map().Validate();
  const std::string key = std::to_string(separator) + ":";
  EXPECT_EQ(deep.Findings(), Strings{"root.-1.49: key " + key + " is above its range"});
  Leaf& first = *static_cast<Leaf*>(deep.inner(0).ChildReference(-1).Get());
  SetKey(outermost, outermost.m_numKeyEntrys - 1, separator - 1);
  SetKey(first, 0, separator - 1);
  EXPECT_EQ(deep.Findings(),
            Strings{"root.0.-1: key " + std::to_string(separator - 1) + ": is below its range"});
}

TEST_F(MapCheckTest, FindsANodeThatHangsInTheTreeTwice) {
  m_tree.root().GetEntry(1).m_ptr = m_tree.root().GetEntry(0).m_ptr;
  EXPECT_EQ(m_tree.Findings(), Strings{"root.1: the node hangs in the tree twice"});
}

TEST_F(MapCheckTest, FindsACycle) {
  m_tree.root().GetEntry(1).m_ptr = m_tree.map().m_root;
  EXPECT_EQ(m_tree.Findings(), Strings{"root.1: the node hangs in the tree twice"});
}

TEST_F(MapCheckTest, FindsAMissingChild) {
  m_tree.root().GetEntry(1).m_ptr.Clear();
  EXPECT_EQ(m_tree.Findings(), Strings{"root.1: the reference is empty"});
}

TEST_F(MapCheckTest, FindsLeavesWhereInternalNodesBelong) {
  m_tree.map().m_height = 2;
  EXPECT_EQ(m_tree.Findings(), (Strings{"root.-1: a node of the wrong class at height 1",
                                        "root.0: a node of the wrong class at height 1",
                                        "root.1: a node of the wrong class at height 1"}));
}

TEST_F(MapCheckTest, FindsAnInternalNodeWhereALeafBelongs) {
  m_tree.map().m_height = 0;
  EXPECT_EQ(m_tree.Findings(), Strings{"root: a node of the wrong class at height 0"});
}

TEST_F(MapCheckTest, FindsEveryFault) {
  ++m_tree.map().m_size;
  m_tree.leaf(2).m_prev.Clear();
  SetKey(m_tree.leaf(0), 3, 90);
  m_tree.map().m_firstLeaf.Clear();
  EXPECT_EQ(m_tree.Findings(),
            (Strings{"root.-1: key 90: is above its range", "root.-1: keys do not ascend at 5:",
                     "map: its first leaf is not the tree's", "leaf 2: its left neighbour is not the tree's",
                     "map: the size is 161, but there are 160 entries"}));
}

TEST_F(MapCheckTest, FindsReferencesOfAMapWithoutNodes) {
  m_tree.map().m_height = -1;
  m_tree.map().m_size = 0;
  EXPECT_EQ(m_tree.Findings(), Strings{"map: a map without nodes has references"});
}

TEST(MapCheckOfAnySizeTest, FindsASizeOfAMapWithoutNodes) {
  TreeToDamage empty(0);
  empty.map().m_size = 3;
  EXPECT_EQ(empty.Findings(), Strings{"map: a map without nodes has a size"});
}

TEST(MapCheckOfAnySizeTest, FindsAHeightBelowThatOfAMapWithoutNodes) {
  TreeToDamage empty(0);
  empty.map().m_height = -2;
  EXPECT_EQ(empty.Findings(), Strings{"map: the height is below -1"});
}

}  // namespace
}  // namespace vemo::test
