#include "tests/campaigns/kill_loop.h"

#include <chrono>
#include <memory>
#include <optional>
#include <random>

#include "store/collect.h"
#include "store/verify.h"
#include "tests/campaigns/scratch_folder.h"
#include "tests/campaigns/workload.h"
#include "tests/engines/child_process.h"

namespace vemo::campaign {

namespace {

using Clock = std::chrono::steady_clock;
using test::ChildProcess;
using test::Conversation;

// Works until it is killed: reports each commit, aborts some transactions, holds a snapshot, collects and opens the space anew
// at times.
bool Work(const std::string& uri, Workload workload, std::uint64_t seed, const Conversation& parent) {
  std::mt19937_64 random(seed);
  std::unique_ptr<CSpace> space;
  std::optional<Snapshot> held;
  std::uint64_t heldCommits = 0;
  for (;;) {
    if (space == nullptr || random() % 8 == 0) {
      held.reset();
      space.reset();
      space = CSpace::Open(uri, {.create = true});
    }
    if (random() % 4 == 0) workload.Abort(*space);
    if (random() % 6 == 0) Collect(*space, {.recordsPerCommit = 4});
    if (!held) {
      heldCommits = workload.model().commits;
      held.emplace(*space);
    } else if (random() % 3 == 0) {
      held->Refresh();
      heldCommits = workload.model().commits;
    }
    workload.Commit(*space);
    if (CommitsIn(*held) != heldCommits) return false;
    parent.Say(std::to_string(workload.model().commits));
  }
}

void Spin(std::chrono::microseconds time) {
  for (const auto end = Clock::now() + time; Clock::now() < end;) {
  }
}

class KillLoop {
 public:
  explicit KillLoop(const KillLoopOptions& options)
      : m_options(options),
        m_verdict("kill_loop", options.seed),
        m_random(options.seed),
        m_uri("lmdb:" + (m_folder.path() / "space").string()),
        m_workload({options.seed, options.keys}) {}

  Verdict Run() {
    m_verdict.Count("kills", 0);
    for (std::uint64_t kill = 1; kill <= m_options.kills && m_verdict.IsSound(); ++kill) {
      const std::uint64_t acknowledged = WorkAndKill();
      try {
        Judge(acknowledged, "after kill " + std::to_string(kill));
      } catch (const std::exception& error) {
        m_verdict.AddFault("after kill " + std::to_string(kill) + ": " + error.what());
      }
      m_verdict.Count("kills");
    }
    if (m_verdict.IsSound()) DrainQueue();
    m_verdict.Count("commits", m_workload.model().commits);
    return m_verdict;
  }

 private:
  // Returns the last commit that was reported.
  std::uint64_t WorkAndKill() {
    const std::uint64_t seed = m_random();
    // Half of the processes write changes into their records all the time, the others hardly ever.
    const std::string uri = m_uri + (seed % 2 == 0 ? "?pending_bytes=8192" : "");
    ChildProcess child([&](const Conversation& parent) { return Work(uri, m_workload, seed, parent); });
    std::uint64_t acknowledged = m_workload.model().commits;
    const auto hear = [&] {
      const std::string heard = child.Hear();
      if (heard.empty()) return false;
      acknowledged = std::stoull(heard);
      return true;
    };
    const bool whileOpening = m_random() % 4 == 0;
    for (std::uint64_t wait = whileOpening ? 0 : 1 + m_random() % 5; wait > 0; --wait) {
      const auto start = Clock::now();
      if (!hear()) {
        m_verdict.AddFault("the child ended by itself after commit " + std::to_string(acknowledged));
        return acknowledged;
      }
      m_commitTime = (3 * m_commitTime + std::chrono::duration_cast<std::chrono::microseconds>(Clock::now() - start)) / 4;
    }
    Spin(std::chrono::microseconds(m_random() % static_cast<std::uint64_t>(2 * m_commitTime.count() + 1)));
    child.Kill();
    if (whileOpening) m_verdict.Count("while opening");
    while (hear()) {
    }
    return acknowledged;
  }

  void Judge(std::uint64_t acknowledged, const std::string& when) {
    const auto space = CSpace::Open(m_uri, {.create = true});
    Snapshot snapshot(*space);
    const std::uint64_t commits = CommitsIn(snapshot);
    if (commits != acknowledged && commits != acknowledged + 1) {
      m_verdict.AddFault(when + ": commit " + std::to_string(acknowledged) + " was reported, the space is at " +
                         std::to_string(commits));
      return;
    }
    if (commits > acknowledged) m_verdict.Count("made but not reported");
    while (m_workload.model().commits < commits) m_workload.Skip();
    if (snapshot.Generation() < commits + 1) m_verdict.AddFault(when + ": the generation is lower than the commits are many");
    const std::string differences = Differences(snapshot, m_workload.model(), LeftBehind::kPerhapsCollected);
    if (!differences.empty()) m_verdict.AddFault(when + ": " + differences);
  }

  // What awaits deletion or collection goes, and takes nothing along that is alive.
  void DrainQueue() {
    const auto space = CSpace::Open(m_uri);
    m_verdict.Count("records collected at the end", Collect(*space).swept);
    Snapshot snapshot(*space);
    if (!snapshot.Objects().State().QueuedDeletions(1).empty()) m_verdict.AddFault("collection leaves a queue of deletions");
    if (VerifySpace(snapshot).unreachable != 0) m_verdict.AddFault("collection leaves what nothing reaches");
    const std::string differences = Differences(snapshot, m_workload.model(), LeftBehind::kPerhapsCollected);
    if (!differences.empty()) m_verdict.AddFault("after the last collection: " + differences);
  }

  KillLoopOptions m_options;
  Verdict m_verdict;
  std::mt19937_64 m_random;
  ScratchFolder m_folder;
  std::string m_uri;
  Workload m_workload;  // at the commit that the space is at
  std::chrono::microseconds m_commitTime{2'000};
};

}  // namespace

Verdict RunKillLoop(const KillLoopOptions& options) { return KillLoop(options).Run(); }

}  // namespace vemo::campaign
