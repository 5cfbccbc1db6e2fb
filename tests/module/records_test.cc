// The records of maps and nodes, byte for byte, and what becomes of damaged ones.
#include <vector>

#include "platform/error.h"
#include "tests/module/map_fixture.h"
#include "tests/support/production_payloads.h"
#include "tests/support/small_map.h"
#include "vxUtils/ByteForms.h"

namespace vemo::test {
namespace {

// The host writes a reference as the id of its object; ids count from 1, the map's, in the order of the
// tree's text.
class Records : public MapFixture<SmallMap> {};
class ProductionRecords : public MapFixture<FieldIdToVectorInsertionsMap> {
 protected:
  static Bytes LeafOf(int count) {
    Bytes bytes{1, 0, 0, static_cast<std::uint8_t>(count)};
    for (int i = 1; i <= count; ++i) bytes.insert(bytes.end(), {static_cast<std::uint8_t>(i), 0, 0, 0});
    return bytes;
  }
  static Bytes InternalNodeOf(int count) {
    Bytes bytes{1, 9, static_cast<std::uint8_t>(count)};
    for (int i = 1; i <= count; ++i) bytes.insert(bytes.end(), {static_cast<std::uint8_t>(i), 0, 9});
    return bytes;
  }
};

TEST_F(Records, OfAnEmptyMap) {
  EXPECT_EQ(ToBytes(map), (Bytes{1, 0, 0, 0, 0, 0}));
  SmallMap read;
  read.m_height = 5;
  FromBytes(Bytes{1, 0, 0, 0, 0, 0}, read);
  EXPECT_EQ(read.m_height, -1);
  EXPECT_EQ(read.m_size, 0);
  EXPECT_FALSE(read.m_root);
  EXPECT_FALSE(read.m_firstLeaf);
  EXPECT_FALSE(read.m_lastLeaf);
}

TEST_F(Records, OfAMapThatIsOneLeaf) {
  Build("[1 2]");
  EXPECT_EQ(ToBytes(map), (Bytes{1, 2, 2, 2, 2, 1}));
  EXPECT_EQ(ToBytes(*Leaf(1)), (Bytes{1, 0, 0, 2, 1, 0, 1, 2, 0, 2}));
}

TEST_F(Records, OfATree) {
  Build("([1 2] 10 [10 11 12] 20 [20 21])");
  // schema, size, first leaf, last leaf, root, height + 1
  EXPECT_EQ(ToBytes(map), (Bytes{1, 7, 3, 5, 2, 2}));
  // schema, leftmost child, count, then key (object, steps) and child
  EXPECT_EQ(ToBytes(*Node(1)), (Bytes{1, 3, 2, 10, 0, 4, 20, 0, 5}));
  // schema, previous, next, count, then key and payload
  EXPECT_EQ(ToBytes(*Leaf(1)), (Bytes{1, 0, 4, 2, 1, 0, 1, 2, 0, 2}));
  EXPECT_EQ(ToBytes(*Leaf(2)), (Bytes{1, 3, 5, 3, 10, 0, 10, 11, 0, 11, 12, 0, 12}));
  EXPECT_EQ(ToBytes(*Leaf(3)), (Bytes{1, 4, 0, 2, 20, 0, 20, 21, 0, 21}));
}

TEST_F(Records, WriteKeysWithTheirPaths) {
  map.Insert(FieldId{OID(200), {1, 300}}, MakePayload(5), false);
  EXPECT_EQ(ToBytes(*Leaf(1)), (Bytes{1, 0, 0, 1, 0x80, 200, 2, 1, 0x81, 0x2C, 5}));
}

TEST_F(Records, KeepTheLow32BitsOfTheSize) {
  map.m_size = (ssize_t{1} << 32) + 5;
  EXPECT_EQ(ToBytes(map)[1], 5);
  map.m_size = 0;
}

TEST_F(Records, AreReadBackWithoutAStoreCall) {
  Build("([1 2] 10 [10 11 12] 20 [20 21])");
  SmallMap readMap;
  FromBytes(ToBytes(map), readMap);
  EXPECT_EQ(readMap.m_size, 7);
  EXPECT_EQ(readMap.m_height, 1);
  EXPECT_EQ(readMap.m_root.m_oid, map.m_root.m_oid);
  EXPECT_EQ(readMap.m_firstLeaf.m_oid, map.m_firstLeaf.m_oid);
  EXPECT_EQ(readMap.m_lastLeaf.m_oid, map.m_lastLeaf.m_oid);
  EXPECT_EQ(readMap.m_root.m_ptr.m_self, nullptr);
  SmallMapInternalNode readNode;
  FromBytes(ToBytes(*Node(1)), readNode);
  EXPECT_EQ(ToBytes(readNode), ToBytes(*Node(1)));
  SmallMapLeafNode readLeaf;
  FromBytes(ToBytes(*Leaf(2)), readLeaf);
  EXPECT_EQ(ToBytes(readLeaf), ToBytes(*Leaf(2)));
  EXPECT_EQ(host.log().FullText(), "");
  EXPECT_EQ(TreeText(readMap), Tree());
}

TEST_F(Records, OfFewerEntriesDestroyTheSurplusAndOfMoreConstructTheMissing) {
  Build("([1 2] 10 [10 11 12] 20 [20 21])");
  const Bytes two = ToBytes(*Leaf(1));
  const Bytes three = ToBytes(*Leaf(2));
  const std::int64_t before = CountedPayload::NumLive();
  SmallMapLeafNode leaf;
  FromBytes(three, leaf);
  EXPECT_EQ(CountedPayload::NumLive(), before + 3);
  FromBytes(two, leaf);
  EXPECT_EQ(CountedPayload::NumLive(), before + 2);
  EXPECT_EQ(ToBytes(leaf), two);
  FromBytes(three, leaf);
  EXPECT_EQ(CountedPayload::NumLive(), before + 3);
  EXPECT_EQ(ToBytes(leaf), three);
  FromBytes(Bytes{1, 0, 0, 0}, leaf);
  EXPECT_EQ(CountedPayload::NumLive(), before);

  SmallMapInternalNode node;
  const Bytes wide = ToBytes(*Node(1));
  FromBytes(wide, node);
  FromBytes(Bytes{1, 3, 1, 10, 6, 1, 2, 3, 4, 5, 6, 4}, node);
  EXPECT_EQ(node.m_numKeyEntrys, 1);
  EXPECT_EQ(node.GetEntry(0).m_key, (FieldId{OID(10), {1, 2, 3, 4, 5, 6}}));
  FromBytes(wide, node);
  EXPECT_EQ(ToBytes(node), wide);
}

TEST_F(ProductionRecords, OfAHundredEntriesAreReadAndOf101AreAnAssertion) {
  FieldIdToVectorInsertionsMapLeafNode leaf;
  const Bytes hundred = LeafOf(100);
  InputArchive leafArchive(hundred.data());
  leaf.Deserialise(leafArchive);
  EXPECT_EQ(leaf.m_numKeyEntrys, 100);
  EXPECT_EQ(ToBytes(leaf), hundred);
  FieldIdToVectorInsertionsMapInternalNode node;
  const Bytes hundredChildren = InternalNodeOf(100);
  InputArchive nodeArchive(hundredChildren.data());
  node.Deserialise(nodeArchive);
  EXPECT_EQ(node.m_numKeyEntrys, 100);
  EXPECT_EQ(ToBytes(node), hundredChildren);

  const auto readLeafOf101 = [&] {
    const Bytes bytes = LeafOf(101);
    InputArchive archive(bytes.data());
    leaf.Deserialise(archive);
  };
  EXPECT_ASSERTION(readLeafOf101(), "0 <= n && n <= 100");
  const auto readNodeOf101 = [&] {
    const Bytes bytes = InternalNodeOf(101);
    InputArchive archive(bytes.data());
    node.Deserialise(archive);
  };
  EXPECT_ASSERTION(readNodeOf101(), "0 <= n && n <= 100");
}

TEST_F(ProductionRecords, From101EntriesAreRefusedBeforeTheyReachTheReader) {
  FieldIdToVectorInsertionsMapLeafNode leaf;
  EXPECT_THROW(FromBytes(LeafOf(101), leaf), MalformedBytes);
  FieldIdToVectorInsertionsMapInternalNode node;
  EXPECT_THROW(FromBytes(InternalNodeOf(101), node), MalformedBytes);
  FromBytes(LeafOf(100), leaf);
  FromBytes(InternalNodeOf(100), node);
}

TEST_F(ProductionRecords, OfALeafHoldThePayloads) {
  Build("[3]");
  Bytes expected{1, 0, 0, 1, 3, 0, 3, 1};   // ... key, then u2 and one inserted run:
  expected.resize(expected.size() + 16);    // its operation's site, null
  for (const int field : {-1, 3, 0, -1}) {  // its operation's number, q, n, u
    if (field < 0) {
      expected.insert(expected.end(), {0xF0, 0xFF, 0xFF, 0xFF, 0xFF});
    } else {
      expected.push_back(static_cast<std::uint8_t>(field));
    }
  }
  EXPECT_EQ(ToBytes(*Leaf(1)), expected);
}

TEST_F(ProductionRecords, LargerThanTheArchivesBufferAreWhole) {
  for (std::uint64_t n = 1; n <= 100; ++n)
    map.Insert(FieldId{OID(n << 40), {1, 2, 3, 4, 5}}, MakePayload(n), false);
  const Bytes bytes = ToBytes(*Leaf(1));
  EXPECT_GT(bytes.size(), static_cast<std::size_t>(ARCHIVE_BUFSIZE));
  FieldIdToVectorInsertionsMapLeafNode read;
  FromBytes(bytes, read);
  EXPECT_EQ(ToBytes(read), bytes);
}

// Expects that no damage to one byte of the record, and no loss of its end, passes for something else than it
// is.
template <class T>
void ExpectDamageIsSeen(const Bytes& record) {
  for (std::size_t length = 0; length < record.size(); ++length) {
    T object;
    EXPECT_THROW(FromBytes(std::span(record).first(length), object), MalformedBytes) << "length " << length;
  }
  Bytes longer = record;
  longer.push_back(0);
  T object;
  EXPECT_THROW(FromBytes(longer, object), MalformedBytes);
  for (std::size_t i = 0; i < record.size(); ++i) {
    for (int value = 0; value < 256; ++value) {
      Bytes damaged = record;
      damaged[i] = static_cast<std::uint8_t>(value);
      T read;
      try {
        FromBytes(damaged, read);
      } catch (const MalformedBytes& error) {
        EXPECT_LE(error.offset(), damaged.size());
        continue;
      }
      ASSERT_EQ(ToBytes(read), damaged) << "byte " << i << " changed to " << value;
    }
  }
}

TEST_F(Records, ThatAreDamagedAreRefusedOrAreOtherSoundRecords) {
  Build("([1 2] 10 [10 11 12] 20 [20 21])");
  map.Insert(FieldId{OID(11), {7, 300, 1, 1, 1}}, MakePayload(200), false);
  ExpectDamageIsSeen<SmallMap>(ToBytes(map));
  ExpectDamageIsSeen<SmallMapInternalNode>(ToBytes(*Node(1)));
  ExpectDamageIsSeen<SmallMapLeafNode>(ToBytes(*Leaf(2)));
}

TEST_F(ProductionRecords, ThatAreDamagedAreRefusedOrAreOtherSoundRecords) {
  Build("[1 2 3]");
  ExpectDamageIsSeen<FieldIdToVectorInsertionsMapLeafNode>(ToBytes(*Leaf(1)));
  FieldIdToVectorTombstonesMapLeafNode tombstones;
  FromBytes(Bytes{1, 0, 0, 2, 1, 0, 2, 1, 2, 2, 1, 5, 0, 0}, tombstones);
  ExpectDamageIsSeen<FieldIdToVectorTombstonesMapLeafNode>(ToBytes(tombstones));
  FieldIdToVectorInsertionsAndDeletionsMapLeafNode both;
  FromBytes(Bytes{1, 0, 0, 2, 1, 0, 0, 0, 0, 5, 0, 3, 0, 0}, both);
  ExpectDamageIsSeen<FieldIdToVectorInsertionsAndDeletionsMapLeafNode>(ToBytes(both));
}

struct Refusal {
  Bytes m_bytes;
  std::size_t m_offset;
  const char* m_reason;
};

template <class T>
void ExpectRefusals(const std::vector<Refusal>& rows) {
  for (const Refusal& row : rows) {
    T object;
    try {
      FromBytes(row.m_bytes, object);
      ADD_FAILURE() << "accepted: " << row.m_reason;
    } catch (const MalformedBytes& error) {
      EXPECT_EQ(error.offset(), row.m_offset) << error.what();
      EXPECT_NE(std::string(error.what()).find(row.m_reason), std::string::npos) << error.what();
    }
  }
}

TEST(RefusedRecords, OfMapsThatContradictThemselves) {
  const char* const reason = "size, references and height of a map contradict one another";
  ExpectRefusals<SmallMap>({
      {{1, 1, 0, 0, 0, 0}, 6, reason},  // entries without a node
      {{1, 0, 2, 2, 2, 0}, 6, reason},  // nodes without a level
      {{1, 0, 0, 0, 0, 1}, 6, reason},  // a level without a node
      {{1, 0, 0, 2, 2, 1}, 6, reason},
      {{1, 0, 2, 0, 2, 1}, 6, reason},
      {{1, 0, 2, 2, 0, 1}, 6, reason},
      {{1, 0, 2, 2, 2, 65}, 6, "a map cannot have 65 levels"},
      {{2, 0, 0, 0, 0, 0}, 0, "schema 2"},
  });
}

TEST(RefusedRecords, OfNodes) {
  ExpectRefusals<SmallMapInternalNode>({
      {{1, 0, 1, 10, 0, 4}, 2, "a reference to a child is empty"},
      {{1, 3, 1, 10, 0, 0}, 6, "a reference to a child is empty"},
      {{1, 3, 0}, 3, "a node cannot hold 0 entries"},
      {{1, 3, 5}, 3, "a node cannot hold 5 entries"},
      {{1, 3, 2, 10, 0, 4, 10, 0, 5}, 8, "the keys of a node do not ascend"},
  });
  ExpectRefusals<SmallMapLeafNode>({
      {{1, 0, 0, 5}, 4, "a node cannot hold 5 entries"},
      {{1, 3, 3, 0}, 3, "a leaf has the same neighbour on both sides"},
      {{1, 0, 0, 2, 2, 0, 1, 1, 0, 1}, 9, "the keys of a node do not ascend"},
  });
}

// The keys and payloads of a leaf, read one by one.
std::vector<std::pair<std::uint64_t, std::uint64_t>> EntriesOf(const Bytes& record) {
  std::vector<std::pair<std::uint64_t, std::uint64_t>> entries;
  LeafFormReader<SmallMapTraits> reader{BoundedReader(record)};
  FieldId key;
  SmallMap::Payload payload;
  while (reader.NextKey()) {
    reader.Read(key, payload);
    entries.emplace_back(NumberOf(key), PayloadNumber<SmallMap::Payload>::Number(payload));
  }
  return entries;
}

TEST_F(Records, OfALeafAreReadEntryByEntry) {
  Build("([1 2] 10 [10 11 12])");
  EXPECT_TRUE(EntriesOf({1, 0, 0, 0}).empty());
  EXPECT_EQ(EntriesOf(ToBytes(*Leaf(2))), (std::vector<std::pair<std::uint64_t, std::uint64_t>>{{10, 10}, {11, 11}, {12, 12}}));
}

TEST_F(Records, OfALeafAreComparedWithAKeyWithoutTheirPayloads) {
  const FieldId wide{OID(7), Path{1, 300}}, deep{OID(7), Path{1, 300, 70'000, 1, 2, 3, 4}};
  map.Insert(wide, PayloadNumber<SmallMap::Payload>::Make(1), false);
  map.Insert(deep, PayloadNumber<SmallMap::Payload>::Make(2), false);
  const Bytes record = ToBytes(*map.m_firstLeaf.Get());
  LeafFormReader<SmallMapTraits> reader{BoundedReader(record)};
  ASSERT_TRUE(reader.NextKey());
  EXPECT_EQ(reader.CompareKeyWith(wide), 0);
  EXPECT_EQ(reader.CompareKeyWith(deep), -1);
  EXPECT_EQ(reader.CompareKeyWith(FieldId{OID(7), Path{1, 299}}), 1);
  EXPECT_EQ(reader.CompareKeyWith(FieldId{OID(6), Path{9}}), 1);
  EXPECT_EQ(reader.CompareKeyWith(FieldId{OID(8), Path{}}), -1);
  reader.SkipPayload();
  ASSERT_TRUE(reader.NextKey());
  EXPECT_EQ(reader.CompareKeyWith(deep), 0);
  EXPECT_EQ(reader.CompareKeyWith(wide), 1);
  reader.SkipPayload();
  EXPECT_FALSE(reader.NextKey());
}

TEST(RefusedRecords, OfLeavesAreRefusedEntryByEntryToo) {
  const std::vector<Refusal> rows = {
      {{1, 0, 0, 5}, 4, "a node cannot hold 5 entries"},
      {{1, 3, 3, 0}, 3, "a leaf has the same neighbour on both sides"},
      {{1, 0, 0, 2, 2, 0, 1, 1, 0, 1}, 9, "the keys of a node do not ascend"},
      {{1, 0, 0, 1, 7, 0}, 6, "end"},
      {{1, 0, 0, 1, 7, 0, 8, 9}, 7, "the record should end here"},
  };
  for (const Refusal& row : rows) {
    try {
      EntriesOf(row.m_bytes);
      ADD_FAILURE() << "accepted: " << row.m_reason;
    } catch (const MalformedBytes& error) {
      EXPECT_EQ(error.offset(), row.m_offset) << error.what();
      EXPECT_NE(std::string(error.what()).find(row.m_reason), std::string::npos) << error.what();
    }
  }
}

TEST(RefusedRecords, LeaveTheObjectAsItWas) {
  SmallMapLeafNode leaf;
  const Bytes sound{1, 0, 0, 1, 7, 0, 8};
  FromBytes(sound, leaf);
  EXPECT_THROW(FromBytes(Bytes{1, 0, 0, 2, 1, 0, 1, 1, 0, 1}, leaf), MalformedBytes);
  EXPECT_EQ(ToBytes(leaf), sound);
}

TEST_F(Records, NodesAsTextNameTheirNeighboursAndChildrenById) {
  Build("([1 2] 10 [10 11])");
  EXPECT_EQ(ToText(*Node(1)), "{child=3\n10: child=4\n}\n");
  EXPECT_EQ(ToText(*Leaf(2)), "{prev=3 next=0\n10: --> 10\n11: --> 11\n}\n");
  EXPECT_EQ(host.log().FullText(), "");
}

class VisitedIds final : public IObjectVisitor, public IPrefVisitor {
 public:
  void VisitObject(ptr<const IObject>) override { m_text += "object "; }
  void VisitEvictableObject(const prefbase& reference) override { Add(reference); }
  void VisitPref(const prefbase& reference) override { Add(reference); }
  void VisitParentPref(const prefbase&) override { m_text += "parent "; }

  std::string m_text;

 private:
  void Add(const prefbase& reference) { m_text += RecordingHost::Current().NameOf(reference.m_oid) + " "; }
};

template <class T>
std::string ObjectsOf(const T& object) {
  VisitedIds visited;
  IPersistable::Stubs<T>::GetTable()->_IObject.VisitObjects(&object, visited);
  return visited.m_text;
}
template <class T>
std::string PrefsOf(const T& object) {
  VisitedIds visited;
  IPersistable::Stubs<T>::GetTable()->VisitPrefs(&object, visited);
  return visited.m_text;
}

TEST_F(Records, VisitorsSeeAllReferencesOrTheOwningOnes) {
  Build("([1 2] 10 [10 11 12] 20 [20 21])");
  EXPECT_EQ(ObjectsOf(map), "leaf1 leaf3 node1 ");
  EXPECT_EQ(PrefsOf(map), "node1 ");
  EXPECT_EQ(ObjectsOf(*Node(1)), "leaf1 leaf2 leaf3 ");
  EXPECT_EQ(PrefsOf(*Node(1)), "leaf1 leaf2 leaf3 ");
  EXPECT_EQ(ObjectsOf(*Leaf(2)), "leaf1 leaf3 ");
  EXPECT_EQ(PrefsOf(*Leaf(2)), "");
  EXPECT_EQ(host.log().FullText(), "");
}

TEST_F(Records, VisitorsDoNotLoad) {
  Build("([1 2] 10 [10 11])");
  host.UnloadAll();
  host.log().Clear();
  EXPECT_EQ(ObjectsOf(map), "leaf1 leaf2 node1 ");
  EXPECT_EQ(PrefsOf(map), "node1 ");
  EXPECT_EQ(host.log().FullText(), "");
}

}  // namespace
}  // namespace vemo::test
