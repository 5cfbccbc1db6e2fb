// Persistent references and interface pointers.
#include <algorithm>
#include <utility>

#include "tests/module/map_fixture.h"
#include "tests/support/small_map.h"

namespace vemo::test {
namespace {

class Reference : public MapFixture<SmallMap> {
 protected:
  Reference() { Build("([1 2] 10 [10 11])"); }
};

TEST(InterfacePointer, StartsNullAndTakesObjectAndTable) {
  const ptr<IPersistable> none;
  EXPECT_EQ(none.m_self, nullptr);
  EXPECT_EQ(none.m_table, nullptr);
  const ptr<IObject> fromNull = null;
  EXPECT_EQ(fromNull.m_self, nullptr);
  EXPECT_EQ(fromNull.m_table, nullptr);
  EXPECT_EQ(static_cast<void*>(null), nullptr);

  SmallMapLeafNode leaf;
  const ptr<IPersistable> persistable(&leaf);
  EXPECT_EQ(persistable.m_self, &leaf);
  EXPECT_EQ(persistable.m_table, IPersistable::Stubs<SmallMapLeafNode>::GetTable());
  const ptr<IObject> object(&leaf);
  EXPECT_EQ(object.m_table, IObject::Stubs<SmallMapLeafNode>::GetTable());
  const ptr<const IPersistable> constant = persistable;
  EXPECT_EQ(constant.m_self, &leaf);
  EXPECT_EQ(constant.m_table, persistable.m_table);
  EXPECT_EQ(static_cast<void*>(constant), &leaf);
  ptr<const IPersistable> coerced;
  coerced.CoerceFrom(&std::as_const(leaf));
  EXPECT_EQ(coerced.m_self, &leaf);
  EXPECT_EQ(coerced.m_table, persistable.m_table);
}

static_assert(!std::is_constructible_v<ptr<IPersistable>, ptr<const IPersistable>>);
static_assert(!std::is_constructible_v<ptr<IPersistable>, const SmallMapLeafNode*>);
static_assert(!std::is_constructible_v<ptr<IPersistable>, void*>);

TEST_F(Reference, AnEmptyOneYieldsNull) {
  const cref<SmallMapLeafNode> typed;
  const cref<void> untyped;
  EXPECT_FALSE(typed);
  EXPECT_FALSE(untyped);
  EXPECT_EQ(typed.Get(), nullptr);
  EXPECT_EQ(untyped.Get(), nullptr);
  EXPECT_TRUE(typed.m_oid.IsNull());
  EXPECT_ASSERTION(typed.GetNotNull(), "m_ptr");
  EXPECT_ASSERTION(untyped.GetNotNull(), "m_ptr");
  EXPECT_EQ(host.log().FullText(), "");
}

TEST_F(Reference, AssignmentOfAnObjectBindsItAndRecordsItsId) {
  cref<SmallMapLeafNode> typed;
  EXPECT_EQ(&(typed = Leaf(1)), &typed);
  EXPECT_TRUE(typed);
  EXPECT_EQ(typed.Get(), Leaf(1));
  EXPECT_EQ(typed.GetNotNull(), Leaf(1));
  EXPECT_EQ(typed->m_numKeyEntrys, 2);
  EXPECT_EQ(typed.m_oid, Leaf(1)->m_persistObjState.m_oid);
  cref<void> untyped;
  EXPECT_EQ(&(untyped = Node(1)), &untyped);
  EXPECT_EQ(untyped.Get(), Node(1));
  EXPECT_EQ(untyped.m_ptr.m_table, IPersistable::Stubs<SmallMapInternalNode>::GetTable());
  EXPECT_EQ(host.log().FullText(), "set leaf1\nset node1\n");
}

TEST_F(Reference, UntypedAssignmentTakesNullAlone) {
  cref<void> reference;
  reference = Leaf(1);
  EXPECT_EQ(&(reference = static_cast<void*>(nullptr)), &reference);
  EXPECT_FALSE(reference);
  EXPECT_EQ(reference.Get(), nullptr);
  reference = Leaf(1);
  reference = nullptr;
  EXPECT_FALSE(reference);
  EXPECT_ASSERTION(reference = static_cast<void*>(Leaf(1)), "!p");
}

TEST_F(Reference, SettingANullObjectClears) {
  cref<SmallMapLeafNode> reference;
  reference = Leaf(1);
  host.log().Clear();
  reference = nullptr;
  EXPECT_FALSE(reference);
  EXPECT_EQ(host.log().FullText(), "clear\n");
}

TEST_F(Reference, CopiesAndSwapsMoveTheWordsWithoutACall) {
  cref<SmallMapLeafNode> a;
  a = Leaf(1);
  cref<SmallMapLeafNode> b;
  b = Leaf(2);
  cref<void> c;
  c = Node(1);
  cref<void> d;
  host.log().Clear();
  const cref<SmallMapLeafNode> copy(a);
  EXPECT_EQ(copy.m_oid, a.m_oid);
  EXPECT_EQ(copy.m_ptr.m_self, a.m_ptr.m_self);
  EXPECT_EQ(copy.m_ptr.m_table, a.m_ptr.m_table);
  swap(a, b);
  EXPECT_EQ(a.Get(), Leaf(2));
  EXPECT_EQ(b.Get(), Leaf(1));
  swap(c, d);
  EXPECT_FALSE(c);
  EXPECT_EQ(d.Get(), Node(1));
  d = c;
  EXPECT_FALSE(d);
  EXPECT_EQ(host.log().FullText(), "");
  EXPECT_EQ(host.DirtyNames(), "");
}

TEST_F(Reference, AnUnboundOneLoadsOnceAndStaysBound) {
  host.UnloadAll();
  host.log().Clear();
  EXPECT_TRUE(map.m_firstLeaf);
  EXPECT_EQ(host.log().FullText(), "");
  EXPECT_EQ(map.m_firstLeaf.Get()->m_numKeyEntrys, 2);
  EXPECT_EQ(map.m_firstLeaf.Get(), Leaf(1));
  EXPECT_EQ(map.m_lastLeaf->m_numKeyEntrys, 2);
  EXPECT_EQ(host.log().FullText(), "load leaf1\nload leaf2\n");
}

TEST_F(Reference, AnObjectOfAnotherClassThanExpectedIsTheHostsError) {
  host.UnloadAll();
  map.m_firstLeaf.m_oid = map.m_root.m_oid;
  EXPECT_THROW(map.m_firstLeaf.Get(), HostFailure);
  map.MarkAsDirtyWithoutTrace();
}

TEST_F(Reference, ComparesWithObjectsById) {
  cref<SmallMapLeafNode> reference;
  reference = Leaf(1);
  EXPECT_TRUE(reference == ptr<const IObject>(Leaf(1)));
  EXPECT_FALSE(reference == ptr<const IObject>(Leaf(2)));
  EXPECT_TRUE(reference != ptr<const IObject>(Leaf(2)));
  EXPECT_FALSE(reference != ptr<const IObject>(Leaf(1)));
  const cref<SmallMapLeafNode> empty;
  EXPECT_TRUE(empty != ptr<const IObject>(Leaf(1)));
}

TEST_F(Reference, ANewNodeIsRegisteredAndReturned) {
  SmallMapLeafNode* const leaf = ::new SmallMapLeafNode;
  EXPECT_EQ(DollarNew(leaf), leaf);
  EXPECT_EQ(Calls(), "register leaf3\n");
  EXPECT_FALSE(leaf->IsDirty());
  EXPECT_FALSE(leaf->m_persistObjState.m_oid.IsNull());
}

TEST(NewNodes, AreEmpty) {
  SmallMapLeafNode leaf;
  EXPECT_FALSE(leaf.m_prev);
  EXPECT_FALSE(leaf.m_next);
  EXPECT_EQ(leaf.m_numKeyEntrys, 0);
  SmallMapInternalNode node;
  EXPECT_FALSE(node.m_ptr);
  EXPECT_EQ(node.m_numKeyEntrys, 0);
}

TEST(InternalKeyEntry, StartsEmptyAndSwapsItsWholeContents) {
  SmallMapInternalKeyEntry a;
  EXPECT_EQ(a.m_key, FieldId());
  EXPECT_FALSE(a.m_ptr);
  a.m_key = LongKey(1);
  a.m_ptr.m_oid = OID(11);
  SmallMapInternalKeyEntry b(a);
  b.m_key = Key(2);
  b.m_ptr.m_oid = OID(22);
  a.swap(b);
  EXPECT_EQ(a.m_key, Key(2));
  EXPECT_EQ(a.m_ptr.m_oid, OID(22));
  EXPECT_EQ(b.m_key, LongKey(1));
  EXPECT_EQ(b.m_ptr.m_oid, OID(11));
}

}  // namespace
}  // namespace vemo::test
