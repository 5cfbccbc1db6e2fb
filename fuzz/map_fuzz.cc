// Operations on a map of a space in memory beside a std::map: commits, aborts, snapshots, collection, and everything out of memory
// in between.
#include <cstdlib>
#include <map>
#include <memory>

#include "store/collect.h"
#include "store/raw_check.h"
#include "store/snapshot.h"
#include "store/transaction.h"
#include "store/verify.h"
#include "vxOperation/src/WorkingSet/CompOp/VectorOT.h"

namespace {

using namespace vemo;
using Map = FieldIdToVectorTombstonesMap;
using Model = std::map<std::uint64_t, ssize_t>;

void Require(bool holds) {
  if (!holds) std::abort();
}

FieldId Key(std::uint64_t n) { return FieldId{OID(n / 8 + 1), Path{static_cast<std::uint32_t>(n % 8)}}; }
std::uint64_t NumberOf(const FieldId& key) { return 8 * (key.oid.m_value - 1) + key.path.elements().front(); }

VectorTombstones Payload(ssize_t n) {
  VectorTombstones payload;
  payload.m_tombstones.safe_push_back({n, n + 1});
  return payload;
}

void Compare(const Map& map, const Model& model) {
  auto expected = model.begin();
  Require(map.size() == static_cast<ssize_t>(model.size()));
  for (const auto& [key, payload] : map) {
    Require(expected != model.end() && NumberOf(key) == expected->first && payload.begin()->t1 == expected->second);
    ++expected;
  }
  Require(expected == model.end());
}

// One run of operations, read from the input a few bytes each.
class Run {
 public:
  Run(const std::uint8_t* data, std::size_t size) : m_data(data), m_end(data + size) {}

  void Go() {
    Begin();
    while (m_end - m_data >= 4) Step(m_data[0], m_data[1] | m_data[2] << 8, m_data[3]);
    End(true);
    Snapshot snapshot(*m_space);
    Compare(snapshot.Root<Map>("t"), m_committed);
    const VerifyReport report = VerifySpace(snapshot);
    Require(report.findings.empty());
    Require(CheckRawSpace(snapshot.Objects().State()).findings.empty());
  }

 private:
  Map& map() { return m_transaction->Root<Map>("t"); }

  void Begin() {
    m_transaction = std::make_unique<WriteTransaction>(*m_space);
    m_model = m_committed;
    map();
  }
  void End(bool commit) {
    if (commit) {
      m_transaction->Commit();
      m_committed = m_model;
    }
    m_transaction.reset();
  }

  void Step(std::uint8_t operation, int key, std::uint8_t count) {
    m_data += 4;
    const auto n = static_cast<std::uint64_t>(key % 2'048);
    switch (operation % 12) {
      case 0: return Insert(n, 1);
      case 1: return Insert(n, count);
      case 2: return Erase(n, 1);
      case 3: return Erase(n, count);
      case 4: {
        const auto found = m_model.find(n);
        const auto* payload = std::as_const(map()).rFind(Key(n));
        Require((payload != nullptr) == (found != m_model.end()));
        Require(payload == nullptr || payload->begin()->t1 == found->second);
        return;
      }
      case 5: {
        const auto expected = m_model.lower_bound(n);
        const auto found = std::as_const(map()).lower_bound(Key(n));
        Require((found == std::as_const(map()).end()) == (expected == m_model.end()));
        if (expected != m_model.end()) Require(NumberOf(found->first) == expected->first);
        return;
      }
      case 6: map().clear(); return m_model.clear();
      case 7: return Assign();
      case 8: End(true); return Begin();
      case 9: End(false); return Begin();
      case 10: return Forget(count);
      case 11: return Compare(std::as_const(map()), m_model);
    }
  }

  void Insert(std::uint64_t first, std::uint8_t count) {
    for (std::uint64_t n = first; n < first + count; ++n) {
      const bool isNew = m_model.insert_or_assign(n, static_cast<ssize_t>(n + count)).second;
      Require(map().Insert(Key(n), Payload(static_cast<ssize_t>(n + count)), true) == isNew);
    }
  }
  void Erase(std::uint64_t first, std::uint8_t count) {
    for (std::uint64_t n = first; n < first + count; ++n) Require(map().Delete(Key(n)) == (m_model.erase(n) == 1));
  }
  // By copy and swap, which leaves the old tree to collection.
  void Assign() {
    Map copy(map());
    map() = copy;
  }
  // An abort has the writer forget what it has in memory; a collection comes in between now and then.
  void Forget(std::uint8_t count) {
    End(true);
    if (count % 4 == 0) Collect(*m_space, {.recordsPerCommit = 3});
    {
      Snapshot snapshot(*m_space);
      Compare(snapshot.Root<Map>("t"), m_committed);
    }
    m_transaction = std::make_unique<WriteTransaction>(*m_space);
    m_transaction->Poison();
    m_transaction.reset();
    Begin();
  }

  std::unique_ptr<CSpace> m_space = CSpace::Open("memory:");
  std::unique_ptr<WriteTransaction> m_transaction;
  Model m_model, m_committed;
  const std::uint8_t* m_data;
  const std::uint8_t* m_end;
};

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  Run(data, size).Go();
  return 0;
}
