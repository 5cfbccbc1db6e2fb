// Random operations on a map and on a std::map beside it. At capacity 4 everything is compared after every
// operation.
#include <algorithm>
#include <iostream>
#include <optional>
#include <random>
#include <string>
#include <vector>

#include "tests/module/map_fixture.h"
#include "tests/support/map_model.h"
#include "tests/support/production_payloads.h"
#include "tests/support/repair_census.h"
#include "tests/support/seed.h"
#include "tests/support/small_map.h"

namespace vemo::test {
namespace {

// Eight fields an object, with paths of one to six steps: the last ones lie on the heap.
FieldId FieldOfObject(std::uint64_t n) {
  const auto step = static_cast<Path::Element>(n % 8);
  const Path path = step < 6 ? Path{step} : Path{5, 1, 2, 3, 4, step};
  return FieldId{OID(n / 8 + 1), path};
}

struct Phase {
  int m_operations;
  std::uint64_t m_insertions;  // of a hundred
  Order m_order;
};

// Grows, churns, shrinks to nothing.
std::vector<Phase> PhasesOf(Order order, Order deletion, int scale) {
  return {{scale, 95, order}, {scale, 50, Order::kRandom}, {2 * scale, 10, deletion}};
}

template <class Map>
class RandomRun {
 public:
  RandomRun(std::uint64_t seed, std::uint64_t range, KeyMaker key, int checkEvery)
      : m_map(m_host),
        m_random(seed),
        m_choose(m_random, range),
        m_key(key),
        m_checkEvery(checkEvery),
        m_modelled(*m_map) {}

  ssize_t maxHeight() const { return m_maxHeight; }
  // Counts splits and repairs; the host then leaves dirty flags clear.
  void CountRepairs(RepairCounts& counts) {
    m_host.SetFlagging(false);
    m_census.emplace(m_host, *m_map, counts);
  }
  // Before each operation, everything leaves memory.
  void UnloadBetweenOperations() { m_unload = true; }

  // Returns the first difference, after which nothing more is done.
  std::string Run(const std::vector<Phase>& phases) {
    for (const Phase& phase : phases) {
      for (int i = 0; i < phase.m_operations; ++i) {
        const std::string difference = Step(phase);
        if (!difference.empty()) return "operation " + std::to_string(m_steps) + ": " + difference;
      }
    }
    return Empty();
  }

 private:
  std::string Step(const Phase& phase) {
    const bool inserts = m_choose.Draw(100) <= phase.m_insertions;
    const std::uint64_t n = m_choose.Next(phase.m_order);
    return inserts ? Insert(m_key(n)) : Delete(KeyNear(m_key(n)));
  }

  // Deletions look for a key that is there.
  FieldId KeyNear(const FieldId& key) {
    const auto& model = m_modelled.model();
    const auto entry = model.lower_bound(key);
    return entry != model.end() ? entry->first : model.empty() ? key : model.begin()->first;
  }

  std::string Insert(const FieldId& key) {
    const bool isNew = m_modelled.model().count(key) == 0;
    Begin();
    const std::string difference =
        m_modelled.Insert(key, m_choose.Draw(1000000), static_cast<unsigned>(m_choose.Draw(5)));
    if (!difference.empty()) return difference;
    if (isNew && m_census) m_census->AfterInsertion(key);
    m_maxHeight = std::max(m_maxHeight, m_map->m_height);
    return Check(key);
  }

  std::string Delete(const FieldId& key) {
    const bool present = m_modelled.model().count(key) == 1;
    Begin();
    const std::string difference = m_modelled.Delete(key, static_cast<unsigned>(m_choose.Draw(3)));
    if (!difference.empty()) return difference;
    if (present && m_census) m_census->AfterDeletion();
    return Check(key);
  }

  std::string Empty() {
    while (!m_modelled.model().empty()) {
      const std::string difference = Delete(KeyNear(m_key(m_choose.Next(Order::kRandom))));
      if (!difference.empty()) return difference;
    }
    return m_map->size() == 0 && m_map->m_height == 0 ? m_modelled.Compare() : "not empty at the end";
  }

  void Begin() {
    ++m_steps;
    if (m_unload) m_host.UnloadAll();
    m_host.log().Clear();
  }

  std::string Check(const FieldId& key) {
    if (!m_host.Faults().empty()) return m_host.Faults();
    if (m_unload) m_host.UnloadAll();
    if (const std::string difference = m_modelled.CompareAt(key); !difference.empty()) return difference;
    if (m_steps % m_checkEvery != 0) return "";
    const FieldId other = m_key(m_choose.Next(Order::kRandom));
    if (const std::string difference = m_modelled.CompareAt(other); !difference.empty()) return difference;
    return m_modelled.Compare();
  }

  RecordingHost m_host;
  Hosted<Map> m_map;
  std::mt19937_64 m_random;
  KeyChooser m_choose;
  KeyMaker m_key;
  int m_checkEvery;
  ModelledMap<Map> m_modelled;
  std::optional<RepairCensus<Map>> m_census;
  bool m_unload = false;
  int m_steps = 0;
  ssize_t m_maxHeight = -1;
};

constexpr Order kOrders[] = {Order::kAscending, Order::kDescending, Order::kRandom, Order::kClustered};

TEST(RandomOperations, MatchTheModelAfterEveryOperationAndReachEverySplitAndRepair) {
  std::uint64_t seed = TestSeed(20251);
  RepairCounts reached;
  for (const Order insertion : kOrders) {
    for (const Order deletion : kOrders) {
      SCOPED_TRACE("VEMO_SEED=" + std::to_string(seed));
      RandomRun<SmallMap> run(seed, 400, insertion == Order::kClustered ? FieldOfObject : Key, 1);
      run.CountRepairs(reached);
      ASSERT_EQ(run.Run(PhasesOf(insertion, deletion, 250)), "");
      EXPECT_GE(run.maxHeight(), 3);
      ++seed;
    }
  }
  EXPECT_EQ(reached.Missing(), "");
  for (int i = 0; i < static_cast<int>(Repair::kCount); ++i) {
    const auto repair = static_cast<Repair>(i);
    std::cout << "  " << NameOf(repair) << ": " << reached.Count(repair) << '\n';
  }
}

TEST(RandomOperations, MatchTheModelWhenEverythingIsUnloadedBetweenOperations) {
  std::uint64_t seed = TestSeed(20252);
  for (const Order order : kOrders) {
    SCOPED_TRACE("VEMO_SEED=" + std::to_string(seed));
    RandomRun<SmallMap> run(seed, 300, order == Order::kRandom ? FieldOfObject : Key, 1);
    run.UnloadBetweenOperations();
    ASSERT_EQ(run.Run(PhasesOf(order, order, 120)), "");
    EXPECT_GE(run.maxHeight(), 2);
    ++seed;
  }
}

template <class Map>
class RandomOperationsOfProductionMaps : public ::testing::Test {};

using ProductionMaps = ::testing::Types<FieldIdToVectorInsertionsMap, FieldIdToVectorTombstonesMap,
                                        FieldIdToVectorInsertionsAndDeletionsMap>;
TYPED_TEST_SUITE(RandomOperationsOfProductionMaps, ProductionMaps);

TYPED_TEST(RandomOperationsOfProductionMaps, MatchTheModel) {
  std::uint64_t seed = TestSeed(20253);
  for (const Order order : {Order::kAscending, Order::kRandom, Order::kClustered}) {
    SCOPED_TRACE("VEMO_SEED=" + std::to_string(seed));
    RandomRun<TypeParam> run(seed, 20000, FieldOfObject, 500);
    ASSERT_EQ(run.Run(PhasesOf(order, Order::kClustered, 4000)), "");
    EXPECT_GE(run.maxHeight(), 1);
    ++seed;
  }
}

}  // namespace
}  // namespace vemo::test
