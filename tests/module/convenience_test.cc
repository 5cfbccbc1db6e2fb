// What a map offers beside the basic operations: moving, rvalue payloads, editing in place, ranges, loading.
#include <limits>
#include <memory>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

#include "platform/error.h"
#include "tests/module/map_fixture.h"
#include "tests/support/small_map.h"
#include "vxOperation/src/WorkingSet/CompOp/FieldMapFill.h"
#include "vxOperation/src/WorkingSet/CompOp/VectorOT.h"

namespace vemo::test {
namespace {

class Convenience : public MapFixture<SmallMap> {};

TEST_F(Convenience, AMovedFromMapIsEmptyAndMarkedAndItsNodesStay) {
  Build("([1 2] 10 [10 11])");
  SmallMap moved(std::move(map));
  EXPECT_EQ(TreeText(moved), "([1 2] 10 [10 11])");
  EXPECT_EQ(Tree(), "-");
  EXPECT_EQ(host.DirtyNames(), "map");
  EXPECT_EQ(host.log().LifecycleText().find("delete"), std::string::npos);
}

TEST_F(Convenience, MoveAssignmentDeletesTheOldTreeAndTakesTheOther) {
  Build("([1 2] 10 [10 11])");
  Hosted<SmallMap> other(host, "other");
  other->insert({Key(7), MakePayload(70)});
  host.CleanAll();
  host.log().Clear();
  *other = std::move(map);
  EXPECT_EQ(TreeText(*other), "([1 2] 10 [10 11])");
  EXPECT_EQ(Tree(), "-");
  EXPECT_EQ(Calls(), "delete-tree leaf3\ndirty other\ndirty map\n");
}

TEST_F(Convenience, MoveAssignmentToItselfChangesNothing) {
  Build("[1 2]");
  SmallMap& same = map;
  map = std::move(same);
  EXPECT_EQ(Tree(), "[1 2]");
  EXPECT_EQ(Calls(), "");
}

TEST_F(Convenience, EditMarksTheLeafOnceAndChangesThePayloadInPlace) {
  Build("([1 2] 10 [10 11])");
  EXPECT_TRUE(map.Edit(Key(10), [](CountedPayload& payload) { payload = MakePayload(5); }));
  EXPECT_EQ(PayloadOf(*map.rFind(Key(10))), 5u);
  EXPECT_EQ(Calls(), "dirty leaf2\n");
}

TEST_F(Convenience, EditOfAMissingKeyMakesNoCallAndNoEntry) {
  int calls = 0;
  const auto count = [&calls](CountedPayload&) { ++calls; };
  EXPECT_FALSE(map.Edit(Key(1), count));
  EXPECT_EQ(Tree(), "-") << "an empty map gets no root leaf";
  Build("[1 2]");
  EXPECT_FALSE(map.Edit(Key(3), count));
  EXPECT_EQ(calls, 0);
  EXPECT_EQ(Calls(), "");
}

TEST_F(Convenience, AnEditThatThrowsIsReportedAsInterrupted) {
  Build("[1 2]");
  EXPECT_THROW(map.Edit(Key(1), [](CountedPayload&) { throw std::runtime_error("change"); }), std::runtime_error);
  EXPECT_EQ(Calls(), "dirty leaf1\ninterrupted map\n");
}

TEST_F(Convenience, EqualRangeHoldsTheKeyOrNothing) {
  Build("([1 2] 10 [10 11])");
  const auto [first, last] = map.equal_range(Key(2));
  EXPECT_EQ(first->first, Key(2));
  EXPECT_EQ(std::next(first), last);
  const auto [missing, end] = map.equal_range(Key(5));
  EXPECT_EQ(missing, end);
  EXPECT_EQ(missing->first, Key(10));
}

using Tombstones = FieldIdToVectorTombstonesMap;

class MapRange : public MapFixture<Tombstones> {
 protected:
  std::string Texts(const FieldMapRange<Tombstones::const_iterator>& range) const {
    std::string texts;
    for (const auto& [field, payload] : range) texts += FieldIdText(field) + ' ';
    return texts;
  }
  void Add(const FieldId& field) { map.insert({field, VectorTombstones()}); }
};

TEST_F(MapRange, FieldsOfAnObjectAreItsAlone) {
  for (const std::uint64_t object : {1u, 2u, 3u}) {
    Add({OID(object), Path{}});
    Add({OID(object), Path{0, 3}});
    Add({OID(object), Path{std::numeric_limits<std::uint32_t>::max()}});
  }
  EXPECT_EQ(Texts(map.FieldsOf(OID(2))), "2: 2:0.3 2:4294967295 ");
  EXPECT_TRUE(map.FieldsOf(OID(9)).empty());
}

TEST_F(MapRange, FieldsBelowAPrefixIncludeThePrefixAndEndBeforeItsNextSibling) {
  const std::uint32_t top = std::numeric_limits<std::uint32_t>::max();
  for (const Path& path : {Path{4}, Path{5}, Path{5, 0}, Path{5, top}, Path{5, top, 1}, Path{6}, Path{top}, Path{top, 2}}) {
    Add({OID(1), path});
  }
  Add({OID(2), Path{}});
  EXPECT_EQ(Texts(map.FieldsBelow({OID(1), Path{5}})), "1:5 1:5.0 1:5.4294967295 1:5.4294967295.1 ");
  EXPECT_EQ(Texts(map.FieldsBelow({OID(1), Path{5, top}})), "1:5.4294967295 1:5.4294967295.1 ");
  EXPECT_EQ(Texts(map.FieldsBelow({OID(1), Path{top}})), "1:4294967295 1:4294967295.2 ");
}

TEST_F(MapRange, TheLastObjectOfAllHasNoEndButTheMaps) {
  const OID last(std::numeric_limits<std::uint64_t>::max());
  Add({OID(1), Path{}});
  Add({last, Path{7}});
  EXPECT_EQ(Texts(map.FieldsOf(last)), "18446744073709551615:7 ");
}

TEST_F(MapRange, AnRvaluePayloadIsMovedAndNotCopied) {
  VectorTombstones payload;
  for (const ssize_t p : {3, 13, 23}) payload.Erasep(p, 4);  // more than lies in the payload itself
  const auto* runs = payload.m_tombstones.data();
  EXPECT_TRUE(map.Insert(Key(1), std::move(payload), false));
  EXPECT_EQ(map.rFind(Key(1))->m_tombstones.data(), runs);
}

TEST_F(MapRange, AnRvaluePayloadThatIsNotUsedStaysWithTheCaller) {
  map.Insert(Key(1), VectorTombstones(), false);
  VectorTombstones payload;
  payload.Erasep(3, 4);
  EXPECT_FALSE(map.Insert(Key(1), std::move(payload), false));
  EXPECT_EQ(payload.NumTombstones(), 4);
}

TEST_F(MapRange, AnRvaluePayloadOfTheLeafThatIsAboutToShiftArrivesWhole) {
  VectorTombstones payload;
  payload.Erasep(3, 4);
  map.Insert(Key(5), std::move(payload), false);
  EXPECT_TRUE(map.Insert(Key(1), std::move(map[Key(5)]), false));
  EXPECT_EQ(map.rFind(Key(1))->NumTombstones(), 4);
}

class BulkLoad : public MapFixture<SmallMap> {
 protected:
  static std::vector<SmallMap::value_type> Entries(std::uint64_t n) {
    std::vector<SmallMap::value_type> entries;
    for (std::uint64_t i = 1; i <= n; ++i) entries.emplace_back(LongKey(i), MakePayload(i));
    return entries;
  }
};

TEST_F(BulkLoad, FillsLeavesAsAskedAndIsSoundForEveryCount) {
  for (const double fill : {0.5, 0.75, 1.0}) {
    for (std::uint64_t n = 0; n <= 150; ++n) {
      const auto entries = Entries(n);
      RecordingHost& current = host;
      SmallMap loaded;
      loaded.BulkLoad(entries.begin(), entries.end(), fill);
      ASSERT_EQ(CheckTree(loaded), "") << n << " entries, fill " << fill;
      loaded.Validate();
      ASSERT_EQ(loaded.size(), static_cast<ssize_t>(n));
      std::uint64_t expected = 1;
      for (const auto& [key, payload] : std::as_const(loaded)) {
        ASSERT_EQ(key, LongKey(expected));
        ASSERT_EQ(PayloadOf(payload), expected++);
      }
      ASSERT_EQ(current.Faults(), "");
    }
  }
}

TEST_F(BulkLoad, FullLeavesHoldTwiceAsMuchAsAscendingInsertion) {
  const auto entries = Entries(64);
  map.BulkLoad(entries.begin(), entries.end());
  SmallMap inserted;
  for (const auto& entry : entries) inserted.insert(entry);
  EXPECT_EQ(map.m_firstLeaf->m_numKeyEntrys, 4);
  EXPECT_EQ(inserted.m_firstLeaf->m_numKeyEntrys, 2);
  EXPECT_EQ(map, inserted);
}

TEST_F(BulkLoad, WorksOnAnEmptiedMapAndGivesItsRootLeafBack) {
  map.insert({Key(1), MakePayload(1)});
  map.Delete(Key(1));
  Calls();
  const auto entries = Entries(3);
  map.BulkLoad(entries.begin(), entries.end());
  EXPECT_EQ(Tree(), "[1 2 3]");
  EXPECT_TRUE(host.IsDeleted("leaf1"));
}

TEST_F(BulkLoad, RefusesAMapWithEntriesAndKeysThatDoNotAscend) {
  const auto entries = Entries(3);
  std::vector<SmallMap::value_type> twice(entries);
  twice.push_back(entries.back());
  EXPECT_THROW(map.BulkLoad(twice.begin(), twice.end()), UsageError);
  EXPECT_NE(Calls().find("interrupted map"), std::string::npos);
  SmallMap full;
  full.insert(entries.front());
  EXPECT_THROW(full.BulkLoad(entries.begin(), entries.end()), UsageError);
  SmallMap empty;
  EXPECT_THROW(empty.BulkLoad(entries.begin(), entries.end(), 0.4), UsageError);
}

}  // namespace
}  // namespace vemo::test
