#include <fmt/core.h>

#include <CLI/CLI.hpp>
#include <memory>

#include "history/source_error.h"
#include "history/verify_history.h"
#include "store/raw_check.h"
#include "store/reading_engine.h"
#include "store/verify.h"
#include "tool/cache_option.h"
#include "tool/commands.h"
#include "tool/numbers.h"
#include "tool/progress_bar.h"

namespace vemo::tool {

namespace {

void PrintFinding(const std::string& space, const std::string& finding) { fmt::print("{}: {}\n", space, OneLine(finding)); }

struct VerifyArguments {
  std::string store;
  bool raw = false;
  std::optional<std::uint64_t> cacheBytes;
};

ExitCode RunVerify(const VerifyArguments& arguments) {
  const auto space = CSpace::Open(arguments.store, {.cacheBytes = arguments.cacheBytes});
  Snapshot snapshot(*space);
  VerifyReport report;
  {
    ProgressBar bar("verifying", space->Usage().records);
    report = VerifySpace(snapshot, [&bar](std::uint64_t done, std::uint64_t) { bar.Update(done); });
  }
  for (const Finding& finding : report.findings) PrintFinding(report.space, FindingText(finding));
  std::size_t findings = report.findings.size();
  // What the maps say to one another can be compared only where each is sound.
  if (findings == 0 && HasHistory(snapshot)) {
    for (const HistoryFinding& finding : VerifyHistory(snapshot)) {
      fmt::print("field {}: {}\n", FieldIdText(finding.field), finding.fault);
      ++findings;
    }
  }
  fmt::print("{} maps, {} entries, {} nodes, {} records, {} unreachable: {}\n", Grouped(report.maps),
             Grouped(report.entries), Grouped(report.nodes), Grouped(report.records), Grouped(report.unreachable),
             findings == 0 ? "sound" : fmt::format("{} findings", findings));
  return findings == 0 ? kGood : kFinding;
}

ExitCode RunRawVerify(const std::string& store) {
  const auto engine = OpenEngineForReading(store);
  const auto state = engine->OpenSnapshot();
  RawCheckReport report;
  {
    ProgressBar bar("verifying", engine->Usage().records);
    report = CheckRawSpace(*state, [&bar](std::uint64_t done) { bar.Update(done); });
  }
  for (const RawFinding& finding : report.findings) PrintFinding(engine->Name(), RawFindingText(finding));
  fmt::print("{} maps, {} entries, {} nodes, {} records, {} unreachable: {}\n", Grouped(report.maps),
             Grouped(report.entries), Grouped(report.nodes), Grouped(report.records), Grouped(report.unreachable),
             report.findings.empty() ? "sound" : fmt::format("{} findings", report.findings.size()));
  return report.findings.empty() ? kGood : kFinding;
}

}  // namespace

void AddVerifyCommand(CLI::App& app, Command& chosen) {
  auto arguments = std::make_shared<VerifyArguments>();
  CLI::App* command =
      app.add_subcommand("verify", "Check checksums, every map's structure and that the maps agree with one another");
  command->add_option("store", arguments->store, "The space: lmdb:PATH")->required();
  command->add_flag("--raw", arguments->raw, "Check the stored bytes with a reader of their own, also where the space cannot be opened");
  AddCacheOption(*command, arguments->cacheBytes);
  command->footer("Example:\n  vemo verify lmdb:/tmp/history");
  command->callback([arguments, &chosen] {
    chosen = [arguments] { return arguments->raw ? RunRawVerify(arguments->store) : RunVerify(*arguments); };
  });
}

}  // namespace vemo::tool
