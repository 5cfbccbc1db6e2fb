#include "tests/campaigns/races.h"

#include <barrier>
#include <memory>
#include <mutex>
#include <optional>
#include <random>
#include <thread>
#include <utility>
#include <vector>

#include "store/collect.h"
#include "store/transaction.h"
#include "store/verify.h"
#include "tests/campaigns/scratch_folder.h"
#include "tests/support/keys.h"
#include "tests/support/production_payloads.h"

namespace vemo::campaign {

namespace {

using test::Key;
using test::NumberOf;
using InsertionsMap = FieldIdToVectorInsertionsMap;
using TombstonesMap = FieldIdToVectorTombstonesMap;

constexpr std::uint64_t kMixer = 0x9e3779b97f4a7c15u;

template <class Map>
std::uint64_t SumOf(const Map& map) {
  std::uint64_t sum = 0;
  for (const auto& [key, payload] : map) {
    sum += (NumberOf(key) * kMixer) ^ test::PayloadNumber<typename Map::Payload>::Number(payload);
  }
  return sum;
}

// The writer keeps two maps of different classes alike and their sum among the meta values, in one commit each time.
class Races {
 public:
  explicit Races(const RacesOptions& options) : m_options(options), m_verdict("races", options.seed) {}

  Verdict Run() {
    // One writes changes into their records all the time, the other has as many commits as it can in the log.
    for (const char* options : {"?pending_bytes=8192", ""}) {
      ScratchFolder folder;
      RunOn("lmdb:" + (folder.path() / "space").string() + options);
    }
    RunOn("memory:");
    return m_verdict;
  }

 private:
  void RunOn(const std::string& uri) {
    SpaceOptions options;
    options.create = true;
    options.cacheBytes = m_options.cacheBytes;
    options.writerTimeout = std::chrono::hours(1);  // collection and the writer wait for one another
    m_space = CSpace::Open(uri, options);
    m_random.seed(m_options.seed);
    Commit(0);
    std::barrier start(static_cast<std::ptrdiff_t>(m_options.readers) + 2);
    std::vector<std::thread> readers;
    for (std::uint64_t reader = 0; reader < m_options.readers; ++reader) {
      readers.emplace_back([this, reader, &start] {
        start.arrive_and_wait();
        Guard([&] { Read(reader); });
      });
    }
    std::thread collector([this, &start] {
      start.arrive_and_wait();
      Guard([&] {
        for (std::uint64_t n = 0; n < m_options.collections; ++n) {
          m_swept += Collect(*m_space, {.recordsPerCommit = 8}).swept;
        }
      });
    });
    start.arrive_and_wait();
    Guard([&] {
      for (std::uint64_t n = 1; n <= m_options.commits; ++n) Commit(n);
    });
    for (std::thread& reader : readers) reader.join();
    collector.join();
    m_swept += Collect(*m_space).swept;
    Snapshot snapshot(*m_space);
    const VerifyReport report = VerifySpace(snapshot);
    for (const Finding& finding : report.findings) AddFault(finding.fault);
    if (report.unreachable != 0) AddFault("collection has left " + std::to_string(report.unreachable) + " records behind");
    m_verdict.Count("commits", m_options.commits);
    m_verdict.Count("collections", m_options.collections);
    m_verdict.Count("records collected", std::exchange(m_swept, 0));
    m_verdict.Count("nodes left memory", m_space->CacheStatistics().evictions);
    m_verdict.Count("reads", m_options.reads * m_options.readers);
  }

  template <class Act>
  void Guard(Act&& act) {
    try {
      act();
    } catch (const std::exception& error) {
      AddFault(error.what());
    }
  }

  void AddFault(const std::string& fault) {
    const std::lock_guard lock(m_mutex);
    m_verdict.AddFault(fault);
  }

  void Commit(std::uint64_t number) {
    WriteTransaction transaction(*m_space);
    auto& insertions = transaction.Root<InsertionsMap>("i");
    auto& tombstones = transaction.Root<TombstonesMap>("t");
    if (number % 16 == 5) transaction.Root<TombstonesMap>("copy") = tombstones;  // leaves the last copy to collection
    if (number % 64 == 63) {
      insertions.clear();
      tombstones.clear();
    }
    const std::uint64_t first = 1 + m_random() % m_options.keys;
    const bool deletes = m_random() % 3 == 0;
    const std::uint64_t count = number % 2 == 0 ? 60 : 1;
    for (std::uint64_t n = first; n < first + count; ++n) {
      if (deletes) {
        insertions.Delete(Key(n));
        tombstones.Delete(Key(n));
      } else {
        insertions.Insert(Key(n), test::PayloadNumber<VectorInsertions>::Make(n + number), true);
        tombstones.Insert(Key(n), test::PayloadNumber<VectorTombstones>::Make(n + number), true);
      }
    }
    transaction.SetMeta("commit", std::to_string(number));
    transaction.SetMeta("sum", std::to_string(SumOf(transaction.View<TombstonesMap>("t"))));
    if (number % 7 == 6) return;  // an abort: the next commit finds the maps as they were
    transaction.Commit();
  }

  // Half of the readers refresh one snapshot, half take a new one each time.
  void Read(std::uint64_t reader) {
    std::optional<Snapshot> snapshot;
    std::uint64_t last = 0;
    for (std::uint64_t i = 0; i < m_options.reads; ++i) {
      if (snapshot && reader % 2 == 0) {
        snapshot->Refresh();
      } else {
        snapshot.reset();
        snapshot.emplace(*m_space, "reader " + std::to_string(reader));
      }
      const std::uint64_t commit = std::stoull(*snapshot->Meta("commit"));
      if (commit < last) return AddFault("a reader went back from commit " + std::to_string(last));
      last = commit;
      const std::uint64_t sum = std::stoull(*snapshot->Meta("sum"));
      if (SumOf(snapshot->Root<TombstonesMap>("t")) != sum || SumOf(snapshot->Root<InsertionsMap>("i")) != sum) {
        return AddFault("a reader sees parts of two commits at commit " + std::to_string(commit));
      }
    }
  }

  RacesOptions m_options;
  std::mutex m_mutex;  // of the verdict
  Verdict m_verdict;
  std::mt19937_64 m_random;    // the writer's
  std::uint64_t m_swept = 0;   // the collector's, and after it the writer's
  std::unique_ptr<CSpace> m_space;
};

}  // namespace

Verdict RunRaces(const RacesOptions& options) { return Races(options).Run(); }

}  // namespace vemo::campaign
