// Three maps under random operations, commits, aborts and reopenings, each beside a std::map that is told the
// same. Where the space evicts, every unchanged node leaves memory after every operation.
#include <optional>
#include <random>

#include "store/peek.h"
#include "store/scan.h"
#include "store/verify.h"
#include "tests/store/store_fixture.h"
#include "tests/support/seed.h"

namespace vemo::test {
namespace {

// One root map and its models: of the newest commit, and of the transaction.
template <class Map>
class ModelledRoot {
 public:
  ModelledRoot(std::string name, bool evicts) : m_name(std::move(name)), m_evicts(evicts) {}

  void Begin(WriteTransaction& transaction) {
    m_transaction = &transaction;
    m_map = &transaction.Root<Map>(m_name);
    m_now = m_committed;
  }
  void Committed() { m_committed = m_now; }

  void Change(std::mt19937_64& random) {
    const std::uint64_t first = 1 + random() % kKeys;
    const std::uint64_t last = std::min<std::uint64_t>(kKeys, first + random() % 200);
    const std::uint64_t kind = random() % 100;
    if (kind < 45) {
      for (std::uint64_t n = first; n <= last; ++n) {
        m_map->Insert(Key(n), PayloadOf<Map>(n + kind), true);
        m_now[n] = n + kind;
        AfterOperation();
      }
    } else if (kind < 90) {
      for (std::uint64_t n = first; n <= last; ++n) {
        EXPECT_EQ(m_map->Delete(Key(n)), m_now.erase(n) == 1);
        AfterOperation();
      }
    } else if (kind < 94) {
      for (auto i = m_map->begin(); i != m_map->end(); ++i) {
        const std::uint64_t n = NumberOf(i.const_deref().first);
        if (n % 97 != kind) continue;
        i->second = PayloadOf<Map>(n);
        m_now[n] = n;
      }
    } else if (kind < 96) {
      m_map->clear();
      m_now.clear();
    } else if (kind < 98) {
      *m_map = Map(*m_map);
    } else {
      Map stack;
      Fill(stack, first, last);
      stack.swap(*m_map);
      stack.clear();
      m_now.clear();
      for (std::uint64_t n = first; n <= last; ++n) m_now[n] = n;
    }
    AfterOperation();
  }

  void CheckOpen(std::mt19937_64& random) const {
    EXPECT_EQ(Scanned(*m_transaction, *m_map), m_now) << m_name;
    CheckPeeks(*m_transaction, *m_map, m_now, random);
  }
  void CheckCommitted(Snapshot& snapshot, std::mt19937_64& random) const {
    if (!snapshot.HasRoot(m_name)) {
      EXPECT_TRUE(m_committed.empty());
      return;
    }
    EXPECT_EQ(Scanned(snapshot, snapshot.Root<Map>(m_name)), m_committed) << m_name;
    CheckPeeks(snapshot, snapshot.Root<Map>(m_name), m_committed, random);
    EXPECT_EQ(NumbersOf(snapshot.Root<Map>(m_name)), m_committed) << m_name;
    if (m_evicts) snapshot.TrimTo(0);
    EXPECT_EQ(FaultsOf(snapshot.Root<Map>(m_name)), "") << m_name;
  }

 private:
  static constexpr std::uint64_t kKeys = 9000;

  void AfterOperation() {
    if (m_evicts) m_transaction->TrimTo(0);
  }

  // Keys and payload numbers as a scan meets them, which trims after every leaf where there is no budget at all.
  template <class Owner>
  static std::map<std::uint64_t, std::uint64_t> Scanned(Owner& owner, const Map& map) {
    std::map<std::uint64_t, std::uint64_t> numbers;
    ScanMap(owner, map, FieldId(), [&numbers](const FieldId& key, const auto& payload) {
      numbers.emplace(NumberOf(key), PayloadNumber<typename Map::Payload>::Number(payload));
      return true;
    });
    return numbers;
  }

  template <class Owner>
  static void CheckPeeks(Owner& owner, const Map& map, const std::map<std::uint64_t, std::uint64_t>& model,
                         std::mt19937_64& random) {
    for (int i = 0; i < 50; ++i) {
      const std::uint64_t n = 1 + random() % kKeys;
      const auto payload = PeekMap(owner, map, Key(n));
      ASSERT_EQ(payload.has_value(), model.contains(n)) << n;
      if (payload) {
        EXPECT_EQ(PayloadNumber<typename Map::Payload>::Number(*payload), model.at(n));
      }
    }
  }

  std::string m_name;
  bool m_evicts;
  WriteTransaction* m_transaction = nullptr;
  Map* m_map = nullptr;
  std::map<std::uint64_t, std::uint64_t> m_committed, m_now;
};

using RandomStoreTest = StoreTest;
INSTANTIATE_STORE_TEST(RandomStoreTest);

TEST_P(RandomStoreTest, MapsStayWhatTheirModelsAre) {
  std::mt19937_64 random(TestSeed(5));
  ModelledRoot<InsertionsMap> insertions("i", Evicts(GetParam()));
  ModelledRoot<TombstonesMap> tombstones("t", Evicts(GetParam()));
  ModelledRoot<HistoriesMap> histories("h", Evicts(GetParam()));
  const int rounds = Evicts(GetParam()) ? 40 : 240;
  for (int round = 0; round < rounds && !HasFailure(); ++round) {
    SCOPED_TRACE(round);
    {
      WriteTransaction transaction(space());
      insertions.Begin(transaction);
      tombstones.Begin(transaction);
      histories.Begin(transaction);
      for (std::uint64_t i = random() % 12; i > 0; --i) {
        const std::uint64_t map = random() % 4;
        if (map == 0) insertions.Change(random);
        if (map == 1) histories.Change(random);
        if (map >= 2) tombstones.Change(random);
      }
      if (random() % 4 == 0) tombstones.CheckOpen(random);
      if (random() % 3 != 0) {
        transaction.Commit();
        insertions.Committed();
        tombstones.Committed();
        histories.Committed();
      }
    }
    if (random() % 6 == 0) site.Reopen();
    if (random() % 4 != 0) continue;
    Snapshot snapshot(space());
    insertions.CheckCommitted(snapshot, random);
    tombstones.CheckCommitted(snapshot, random);
    histories.CheckCommitted(snapshot, random);
  }
  Snapshot snapshot(space());
  const VerifyReport report = VerifySpace(snapshot);
  EXPECT_TRUE(report.findings.empty()) << report.findings.front().fault;
}

}  // namespace
}  // namespace vemo::test
