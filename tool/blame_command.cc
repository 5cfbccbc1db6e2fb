#include <fmt/core.h>

#include <CLI/CLI.hpp>
#include <algorithm>
#include <memory>
#include <vector>

#include "history/blame.h"
#include "history/source_error.h"
#include "platform/error.h"
#include "tool/commands.h"

namespace vemo::tool {

namespace {

struct BlameArguments {
  std::string store;
  std::string field;
  std::string path;
};

constexpr std::size_t kCommitDigits = 12;

FieldId FieldToBlame(const Snapshot& snapshot, const BlameArguments& arguments) {
  if (arguments.field.empty() == arguments.path.empty()) {
    throw UsageError("name either a field, such as 1:0, or the file of a replayed repository, with --path");
  }
  if (!arguments.field.empty()) return ParseFieldId(arguments.field);
  const std::optional<FieldId> found = FindGitField(snapshot, arguments.path);
  if (!found) throw UsageError(snapshot.Space().Name() + ": it has no file \"" + arguments.path + "\"");
  return *found;
}

std::string RangeText(const BlameRun& run) {
  return run.n == 1 ? std::to_string(run.p + 1) : fmt::format("{}-{}", run.p + 1, run.p + run.n);
}

// The columns that --help tells of; all but the last are aligned.
std::string BlameText(const std::vector<BlameRun>& runs) {
  std::size_t rangeWidth = 0;
  std::size_t numberWidth = 0;
  for (const BlameRun& run : runs) {
    rangeWidth = std::max(rangeWidth, RangeText(run).size());
    numberWidth = std::max(numberWidth, std::to_string(run.first.t).size());
  }
  std::string text;
  for (const BlameRun& run : runs) {
    const std::string commit = run.commit.empty() ? "-" : OneLine(run.commit.substr(0, kCommitDigits));
    const std::string author = run.author.empty() ? GuidText(run.first.s) : OneLine(run.author);
    text += fmt::format("{:<{}}  {:<{}}  {:>{}}  {}\n", RangeText(run), rangeWidth, commit, kCommitDigits,
                        run.first.t, numberWidth, author);
  }
  return text;
}

ExitCode RunBlame(const BlameArguments& arguments) {
  const auto space = CSpace::Open(arguments.store);
  Snapshot snapshot(*space);
  fmt::print("{}", BlameText(BlameField(snapshot, FieldToBlame(snapshot, arguments))));
  return kGood;
}

}  // namespace

void AddBlameCommand(CLI::App& app, Command& chosen) {
  auto arguments = std::make_shared<BlameArguments>();
  CLI::App* command = app.add_subcommand("blame", "Print who wrote the live elements of a field");
  command->add_option("store", arguments->store, "The space: lmdb:PATH")->required();
  command->add_option("field", arguments->field, "The field, such as 1:0 (object 1, path 0)");
  command->add_option("--path", arguments->path,
                      "Instead of a field: the path of a file of a replayed repository");
  command->footer(
      "A line is a run of live elements that one author wrote in one go, in the order of the field:\n"
      "  1  the elements, counted from 1 without tombstones: the lines of a file of a git repository,\n"
      "     the code points of a recorded session\n"
      "  2  the commit that wrote them, 12 digits of it; - where the field is none of a git repository\n"
      "  3  the number of the first element's operation, among those of its author\n"
      "  4  the author, up to the end of the line; the id of the site where no author is recorded\n"
      "Examples:\n"
      "  vemo blame lmdb:/tmp/history --path README.md\n"
      "  vemo blame lmdb:/tmp/session 1:0");
  command->callback([arguments, &chosen] { chosen = [arguments] { return RunBlame(*arguments); }; });
}

}  // namespace vemo::tool
