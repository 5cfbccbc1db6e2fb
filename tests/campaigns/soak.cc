#include "tests/campaigns/soak.h"

#include <algorithm>
#include <fstream>
#include <iostream>
#include <map>
#include <memory>
#include <optional>
#include <random>

#include "store/verify.h"
#include "store/transaction.h"
#include "tests/campaigns/scratch_folder.h"
#include "tests/support/keys.h"
#include "tests/support/production_payloads.h"

namespace vemo::campaign {

namespace {

using test::Key;
using test::NumberOf;
using Map = FieldIdToVectorTombstonesMap;
using Payload = test::PayloadNumber<VectorTombstones>;
using Model = std::map<std::uint64_t, std::uint64_t>;

constexpr std::uint64_t kRun = 64;             // operations on neighbouring keys, one after the other
constexpr std::uint64_t kCommitsPerOpening = 40;
constexpr std::uint64_t kCommitsPerCheck = 200;
constexpr std::uint64_t kIntervals = 20;

// The process's own memory in KiB, without the pages of files that it maps.
std::uint64_t ResidentKiB() {
  std::ifstream status("/proc/self/status");
  for (std::string line; std::getline(status, line);) {
    if (line.starts_with("RssAnon:")) return std::stoull(line.substr(8));
  }
  return 0;
}

class Soak {
 public:
  explicit Soak(const SoakOptions& options)
      : m_options(options),
        m_verdict("soak", options.seed),
        m_random(options.seed),
        m_uri("lmdb:" + (m_folder.path() / "space").string()) {}

  Verdict Run() {
    std::uint64_t nextReport = m_options.operations / kIntervals;
    while (m_done < m_options.operations && m_verdict.IsSound()) {
      if (m_commits % kCommitsPerOpening == 0) Reopen();
      CommitSome();
      CheckReader();
      if (++m_commits % kCommitsPerCheck == 0) CheckAll();
      if (m_done >= nextReport) {
        Report();
        nextReport += m_options.operations / kIntervals;
      }
    }
    CheckAll();
    m_verdict.Count("operations", m_done);
    m_verdict.Count("commits", m_commits);
    m_verdict.Count("entries at the end", m_model.size());
    m_verdict.Count("nodes left memory", m_evictions + m_space->CacheStatistics().evictions);
    if (m_options.operations >= 60 * m_options.keys) JudgeMemory();
    return m_verdict;
  }

 private:
  void Reopen() {
    m_reader.reset();
    if (m_space != nullptr) m_evictions += m_space->CacheStatistics().evictions;
    m_space.reset();
    SpaceOptions options;
    options.create = true;
    options.cacheBytes = m_options.cacheBytes;
    m_space = CSpace::Open(m_uri, options);
  }

  void CommitSome() {
    WriteTransaction transaction(*m_space);
    auto& map = transaction.Root<Map>("t");
    if (m_random() % 500 == 0) {
      map.clear();
      m_model.clear();
    }
    const std::uint64_t end = m_done + m_options.operationsPerCommit;
    while (m_done < end && m_verdict.IsSound()) {
      const std::uint64_t first = 1 + m_random() % m_options.keys;
      // A run mostly inserts or mostly deletes, so that leaves fill and empty.
      const bool inserts = m_random() % 2 == 0;
      for (std::uint64_t i = 0; i < kRun; ++i) Operate(map, first + i, inserts);
      m_done += kRun;
      transaction.Trim();
    }
    transaction.Commit();
  }

  void Operate(Map& map, std::uint64_t n, bool inserts) {
    const std::uint64_t draw = m_random();
    const std::uint64_t kind = draw % 16;
    const FieldId key = Key(n);
    if (kind < 10) {
      if (inserts == (kind != 0)) {
        const std::uint64_t number = 1 + (draw >> 8) % 1'000'000;
        const bool isNew = m_model.insert_or_assign(n, number).second;
        Expect(map.Insert(key, Payload::Make(number), true) == isNew, "an insertion");
      } else {
        Expect(map.Delete(key) == (m_model.erase(n) == 1), "a deletion");
      }
    } else if (kind < 13) {
      const auto expected = m_model.find(n);
      const auto* found = map.rFind(key);
      Expect((found == nullptr) == (expected == m_model.end()), "presence");
      if (found != nullptr) Expect(Payload::Number(*found) == expected->second, "a payload");
    } else if (kind == 13) {
      const auto expected = m_model.find(n);
      const bool edited = map.Edit(key, [&](VectorTombstones& payload) { payload = Payload::Make(n); });
      Expect(edited == (expected != m_model.end()), "an edit");
      if (expected != m_model.end()) expected->second = n;
    } else {
      auto position = std::as_const(map).lower_bound(key);
      auto expected = m_model.lower_bound(n);
      for (int step = 0; step < 3 && expected != m_model.end(); ++step, ++expected, ++position) {
        if (position == map.cend() || NumberOf(position->first) != expected->first) return Expect(false, "a lower bound");
      }
      if (expected == m_model.end()) Expect(position == map.cend(), "the end");
    }
  }

  void Expect(bool isAsInModel, const char* what) {
    if (!isAsInModel) m_verdict.AddFault(std::string(what) + " is another than the model's after " + std::to_string(m_done));
  }

  // A reader beside the writer, which moves on after each commit.
  void CheckReader() {
    if (!m_reader) {
      m_reader.emplace(*m_space);
    } else {
      m_reader->Refresh();
    }
    const Map& map = m_reader->Root<Map>("t");
    Expect(map.size() == static_cast<ssize_t>(m_model.size()), "the size that a reader sees");
    for (int i = 0; i < 200; ++i) {
      const std::uint64_t n = 1 + m_random() % m_options.keys;
      Expect(map.contains(Key(n)) == m_model.contains(n), "what a reader sees");
    }
  }

  void CheckAll() {
    Snapshot snapshot(*m_space);
    for (const Finding& finding : VerifySpace(snapshot).findings) m_verdict.AddFault(finding.fault);
    const Map& map = snapshot.Root<Map>("t");
    const bool equal = std::equal(map.begin(), map.end(), m_model.begin(), m_model.end(), [](const auto& a, const auto& b) {
      return NumberOf(a.first) == b.first && Payload::Number(a.second) == b.second;
    });
    Expect(equal, "the whole map");
    m_verdict.Count("checks of the whole space");
  }

  void Report() {
    m_resident.push_back(ResidentKiB());
    if (!m_options.print) return;
    std::cout << m_done << " operations, " << m_model.size() << " entries, " << m_resident.back() / 1024 << " MiB resident, "
              << m_space->Usage().bytes / (1024 * 1024) << " MiB on the medium" << std::endl;
  }

  // Of what is there after a quarter of the way, the rest may take a fifth more.
  void JudgeMemory() {
    const auto quarter = m_resident.begin() + static_cast<std::ptrdiff_t>(m_resident.size() / 4 + 1);
    const std::uint64_t before = *std::max_element(m_resident.begin(), quarter);
    const std::uint64_t after = *std::max_element(quarter, m_resident.end());
    m_verdict.Count("MiB at most after a quarter", before / 1024);
    m_verdict.Count("MiB at most in the rest", after / 1024);
    if (after > before + before / 5) m_verdict.AddFault("memory grows");
  }

  SoakOptions m_options;
  Verdict m_verdict;
  std::mt19937_64 m_random;
  ScratchFolder m_folder;
  std::string m_uri;
  std::unique_ptr<CSpace> m_space;
  std::optional<Snapshot> m_reader;
  Model m_model;
  std::uint64_t m_done = 0;
  std::uint64_t m_commits = 0;
  std::uint64_t m_evictions = 0;
  std::vector<std::uint64_t> m_resident;
};

}  // namespace

Verdict RunSoak(const SoakOptions& options) { return Soak(options).Run(); }

}  // namespace vemo::campaign
