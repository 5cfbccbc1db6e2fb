// Ids of objects are never given out twice.
#include <optional>
#include <set>

#include "tests/store/store_fixture.h"

namespace vemo::test {
namespace {

using IdsTest = StoreTest;
INSTANTIATE_STORE_TEST(IdsTest);

TEST_P(IdsTest, AreUniqueOverAbortsCommitsAndReopening) {
  std::set<OID> given{OID()};
  const auto expectNew = [&](OID oid) {
    EXPECT_TRUE(given.insert(oid).second) << oid.m_value << " was given out twice";
  };
  for (int round = 0; round < 12; ++round) {
    std::optional<WriteTransaction> transaction(space());
    TombstonesMap stack;
    Fill(stack, 1, 3000);
    for (const OID oid : NodeIds(stack)) expectNew(oid);
    expectNew(transaction->Own<TombstonesMap>().GetPersistObjState().m_oid);
    if (round % 3 == 0) {
      auto& map = transaction->Root<TombstonesMap>("t");
      if (round == 0) expectNew(map.GetPersistObjState().m_oid);
      map.swap(stack);
      stack.clear();
      transaction->Commit();
    }
    transaction.reset();
    if (round % 4 == 1) site.Reopen();
  }
  EXPECT_GT(given.size(), 12 * 50u);
}

TEST_P(IdsTest, Have64Bits) {
  watch().idOffset = 0xFEDCBA9800000000;
  CommitFilled<TombstonesMap>(space(), "t", 7000);
  OID owned;
  {
    WriteTransaction transaction(space());
    auto& map = transaction.Own<TombstonesMap>();
    Fill(map, 1, 10);
    owned = map.GetPersistObjState().m_oid;
    transaction.Commit();
  }
  for (const auto& [oid, record] : Stored().records) EXPECT_GT(oid.m_value, 0xFEDCBA9800000000);
  site.Reopen();
  {
    WriteTransaction transaction(space());
    EXPECT_EQ(transaction.Owned<TombstonesMap>(owned).size(), 10);
    auto& map = transaction.Root<TombstonesMap>("t");
    EXPECT_EQ(map.size(), 7000);
    EXPECT_EQ(FaultsOf(map), "");
  }
  WriteTransaction transaction(space());
  transaction.Root<TombstonesMap>("t").clear();
  transaction.Commit();
  for (const OID oid : Stored().queue) EXPECT_GT(oid.m_value, 0xFEDCBA9800000000);
}

}  // namespace
}  // namespace vemo::test
