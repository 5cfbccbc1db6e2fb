// Random commits against a model of maps, with snapshots that are opened and closed in between.
#include <cstdint>
#include <map>
#include <random>
#include <set>

#include "tests/engines/engine_contract.h"
#include "tests/support/seed.h"

namespace vemo::test {
namespace {

using RandomContract = EngineContract;
INSTANTIATE_TEST_SUITE_P(Engines, RandomContract, testing::ValuesIn(AllEngineKinds()), EngineKindName);

class Model {
 public:
  explicit Model(std::uint64_t seed) : m_random(seed) {}

  std::size_t Below(std::size_t end) {
    return std::uniform_int_distribution<std::size_t>(0, end - 1)(m_random);
  }

  // A batch of random changes, applied to the model as well.
  BatchBuilder NextCommit() {
    BatchBuilder batch;
    std::set<std::uint64_t> touched;
    for (std::size_t i = Below(20); i > 0; --i) {
      const std::uint64_t oid = 1 + Below(40);
      if (!touched.insert(oid).second) continue;
      if (Below(3) == 0) {
        batch.Remove(oid);
        m_records.erase(oid);
      } else {
        batch.Put(oid, m_records[oid] = m_records.contains(oid) && Below(3) > 0 ? Edited(m_records[oid]) : Value());
      }
    }
    for (std::size_t i = Below(6); i > 0; --i) ChangeName(batch);
    ChangeQueue(batch);
    ++m_generation;
    return batch;
  }

  Contents State() const {
    Contents contents;
    contents.generation = m_generation;
    contents.records.assign(m_records.begin(), m_records.end());
    contents.info.assign(m_names[0].begin(), m_names[0].end());
    contents.roots.assign(m_names[1].begin(), m_names[1].end());
    contents.meta.assign(m_names[2].begin(), m_names[2].end());
    contents.queue.assign(m_queue.begin(), m_queue.end());
    return contents;
  }

 private:
  std::string Value() {
    return std::string(Below(8) == 0 ? Below(9000) : Below(50), static_cast<char>(Below(256)));
  }

  // The value with a few bytes more, less or different somewhere.
  std::string Edited(std::string value) {
    for (std::size_t edit = 1 + Below(3); edit > 0; --edit) {
      const std::size_t from = Below(value.size() + 1);
      value.replace(from, Below(12), Below(12), static_cast<char>(Below(256)));
    }
    return value;
  }

  void ChangeName(BatchBuilder& batch) {
    const std::size_t table = Below(3);
    const std::string name(1 + Below(3), static_cast<char>('a' + Below(3)));
    if (Below(3) == 0) {
      batch.Unname(static_cast<NamedTable>(table), name);
      m_names[table].erase(name);
    } else {
      batch.Name(static_cast<NamedTable>(table), name, m_names[table][name] = Value());
    }
  }

  void ChangeQueue(BatchBuilder& batch) {
    std::vector<std::uint64_t> finished, queued;
    for (std::size_t i = Below(4); i > 0; --i) finished.push_back(1 + Below(20));
    for (std::size_t i = Below(4); i > 0; --i) queued.push_back(1 + Below(20));
    for (const std::uint64_t oid : finished) {
      batch.Finish(oid);
      m_queue.erase(oid);
    }
    for (const std::uint64_t oid : queued) {
      batch.Queue(oid);
      m_queue.insert(oid);
    }
  }

  std::mt19937_64 m_random;
  std::uint64_t m_generation = 0;
  std::map<std::uint64_t, std::string> m_records;
  std::map<std::string, std::string> m_names[3];
  std::set<std::uint64_t> m_queue;
};

TEST_P(RandomContract, EverySnapshotShowsTheModelOfItsCommit) {
  Model model(TestSeed(20260317));
  struct Open {
    std::unique_ptr<EngineSnapshot> snapshot;
    Contents expected;
  };
  std::vector<Open> open;
  for (int step = 0; step < 300; ++step) {
    const std::uint64_t before = model.State().generation;
    BatchBuilder batch = model.NextCommit();
    ASSERT_EQ(engine().Commit(batch.At(before)), before + 1);
    if (model.Below(2) == 0) open.push_back({engine().OpenSnapshot(), model.State()});
    if (open.size() > 6 || (!open.empty() && model.Below(4) == 0)) {
      open.erase(open.begin() + static_cast<std::ptrdiff_t>(model.Below(open.size())));
    }
    if (IsPersistent() && step % 50 == 49) {
      open.clear();
      Reopen();
    }
    ASSERT_EQ(NewestContents(engine()), model.State()) << "step " << step;
    ASSERT_EQ(engine().Usage().records, model.State().records.size()) << "step " << step;
    for (const Open& one : open) ASSERT_EQ(ContentsOf(*one.snapshot), one.expected) << "step " << step;
  }
}

}  // namespace
}  // namespace vemo::test
