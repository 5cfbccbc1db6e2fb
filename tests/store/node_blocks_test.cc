#include "store/node_blocks.h"

#include <gtest/gtest.h>

#include "store/object_state.h"
#include "vxOperation/src/WorkingSet/CompOp/VectorOT.h"

namespace vemo {
namespace {

using Leaf = FieldIdToVectorInsertionsMapLeafNode;
using OtherLeaf = FieldIdToVectorTombstonesMapLeafNode;

constexpr std::size_t kLeafBytes = sizeof(Leaf);

template <class Node>
const ClassEntry& ClassOf() {
  RegisterMapClasses();
  return *FindClass(IPersistable::Stubs<Node>::GetTable());
}

class NodeBlocksTest : public testing::Test {
 protected:
  void SetUp() override {
    blocks.End(blocks.Create(ClassOf<Leaf>()), kLeafBytes);
    if (blocks.bytes() == 0) GTEST_SKIP() << "under AddressSanitizer nothing is kept";
    blocks.Clear();
  }

  NodeBlocks blocks;
};

TEST_F(NodeBlocksTest, TheNextNodeOfAClassTakesTheMemoryOfTheLast) {
  const ptr<IPersistable> first = blocks.Create(ClassOf<Leaf>());
  static_cast<Leaf*>(first.m_self)->m_prev.m_oid = OID(7);
  SysStateOf(first).SetFlag(ObjSysState::kDirtyFlag);
  blocks.End(first, kLeafBytes);
  EXPECT_EQ(blocks.bytes(), kLeafBytes);
  const ptr<IPersistable> next = blocks.Create(ClassOf<Leaf>());
  EXPECT_EQ(blocks.bytes(), 0u);
  EXPECT_EQ(next.m_self, first.m_self);
  EXPECT_FALSE(static_cast<Leaf*>(next.m_self)->m_prev);
  EXPECT_FALSE(SysStateOf(next).GetFlag(ObjSysState::kDirtyFlag));
  DestroyObject(next);
}

TEST_F(NodeBlocksTest, ANodeOfAnotherClassGetsMemoryOfItsOwn) {
  const ptr<IPersistable> first = blocks.Create(ClassOf<Leaf>());
  blocks.End(first, kLeafBytes);
  const ptr<IPersistable> other = blocks.Create(ClassOf<OtherLeaf>());
  EXPECT_NE(other.m_self, first.m_self);
  EXPECT_EQ(blocks.bytes(), kLeafBytes);
  EXPECT_EQ(other.Table(), ClassOf<OtherLeaf>().table);
  DestroyObject(other);
}

TEST_F(NodeBlocksTest, KeepsNoMoreThanItMay) {
  const ptr<IPersistable> first = blocks.Create(ClassOf<Leaf>()), second = blocks.Create(ClassOf<Leaf>());
  blocks.End(first, 2 * kLeafBytes - 1);
  blocks.End(second, 2 * kLeafBytes - 1);
  EXPECT_EQ(blocks.bytes(), kLeafBytes);
  blocks.Clear();
  EXPECT_EQ(blocks.bytes(), 0u);
}

}  // namespace
}  // namespace vemo
