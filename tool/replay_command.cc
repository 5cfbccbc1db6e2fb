#include <fmt/core.h>

#include <CLI/CLI.hpp>
#include <chrono>
#include <memory>
#include <optional>

#include "history/edit_source.h"
#include "history/recorded_maps.h"
#include "history/replay.h"
#include "history/source_error.h"
#include "platform/error.h"
#include "store/snapshot.h"
#include "tool/cache_option.h"
#include "tool/commands.h"
#include "tool/numbers.h"
#include "tool/progress_bar.h"

namespace vemo::tool {

namespace {

struct ReplayArguments {
  std::string store;
  std::string file;
  std::string field;
  std::string author = "recorded author";
  std::string repository;
  std::string revision;  // empty: HEAD
  std::int64_t batch = 10'000;
  bool resume = false;
  bool check = false;
  std::optional<std::uint64_t> cacheBytes;
};

std::unique_ptr<EditSource> OpenSource(const ReplayArguments& arguments) {
  if (arguments.file.empty() == arguments.repository.empty()) {
    throw UsageError("name either a recording, with --field, or a repository, with --git");
  }
  if (!arguments.repository.empty()) {
    if (!arguments.field.empty()) throw UsageError("--field is for a recording; a repository has a field for each file");
    return OpenGitHistory(arguments.repository, arguments.revision.empty() ? "HEAD" : arguments.revision);
  }
  if (!arguments.revision.empty()) throw UsageError("--rev names a commit of a repository; a recording has none");
  if (arguments.field.empty())
    throw UsageError("a recording needs --field to say where it goes, such as --field 1:0");
  return OpenTrace(arguments.file, ParseFieldId(arguments.field), arguments.author);
}

void PrintMaps(Snapshot& snapshot) {
  fmt::print("  {:<12} {:>10} {:>10} {:>8} {:>12}\n", "map", "fields", "nodes", "height", "runs");
  for (const RecordedMap& map : MeasureRecordedMaps(snapshot)) {
    fmt::print("  {:<12} {:>10} {:>10} {:>8} {:>12}\n", map.root, Grouped(map.fields), Grouped(map.nodes), map.height,
               Grouped(map.runs));
  }
}

void PrintReport(const ReplayReport& report, double seconds) {
  const auto row = [](const char* what, std::uint64_t count, const std::string& note) {
    fmt::print("  {:<18} {:>14}{}{}\n", what, Grouped(count), note.empty() ? "" : "  ", note);
  };
  row("edits", report.edits,
      report.editsApplied == report.edits ? ""
                                          : fmt::format("of which {} now", Grouped(report.editsApplied)));
  row("elements inserted", report.elementsInserted, "");
  row("elements deleted", report.elementsDeleted, "");
  row("authors", report.sites, "");
  if (report.sourceCommits > 0)
    row("files", report.objects, fmt::format("in {} git commits", Grouped(report.sourceCommits)));
  row("store commits", report.storeCommits,
      fmt::format("in {:.2f} s, {} edits/s", seconds,
                  Grouped(static_cast<std::uint64_t>(static_cast<double>(report.editsApplied) /
                                                     std::max(seconds, 1e-9)))));
}

void PrintSkipped(const SkippedFiles& skipped) {
  if (skipped.binary + skipped.symlinks + skipped.submodules == 0) return;
  fmt::print("  {:<18} {:>14}  binary {}, symbolic links {}, submodules {}\n", "paths skipped",
             Grouped(skipped.binary + skipped.symlinks + skipped.submodules), skipped.binary,
             skipped.symlinks, skipped.submodules);
}

// Reads the history of a repository once, to find out what there is to replay.
std::uint64_t CountEdits(EditSource& source) {
  std::optional<ProgressBar> bar;
  source.ReportScanTo([&bar](std::uint64_t done, std::uint64_t of) {
    if (!bar) bar.emplace("reading the history", of);
    bar->Update(done);
  });
  const std::uint64_t edits = source.CountEdits();
  source.ReportScanTo({});
  return edits;
}

std::optional<std::string> Check(CSpace& space, EditSource& source, std::uint64_t edits) {
  ProgressBar bar("checking", edits);
  return CheckReplay(space, source, [&bar](std::uint64_t done) { bar.Update(done); });
}

ExitCode RunReplay(const ReplayArguments& arguments) {
  if (arguments.batch < 1) throw UsageError("--batch: a batch has at least 1 edit");
  const std::unique_ptr<EditSource> source = OpenSource(arguments);
  const std::uint64_t edits = CountEdits(*source);
  auto space = CSpace::Open(arguments.store, {.create = true, .cacheBytes = arguments.cacheBytes});
  const auto start = std::chrono::steady_clock::now();
  ReplayReport report;
  {
    ProgressBar bar("replaying", edits);
    ReplayOptions options;
    options.batchEdits = static_cast<std::uint64_t>(arguments.batch);
    options.resume = arguments.resume;
    options.progress = [&bar](std::uint64_t done) { bar.Update(done); };
    report = Replay(*space, *source, options);
  }
  const double seconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
  fmt::print("{} in {}\n", source->Describe(), space->Name());
  PrintReport(report, seconds);
  PrintSkipped(source->Skipped());

  // A memory space ends with its handle; any other is read back from where it was written.
  const bool reopen = space->Name() != "memory:";
  if (reopen && arguments.check) {
    space.reset();
    space = CSpace::Open(arguments.store, {.cacheBytes = arguments.cacheBytes});
  }
  {
    Snapshot snapshot(*space);
    PrintMaps(snapshot);
    const EngineUsage usage = space->Usage();
    fmt::print("  {} records, {}\n", Grouped(usage.records), ByteSize(usage.bytes));
  }
  if (!arguments.check) return kGood;
  if (const std::optional<std::string> difference = Check(*space, *source, edits)) {
    fmt::print("{}\n", OneLine(*difference));
    return kFinding;
  }
  fmt::print("content matches\n");
  return kGood;
}

}  // namespace

void AddReplayCommand(CLI::App& app, Command& chosen) {
  auto arguments = std::make_shared<ReplayArguments>();
  CLI::App* command =
      app.add_subcommand("replay", "Record the edits of a session or of a git repository in a space");
  command->add_option("--store", arguments->store, "The space, made if it is not there: lmdb:PATH or memory:")
      ->required();
  command->add_option("file", arguments->file, "A recorded session, JSON, plain or gzip");
  command->add_option("--field", arguments->field,
                      "The field that the recording edits, such as 1:0 (object 1, path 0)");
  command->add_option("--author", arguments->author, "Whose site the recording's operations are")
      ->capture_default_str();
  command->add_option("--git", arguments->repository,
                      "A git repository: its first-parent history is replayed");
  command->add_option("--rev", arguments->revision, "The commit up to which the repository is replayed (default HEAD)");
  command->add_option("--batch", arguments->batch, "Commit after this many edits")->capture_default_str();
  command->add_flag("--resume", arguments->resume, "Go on after the last edit that the space has recorded");
  command->add_flag("--check", arguments->check,
                    "Open the space anew, rebuild every content from it and compare it with the source");
  AddCacheOption(*command, arguments->cacheBytes);
  command->footer(
      "Examples:\n"
      "  vemo replay --store lmdb:/tmp/history --git . --check\n"
      "  vemo replay --store lmdb:/tmp/session --field 1:0 session.json.gz --check");
  command->callback([arguments, &chosen] { chosen = [arguments] { return RunReplay(*arguments); }; });
}

}  // namespace vemo::tool
