#include <fmt/core.h>

#include <CLI/CLI.hpp>
#include <memory>

#include "history/source_error.h"
#include "store/raw_record.h"
#include "store/reading_engine.h"
#include "store/salvage.h"
#include "store/snapshot.h"
#include "tool/commands.h"
#include "tool/numbers.h"
#include "tool/progress_bar.h"

namespace vemo::tool {

namespace {

struct Request {
  std::string source;
  std::string destination;
};

// What the nodes of the space that is made may take in memory.
constexpr std::uint64_t kCacheBytes = std::uint64_t{64} << 20;

ExitCode RunSalvage(const Request& request) {
  const auto engine = OpenEngineForReading(request.source);
  const auto state = engine->OpenSnapshot();
  const auto space = CSpace::Open(request.destination, {.create = true, .cacheBytes = kCacheBytes});
  SalvageReport report;
  {
    std::unique_ptr<ProgressBar> bar;
    SalvageOptions options;
    options.progress = [&bar](std::uint64_t done, std::uint64_t of) {
      if (bar == nullptr) bar = std::make_unique<ProgressBar>("salvaging", of);
      bar->Update(done);
    };
    report = Salvage(*state, *space, options);
  }
  for (const SalvageReport::Map& map : report.maps) {
    fmt::print("{}: {} entries\n", OneLine(RootNameText(map.root)), Grouped(map.entries));
  }
  for (const SalvageLoss& loss : report.losses) fmt::print("lost: {}\n", OneLine(SalvageLossText(loss)));
  fmt::print("{} maps, {} entries, {} meta values copied, {} leaves left behind: {}\n", Grouped(report.maps.size()),
             Grouped(report.entries), Grouped(report.metaValues), Grouped(report.leftLeaves),
             report.losses.empty() ? "nothing lost" : fmt::format("{} losses", report.losses.size()));
  return report.losses.empty() ? kGood : kFinding;
}

}  // namespace

void AddSalvageCommand(CLI::App& app, Command& chosen) {
  auto request = std::make_shared<Request>();
  CLI::App* command = app.add_subcommand("salvage", "Copy what is sound in a damaged space into a new one");
  command->add_option("source", request->source, "The damaged space: lmdb:PATH; it is only read")->required();
  command->add_option("destination", request->destination, "The space to make: lmdb:PATH")->required();
  command->footer("Example:\n  vemo salvage lmdb:/tmp/history lmdb:/tmp/rescued");
  command->callback([request, &chosen] { chosen = [request] { return RunSalvage(*request); }; });
}

}  // namespace vemo::tool
