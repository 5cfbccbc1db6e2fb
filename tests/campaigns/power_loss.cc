#include "tests/campaigns/power_loss.h"

#include <dlfcn.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <memory>
#include <optional>
#include <random>
#include <stdexcept>

#include "store/scope.h"
#include "tests/campaigns/disk_trace.h"
#include "tests/campaigns/scratch_folder.h"
#include "tests/campaigns/workload.h"
#include "tests/engines/child_process.h"

namespace vemo::campaign {

namespace {

using test::ChildProcess;
using test::Conversation;

constexpr std::size_t kImagesPerChild = 64;
constexpr std::size_t kImagesPerSecondLoss = 6;

std::string UriOf(const std::filesystem::path& folder, bool sync) {
  return "lmdb:" + folder.string() + "?sync=" + (sync ? "commit" : "none_risking_loss");
}

// One folder to be judged, and how it came to be.
struct Image {
  FolderImage files;
  std::optional<std::uint64_t> acknowledged;  // the last commit that was reported; nothing before the space was made
  std::string origin;
};

constexpr const char* kSound = "sound";

// Opens the space, which is made where the loss came before it was, compares it with the model of its commit, and makes one more commit.
std::string Judge(const std::string& uri, const Image& image, const std::vector<Workload>& states) {
  const std::uint64_t acknowledged = image.acknowledged.value_or(0);
  std::uint64_t commits = 0;
  {
    const auto space = CSpace::Open(uri, {.create = true});
    {
      Snapshot snapshot(*space);
      commits = CommitsIn(snapshot);
      if (commits != acknowledged && commits != acknowledged + 1) {
        return "commit " + std::to_string(acknowledged) + " was reported, the space is at " + std::to_string(commits);
      }
      if (std::string text = Differences(snapshot, states.at(commits).model()); !text.empty()) return text;
    }
    Workload workload = states.at(commits);
    workload.Commit(*space);
  }
  const auto space = CSpace::Open(uri);
  Snapshot snapshot(*space);
  const std::string text = Differences(snapshot, states.at(commits + 1).model());
  return text.empty() ? kSound : "after one more commit: " + text;
}

class PowerLoss {
 public:
  explicit PowerLoss(const PowerLossOptions& options)
      : m_options(options), m_verdict(options.sync ? "power_loss" : "power_loss without syncs", options.seed), m_random(options.seed) {}

  Verdict Run() {
    m_verdict.Count("images", 0);
    while (!IsDone()) CutOneWork(m_random() % 1'000'000);
    return m_verdict;
  }

 private:
  bool IsDone() const {
    return m_verdict.CountOf("images") >= m_options.images || m_verdict.faults().size() >= m_options.maxFaults;
  }

  // Records one process from an empty folder on, and cuts its power at points all over.
  void CutOneWork(std::uint64_t seed) {
    Workload workload({seed, m_options.keys});
    m_states.assign(1, workload);
    while (m_states.size() < m_options.commits + 8) {
      workload.Skip();
      m_states.push_back(workload);
    }
    WriteFolder(Space(), {});
    const DiskTrace trace = Record(seed, m_options.commits, {});
    m_verdict.Count("processes");
    for (std::size_t point = 0; point < trace.Points() && !IsDone(); ++point) {
      for (int survival = 0; survival < kSurvivals; ++survival) {
        Image image = ImageAt(trace, point, static_cast<Survival>(survival), std::nullopt, "seed " + std::to_string(seed));
        if (m_random() % kImagesPerSecondLoss == 0) CutRecovery(seed, image);
        Enqueue(std::move(image));
      }
    }
    JudgeQueue();
  }

  // Opens an image in a recorded process and cuts the power again.
  void CutRecovery(std::uint64_t seed, const Image& image) {
    WriteFolder(Space(), image.files);
    std::optional<DiskTrace> trace;
    try {
      trace = Record(seed, 1, image.files);
    } catch (const std::exception& error) {
      m_verdict.AddFault(image.origin + ", opened and worked on: " + error.what());
      return;
    }
    m_verdict.Count("second losses");
    for (int i = 0; i < 3; ++i) {
      const std::size_t point = m_random() % trace->Points();
      const auto survival = static_cast<Survival>(m_random() % kSurvivals);
      Image again = ImageAt(*trace, point, survival, image.acknowledged, image.origin);
      Enqueue(std::move(again));
    }
  }

  Image ImageAt(const DiskTrace& trace, std::size_t point, Survival survival,
                const std::optional<std::uint64_t>& acknowledged, const std::string& origin) {
    const std::optional<std::uint64_t> mark = trace.MarkBefore(point);
    return {trace.After(point, survival, m_random), mark ? mark : acknowledged,
            origin + ", cut at entry " + std::to_string(point) + " of " + std::to_string(trace.Points() - 1) +
                ", survival " + std::to_string(static_cast<int>(survival))};
  }

  DiskTrace Record(std::uint64_t seed, std::uint64_t commits, const FolderImage& before) {
    const std::filesystem::path traceFile = m_folder.path() / "trace";
    std::filesystem::remove(traceFile);
    // Half of the processes write changes into their records all the time, the others hardly ever.
    const std::string uri = UriOf(Space(), m_options.sync) + (seed % 2 == 0 ? "&pending_bytes=4096" : "");
    const std::vector<std::string> arguments{VEMO_CAMPAIGN_PROGRAM, "record", uri, std::to_string(seed),
                                             std::to_string(m_options.keys), std::to_string(commits)};
    std::vector<std::string> environment{"VEMO_DISK_FOLDER=" + Space().string(), "VEMO_DISK_TRACE=" + traceFile.string(),
                                         std::string("LD_PRELOAD=") + VEMO_DISK_RECORDER,
                                         "ASAN_OPTIONS=verify_asan_link_order=0:detect_leaks=0"};
    std::vector<char*> argv, env;
    for (const std::string& text : arguments) argv.push_back(const_cast<char*>(text.c_str()));
    for (const std::string& text : environment) env.push_back(const_cast<char*>(text.c_str()));
    argv.push_back(nullptr);
    env.push_back(nullptr);
    pid_t child = 0;
    int status = 0;
    if (::posix_spawn(&child, argv[0], nullptr, nullptr, argv.data(), env.data()) != 0 ||
        ::waitpid(child, &status, 0) != child || status != 0) {
      throw std::runtime_error("the recorded process failed with status " + std::to_string(status));
    }
    return DiskTrace(before, traceFile);
  }

  void Enqueue(Image image) {
    m_queue.push_back(std::move(image));
    if (m_queue.size() >= kImagesPerChild) JudgeQueue();
  }

  // In children, so that an image that crashes the library is a fault of the image.
  void JudgeQueue() {
    for (std::size_t next = 0; next < m_queue.size();) {
      ChildProcess child([&](const Conversation& parent) {
        for (std::size_t i = next; i < m_queue.size(); ++i) parent.Say(JudgeOne(m_queue[i]));
        return true;
      });
      for (; next < m_queue.size(); ++next) {
        const std::string heard = child.Hear();
        if (heard.empty()) break;
        if (heard != kSound) m_verdict.AddFault(m_queue[next].origin + ": " + heard);
      }
      if (next < m_queue.size()) m_verdict.AddFault(m_queue[next++].origin + ": opening it ends the process");
    }
    m_verdict.Count("images", m_queue.size());
    m_queue.clear();
  }

  std::string JudgeOne(const Image& image) const {
    std::string text;
    try {
      WriteFolder(Space(), image.files);
      text = Judge(UriOf(Space(), m_options.sync), image, m_states);
    } catch (const std::exception& error) {
      text = error.what();
    }
    for (char& c : text) {
      if (c == '\n') c = ' ';
    }
    return text;
  }

  std::filesystem::path Space() const { return m_folder.path() / "space"; }

  PowerLossOptions m_options;
  Verdict m_verdict;
  std::mt19937_64 m_random;
  ScratchFolder m_folder;
  std::vector<Workload> m_states;  // after 0, 1, ... commits
  std::vector<Image> m_queue;
};

}  // namespace

Verdict RunPowerLoss(const PowerLossOptions& options) { return PowerLoss(options).Run(); }

void WorkUnderRecorder(const RecordedWork& work) {
  const auto mark = reinterpret_cast<void (*)(std::uint64_t)>(::dlsym(RTLD_DEFAULT, "vemo_disk_recorder_mark"));
  if (mark == nullptr) throw std::runtime_error("the disk recorder is not preloaded");
  auto space = CSpace::Open(work.uri, {.create = true});
  Workload workload({work.seed, work.keys});
  const std::uint64_t before = InSnapshot(*space, [](Snapshot& snapshot) { return CommitsIn(snapshot); });
  while (workload.model().commits < before) workload.Skip();
  mark(before);
  for (std::uint64_t i = 0; i < work.commits; ++i) {
    if (i % 5 == 4) {
      space.reset();
      space = CSpace::Open(work.uri);
    }
    if (i % 3 == 2) workload.Abort(*space);
    workload.Commit(*space);
    mark(workload.model().commits);
  }
}

}  // namespace vemo::campaign
