// What salvage brings out of a damaged space, and what it says it has lost.
#include "store/salvage.h"

#include "store/scope.h"
#include "store/verify.h"
#include "tests/store/store_fixture.h"

namespace vemo::test {
namespace {

using Numbers = std::map<std::uint64_t, std::uint64_t>;

Numbers NumbersFrom(std::uint64_t first, std::uint64_t last) {
  Numbers numbers;
  for (std::uint64_t n = first; n <= last; ++n) numbers[n] = n;
  return numbers;
}

class SalvageTest : public StoreTest {
 protected:
  // "t": two levels of internal nodes, 160 leaves of 50 keys; "h": an internal root and leaves; "e": no nodes; an owned map.
  SalvageTest() {
    CommitFilled<TombstonesMap>(space(), "t", kKeys);
    CommitFilled<HistoriesMap>(space(), "h", 160);
    WriteTransaction transaction(space());
    transaction.Root<InsertionsMap>("e");
    auto& owned = transaction.Own<InsertionsMap>();
    Fill(owned, 1, 120);
    m_owned = owned.GetPersistObjState().m_oid;
    transaction.SetMeta("a", "1");
    transaction.SetMeta("b", "2");
    transaction.Commit();
    Snapshot snapshot(space());
    const auto& map = snapshot.Root<TombstonesMap>("t");
    m_map = map.GetPersistObjState().m_oid;
    m_root = map.m_root.m_oid;
    const auto& root = *static_cast<const TombstonesMap::InternalNode*>(map.m_root.Get());
    for (ssize_t i = -1; i < root.m_numKeyEntrys; ++i) m_inner.push_back(root.ChildReference(i).m_oid);
    for (const auto* leaf = map.m_firstLeaf.Get(); leaf != nullptr; leaf = leaf->m_next.Get())
      m_leaves.push_back(leaf->GetPersistObjState().m_oid);
    m_stored = Stored();
  }
  static constexpr std::uint64_t kKeys = 8'000;

  void Damage(OID oid) {
    Bytes record = m_stored.records.at(oid);
    record[record.size() / 2] ^= 0x20;
    site.Tamper(oid, record);
  }

  // What it says can still be read.
  void DamageChecksum(OID oid) {
    Bytes record = m_stored.records.at(oid);
    record.back() ^= 1;
    site.Tamper(oid, record);
  }
  static std::string NameOfLeaf(OID leaf) { return "salvaged/leaf " + std::to_string(leaf.m_value); }

  // The leaf with these keys, as the maps above are filled.
  static std::uint64_t FirstKeyOf(std::size_t leaf) { return 50 * leaf + 1; }

  // Salvages into a new space, which must be sound.
  void Rescue() {
    m_rescued = CSpace::Open("memory:");
    m_report = Salvage(*site.engine().OpenSnapshot(), *m_rescued, {.entriesPerCommit = 700});
    Snapshot snapshot(*m_rescued);
    const VerifyReport report = VerifySpace(snapshot);
    for (const Finding& finding : report.findings) ADD_FAILURE() << finding.fault;
    EXPECT_EQ(report.unreachable, 0u);
    EXPECT_EQ(report.entries, m_report.entries);
  }
  template <class Map>
  Numbers Rescued(const std::string& root) {
    Snapshot snapshot(*m_rescued);
    return NumbersOf(snapshot.Root<Map>(root));
  }
  void ExpectTheRestIsThere() {
    EXPECT_EQ(Rescued<HistoriesMap>("h"), NumbersFrom(1, 160));
    EXPECT_EQ(Rescued<InsertionsMap>("e"), Numbers());
    EXPECT_EQ(Snapshot(*m_rescued).Meta("a"), "1");
    WriteTransaction transaction(*m_rescued);
    EXPECT_EQ(NumbersOf(transaction.Owned<InsertionsMap>(m_owned)), NumbersFrom(1, 120));
  }
  // Whether a loss names the object, and a text that holds its range of keys if it has one.
  const SalvageLoss* LossOf(OID oid) {
    for (const SalvageLoss& loss : m_report.losses) {
      if (loss.oid == oid) return &loss;
    }
    ADD_FAILURE() << "object " << oid.m_value << " is not listed";
    return nullptr;
  }

  OID m_map, m_root, m_owned;
  std::vector<OID> m_inner, m_leaves;
  StoredState m_stored;
  std::unique_ptr<CSpace> m_rescued;
  SalvageReport m_report;
};
INSTANTIATE_STORE_TEST(SalvageTest);

TEST_P(SalvageTest, OfASoundSpaceIsACopyAndChangesNothingInTheSource) {
  ASSERT_EQ(m_leaves.size(), 159u);
  Rescue();
  EXPECT_TRUE(m_report.losses.empty()) << SalvageLossText(m_report.losses.front());
  EXPECT_EQ(m_report.maps.size(), 4u);
  EXPECT_EQ(m_report.entries, kKeys + 160 + 120);
  EXPECT_EQ(m_report.metaValues, 2u);
  EXPECT_EQ(m_report.leftLeaves, 0u);
  EXPECT_EQ(Rescued<TombstonesMap>("t"), NumbersFrom(1, kKeys));
  ExpectTheRestIsThere();
  EXPECT_EQ(Stored(), m_stored);
}

TEST_P(SalvageTest, ADestinationThatHoldsSomethingIsRefused) {
  const auto full = CSpace::Open("memory:");
  CommitFilled<TombstonesMap>(*full, "x", 1);
  EXPECT_THROW(Salvage(*site.engine().OpenSnapshot(), *full), UsageError);
  const auto meta = CSpace::Open("memory:");
  {
    WriteTransaction transaction(*meta);
    transaction.SetMeta("m", "");
    transaction.Commit();
  }
  EXPECT_THROW(Salvage(*site.engine().OpenSnapshot(), *meta), UsageError);
}

// An engine may put a changed record together for each read.
TEST_P(SalvageTest, OfLeavesThatChangedSinceBehindADamagedNodeBringsWhatTheyHoldNow) {
  Numbers expected = NumbersFrom(1, kKeys);
  {
    WriteTransaction transaction(space());
    auto& map = transaction.Root<TombstonesMap>("t");
    for (std::uint64_t n = 1; n <= kKeys; n += 10) {
      expected[n] = n + 5;
      map.Insert(Key(n), PayloadOf<TombstonesMap>(n + 5), true);
    }
    transaction.Commit();
  }
  m_stored = Stored();
  Damage(m_inner[1]);
  Damage(m_leaves[77]);  // below it: what is behind is reached from the right
  Rescue();
  for (std::uint64_t n = FirstKeyOf(77); n < FirstKeyOf(78); ++n) expected.erase(n);
  EXPECT_EQ(Rescued<TombstonesMap>("t"), expected);
  ExpectTheRestIsThere();
}

TEST_P(SalvageTest, OfADamagedLeafLosesItsEntriesAloneAndNamesTheirRange) {
  for (const std::size_t i : {std::size_t{0}, std::size_t{77}, m_leaves.size() - 1}) {
    Damage(m_leaves[i]);
    Rescue();
    Numbers expected = NumbersFrom(1, kKeys);
    const bool isLast = i + 1 == m_leaves.size();
    const std::uint64_t behind = isLast ? kKeys + 1 : FirstKeyOf(i + 1);
    for (std::uint64_t n = FirstKeyOf(i); n < behind; ++n) expected.erase(n);
    EXPECT_EQ(Rescued<TombstonesMap>("t"), expected);
    ExpectTheRestIsThere();
    ASSERT_EQ(m_report.losses.size(), 1u);
    const SalvageLoss& loss = *LossOf(m_leaves[i]);
    EXPECT_EQ(loss.root, "t");
    EXPECT_EQ(loss.low ? FieldIdText(*loss.low) : "", i > 0 ? FieldIdText(Key(FirstKeyOf(i))) : "");
    EXPECT_EQ(loss.high ? FieldIdText(*loss.high) : "", isLast ? "" : FieldIdText(Key(behind)));
    site.Tamper(m_leaves[i], m_stored.records.at(m_leaves[i]));
  }
}

TEST_P(SalvageTest, LosesNothingBelowAnInternalNodeThatIsDamagedOrMissing) {
  std::vector<OID> nodes = m_inner;
  nodes.push_back(m_root);
  ASSERT_GE(m_inner.size(), 3u);
  for (const OID oid : nodes) {
    site.Tamper(oid, std::nullopt);
    Rescue();
    EXPECT_EQ(Rescued<TombstonesMap>("t"), NumbersFrom(1, kKeys)) << oid.m_value;
    ExpectTheRestIsThere();
    ASSERT_EQ(m_report.losses.size(), 1u);
    LossOf(oid);
    site.Tamper(oid, m_stored.records.at(oid));
  }
}

TEST_P(SalvageTest, StepsOverLostLeavesBelowALostNode) {
  for (const OID oid : {m_inner[1], m_leaves[60], m_leaves[70]}) Damage(oid);
  Rescue();
  Numbers expected = NumbersFrom(1, kKeys);
  for (const std::size_t i : {60u, 70u}) {
    for (std::uint64_t n = FirstKeyOf(i); n < FirstKeyOf(i + 1); ++n) expected.erase(n);
    LossOf(m_leaves[i]);
  }
  EXPECT_EQ(Rescued<TombstonesMap>("t"), expected);
  EXPECT_EQ(m_report.losses.size(), 3u);
}

TEST_P(SalvageTest, ReachesLeavesBelowALostNodeFromTheRightWhereTheChainIsBrokenTwice) {
  for (const OID oid : {m_inner[1], m_leaves[60], m_leaves[61]}) Damage(oid);
  Rescue();
  Numbers expected = NumbersFrom(1, kKeys);
  for (std::uint64_t n = FirstKeyOf(60); n < FirstKeyOf(62); ++n) expected.erase(n);
  EXPECT_EQ(Rescued<TombstonesMap>("t"), expected);
}

TEST_P(SalvageTest, FindsLeavesBetweenTwoBreaksThatNothingLeadsTo) {
  for (const OID oid : {m_root, m_leaves[60], m_leaves[61], m_leaves[80], m_leaves[81]}) Damage(oid);
  Rescue();
  Numbers expected = NumbersFrom(1, kKeys);
  for (std::uint64_t n = FirstKeyOf(60); n < FirstKeyOf(62); ++n) expected.erase(n);
  for (std::uint64_t n = FirstKeyOf(80); n < FirstKeyOf(82); ++n) expected.erase(n);
  EXPECT_EQ(Rescued<TombstonesMap>("t"), expected);
  for (const std::size_t i : {60u, 61u, 80u, 81u}) LossOf(m_leaves[i]);
  EXPECT_EQ(m_report.leftLeaves, 0u);
}

TEST_P(SalvageTest, PutsAMapTogetherWhoseOwnRecordIsDamaged) {
  for (const bool withRoot : {false, true}) {
    DamageChecksum(m_map);
    if (withRoot) Damage(m_root);
    Rescue();
    EXPECT_EQ(Rescued<TombstonesMap>("t"), NumbersFrom(1, kKeys));
    ExpectTheRestIsThere();
    LossOf(m_map);
    EXPECT_EQ(m_report.maps.size(), 4u);
  }
}

TEST_P(SalvageTest, WhatIsLeftOfAMapsRecordGivesItsLeavesOrNone) {
  const Bytes record = m_stored.records.at(m_map);
  std::size_t found = 0;
  for (std::size_t bit = 0; bit < 8 * record.size(); bit += 3) {
    Bytes damaged = record;
    damaged[bit / 8] ^= static_cast<std::uint8_t>(1u << bit % 8);
    site.Tamper(m_map, damaged);
    Rescue();
    const Numbers numbers = Rescued<TombstonesMap>("t");
    if (numbers.empty()) {
      EXPECT_EQ(Rescued<TombstonesMap>(NameOfLeaf(m_leaves[0])), NumbersFrom(1, kKeys)) << "bit " << bit;
      LossOf(m_leaves[0]);
    } else {
      EXPECT_EQ(numbers, NumbersFrom(1, kKeys)) << "bit " << bit;
      ++found;
    }
  }
  EXPECT_GT(found, record.size());
}

TEST_P(SalvageTest, PutsADamagedMapTogetherWhoseChainIsBroken) {
  DamageChecksum(m_map);
  for (const OID oid : {m_leaves[60], m_leaves[80]}) Damage(oid);
  Rescue();
  Numbers expected = NumbersFrom(1, kKeys);
  for (const std::size_t i : {60u, 80u}) {
    for (std::uint64_t n = FirstKeyOf(i); n < FirstKeyOf(i + 1); ++n) expected.erase(n);
  }
  EXPECT_EQ(Rescued<TombstonesMap>("t"), expected);
}

TEST_P(SalvageTest, AMapsRecordInThePlaceOfAnotherTellsNothing) {
  CommitFilled<TombstonesMap>(space(), "u", 130);
  const auto [map, leaf] = InSnapshot(space(), [](Snapshot& snapshot) {
    const auto& u = snapshot.Root<TombstonesMap>("u");
    return std::pair(u.GetPersistObjState().m_oid, u.m_firstLeaf.m_oid);
  });
  m_stored = Stored();
  site.Tamper(map, m_stored.records.at(m_map));
  site.Tamper(m_map, m_stored.records.at(map));
  Rescue();
  EXPECT_EQ(Rescued<TombstonesMap>("t"), Numbers());
  EXPECT_EQ(Rescued<TombstonesMap>("u"), Numbers());
  EXPECT_EQ(Rescued<TombstonesMap>(NameOfLeaf(m_leaves[0])), NumbersFrom(1, kKeys));
  EXPECT_EQ(Rescued<TombstonesMap>(NameOfLeaf(leaf)), NumbersFrom(1, 130));
}

TEST_P(SalvageTest, TheLeavesOfAMapWhoseRecordIsGoneGetANameOfTheirOwn) {
  site.Tamper(m_map, std::nullopt);
  Rescue();
  EXPECT_EQ(Rescued<TombstonesMap>("t"), Numbers());
  EXPECT_EQ(Rescued<TombstonesMap>(NameOfLeaf(m_leaves[0])), NumbersFrom(1, kKeys));
  ExpectTheRestIsThere();
  LossOf(m_map);
  LossOf(m_leaves[0]);
}

TEST_P(SalvageTest, PutsALostOwnedMapTogetherUnderItsId) {
  DamageChecksum(m_owned);
  Rescue();
  WriteTransaction transaction(*m_rescued);
  EXPECT_EQ(NumbersOf(transaction.Owned<InsertionsMap>(m_owned)), NumbersFrom(1, 120));
}

TEST_P(SalvageTest, TakesTheNewerTreeWhereALostMapHadBeenReplaced) {
  {
    WriteTransaction transaction(space());
    TombstonesMap fresh;
    Fill(fresh, 1, 300, 1'000);
    transaction.Root<TombstonesMap>("t") = fresh;
    transaction.Commit();
  }
  Rescue();
  EXPECT_EQ(m_report.leftLeaves, m_leaves.size()) << "what was replaced is left behind";
  EXPECT_TRUE(m_report.losses.empty());
  m_stored = Stored();
  DamageChecksum(m_map);
  Rescue();
  Numbers expected;
  for (std::uint64_t n = 1; n <= 300; ++n) expected[n] = n + 1'000;
  EXPECT_EQ(Rescued<TombstonesMap>("t"), expected);
  EXPECT_EQ(Rescued<TombstonesMap>(NameOfLeaf(m_leaves[0])), NumbersFrom(1, kKeys))
      << "the older tree is not thrown away: nothing tells for certain whose it was";
}

TEST_P(SalvageTest, TakesNoPartOfAnOlderTreeWhereADamagedMapHadBeenReplacedByOneOfOtherKeys) {
  {
    WriteTransaction transaction(space());
    TombstonesMap fresh;
    Fill(fresh, kKeys + 1, kKeys + 300);
    transaction.Root<TombstonesMap>("t") = fresh;
    transaction.Commit();
  }
  m_stored = Stored();
  DamageChecksum(m_map);
  for (const bool isBroken : {false, true}) {
    if (isBroken) Damage(m_leaves[80]);
    Rescue();
    EXPECT_EQ(Rescued<TombstonesMap>("t"), NumbersFrom(kKeys + 1, kKeys + 300));
  }
}

TEST_P(SalvageTest, KeepsTheLeavesOfSeveralLostMapsApart) {
  CommitFilled<TombstonesMap>(space(), "u", 130);
  const auto [map, leaf] = InSnapshot(space(), [](Snapshot& snapshot) {
    const auto& u = snapshot.Root<TombstonesMap>("u");
    return std::pair(u.GetPersistObjState().m_oid, u.m_firstLeaf.m_oid);
  });
  m_stored = Stored();
  DamageChecksum(map);
  DamageChecksum(m_map);
  Rescue();
  EXPECT_EQ(Rescued<TombstonesMap>("t"), NumbersFrom(1, kKeys));
  EXPECT_EQ(Rescued<TombstonesMap>("u"), NumbersFrom(1, 130));
  site.Tamper(map, std::nullopt);
  site.Tamper(m_map, std::nullopt);
  Rescue();
  EXPECT_EQ(Rescued<TombstonesMap>("t"), Numbers());
  EXPECT_EQ(Rescued<TombstonesMap>(NameOfLeaf(m_leaves[0])), NumbersFrom(1, kKeys));
  EXPECT_EQ(Rescued<TombstonesMap>(NameOfLeaf(leaf)), NumbersFrom(1, 130));
  LossOf(map);
  LossOf(m_map);
}

TEST_P(SalvageTest, FindsTheMapOfARootWhoseValueIsDamaged) {
  for (std::size_t i = 0; i < m_stored.roots.at("t").size(); ++i) {
    Bytes damaged = m_stored.roots.at("t");
    damaged[i] ^= 0x11;
    site.TamperNamed(NamedTable::kRoots, "t", damaged);
    Rescue();
    EXPECT_EQ(Rescued<TombstonesMap>("t").size(), kKeys) << "byte " << i;
    ASSERT_EQ(m_report.losses.size(), 1u);
    EXPECT_EQ(m_report.losses.front().root, "t");
  }
  ExpectTheRestIsThere();
}

TEST_P(SalvageTest, GivesAMapWithoutANameANewOne) {
  site.TamperNamed(NamedTable::kRoots, "t", std::nullopt);
  Rescue();
  EXPECT_EQ(Rescued<TombstonesMap>("salvaged/map " + std::to_string(m_map.m_value)), NumbersFrom(1, kKeys));
  LossOf(m_map);
}

TEST_P(SalvageTest, CopiesWhatItCanWhereTheTableOfClassesOrTheFormatIsLost) {
  for (const auto& [name, sealed] : m_stored.info) {
    Bytes damaged = sealed;
    damaged[1] ^= 0x08;
    for (const bool isThere : {true, false}) {
      site.TamperNamed(NamedTable::kInfo, name, isThere ? std::optional(damaged) : std::nullopt);
      Rescue();
      EXPECT_EQ(Rescued<TombstonesMap>("t"), NumbersFrom(1, kKeys)) << name;
      ExpectTheRestIsThere();
    }
    site.TamperNamed(NamedTable::kInfo, name, sealed);
  }
}

TEST_P(SalvageTest, NamesMetaValuesThatAreLost) {
  Bytes damaged = m_stored.meta.at("b");
  damaged.back() ^= 1;
  site.TamperNamed(NamedTable::kMeta, "b", damaged);
  Rescue();
  EXPECT_EQ(m_report.metaValues, 1u);
  ASSERT_EQ(m_report.losses.size(), 1u);
  EXPECT_NE(SalvageLossText(m_report.losses.front()).find("\"b\""), std::string::npos);
  EXPECT_FALSE(Snapshot(*m_rescued).Meta("b"));
}

TEST_P(SalvageTest, WhatAwaitsDeletionIsNotBroughtBack) {
  site.Reopen();
  {
    WriteTransaction transaction(space());
    transaction.Root<TombstonesMap>("t").clear();
    transaction.Commit();
  }
  ASSERT_FALSE(Stored().queue.empty());
  site.Tamper(m_map, std::nullopt);
  Rescue();
  EXPECT_EQ(Rescued<TombstonesMap>("t"), Numbers());
  EXPECT_EQ(m_report.maps.size(), 4u);
}

class SalvageOfQueueTest : public SalvageTest {
 protected:
  // "t" is cleared, and its tree is queued where it hung from the root node.
  SalvageOfQueueTest() {
    site.Reopen();
    {
      WriteTransaction transaction(space());
      transaction.Root<TombstonesMap>("t").clear();
      transaction.Commit();
    }
    m_stored = Stored();
  }
  bool IsQueued(OID oid) const { return std::find(m_stored.queue.begin(), m_stored.queue.end(), oid) != m_stored.queue.end(); }
};
INSTANTIATE_STORE_TEST(SalvageOfQueueTest);

TEST_P(SalvageOfQueueTest, LeavesBelowAQueuedNodeThatIsDamagedAreKnownByTheirNeighbours) {
  site.Tamper(m_map, std::nullopt);
  std::size_t tried = 0;
  for (const OID oid : m_inner) {
    if (!IsQueued(oid)) continue;
    Damage(oid);
    Rescue();
    EXPECT_EQ(Rescued<TombstonesMap>("t"), Numbers());
    EXPECT_EQ(m_report.maps.size(), 4u);
    LossOf(oid);
    site.Tamper(oid, m_stored.records.at(oid));
    ++tried;
  }
  EXPECT_GE(tried, 2u);
}

TEST_P(SalvageOfQueueTest, LeavesThatMayHaveBeenDeletedGetNoMapsName) {
  site.Tamper(m_map, std::nullopt);
  for (const OID oid : m_stored.queue) Damage(oid);
  Rescue();
  EXPECT_EQ(Rescued<TombstonesMap>("t"), Numbers());
  ExpectTheRestIsThere();
  const auto isLeft = [this](OID leaf) { return m_stored.records.contains(leaf) && !IsQueued(leaf); };
  const auto head = std::find_if(m_leaves.begin(), m_leaves.end(), isLeft);
  ASSERT_NE(head, m_leaves.end());
  const SalvageLoss* loss = LossOf(*head);
  ASSERT_NE(loss, nullptr);
  EXPECT_NE(loss->what.find("replaced or deleted"), std::string::npos) << loss->what;
  EXPECT_FALSE(Rescued<TombstonesMap>(NameOfLeaf(*head)).empty());
}

TEST_P(SalvageOfQueueTest, LeavesThatMayHaveBeenDeletedFillNoHoleOfAnotherMap) {
  CommitFilled<TombstonesMap>(space(), "u", 600);
  std::vector<OID> leaves;
  OID root;
  {
    Snapshot snapshot(space());
    const auto& map = snapshot.Root<TombstonesMap>("u");
    root = map.m_root.m_oid;
    for (const auto* leaf = map.m_firstLeaf.Get(); leaf != nullptr; leaf = leaf->m_next.Get())
      leaves.push_back(leaf->GetPersistObjState().m_oid);
  }
  m_stored = Stored();
  ASSERT_FALSE(m_stored.queue.empty());
  for (const OID oid : {root, leaves[2], leaves[3], leaves[6], leaves[7]}) Damage(oid);
  Numbers expected = NumbersFrom(1, FirstKeyOf(2) - 1);
  expected.merge(NumbersFrom(FirstKeyOf(4), FirstKeyOf(6) - 1));
  expected.merge(NumbersFrom(FirstKeyOf(8), 600));
  Rescue();
  EXPECT_EQ(Rescued<TombstonesMap>("u"), expected);

  for (const OID oid : m_stored.queue) Damage(oid);
  Rescue();
  for (std::uint64_t n = FirstKeyOf(4); n < FirstKeyOf(6); ++n) expected.erase(n);
  EXPECT_EQ(Rescued<TombstonesMap>("u"), expected);
  EXPECT_EQ(Rescued<TombstonesMap>(NameOfLeaf(leaves[4])),
            NumbersFrom(FirstKeyOf(4), FirstKeyOf(6) - 1));
}

}  // namespace
}  // namespace vemo::test
