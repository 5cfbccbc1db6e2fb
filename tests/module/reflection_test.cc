// Reflection records, type operations, registration.
#include <array>
#include <cstring>
#include <memory>
#include <string>
#include <thread>

#include "tests/module/map_fixture.h"
#include "tests/support/production_payloads.h"
#include "tests/support/small_map.h"

namespace vemo::test {
namespace {

template <class T>
struct Named;
#define VEMO_NAMED(Class)                           \
  template <>                                       \
  struct Named<Class> {                             \
    static constexpr const char* kName = #Class;    \
    static constexpr int kSchema = Class##_SCHEMA;  \
    static void Register() { _Register_##Class(); } \
  }
VEMO_NAMED(FieldIdToVectorInsertionsMap);
VEMO_NAMED(FieldIdToVectorInsertionsMapInternalNode);
VEMO_NAMED(FieldIdToVectorInsertionsMapLeafNode);
VEMO_NAMED(FieldIdToVectorTombstonesMap);
VEMO_NAMED(FieldIdToVectorTombstonesMapInternalNode);
VEMO_NAMED(FieldIdToVectorTombstonesMapLeafNode);
VEMO_NAMED(FieldIdToVectorInsertionsAndDeletionsMap);
VEMO_NAMED(FieldIdToVectorInsertionsAndDeletionsMapInternalNode);
VEMO_NAMED(FieldIdToVectorInsertionsAndDeletionsMapLeafNode);
#undef VEMO_NAMED

template <class T>
class ReflectedObject : public ::testing::Test {
 protected:
  RecordingHost host;
};

using AllClasses =
    ::testing::Types<FieldIdToVectorInsertionsMap, FieldIdToVectorInsertionsMapInternalNode,
                     FieldIdToVectorInsertionsMapLeafNode, FieldIdToVectorTombstonesMap,
                     FieldIdToVectorTombstonesMapInternalNode, FieldIdToVectorTombstonesMapLeafNode,
                     FieldIdToVectorInsertionsAndDeletionsMap,
                     FieldIdToVectorInsertionsAndDeletionsMapInternalNode,
                     FieldIdToVectorInsertionsAndDeletionsMapLeafNode>;
TYPED_TEST_SUITE(ReflectedObject, AllClasses);

TYPED_TEST(ReflectedObject, HasOneRecordHoweverItIsAskedFor) {
  const ReflectedClass* const record = GetReflectedClass<TypeParam>();
  TypeParam object;
  EXPECT_EQ(object.GetReflectedClass(), record);
  EXPECT_EQ(&_GetReflected(static_cast<const TypeParam*>(nullptr)), record);
  EXPECT_EQ(&_GetReflected(&object), record);
  EXPECT_EQ(GetReflectedClass<TypeParam>(), record);
  EXPECT_EQ(_GetTypeOps(static_cast<const TypeParam*>(nullptr)), &record->m_ops);
}

TYPED_TEST(ReflectedObject, RecordsNameSizeTablesAndNoFields) {
  const ReflectedClass& record = *GetReflectedClass<TypeParam>();
  EXPECT_EQ(record.m_flags, 1u);
  EXPECT_EQ(record.m_name, std::string("vemo::") + Named<TypeParam>::kName);
  EXPECT_EQ(record.m_size, static_cast<ssize_t>(sizeof(TypeParam)));
  EXPECT_EQ(record.m_metaData, nullptr);
  EXPECT_EQ(record.m_fields, nullptr);
  EXPECT_EQ(record.m_numFields, 0);
  EXPECT_EQ(record.m_modelFields, nullptr);
  EXPECT_EQ(record.m_numModelFields, 0);
  EXPECT_EQ(record.m_depFields, nullptr);
  EXPECT_EQ(record.m_numDepFields, 0);
  EXPECT_EQ(record.m_methods, nullptr);
  EXPECT_EQ(record.m_numMethods, 0);
  EXPECT_EQ(record.m_stringTable, nullptr);
  EXPECT_STREQ(record.m_interfaces[0], "vemo::IObject");
  EXPECT_STREQ(record.m_interfaces[1], "vemo::IPersistable");
  EXPECT_EQ(record.m_numIndirectInterfaces, 1);
  EXPECT_EQ(record.m_numDirectInterfaces, 1);
  EXPECT_EQ(record.m_IObjectFnTable, IObject::Stubs<TypeParam>::GetTable());
  EXPECT_EQ(record.m_createFn, &TypeParam::sfnCreateInstance);
}

TYPED_TEST(ReflectedObject, OffersFourTypeOperationsAndNoOther) {
  const TypeOps& ops = *_GetTypeOps(static_cast<const TypeParam*>(nullptr));
  EXPECT_EQ(ops.m_size, static_cast<ssize_t>(sizeof(TypeParam)));
  EXPECT_NE(ops.m_ConstructArrayFn, nullptr);
  EXPECT_NE(ops.m_CopyConstructArrayFn, nullptr);
  EXPECT_NE(ops.m_AssignArrayFn, nullptr);
  EXPECT_NE(ops.m_DestructArrayFn, nullptr);
  for (const TypeOps::UnusedFn none :
       {ops.m_equalsFn, ops.m_lessFn, ops.m_PrintVariableFn, ops.m_SerialiseArrayFn, ops.m_DeserialiseArrayFn,
        ops.m_VisitObjectsInArrayFn, ops.m_VisitPrefsInArrayFn, ops.m_LowerBoundFn, ops.m_UpperBoundFn,
        ops.m_ConstructVariableFromSelfFn, ops.m_ConstructSelfFromVariableFn, ops.m_AssignVariableFromSelfFn,
        ops.m_AssignSelfFromVariableFn}) {
    EXPECT_EQ(none, nullptr);
  }
}

TYPED_TEST(ReflectedObject, IsOfSchemaOne) {
  EXPECT_EQ(Named<TypeParam>::kSchema, 1);
}

TYPED_TEST(ReflectedObject, RegistersUnderItsName) {
  Named<TypeParam>::Register();
  EXPECT_EQ(this->host.log().RegistrationText(),
            std::string("target\nregister-class vemo::") + Named<TypeParam>::kName + "\n");
}

TYPED_TEST(ReflectedObject, AssertsThatRegistrationSucceeded) {
  const std::string name = Named<TypeParam>::kName;
  for (const ENameSpaceError error : {NSE_COLON_EXPECTED, NSE_NAME_ALREADY_IN_USE, NSE_NOT_A_NAMESPACE}) {
    this->host.SetRegistrationResult(error);
    EXPECT_DEATH(Named<TypeParam>::Register(),
                 Literally(": void vemo::_Register_" + name +
                           "(): assertion failed: vemo::RegisterReflectedClass(&_GetReflected( (" + name +
                           "*) 0),vemo::Vemo_vxOperation_GetXTarget()) == vemo::NSE_OK\n"));
  }
}

TYPED_TEST(ReflectedObject, IsMadeOutOfItsRecordAlone) {
  const ReflectedClass& record = *GetReflectedClass<TypeParam>();
  const ptr<IObject> created = record.m_createFn();
  EXPECT_EQ(created.Table()->GetReflectedClass(created.m_self), &record);
  record.m_IObjectFnTable->Destroy(created.m_self);
}

TYPED_TEST(ReflectedObject, ArraysKeepTheBytesBetweenTheirElements) {
  constexpr std::size_t kStride = sizeof(TypeParam) + 32;
  struct alignas(16) Storage {
    std::byte m_bytes[3 * kStride];
  };
  const auto storage = std::make_unique<Storage>();
  std::memset(storage->m_bytes, 0x5A, sizeof(storage->m_bytes));
  const TypeOps& ops = *_GetTypeOps(static_cast<const TypeParam*>(nullptr));
  const auto expectGapsUntouched = [&] {
    for (std::size_t i = 0; i < 3; ++i) {
      for (std::size_t b = sizeof(TypeParam); b < kStride; ++b) {
        ASSERT_EQ(storage->m_bytes[i * kStride + b], std::byte{0x5A});
      }
    }
  };
  ops.m_ConstructArrayFn(storage->m_bytes, kStride, 0);
  ops.m_ConstructArrayFn(storage->m_bytes, kStride, -1);
  for (const std::byte b : storage->m_bytes) ASSERT_EQ(b, std::byte{0x5A});
  ops.m_ConstructArrayFn(storage->m_bytes, kStride, 3);
  expectGapsUntouched();
  for (std::size_t i = 0; i < 3; ++i) {
    const auto* object = std::launder(reinterpret_cast<const TypeParam*>(storage->m_bytes + i * kStride));
    EXPECT_TRUE(object->m_persistObjState.m_oid.IsNull());
    EXPECT_FALSE(object->IsDirty());
  }
  ops.m_DestructArrayFn(storage->m_bytes, kStride, 3);
  expectGapsUntouched();
}

class TypeOperations : public MapFixture<SmallMap> {};

TEST_F(TypeOperations, StrideIsInBytes) {
  SmallMap maps[2];
  SmallMap* p = maps;
  ApplyStride(p, static_cast<ssize_t>(sizeof(SmallMap)));
  EXPECT_EQ(p, maps + 1);
  const SmallMap* q = maps + 1;
  ApplyStride(q, -static_cast<ssize_t>(sizeof(SmallMap)));
  EXPECT_EQ(q, maps);
}

TEST_F(TypeOperations, CopyAndAssignMapsDeeply) {
  const TypeOps& ops = *_GetTypeOps(static_cast<const SmallMap*>(nullptr));
  SmallMap source[2];
  TreeBuilder<SmallMap>::Build(source[0], "[1 2]");
  TreeBuilder<SmallMap>::Build(source[1], "([1 2] 10 [10 11 12])");
  constexpr std::size_t kStride = sizeof(SmallMap) + 16;
  alignas(16) std::byte storage[2 * kStride];
  const auto at = [&](std::size_t i) {
    return std::launder(reinterpret_cast<SmallMap*>(storage + i * kStride));
  };
  ops.m_CopyConstructArrayFn(storage, kStride, source, sizeof(SmallMap), 2);
  EXPECT_EQ(TreeText(*at(0)), "[1 2]");
  EXPECT_EQ(TreeText(*at(1)), "([1 2] 10 [10 11 12])");
  EXPECT_NE(at(0)->m_firstLeaf.Get(), source[0].m_firstLeaf.Get());
  ops.m_AssignArrayFn(storage, kStride, source + 1, 0, 2);  // a source stride of 0 assigns the same to all
  EXPECT_EQ(TreeText(*at(0)), "([1 2] 10 [10 11 12])");
  EXPECT_EQ(TreeText(*at(1)), "([1 2] 10 [10 11 12])");
  ops.m_DestructArrayFn(storage, kStride, 2);
}

// One of a node and its raw image must be emptied before both die.
TEST_F(TypeOperations, CopiesOfNodesAreRawImages) {
  Build("([1 2] 10 [10 11])");
  const TypeOps& leafOps = *_GetTypeOps(static_cast<const SmallMapLeafNode*>(nullptr));
  alignas(SmallMapLeafNode) std::byte leafStorage[sizeof(SmallMapLeafNode)];
  const std::int64_t payloads = CountedPayload::NumLive();
  leafOps.m_CopyConstructArrayFn(leafStorage, sizeof(SmallMapLeafNode), Leaf(1), sizeof(SmallMapLeafNode), 1);
  auto* const leaf = std::launder(reinterpret_cast<SmallMapLeafNode*>(leafStorage));
  EXPECT_EQ(CountedPayload::NumLive(), payloads);
  EXPECT_EQ(leaf->m_numKeyEntrys, 2);
  EXPECT_EQ(leaf->m_next.Get(), Leaf(2));
  EXPECT_TRUE(leaf->m_persistObjState.m_oid.IsNull());
  EXPECT_EQ(leaf->m_objSysState.m_cspace, nullptr);
  EXPECT_EQ(std::memcmp(leaf->m_entrys.Slot(0), Leaf(1)->m_entrys.Slot(0), 2 * sizeof(SmallMap::value_type)),
            0);
  leaf->m_numKeyEntrys = 0;
  leafOps.m_AssignArrayFn(leafStorage, sizeof(SmallMapLeafNode), Leaf(2), sizeof(SmallMapLeafNode), 1);
  EXPECT_EQ(leaf->GetEntry(0).first, Key(10));
  EXPECT_EQ(leaf->m_prev.Get(), Leaf(1));
  leaf->m_numKeyEntrys = 0;
  leafOps.m_DestructArrayFn(leafStorage, sizeof(SmallMapLeafNode), 1);

  const TypeOps& nodeOps = *_GetTypeOps(static_cast<const SmallMapInternalNode*>(nullptr));
  alignas(SmallMapInternalNode) std::byte nodeStorage[sizeof(SmallMapInternalNode)];
  nodeOps.m_CopyConstructArrayFn(nodeStorage, sizeof(SmallMapInternalNode), Node(1),
                                 sizeof(SmallMapInternalNode), 1);
  auto* const node = std::launder(reinterpret_cast<SmallMapInternalNode*>(nodeStorage));
  EXPECT_EQ(node->m_ptr.Get(), Leaf(1));
  EXPECT_EQ(node->GetEntry(0).m_ptr.Get(), Leaf(2));
  EXPECT_TRUE(node->m_persistObjState.m_oid.IsNull());
  node->m_numKeyEntrys = 0;
  nodeOps.m_DestructArrayFn(nodeStorage, sizeof(SmallMapInternalNode), 1);
  EXPECT_EQ(CountedPayload::NumLive(), payloads);
}

TEST(ReflectionRecords, AreBuiltOnceUnderConcurrentFirstCalls) {
  std::array<const ReflectedClass*, 4> seen{};
  std::array<std::thread, 4> threads;
  for (std::size_t i = 0; i < 4; ++i) {
    threads[i] =
        std::thread([&seen, i] { seen[i] = GetReflectedClass<FieldIdToVectorTombstonesMapLeafNode>(); });
  }
  for (std::thread& thread : threads) thread.join();
  for (const ReflectedClass* record : seen) EXPECT_EQ(record, seen[0]);
}

}  // namespace
}  // namespace vemo::test
