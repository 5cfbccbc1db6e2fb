// Stored bytes that are not what was written.
#include <tuple>

#include "store/envelope.h"
#include "store/raw_check.h"
#include "store/verify.h"
#include "tests/store/store_fixture.h"

namespace vemo::test {
namespace {

class DamageTest : public StoreTest {
 protected:
  // A tree of a root and three leaves, a map of another class with one leaf, and one that stays sound.
  DamageTest() {
    CommitFilled<TombstonesMap>(space(), "t", 160);
    CommitFilled<HistoriesMap>(space(), "h", 20);
    CommitFilled<InsertionsMap>(space(), "sound", 20);
    m_stored = Stored();
    Snapshot snapshot(space());
    const auto& sound = snapshot.Root<InsertionsMap>("sound");
    m_soundIds = NodeIds(sound);
    m_soundIds.insert(sound.GetPersistObjState().m_oid);
    m_soundText = ToText(sound);
  }

  // What reading everything but the sound map meets.
  void ReadAll() {
    Snapshot snapshot(space());
    ToText(snapshot.Root<TombstonesMap>("t"));
    ToText(snapshot.Root<HistoriesMap>("h"));
  }

  void ExpectCorrupt(OID oid, const std::string& what) {
    try {
      ReadAll();
      ADD_FAILURE() << what << ": it was read as if nothing were wrong";
    } catch (const CorruptRecord& corrupt) {
      EXPECT_EQ(corrupt.oid(), oid) << what;
      const std::string message = corrupt.what();
      EXPECT_NE(message.find("object " + std::to_string(oid.m_value)), std::string::npos) << message;
      EXPECT_NE(message.find(site.engine().Name()), std::string::npos) << message;
    }
    Snapshot snapshot(space());
    EXPECT_EQ(ToText(snapshot.Root<InsertionsMap>("sound")), m_soundText) << what;
  }

  OID RootNodeOf(const std::string& root) {
    Snapshot snapshot(space());
    return snapshot.Root<TombstonesMap>(root).m_root.m_oid;
  }
  OID MapOf(const std::string& root) {
    Snapshot snapshot(space());
    return PersistStateOf(snapshot.RootMap(root)).m_oid;
  }
  OID FirstLeafOf(const std::string& root) {
    Snapshot snapshot(space());
    return snapshot.Root<TombstonesMap>(root).m_firstLeaf.m_oid;
  }

  StoredState m_stored;
  std::unordered_set<OID> m_soundIds;
  std::string m_soundText;
};
INSTANTIATE_STORE_TEST(DamageTest);

TEST_P(DamageTest, AFlippedByteAnywhereInARecordIsFoundAndTheRestReadable) {
  std::size_t flips = 0;
  for (const auto& [oid, record] : m_stored.records) {
    if (m_soundIds.contains(oid)) continue;
    for (std::size_t i = 0; i < record.size(); ++i, ++flips) {
      Bytes damaged = record;
      damaged[i] ^= static_cast<std::uint8_t>(1u << (flips % 8));
      site.Tamper(oid, damaged);
      ExpectCorrupt(oid, "object " + std::to_string(oid.m_value) + ", byte " + std::to_string(i));
    }
    site.Tamper(oid, record);
  }
  EXPECT_GT(flips, 1000u);
  EXPECT_NO_THROW(ReadAll());
}

TEST_P(DamageTest, ARecordThatIsCutOrLongerAnywhereIsFound) {
  for (const auto& [oid, record] : m_stored.records) {
    if (m_soundIds.contains(oid)) continue;
    for (std::size_t length = 0; length < record.size() + 2; length += length < 24 ? 1 : 17) {
      if (length == record.size()) continue;
      Bytes damaged = record;
      damaged.resize(length);
      site.Tamper(oid, damaged);
      ExpectCorrupt(oid, "object " + std::to_string(oid.m_value) + ", " + std::to_string(length) + " bytes");
    }
    site.Tamper(oid, record);
  }
  EXPECT_NO_THROW(ReadAll());
}

TEST_P(DamageTest, ADamagedRecordIsFoundByATransactionToo) {
  const OID leaf = FirstLeafOf("t");
  Bytes damaged = m_stored.records.at(leaf);
  damaged[damaged.size() / 2] ^= 0x10;
  site.Reopen();
  site.Tamper(leaf, damaged);
  {
    WriteTransaction transaction(space());
    auto& map = transaction.Root<TombstonesMap>("t");
    EXPECT_THROW(map.rFind(Key(1)), CorruptRecord);
    EXPECT_FALSE(transaction.IsPoisoned());
    EXPECT_NE(map.rFind(Key(160)), nullptr);
    map.Insert(Key(160), {}, true);
    transaction.Commit();
  }
  WriteTransaction transaction(space());
  EXPECT_THROW(transaction.Root<TombstonesMap>("t").Delete(Key(1)), CorruptRecord);
  EXPECT_THROW(transaction.Commit(), PoisonedTransaction);
}

TEST_P(DamageTest, RecordsThatWereSwappedAreFound) {
  const OID a = RootNodeOf("t");
  const OID b = FirstLeafOf("t");
  site.Tamper(a, m_stored.records.at(b));
  ExpectCorrupt(a, "the leaf's record under the root's id");
  site.Tamper(a, m_stored.records.at(a));
  site.Tamper(b, m_stored.records.at(a));
  ExpectCorrupt(b, "the root's record under the leaf's id");
}

TEST_P(DamageTest, ARecordOfAnOlderCommitUnderItsOwnIdIsSoundByItself) {
  {
    WriteTransaction transaction(space());
    transaction.Root<TombstonesMap>("t").Insert(Key(1), PayloadOf<TombstonesMap>(99), true);
    transaction.Commit();
  }
  const OID leaf = FirstLeafOf("t");
  site.Tamper(leaf, m_stored.records.at(leaf));
  EXPECT_NO_THROW(ReadAll());
}

TEST_P(DamageTest, AMissingRecordIsADanglingReference) {
  for (const OID oid : {RootNodeOf("t"), FirstLeafOf("t"), MapOf("t")}) {
    site.Tamper(oid, std::nullopt);
    try {
      ReadAll();
      ADD_FAILURE() << oid.m_value;
    } catch (const DanglingReference& dangling) {
      EXPECT_EQ(dangling.oid(), oid);
      EXPECT_NE(std::string(dangling.what()).find("object " + std::to_string(oid.m_value)),
                std::string::npos);
    }
    site.Tamper(oid, m_stored.records.at(oid));
  }
  EXPECT_NO_THROW(ReadAll());
}

TEST_P(DamageTest, ADamagedRootNamesTheRoot) {
  const Bytes sealed = m_stored.roots.at("t");
  for (std::size_t i = 0; i < sealed.size(); ++i) {
    Bytes damaged = sealed;
    damaged[i] ^= 0x04;
    site.TamperNamed(NamedTable::kRoots, "t", damaged);
    Snapshot snapshot(space());
    const std::string message = MessageOf<CorruptRecord>([&] { snapshot.Root<TombstonesMap>("t"); });
    EXPECT_NE(message.find("root \"t\""), std::string::npos) << message;
    EXPECT_EQ(snapshot.Root<HistoriesMap>("h").size(), 20);
  }
  site.TamperNamed(NamedTable::kRoots, "t", m_stored.roots.at("h"));  // sealed under another name
  Snapshot snapshot(space());
  EXPECT_THROW(snapshot.Root<TombstonesMap>("t"), CorruptRecord);
}

TEST_P(DamageTest, ADamagedRootCannotBeTakenForAMissingOne) {
  Bytes damaged = m_stored.roots.at("t");
  damaged[3] ^= 1;
  site.TamperNamed(NamedTable::kRoots, "t", damaged);
  site.Reopen();
  WriteTransaction transaction(space());
  EXPECT_THROW(transaction.Root<TombstonesMap>("t"), CorruptRecord);
  EXPECT_EQ(transaction.Root<HistoriesMap>("h").size(), 20);
}

TEST_P(DamageTest, ADamagedClassTableStopsAllReadingAndWriting) {
  Bytes damaged = m_stored.info.at("class/2");
  damaged[4] ^= 1;
  site.TamperNamed(NamedTable::kInfo, "class/2", damaged);
  const StoredState stored = Stored();
  for (int attempt = 0; attempt < 3; ++attempt) {  // a second attempt must not go on with half of the table
    EXPECT_NE(MessageOf<CorruptRecord>([&] { Snapshot snapshot(space()); }).find("class/2"),
              std::string::npos);
    EXPECT_THROW(WriteTransaction transaction(space()), CorruptRecord);
  }
  EXPECT_EQ(Stored(), stored);
  site.TamperNamed(NamedTable::kInfo, "class/2", m_stored.info.at("class/2"));
  WriteTransaction transaction(space());
  EXPECT_EQ(FaultsOf(transaction.Root<TombstonesMap>("t")), "");
  transaction.Root<TombstonesMap>("t").Delete(Key(1));
  transaction.Commit();
  EXPECT_NO_THROW(ReadAll());
}

TEST_P(DamageTest, NamesOfTheClassTableThatAreNoNumbersAreRefused) {
  const Bytes value{'x'};
  for (const std::string name :
       {"class/", "class/0", "class/x", "class/-1", "class/1x", "class/99999999999999999999"}) {
    site.TamperNamed(NamedTable::kInfo, name, SealNamed(NamedTable::kInfo, name, value));
    EXPECT_THROW(Snapshot snapshot(space()), CorruptRecord) << name;
    site.TamperNamed(NamedTable::kInfo, name, std::nullopt);
  }
  EXPECT_NO_THROW(ReadAll());
}

TEST_P(DamageTest, VerifyNamesEveryFaultAndGoesOn) {
  const std::vector<OID> ids{FirstLeafOf("t"), MapOf("h")};
  for (const OID oid : ids) {
    Bytes damaged = m_stored.records.at(oid);
    damaged.back() ^= 1;
    site.Tamper(oid, damaged);
  }
  Snapshot snapshot(space());
  const VerifyReport report = VerifySpace(snapshot);
  std::unordered_set<OID> found;
  for (const Finding& finding : report.findings) found.insert(finding.oid);
  for (const OID oid : ids) EXPECT_TRUE(found.contains(oid)) << oid.m_value;
  EXPECT_EQ(report.records, m_stored.records.size());
  EXPECT_GE(report.entries, 20u);
}

// Damage behind which nothing of the record can be read, its class neither.
TEST_P(DamageTest, VerifyNamesPlaceAndClassOfWhatCannotBeRead) {
  const std::string map = "vemo::FieldIdToVectorTombstonesMap";
  const std::vector<std::tuple<OID, std::string, std::string>> objects{
      {MapOf("t"), "map", map}, {RootNodeOf("t"), "root", map + "InternalNode"}, {FirstLeafOf("t"), "root.-1", map + "LeafNode"}};
  for (const auto& [oid, path, className] : objects) {
    const Bytes record = m_stored.records.at(oid);
    for (const std::optional<Bytes>& damaged :
         {std::optional<Bytes>(), std::optional(Bytes()), std::optional(Bytes(record.size())), std::optional(Bytes(record.size(), 0xff))}) {
      site.Tamper(oid, damaged);
      Snapshot snapshot(space());
      const VerifyReport report = VerifySpace(snapshot);
      EXPECT_EQ(report.space, site.engine().Name());
      ASSERT_EQ(report.findings.size(), 1u);
      const Finding& finding = report.findings.front();
      const RawFinding raw = CheckRawSpace(*site.engine().OpenSnapshot()).findings.front();
      EXPECT_EQ(finding.root, "t");
      EXPECT_EQ(finding.path, path);
      EXPECT_EQ(finding.oid, oid);
      EXPECT_EQ(finding.className, className);
      EXPECT_EQ(std::tie(raw.root, raw.path, raw.oid, raw.className),
                std::tie(finding.root, finding.path, finding.oid, finding.className));
      EXPECT_EQ(FindingText(finding), "root \"t\", " + path + ", object " + std::to_string(oid.m_value) + " (" + className +
                                          "): " + finding.fault);
      EXPECT_EQ(finding.fault.find("object"), std::string::npos) << "said twice: " << finding.fault;
    }
    site.Tamper(oid, record);
  }
}

TEST_P(DamageTest, VerifyNamesTheClassThatTheHeadOfADamagedRecordTells) {
  const OID leaf = FirstLeafOf("t");
  site.TamperNamed(NamedTable::kRoots, "t", std::nullopt);
  for (const bool hasHead : {true, false}) {
    Bytes damaged = m_stored.records.at(leaf);
    damaged.back() ^= 1;
    if (!hasHead) damaged[1] = 0x7f;
    site.Tamper(leaf, damaged);
    Snapshot snapshot(space());
    const VerifyReport report = VerifySpace(snapshot);
    const RawCheckReport raw = CheckRawSpace(*site.engine().OpenSnapshot());
    ASSERT_EQ(report.findings.size(), 1u);
    ASSERT_EQ(raw.findings.size(), 1u);
    EXPECT_EQ(report.findings.front().oid, leaf);
    EXPECT_EQ(report.findings.front().className, hasHead ? "vemo::FieldIdToVectorTombstonesMapLeafNode" : "");
    EXPECT_EQ(raw.findings.front().className, report.findings.front().className);
  }
}

TEST_P(DamageTest, ExceptionsNameTheClassThatWasAskedFor) {
  const OID leaf = FirstLeafOf("t");
  site.Tamper(leaf, Bytes(20));
  Snapshot snapshot(space());
  try {
    ToText(snapshot.Root<TombstonesMap>("t"));
    ADD_FAILURE() << "it was read";
  } catch (const CorruptRecord& corrupt) {
    EXPECT_EQ(corrupt.place().className, "vemo::FieldIdToVectorTombstonesMapLeafNode");
  }
}

TEST_P(DamageTest, VerifyFindsNothingInASoundSpace) {
  Snapshot snapshot(space());
  std::uint64_t lastDone = 0;
  const VerifyReport report = VerifySpace(snapshot, [&](std::uint64_t done, std::uint64_t of) {
    EXPECT_EQ(done, lastDone + 1);
    EXPECT_EQ(of, m_stored.records.size());
    lastDone = done;
  });
  EXPECT_TRUE(report.findings.empty()) << report.findings.front().fault;
  EXPECT_EQ(report.maps, 3u);
  EXPECT_EQ(report.entries, 200u);
  EXPECT_EQ(report.unreachable, 0u);
  EXPECT_EQ(report.records, report.nodes + report.maps);
}

}  // namespace
}  // namespace vemo::test
