// The three production maps: each with its own payload, names and nodes.
#include "tests/module/map_fixture.h"
#include "tests/support/production_payloads.h"
#include "vxUtils/ByteForms.h"

namespace vemo::test {
namespace {

template <class Map, class Payload, class Leaf, class Internal, class LeafEntry, class InternalEntry>
constexpr bool kIsInstance =
    std::is_same_v<typename Map::mapped_type, Payload>&& std::is_same_v<typename Map::LeafNode, Leaf>&&
        std::is_same_v<typename Map::InternalNode, Internal>&&
            std::is_same_v<typename Map::value_type, LeafEntry>&&
                std::is_same_v<typename Map::InternalKeyEntry, InternalEntry> &&
    sizeof(Leaf::m_entrys) == 100 * sizeof(LeafEntry) &&
    sizeof(Internal::m_entrys) == 100 * sizeof(InternalEntry);
static_assert(
    kIsInstance<FieldIdToVectorInsertionsMap, VectorInsertions, FieldIdToVectorInsertionsMapLeafNode,
                FieldIdToVectorInsertionsMapInternalNode, FieldIdToVectorInsertionsMapLeafKeyEntry,
                FieldIdToVectorInsertionsMapInternalKeyEntry>);
static_assert(
    kIsInstance<FieldIdToVectorTombstonesMap, VectorTombstones, FieldIdToVectorTombstonesMapLeafNode,
                FieldIdToVectorTombstonesMapInternalNode, FieldIdToVectorTombstonesMapLeafKeyEntry,
                FieldIdToVectorTombstonesMapInternalKeyEntry>);
static_assert(kIsInstance<FieldIdToVectorInsertionsAndDeletionsMap, VectorInsertionsAndDeletions,
                          FieldIdToVectorInsertionsAndDeletionsMapLeafNode,
                          FieldIdToVectorInsertionsAndDeletionsMapInternalNode,
                          FieldIdToVectorInsertionsAndDeletionsMapLeafKeyEntry,
                          FieldIdToVectorInsertionsAndDeletionsMapInternalKeyEntry>);

template <class Map>
struct Texts;
template <>
struct Texts<FieldIdToVectorInsertionsMap> {
  static constexpr const char* kName = "FieldIdToVectorInsertionsMap";
  static constexpr const char* kDefault = "insertions(u2=0 c=[])";
  static void ConstructPayload(void* raw) { FieldIdToVectorInsertionsMapConstructPayload(raw); }
  static void CopyConstructKey(void* raw, const FieldId& key) {
    FieldIdToVectorInsertionsMapCopyConstructKey(raw, key);
  }
  static void MoveKey(void* raw, FieldId* key) { FieldIdToVectorInsertionsMapMoveKey(raw, key); }
  static void* AsLeaf(void* node) { return FieldIdToVectorInsertionsMapAsLeafNode(node); }
  static void* AsInternal(void* node) { return FieldIdToVectorInsertionsMapAsInternalNode(node); }
};
template <>
struct Texts<FieldIdToVectorTombstonesMap> {
  static constexpr const char* kName = "FieldIdToVectorTombstonesMap";
  static constexpr const char* kDefault = "[]{}";
  static void ConstructPayload(void* raw) { FieldIdToVectorTombstonesMapConstructPayload(raw); }
  static void CopyConstructKey(void* raw, const FieldId& key) {
    FieldIdToVectorTombstonesMapCopyConstructKey(raw, key);
  }
  static void MoveKey(void* raw, FieldId* key) { FieldIdToVectorTombstonesMapMoveKey(raw, key); }
  static void* AsLeaf(void* node) { return FieldIdToVectorTombstonesMapAsLeafNode(node); }
  static void* AsInternal(void* node) { return FieldIdToVectorTombstonesMapAsInternalNode(node); }
};
template <>
struct Texts<FieldIdToVectorInsertionsAndDeletionsMap> {
  static constexpr const char* kName = "FieldIdToVectorInsertionsAndDeletionsMap";
  static constexpr const char* kDefault = "(i=insertions(u2=0 c=[]) d=[])";
  static void ConstructPayload(void* raw) { FieldIdToVectorInsertionsAndDeletionsMapConstructPayload(raw); }
  static void CopyConstructKey(void* raw, const FieldId& key) {
    FieldIdToVectorInsertionsAndDeletionsMapCopyConstructKey(raw, key);
  }
  static void MoveKey(void* raw, FieldId* key) { FieldIdToVectorInsertionsAndDeletionsMapMoveKey(raw, key); }
  static void* AsLeaf(void* node) { return FieldIdToVectorInsertionsAndDeletionsMapAsLeafNode(node); }
  static void* AsInternal(void* node) { return FieldIdToVectorInsertionsAndDeletionsMapAsInternalNode(node); }
};

template <class Map>
class ProductionMap : public MapFixture<Map> {};
using ProductionMaps = ::testing::Types<FieldIdToVectorInsertionsMap, FieldIdToVectorTombstonesMap,
                                        FieldIdToVectorInsertionsAndDeletionsMap>;
TYPED_TEST_SUITE(ProductionMap, ProductionMaps);

TYPED_TEST(ProductionMap, StoresFindsRemovesWritesAndReadsBack) {
  TypeParam& stored = this->map;
  for (std::uint64_t n = 1; n <= 300; ++n) EXPECT_TRUE(stored.Insert(Key(n), this->MakePayload(n), false));
  this->host.UnloadAll();
  for (std::uint64_t n = 1; n <= 300; ++n) EXPECT_EQ(this->PayloadOf(*stored.rFind(Key(n))), n);
  for (std::uint64_t n = 1; n <= 300; n += 2) EXPECT_TRUE(stored.Delete(Key(n)));
  this->host.UnloadAll();
  EXPECT_EQ(stored.size(), 150);
  for (std::uint64_t n = 1; n <= 300; ++n) EXPECT_EQ(stored.contains(Key(n)), n % 2 == 0);
  EXPECT_EQ(this->TreeFaults(), "");
}

TYPED_TEST(ProductionMap, ACreatedKeyHoldsTheDefaultPayload) {
  typename TypeParam::wFindRet ret;
  this->map.wFind(ret, Key(1), true);
  EXPECT_EQ(ToText(*ret.m_payload), Texts<TypeParam>::kDefault);
  EXPECT_EQ(ToText(this->map[Key(2)]), Texts<TypeParam>::kDefault);
  EXPECT_EQ(ToText(this->map), std::string("Height = 0\n{\n    1: --> ") + Texts<TypeParam>::kDefault +
                                   "\n    2: --> " + Texts<TypeParam>::kDefault + "\n}\n");
}

TYPED_TEST(ProductionMap, HasNodesOfItsOwnClasses) {
  this->map.Insert(Key(1), this->MakePayload(1), false);
  const std::string name = std::string("vemo::") + Texts<TypeParam>::kName;
  EXPECT_EQ(this->Leaf(1)->GetReflectedClass()->m_name, name + "LeafNode");
  EXPECT_EQ(GetReflectedClass<typename TypeParam::InternalNode>()->m_name, name + "InternalNode");
  EXPECT_EQ(this->map.GetReflectedClass()->m_name, name);
}

template <class Traits>
const char* BoundTextOf(const TFieldMap<Traits>&) {
  return Traits::kBoundInLeafText;
}

TYPED_TEST(ProductionMap, NamesItselfInTheBoundsAssertion) {
  EXPECT_EQ(BoundTextOf(this->map),
            std::string("0 <= j && j <= ") + Texts<TypeParam>::kName + "AsLeafNode(node)->m_numKeyEntrys");
}

TYPED_TEST(ProductionMap, HelpersBuildAndMoveEntries) {
  alignas(FieldId) std::byte key[sizeof(FieldId)];
  alignas(FieldId) std::byte moved[sizeof(FieldId)];
  Texts<TypeParam>::CopyConstructKey(key, LongKey(5));
  EXPECT_EQ(*std::launder(reinterpret_cast<FieldId*>(key)), LongKey(5));
  Texts<TypeParam>::MoveKey(moved, std::launder(reinterpret_cast<FieldId*>(key)));
  auto* const arrived = std::launder(reinterpret_cast<FieldId*>(moved));
  EXPECT_EQ(*arrived, LongKey(5));
  std::destroy_at(arrived);

  using Value = typename TypeParam::mapped_type;
  alignas(Value) std::byte raw[sizeof(Value)];
  Texts<TypeParam>::ConstructPayload(raw);
  auto* const payload = std::launder(reinterpret_cast<Value*>(raw));
  EXPECT_EQ(ToText(*payload), Texts<TypeParam>::kDefault);
  std::destroy_at(payload);

  this->Build("([1..50] 100 [100..150])");
  EXPECT_EQ(Texts<TypeParam>::AsLeaf(this->Leaf(1)), this->Leaf(1));
  EXPECT_EQ(Texts<TypeParam>::AsInternal(this->Node(1)), this->Node(1));
}

class InsertionsMap : public MapFixture<FieldIdToVectorInsertionsMap> {};

TEST_F(InsertionsMap, EqualityTakesOperationAndPositionOfRunsAlone) {
  Hosted<FieldIdToVectorInsertionsMap> other(host, "other");
  VectorInsertionInterval run;
  run.m_q = 4;
  map[Key(1)].m_c.InsertAfter(nullptr, run);
  run.m_n = 9;
  run.m_u = 8;
  VectorInsertions& payload = (*other)[Key(1)];
  payload.m_c.InsertAfter(nullptr, run);
  EXPECT_TRUE(map == *other);
  payload.m_u2 = 7;
  EXPECT_TRUE(map == *other);
  payload.m_c.m_first->m_q = 5;
  EXPECT_FALSE(map == *other);
}

class InsertionsAndDeletionsMap : public MapFixture<FieldIdToVectorInsertionsAndDeletionsMap> {};

TEST_F(InsertionsAndDeletionsMap, EqualityTakesAllOfADeletionAndNotTheInsertionsU2) {
  Hosted<FieldIdToVectorInsertionsAndDeletionsMap> other(host, "other");
  VectorDeletionInterval run;
  run.m_q = 4;
  run.m_n = 2;
  map[Key(1)].m_deletions.InsertAfter(nullptr, run);
  (*other)[Key(1)].m_deletions.InsertAfter(nullptr, run);
  (*other)[Key(1)].m_insertions.m_u2 = 7;
  EXPECT_TRUE(map == *other);
  (*other)[Key(1)].m_deletions.m_first->m_n = 3;
  EXPECT_FALSE(map == *other);
}

}  // namespace
}  // namespace vemo::test
