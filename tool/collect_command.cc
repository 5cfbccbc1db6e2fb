#include <fmt/core.h>

#include <CLI/CLI.hpp>
#include <memory>

#include "store/collect.h"
#include "tool/commands.h"
#include "tool/numbers.h"
#include "tool/progress_bar.h"

namespace vemo::tool {

namespace {

struct Request {
  std::string store;
  bool dryRun = false;
  bool lines = false;
};

std::string_view PhaseName(CollectProgress::Phase phase) {
  switch (phase) {
    case CollectProgress::Phase::kMarking: return "marking";
    case CollectProgress::Phase::kDeleting: return "deleting";
    case CollectProgress::Phase::kSweeping: return "sweeping";
  }
  return "";
}

// A bar for each phase where standard error is a terminal, and with --progress a line for each tenth of a phase everywhere.
class Display {
 public:
  explicit Display(bool lines) : m_lines(lines) {}

  void Update(const CollectProgress& progress) {
    if (progress.phase != m_phase || m_bar == nullptr) {
      m_phase = progress.phase;
      m_bar.reset();
      m_bar = std::make_unique<ProgressBar>(std::string(PhaseName(m_phase)), progress.of);
      m_tenths = 0;
    }
    m_bar->Update(progress.done);
    const std::uint64_t tenths = progress.of == 0 ? 10 : progress.done * 10 / progress.of;
    if (!m_lines || tenths <= m_tenths) return;
    m_tenths = tenths;
    fmt::print(stderr, "{} {} of {}\n", PhaseName(m_phase), Grouped(progress.done), Grouped(progress.of));
  }

 private:
  bool m_lines;
  CollectProgress::Phase m_phase = CollectProgress::Phase::kMarking;
  std::unique_ptr<ProgressBar> m_bar;
  std::uint64_t m_tenths = 0;
};

ExitCode RunCollect(const Request& request) {
  const auto space = CSpace::Open(request.store);
  CollectOptions options;
  options.dryRun = request.dryRun;
  CollectReport report;
  {
    Display display(request.lines);
    options.progress = [&display](const CollectProgress& progress) {
      display.Update(progress);
      return true;
    };
    report = Collect(*space, options);
  }
  fmt::print("{} records, {} in use, {} awaiting deletion, {} unreachable ({}): {}\n", Grouped(report.records),
             Grouped(report.marked), Grouped(report.awaitingDeletion), Grouped(report.unreachable),
             ByteSize(report.unreachableBytes),
             request.dryRun ? "nothing removed" : fmt::format("{} swept ({})", Grouped(report.swept), ByteSize(report.sweptBytes)));
  return kGood;
}

}  // namespace

void AddCollectCommand(CLI::App& app, Command& chosen) {
  auto request = std::make_shared<Request>();
  CLI::App* command = app.add_subcommand("collect", "Remove the records that no root map reaches");
  command->add_option("store", request->store, "The space: lmdb:PATH")->required();
  command->add_flag("--dry-run", request->dryRun, "Only count");
  command->add_flag("--progress", request->lines, "Print lines about how far it has come on standard error");
  command->footer("Example:\n  vemo collect lmdb:/tmp/history --dry-run");
  command->callback([request, &chosen] { chosen = [request] { return RunCollect(*request); }; });
}

}  // namespace vemo::tool
