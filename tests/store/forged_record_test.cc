// Records whose checksums are right and whose contents are not.
#include "platform/variable_length.h"
#include "store/envelope.h"
#include "store/root_value.h"
#include "store/scan.h"
#include "tests/store/store_fixture.h"

namespace vemo::test {
namespace {

// Bytes of a body, value by value.
class Body {
 public:
  Body& Uint(std::uint64_t value) {
    std::uint8_t bytes[kMaxVariableLengthUint64Bytes];
    m_bytes.insert(m_bytes.end(), bytes, SerialiseVariableLengthUint64(bytes, value));
    return *this;
  }
  // A key of the object `n` with an empty path.
  Body& KeyOf(std::uint64_t n) {
    const Bytes key = ToBytes(Key(n));
    m_bytes.insert(m_bytes.end(), key.begin(), key.end());
    return *this;
  }
  Body& PayloadWithout() { return Uint(0); }  // a tombstones payload of no run
  const Bytes& bytes() const { return m_bytes; }

 private:
  Bytes m_bytes;
};

constexpr const char* kLeafClass = "vemo::FieldIdToVectorTombstonesMapLeafNode";
constexpr const char* kInternalClass = "vemo::FieldIdToVectorTombstonesMapInternalNode";
constexpr const char* kMapClass = "vemo::FieldIdToVectorTombstonesMap";

class ForgedRecordTest : public StoreTest {
 protected:
  ForgedRecordTest() {
    CommitFilled<TombstonesMap>(space(), "t", 160);
    CommitFilled<InsertionsMap>(space(), "i", 160);
    Snapshot snapshot(space());
    const auto& map = snapshot.Root<TombstonesMap>("t");
    m_map = map.GetPersistObjState().m_oid;
    m_root = map.m_root.m_oid;
    m_first = map.m_firstLeaf.m_oid;
    m_last = map.m_lastLeaf.m_oid;
    m_stored = Stored();
    m_schema = BodyOf(m_first).front();
  }

  Bytes BodyOf(OID oid) {
    const ByteView body = OpenRecord(m_stored.records.at(oid), oid).body;
    return {body.begin(), body.end()};
  }

  void Forge(OID oid, std::uint32_t classNumber, const Bytes& body) {
    Bytes record;
    BeginRecord(record, classNumber, 1);
    record.insert(record.end(), body.begin(), body.end());
    SealRecord(record, 0, oid);
    site.Tamper(oid, record);
  }
  void Forge(OID oid, const std::string& className, const Bytes& body) {
    Forge(oid, site.ClassNumber(className), body);
  }

  // The message on reading map "t", whether or not what is read is kept; another root stays readable. The record is put back.
  std::string MessageFor(OID oid) {
    Snapshot snapshot(space());
    std::string message;
    try {
      ToText(snapshot.Root<TombstonesMap>("t"));
      ADD_FAILURE() << "it was read as if nothing were wrong";
    } catch (const CorruptRecord& corrupt) {
      EXPECT_EQ(corrupt.oid(), oid);
      message = corrupt.what();
      EXPECT_NE(message.find("object " + std::to_string(oid.m_value)), std::string::npos) << message;
    }
    EXPECT_EQ(MessageOf<CorruptRecord>([&] {
                Snapshot another(space());  // which has nothing in memory
                ScanMap(another, another.Root<TombstonesMap>("t"), FieldId(), [](const FieldId&, const auto&) { return true; });
              }),
              message);
    EXPECT_EQ(FaultsOf(snapshot.Root<InsertionsMap>("i")), "");
    site.Tamper(oid, m_stored.records.at(oid));
    return message;
  }

  void ExpectRefused(OID oid, const std::string& className, const Bytes& body, std::size_t offset) {
    Forge(oid, className, body);
    const std::string message = MessageFor(oid);
    EXPECT_NE(message.find(className), std::string::npos) << message;
    EXPECT_NE(message.find("offset " + std::to_string(offset) + ":"), std::string::npos) << message;
  }

  OID m_map, m_root, m_first, m_last;
  std::uint64_t m_schema = 0;
  StoredState m_stored;
};
INSTANTIATE_STORE_TEST(ForgedRecordTest);

TEST_P(ForgedRecordTest, TheSameBodyIsAcceptedWhichShowsThatTheOthersFailForWhatTheyAre) {
  Forge(m_first, kLeafClass, BodyOf(m_first));
  Forge(m_root, kInternalClass, BodyOf(m_root));
  Forge(m_map, kMapClass, BodyOf(m_map));
  Snapshot snapshot(space());
  EXPECT_EQ(FaultsOf(snapshot.Root<TombstonesMap>("t")), "");
}

TEST_P(ForgedRecordTest, ALeafWhereAnInternalNodeBelongs) {
  Forge(m_root, kLeafClass, BodyOf(m_first));
  const std::string message = MessageFor(m_root);
  EXPECT_NE(message.find(kLeafClass), std::string::npos) << message;
  EXPECT_NE(message.find(kInternalClass), std::string::npos) << message;
}

TEST_P(ForgedRecordTest, AnInternalNodeWhereALeafBelongs) {
  Forge(m_first, kInternalClass, BodyOf(m_root));
  const std::string message = MessageFor(m_first);
  EXPECT_NE(message.find(kLeafClass), std::string::npos) << message;
  EXPECT_NE(message.find(kInternalClass), std::string::npos) << message;
  Forge(m_first, kInternalClass, BodyOf(m_root));
  Snapshot snapshot(space());
  EXPECT_THROW(snapshot.Root<TombstonesMap>("t").begin(), CorruptRecord);
  EXPECT_THROW(snapshot.Root<TombstonesMap>("t").rFind(Key(1)), CorruptRecord);
}

TEST_P(ForgedRecordTest, AMapWhereANodeBelongsAndANodeWhereAMapBelongs) {
  Forge(m_root, kMapClass, BodyOf(m_map));
  EXPECT_NE(MessageFor(m_root).find("should stand here"), std::string::npos);
  Forge(m_map, kLeafClass, BodyOf(m_first));
  const std::string message = MessageFor(m_map);
  EXPECT_NE(message.find("root \"t\""), std::string::npos) << message;
}

TEST_P(ForgedRecordTest, ALeafOfAnotherMapsClass) {
  OID otherLeaf;
  {
    Snapshot snapshot(space());
    otherLeaf = snapshot.Root<InsertionsMap>("i").m_firstLeaf.m_oid;
  }
  Forge(m_first, "vemo::FieldIdToVectorInsertionsMapLeafNode", BodyOf(otherLeaf));
  EXPECT_NE(MessageFor(m_first).find("should stand here"), std::string::npos);
}

TEST_P(ForgedRecordTest, AMapWhoseHeightIsNotThatOfItsTree) {
  for (const std::uint64_t levels : {1u, 3u}) {
    const Bytes body = Body()
                           .Uint(m_schema)
                           .Uint(160)
                           .Uint(m_first.m_value)
                           .Uint(m_last.m_value)
                           .Uint(m_root.m_value)
                           .Uint(levels)
                           .bytes();
    Forge(m_map, kMapClass, body);
    Snapshot snapshot(space());
    EXPECT_THROW(ToText(snapshot.Root<TombstonesMap>("t")), CorruptRecord);
    EXPECT_THROW(snapshot.Root<TombstonesMap>("t").rFind(Key(1)), CorruptRecord);
  }
}

TEST_P(ForgedRecordTest, AnUnknownClassNumber) {
  for (const std::uint32_t number : {0u, 1000u, 0xFFFFFFFFu}) {
    Forge(m_first, number, BodyOf(m_first));
    const std::string message = MessageFor(m_first);
    EXPECT_NE(message.find("class number " + std::to_string(number)), std::string::npos) << message;
  }
}

TEST_P(ForgedRecordTest, AClassThatThisProgramDoesNotKnow) {
  const std::string name = "class/99";
  const std::string className = "vemo::ClassOfTheFuture";
  const ByteView value(reinterpret_cast<const std::uint8_t*>(className.data()), className.size());
  site.TamperNamed(NamedTable::kInfo, name, SealNamed(NamedTable::kInfo, name, value));
  Forge(m_first, 99, BodyOf(m_first));
  EXPECT_NE(MessageFor(m_first).find("class number 99"), std::string::npos);
  Forge(m_first, 98, BodyOf(m_first));  // in the gap
  EXPECT_NE(MessageFor(m_first).find("class number 98"), std::string::npos);
  CommitFilled<HistoriesMap>(space(), "h", 10);  // new numbers come behind
  EXPECT_GE(site.ClassNumber("vemo::FieldIdToVectorInsertionsAndDeletionsMap"), 100u);
}

TEST_P(ForgedRecordTest, ARootOfAClassThatThisProgramDoesNotKnow) {
  for (const char* className : {"vemo::MapOfTheFuture", kLeafClass, ""}) {
    site.TamperNamed(NamedTable::kRoots, "t", EncodeRootValue("t", {className, m_map}));
    Snapshot snapshot(space());
    EXPECT_NE(MessageOf<IncompatibleSpace>([&] { snapshot.Root<TombstonesMap>("t"); }).find("root \"t\""),
              std::string::npos);
  }
}

TEST_P(ForgedRecordTest, ARootOfAnotherClassThanItsRecord) {
  site.TamperNamed(NamedTable::kRoots, "t",
                   EncodeRootValue("t", {"vemo::FieldIdToVectorInsertionsMap", m_map}));
  Snapshot snapshot(space());
  const std::string message = MessageOf<CorruptRecord>([&] { snapshot.Root<InsertionsMap>("t"); });
  EXPECT_NE(message.find("root \"t\""), std::string::npos) << message;
}

TEST_P(ForgedRecordTest, LeavesWithImpossibleBodies) {
  const std::uint64_t next = 77;
  const auto start = [&] { return Body().Uint(m_schema).Uint(0).Uint(next); };
  ExpectRefused(m_first, kLeafClass, {}, 0);
  ExpectRefused(m_first, kLeafClass, Body().Uint(m_schema + 1).bytes(), 0);
  ExpectRefused(m_first, kLeafClass, start().Uint(101).bytes(), 4);  // more than a node holds
  ExpectRefused(m_first, kLeafClass, start().Uint(0xFFFFFFFF).bytes(), 8);
  ExpectRefused(m_first, kLeafClass, start().Uint(1).bytes(), 4);          // and no entry
  ExpectRefused(m_first, kLeafClass, start().Uint(0).Uint(0).bytes(), 4);  // bytes behind the end
  ExpectRefused(m_first, kLeafClass, Body().Uint(m_schema).Uint(next).Uint(next).Uint(0).bytes(), 3);
  const auto twoKeys = [&](std::uint64_t a, std::uint64_t b) {
    return start().Uint(2).KeyOf(a).PayloadWithout().KeyOf(b).PayloadWithout().bytes();
  };
  const std::size_t behindSecondKey = 4 + 2 * ToBytes(Key(3)).size() + 1;
  ExpectRefused(m_first, kLeafClass, twoKeys(3, 2), behindSecondKey);  // descending
  ExpectRefused(m_first, kLeafClass, twoKeys(3, 3), behindSecondKey);  // twice the same
}

TEST_P(ForgedRecordTest, InternalNodesWithImpossibleBodies) {
  const auto start = [&] { return Body().Uint(m_schema).Uint(m_first.m_value); };
  ExpectRefused(m_root, kInternalClass, Body().Uint(m_schema).Uint(0).Uint(1).bytes(),
                2);                                                   // no leftmost child
  ExpectRefused(m_root, kInternalClass, start().Uint(0).bytes(), 3);  // no separator
  ExpectRefused(m_root, kInternalClass, start().Uint(101).bytes(), 3);
  const std::size_t keyBytes = ToBytes(Key(3)).size();
  ExpectRefused(m_root, kInternalClass, start().Uint(1).KeyOf(3).Uint(0).bytes(), 3 + keyBytes + 1);
  ExpectRefused(m_root, kInternalClass, start().Uint(2).KeyOf(3).Uint(9).KeyOf(2).Uint(9).bytes(),
                3 + 2 * keyBytes + 1);
  ExpectRefused(m_root, kInternalClass, start().Uint(1).KeyOf(3).Uint(9).Uint(9).bytes(), 3 + keyBytes + 1);
}

TEST_P(ForgedRecordTest, MapsWithImpossibleBodies) {
  const auto map = [&](std::uint64_t size, std::uint64_t first, std::uint64_t root, std::uint64_t levels) {
    return Body().Uint(m_schema).Uint(size).Uint(first).Uint(first).Uint(root).Uint(levels).bytes();
  };
  ExpectRefused(m_map, kMapClass, map(0, 0, 0, 1), 6);   // a level without a root
  ExpectRefused(m_map, kMapClass, map(0, 9, 9, 0), 6);   // a root without a level
  ExpectRefused(m_map, kMapClass, map(5, 0, 0, 0), 6);   // entries without a node
  ExpectRefused(m_map, kMapClass, map(5, 9, 9, 65), 6);  // higher than any memory
  ExpectRefused(m_map, kMapClass, map(5, 9, 0, 2), 6);
}

}  // namespace
}  // namespace vemo::test
