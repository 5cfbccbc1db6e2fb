// The objects as the store sees them: state, function tables, interface queries, creation and destruction.
#include <cstddef>
#include <cstring>
#include <memory>

#include "tests/module/map_fixture.h"
#include "tests/support/failing_allocator.h"
#include "tests/support/production_payloads.h"
#include "tests/support/small_map.h"
#include "vxUtils/ByteForms.h"

namespace vemo::test {
namespace {

static_assert(offsetof(IObject::FnTable, QueryInterface) == 0);
static_assert(offsetof(IObject::FnTable, BindInterface) == 1 * sizeof(void*));
static_assert(offsetof(IObject::FnTable, GetReflectedClass) == 2 * sizeof(void*));
static_assert(offsetof(IObject::FnTable, VisitObjects) == 3 * sizeof(void*));
static_assert(offsetof(IObject::FnTable, OnGarbageCollect) == 4 * sizeof(void*));
static_assert(offsetof(IObject::FnTable, Destroy) == 5 * sizeof(void*));
static_assert(offsetof(IObject::FnTable, GetSysState) == 6 * sizeof(void*));
static_assert(sizeof(IObject::FnTable) == 7 * sizeof(void*));
static_assert(offsetof(IPersistable::FnTable, _IObject) == 0);
static_assert(offsetof(IPersistable::FnTable, VisitPrefs) == 7 * sizeof(void*));
static_assert(offsetof(IPersistable::FnTable, RepresentsSubTree) == 8 * sizeof(void*));
static_assert(offsetof(IPersistable::FnTable, Serialise) == 9 * sizeof(void*));
static_assert(offsetof(IPersistable::FnTable, Deserialise) == 10 * sizeof(void*));
static_assert(offsetof(IPersistable::FnTable, OnCreate) == 11 * sizeof(void*));
static_assert(offsetof(IPersistable::FnTable, GetPersistObjState) == 12 * sizeof(void*));
static_assert(sizeof(IPersistable::FnTable) == 13 * sizeof(void*));
static_assert(sizeof(ptr<IPersistable>) == 2 * sizeof(void*));
static_assert(sizeof(IPersistable) == 2 * sizeof(void*));
static_assert(!std::is_polymorphic_v<SmallMap> && !std::is_polymorphic_v<SmallMapLeafNode>);

template <class T>
class StoreObject : public ::testing::Test {
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
TYPED_TEST_SUITE(StoreObject, AllClasses);

template <class T>
class Dirtied {
 public:
  explicit Dirtied(T& object) : m_object(object) { m_object.m_objSysState.SetFlag(ObjSysState::kDirtyFlag); }
  ~Dirtied() { m_object.m_objSysState.ClearFlag(ObjSysState::kDirtyFlag); }

 private:
  T& m_object;
};

TYPED_TEST(StoreObject, StartsWithoutStateOrIdentity) {
  TypeParam object;
  EXPECT_EQ(object.m_objSysState.m_cspace, nullptr);
  EXPECT_FALSE(object.m_objSysState.marked_);
  EXPECT_EQ(object.m_objSysState.objflags_, 0u);
  EXPECT_EQ(object.m_objSysState.m_size, 0);
  EXPECT_EQ(object.m_objSysState.m_lastTouchedTime, 0);
  EXPECT_TRUE(object.m_persistObjState.m_oid.IsNull());
  EXPECT_FALSE(object.IsDirty());
}

TYPED_TEST(StoreObject, DirtyIsFlagOne) {
  TypeParam object;
  {
    const Dirtied<TypeParam> dirtied(object);
    EXPECT_TRUE(object.IsDirty());
    EXPECT_EQ(object.m_objSysState.objflags_, 2u);
  }
  EXPECT_FALSE(object.IsDirty());
}

TYPED_TEST(StoreObject, ACopyIsNewAndAnAssignedToObjectKeepsItsState) {
  const auto made = std::make_unique<TypeParam>();
  TypeParam& source = *made;
  CSpace* const somewhere = reinterpret_cast<CSpace*>(&source);
  source.m_objSysState.m_cspace = somewhere;
  source.m_objSysState.marked_ = true;
  source.m_objSysState.m_size = 5;
  source.m_objSysState.m_lastTouchedTime = 6;
  source.m_persistObjState.m_oid = OID(7);
  TypeParam target;
  target.m_persistObjState.m_oid = OID(8);
  {
    const Dirtied<TypeParam> dirtied(source);
    const ObjSysState_2 copiedState(source.m_objSysState);
    EXPECT_EQ(copiedState.objflags_, 0u);
    const TypeParam copy(source);
    EXPECT_FALSE(copy.IsDirty());
    EXPECT_EQ(copy.m_objSysState.m_cspace, nullptr);
    EXPECT_FALSE(copy.m_objSysState.marked_);
    EXPECT_EQ(copy.m_objSysState.m_size, 0);
    EXPECT_EQ(copy.m_objSysState.m_lastTouchedTime, 0);
    EXPECT_TRUE(copy.m_persistObjState.m_oid.IsNull());
  }
  // A map's assignment marks both maps; the host owns neither, so the flags stay as they are.
  target.m_objSysState = source.m_objSysState;
  target.m_persistObjState = source.m_persistObjState;
  EXPECT_EQ(target.m_objSysState.m_cspace, nullptr);
  EXPECT_EQ(target.m_objSysState.m_size, 0);
  EXPECT_EQ(target.m_persistObjState.m_oid, OID(8));
}

TYPED_TEST(StoreObject, AssigningADirtyOneToACleanOneLeavesItCleanWithItsId) {
  if constexpr (!requires {
                  typename TypeParam::iterator;
                }) {  // a node; a map's assignment is a change of its own
    const auto made = std::make_unique<TypeParam>();
    TypeParam& source = *made;
    TypeParam target;
    target.m_persistObjState.m_oid = OID(8);
    const Dirtied<TypeParam> dirtied(source);
    target = source;
    EXPECT_FALSE(target.IsDirty());
    EXPECT_EQ(target.m_persistObjState.m_oid, OID(8));
  }
}

TYPED_TEST(StoreObject, ItsTablesForwardToIt) {
  TypeParam object;
  const auto* const table = IPersistable::Stubs<TypeParam>::GetTable();
  EXPECT_EQ(IPersistable::Stubs<TypeParam>::GetTable(), table);
  const auto* const objectTable = IObject::Stubs<TypeParam>::GetTable();
  EXPECT_EQ(IObject::Stubs<TypeParam>::GetTable(), objectTable);
  for (const IObject::FnTable* t : {objectTable, &table->_IObject}) {
    EXPECT_EQ(t->GetReflectedClass(&object), GetReflectedClass<TypeParam>());
    EXPECT_EQ(t->GetSysState(&object), &object.m_objSysState);
    t->OnGarbageCollect(&object);
  }
  EXPECT_EQ(this->host.log().Count(HostCall::kCollect), 2);
  EXPECT_EQ(std::memcmp(objectTable, &table->_IObject, sizeof(*objectTable)), 0);
  EXPECT_EQ(table->GetPersistObjState(&object), &object.m_persistObjState);
  EXPECT_EQ(&object.GetSysState(), &object.m_objSysState);
  EXPECT_EQ(&object.GetPersistObjState(), &object.m_persistObjState);
  EXPECT_EQ(object.GetThisAsFinalClass(), &object);
  EXPECT_TRUE(table->RepresentsSubTree(&object));
  const Bytes before = RecordOf(ptr<IPersistable>(&object));
  table->OnCreate(&object, true);
  table->OnCreate(&object, false);
  EXPECT_EQ(RecordOf(ptr<IPersistable>(&object)), before);
  EXPECT_FALSE(object.IsDirty());
}

TYPED_TEST(StoreObject, OffersItsTwoInterfacesByTheIdentityOfTheirRecords) {
  TypeParam object;
  const auto* const table = IPersistable::Stubs<TypeParam>::GetTable();
  for (const auto query : {table->_IObject.QueryInterface, table->_IObject.BindInterface}) {
    const AnyInterface asObject = query(&object, GetReflectedInterface<IObject>());
    EXPECT_EQ(asObject.m_self, &object);
    EXPECT_EQ(asObject.m_table, IObject::Stubs<TypeParam>::GetTable());
    const AnyInterface asPersistable = query(&object, GetReflectedInterface<IPersistable>());
    EXPECT_EQ(asPersistable.m_self, &object);
    EXPECT_EQ(asPersistable.m_table, table);
    const ReflectedInterface sameName{GetReflectedInterface<IObject>().m_name};
    const AnyInterface none = query(&object, sameName);
    EXPECT_EQ(none.m_self, nullptr);
    EXPECT_EQ(none.m_table, nullptr);
  }
}

TYPED_TEST(StoreObject, APersistableIsAnObjectThroughThePrefixOfItsTable) {
  TypeParam object;
  IPersistable persistable;
  persistable.CoerceFrom(&object);
  EXPECT_EQ(persistable.m_self, &object);
  EXPECT_EQ(persistable.m_table, IPersistable::Stubs<TypeParam>::GetTable());
  const IObject asObject = persistable;
  EXPECT_EQ(asObject.m_self, &object);
  EXPECT_EQ(asObject.m_table, &persistable.m_table->_IObject);
  IObject assigned;
  assigned.AssignFrom(asObject);
  EXPECT_EQ(assigned.m_self, asObject.m_self);
  EXPECT_EQ(assigned.m_table, asObject.m_table);
  IPersistable other;
  other.AssignFrom(persistable);
  EXPECT_EQ(other.m_self, persistable.m_self);
  EXPECT_EQ(other.m_table, persistable.m_table);
}

TYPED_TEST(StoreObject, IsCreatedUnregisteredAndDestroyedThroughItsTable) {
  const std::int64_t before = LiveAllocations();
  const ptr<IObject> created = TypeParam::sfnCreateInstance();
  EXPECT_EQ(created.m_table, &IPersistable::Stubs<TypeParam>::GetTable()->_IObject);
  EXPECT_EQ(created.Table()->GetReflectedClass(created.m_self), GetReflectedClass<TypeParam>());
  EXPECT_TRUE(static_cast<TypeParam*>(created.m_self)->m_persistObjState.m_oid.IsNull());
  created.Table()->Destroy(created.m_self);
  created.Table()->Destroy(nullptr);
  TypeParam::Destroy(nullptr);
  EXPECT_EQ(LiveAllocations(), before);
  EXPECT_EQ(this->host.log().FullText(), "");
}

TYPED_TEST(StoreObject, IsNotDestroyedWhileDirty) {
  TypeParam* const object = new TypeParam;
  {
    const Dirtied<TypeParam> dirtied(*object);
    EXPECT_ASSERTION(delete object, "!IsDirty()");
  }
  delete object;
}

TEST(ObjectFlags, AreBitsOfTheirNumber) {
  ObjSysState state;
  for (int i = 0; i < 32; ++i) {
    EXPECT_FALSE(state.GetFlag(i));
    state.SetFlag(i);
    EXPECT_TRUE(state.GetFlag(i));
    EXPECT_EQ(state.objflags_, std::uint32_t{1} << i);
    state.ClearFlag(i);
  }
  EXPECT_EQ(state.objflags_, 0u);
}

TEST(ObjectLayout, FollowsTheOrderOfTheMixins) {
  const SmallMap map;
  const auto offset = [&](const void* member) {
    return static_cast<const std::byte*>(member) - reinterpret_cast<const std::byte*>(&map);
  };
  EXPECT_EQ(offset(&map.m_objSysState), 0);
  EXPECT_LT(offset(&map.m_objSysState), offset(&map.m_persistObjState));
  EXPECT_LT(offset(&map.m_persistObjState), offset(&map.m_size));
  EXPECT_LT(offset(&map.m_size), offset(&map.m_firstLeaf));
  EXPECT_LT(offset(&map.m_firstLeaf), offset(&map.m_lastLeaf));
  EXPECT_LT(offset(&map.m_lastLeaf), offset(&map.m_root));
  EXPECT_LT(offset(&map.m_root), offset(&map.m_height));
}

TEST(ObjectLayout, APayloadLiesBehindItsKey) {
  SmallMapLeafNode leaf;
  const auto* const entry = reinterpret_cast<const std::byte*>(leaf.m_entrys.Slot(1));
  EXPECT_EQ(reinterpret_cast<const std::byte*>(&leaf.m_entrys.Slot(1)->second) - entry,
            SmallMap::GetPayloadOffset());
}

TEST(Collection, CallsTheHostOnceForEachObject) {
  RecordingHost host;
  Hosted<SmallMap> map(host);
  map->OnGarbageCollect();
  EXPECT_EQ(host.log().FullText(), "collect map\n");
}

}  // namespace
}  // namespace vemo::test
