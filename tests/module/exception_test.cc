// Operations that are left by an exception at each point where one can arise: a store call that is refused,
// an allocation that fails. Nothing may leak or die twice, and the host must hear of every change that was
// left half-way.
#include <functional>
#include <new>
#include <utility>
#include <vector>

#include "tests/module/map_fixture.h"
#include "tests/support/failing_allocator.h"
#include "tests/support/small_map.h"
#include "vxOperation/src/WorkingSet/CompOp/FieldMapFill.h"

namespace vemo::test {
namespace {

// Tells where an operation that changes the map begins: what a scenario prepares before (keys, payloads,
// positions) may fail without a word to the host.
class Beginning {
 public:
  void operator()() { m_begun = true; }
  bool HasBegun() const { return m_begun; }

 private:
  bool m_begun = false;
};

struct Scenario {
  const char* m_name;
  const char* m_tree;
  std::function<void(SmallMap&, Beginning&)> m_operation;
};

void PrintTo(const Scenario& scenario, std::ostream* out) {
  *out << scenario.m_name;
}

std::function<void(SmallMap&, Beginning&)> InsertKey(std::uint64_t n) {
  return [n](SmallMap& map, Beginning& begin) {
    const FieldId key = LongKey(n);
    const CountedPayload payload(7);
    begin();
    map.Insert(key, payload, true);
  };
}
std::function<void(SmallMap&, Beginning&)> InsertValue(std::uint64_t n) {
  return [n](SmallMap& map, Beginning& begin) {
    const SmallMap::value_type value(LongKey(n), CountedPayload(7));
    begin();
    map.insert(value);
  };
}
std::function<void(SmallMap&, Beginning&)> DeleteKey(std::uint64_t n) {
  return [n](SmallMap& map, Beginning& begin) {
    const FieldId key = LongKey(n);
    begin();
    map.Delete(key);
  };
}
void Clear(SmallMap& map, Beginning& begin) {
  begin();
  map.clear();
}

constexpr const char* kFullRoot = "([1 2] 3 [3 4] 5 [5 6 7 8] 10 [10 11] 12 [12 13])";
constexpr const char* kTwoParents = "(([1 2] 3 [3 4] 5 [5 6 7]) 10 ([10 11] 12 [12 13] 14 [14 15]))";

const Scenario kScenarios[] = {
    {"FirstInsertion", "-", InsertKey(1)},
    {"FirstInsertionOfAValue", "-", InsertValue(1)},
    {"Subscript", "[1 3]",
     [](SmallMap& map, Beginning& begin) {
       const FieldId key = LongKey(2);
       begin();
       map[key];
     }},
    {"InsertionWithRoom", "[1 3]", InsertKey(2)},
    {"ReplacedPayload", "[1 3]", InsertKey(1)},
    {"PayloadInsideTheLeafThatSplits", "[1 3 4 5]",
     [](SmallMap& map, Beginning& begin) {
       const FieldId key = LongKey(2);
       const CountedPayload& inside = *map.rFind(LongKey(4));
       begin();
       map.Insert(key, inside, false);
     }},
    {"RootLeafSplit", "[1 2 3 4]", InsertKey(5)},
    {"RootLeafSplitLeft", "[1 3 4 5]", InsertKey(2)},
    {"LeafSplitInTheMiddle", "([1 2 3 4] 10 [10 11])", InsertKey(5)},
    {"LastLeafSplit", "([1 2] 10 [10 11 12 13])", InsertKey(14)},
    {"RootSplitRight", "([1 2] 3 [3 4] 5 [5 6] 10 [10 11] 12 [12 13 14 15])", InsertKey(16)},
    {"RootSplitMedian", kFullRoot, InsertKey(9)},
    {"RootSplitLeft", "([1 2 3 4] 5 [5 6] 7 [7 8] 10 [10 11] 12 [12 13])", InsertKey(0)},
    {"LeafBorrowsFromTheRight", "([1 2] 3 [3 4 5])", DeleteKey(1)},
    {"LeafBorrowsFromTheLeft", "([1 2 3] 4 [4 5])", DeleteKey(5)},
    {"LeafBorrowsFromALeftCousin", kTwoParents, DeleteKey(10)},
    {"LeafBorrowsFromARightCousin", "(([1 2] 3 [3 4] 5 [5 6]) 10 ([10 11 12] 13 [13 14] 15 [15 16]))",
     DeleteKey(6)},
    {"LeafMergesLeft", "([1 2] 3 [3 4] 5 [5 6])", DeleteKey(3)},
    {"LeafMergesRight", "([1 2] 3 [3 4] 5 [5 6])", DeleteKey(1)},
    {"LastLeafMerges", "([1 2] 3 [3 4] 5 [5 6])", DeleteKey(6)},
    {"RootCollapses", "([1 2] 3 [3 4])", DeleteKey(4)},
    {"InternalNodeBorrowsFromTheRight",
     "(([1 2] 3 [3 4] 5 [5 6]) 10 ([10 11] 12 [12 13] 14 [14 15] 16 [16 17]))", DeleteKey(1)},
    {"InternalNodeBorrowsFromTheLeft", "(([1 2] 3 [3 4] 5 [5 6] 7 [7 8]) 10 ([10 11] 12 [12 13] 14 [14 15]))",
     DeleteKey(15)},
    {"InternalNodesMergeRightAndTheRootCollapses",
     "(([1 2] 3 [3 4] 5 [5 6]) 10 ([10 11] 12 [12 13] 14 [14 15]))", DeleteKey(1)},
    {"InternalNodesMergeLeft",
     "(([1 2] 3 [3 4] 5 [5 6]) 10 ([10 11] 12 [12 13] 14 [14 15]) 20 ([20 21] 22 [22 23] 24 [24 25]))",
     DeleteKey(12)},
    {"EraseByIterator", "([1 2] 3 [3 4] 5 [5 6])",
     [](SmallMap& map, Beginning& begin) {
       const auto first = map.cbegin();
       begin();
       map.erase(first);
     }},
    {"EraseOfARange", "([1 2] 3 [3 4] 5 [5 6])",
     [](SmallMap& map, Beginning& begin) {
       const auto first = map.cbegin();
       const auto last = map.cend();
       begin();
       map.erase(first, last);
     }},
    {"ClearOfAnEmptyMap", "-", Clear},
    {"ClearOfALeaf", "[1 2]", Clear},
    {"ClearAtHeightTwo", kTwoParents, Clear},
    {"SelfAssignment", kTwoParents,
     [](SmallMap& map, Beginning& begin) {
       const SmallMap& same = map;
       begin();
       map = same;
     }},
    {"Swap", kTwoParents,
     [](SmallMap& map, Beginning& begin) {
       SmallMap other;
       begin();
       map.swap(other);
     }},
    {"MoveAssignment", kTwoParents,
     [](SmallMap& map, Beginning& begin) {
       begin();
       map = SmallMap();
     }},
    {"InsertionOfAPayloadToBeMoved", "[1 3 4 5]",
     [](SmallMap& map, Beginning& begin) {
       const FieldId key = LongKey(2);
       CountedPayload payload(7);
       begin();
       map.Insert(key, std::move(payload), false);
     }},
    {"Edit", "([1 2] 3 [3 4])",
     [](SmallMap& map, Beginning& begin) {
       const FieldId key = LongKey(3);
       begin();
       map.Edit(key, [](CountedPayload& payload) { payload = CountedPayload(7); });
     }},
    {"BulkLoad", "[]",
     [](SmallMap& map, Beginning& begin) {
       std::vector<std::pair<FieldId, CountedPayload>> entries;
       entries.reserve(13);
       for (std::uint32_t n = 1; n <= 13; ++n) entries.emplace_back(LongKey(n), CountedPayload(n));
       begin();
       map.BulkLoad(entries.begin(), entries.end(), 0.75);
     }},
    {"WriteLookUpWithoutCreation", "([1 2] 3 [3 4])",
     [](SmallMap& map, Beginning& begin) {
       const FieldId key = LongKey(9);
       SmallMap::wFindRet ret;
       begin();
       map.wFind(ret, key, false);
     }},
    {"Find", kTwoParents, [](SmallMap& map, Beginning&) { map.find(LongKey(99)); }},
    {"Iteration", kTwoParents,
     [](SmallMap& map, Beginning&) {
       for (const auto& entry : std::as_const(map)) EXPECT_LT(entry.second.value(), 100u);
     }},
};

class Interruption : public ::testing::TestWithParam<Scenario> {};

std::string NameOfScenario(const ::testing::TestParamInfo<Scenario>& info) {
  return info.param.m_name;
}

enum class Failure { kHostCall, kAllocation };
enum class Residency { kInMemory, kUnloaded };

// Runs the scenario with the nth point of failure failing. Returns false when there are fewer points than n.
bool FailsAt(const Scenario& scenario, Failure failure, Residency residency, int n) {
  SCOPED_TRACE("point of failure " + std::to_string(n));
  const std::int64_t allocations = LiveAllocations();
  const std::int64_t payloads = CountedPayload::NumLive();
  bool threw = false;
  {
    Beginning beginning;
    RecordingHost host;
    Hosted<SmallMap> map(host);
    TreeBuilder<SmallMap>::Build(*map, scenario.m_tree, LongKey);
    host.CleanAll();
    if (residency == Residency::kUnloaded) host.UnloadAll();
    host.log().Clear();
    try {
      if (failure == Failure::kHostCall) {
        host.ThrowAtCall(n);
        scenario.m_operation(*map, beginning);
      } else {
        const FailingAllocation failing(n);
        scenario.m_operation(*map, beginning);
      }
    } catch (const HostFailure&) {
      threw = true;
    } catch (const std::bad_alloc&) {
      threw = true;
    }
    host.ThrowAtCall(0);
    EXPECT_EQ(host.log().Count(HostCall::kInterrupted) > 0, threw && beginning.HasBegun())
        << host.log().FullText();
    if (!threw) {
      EXPECT_EQ(CheckTree(*map), "");
    }
    EXPECT_EQ(host.Faults(), "");
  }
  EXPECT_EQ(CountedPayload::NumLive(), payloads);
  EXPECT_EQ(LiveAllocations(), allocations);
  return threw;
}

constexpr int kManyFailures = 1000;  // more than any scenario has

// How many points of failure the scenario has, each of which was made to fail.
int NumFailures(const Scenario& scenario, Failure failure, Residency residency) {
  int n = 1;
  while (n <= kManyFailures && FailsAt(scenario, failure, residency, n)) ++n;
  return n - 1;
}

TEST_P(Interruption, ByARefusedStoreCallLeaksNothingAndIsReported) {
  EXPECT_LT(NumFailures(GetParam(), Failure::kHostCall, Residency::kInMemory), kManyFailures);
}

TEST_P(Interruption, ByANodeThatCannotBeLoadedLeaksNothingAndIsReported) {
  const int failures = NumFailures(GetParam(), Failure::kHostCall, Residency::kUnloaded);
  EXPECT_GT(failures, 0);
  EXPECT_LT(failures, kManyFailures);
}

TEST_P(Interruption, ByAFailedAllocationLeaksNothingAndIsReported) {
  EXPECT_LT(NumFailures(GetParam(), Failure::kAllocation, Residency::kInMemory), kManyFailures);
}

INSTANTIATE_TEST_SUITE_P(Operations, Interruption, ::testing::ValuesIn(kScenarios), NameOfScenario);

TEST(InternalSplits, FreeTheKeyThatTheSplitEntryHeld) {
  const std::int64_t allocations = LiveAllocations();
  {
    RecordingHost host;
    Hosted<SmallMap> map(host);
    TreeBuilder<SmallMap>::Build(*map, "([1 2] 10 [10 11] 20 [20 21] 30 [30 31] 40 [40 41])", LongKey);
    SmallMapInternalKeyEntry entry;
    entry.m_key = LongKey(50);
    entry.m_ptr = host.Find<SmallMapLeafNode>("leaf1");
    SmallMapInternalKeyEntry splitEntry;
    splitEntry.m_key = LongKey(99);
    map->InsertIntoInternalNode(host.Find<SmallMapInternalNode>("node1"), entry, splitEntry);
    EXPECT_EQ(splitEntry.m_key, LongKey(30));
    EXPECT_EQ(splitEntry.m_ptr.Get(), host.Find("node2"));
  }
  EXPECT_EQ(LiveAllocations(), allocations);
}

}  // namespace
}  // namespace vemo::test
