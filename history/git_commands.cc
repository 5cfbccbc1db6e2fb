#include "history/git_commands.h"

#include <initializer_list>

namespace vemo {

namespace {

std::vector<std::string> CommandIn(const std::filesystem::path& repository,
                                   std::initializer_list<const char*> rest) {
  // Replaced objects belong to the history that the repository's own log shows.
  std::vector<std::string> arguments = {"--no-pager", "-C", repository.string(), "-c",
                                        "core.useReplaceRefs=true"};
  arguments.insert(arguments.end(), rest.begin(), rest.end());
  return arguments;
}

}  // namespace

std::vector<std::string> FindRepositoryCommand(const std::filesystem::path& repository) {
  return CommandIn(repository, {"rev-parse", "--show-prefix"});
}

std::vector<std::string> ResolveRevisionCommand(const std::filesystem::path& repository,
                                                std::string_view revision) {
  auto arguments = CommandIn(repository, {"rev-parse", "--verify", "--quiet", "--end-of-options"});
  arguments.push_back(std::string(revision) + "^{commit}");
  return arguments;
}

std::vector<std::string> ListBinarySettingsCommand(const std::filesystem::path& repository) {
  return CommandIn(repository, {"config", "-z", "--name-only", "--get-regexp", "^diff\\..*\\.binary$"});
}

std::vector<std::string> LogCommand(const std::filesystem::path& repository,
                                    const std::vector<std::string>& binarySettings, std::string_view commit) {
  // Settings for which git has no option; the values are git's defaults.
  auto arguments = CommandIn(repository, {"-c", "log.showRoot=true",              //
                                          "-c", "core.quotePath=true",            //
                                          "-c", "core.bigFileThreshold=512m",     //
                                          "-c", "core.attributesFile=/dev/null",  //
                                          "-c", "diff.suppressBlankEmpty=false"});
  for (const std::string& setting : binarySettings) {
    arguments.push_back("-c");
    arguments.push_back(setting + "=auto");
  }
  for (const char* option :
       {// What is asked for.
        "log", "--first-parent", "--diff-merges=first-parent", "--reverse", "-p", "--unified=0",
        "--inter-hunk-context=0", "--no-renames", "--diff-algorithm=myers", "-O/dev/null",
        "--indent-heuristic",
        // The line of a commit: in its place no other line starts with this word.
        "--format=tformat:commit %H %an <%ae>", "--encoding=UTF-8", "--no-mailmap", "--no-show-signature",
        "--no-notes", "--no-decorate",
        // The form of the diff.
        "--no-color", "--no-color-moved", "--no-ext-diff", "--no-textconv", "--src-prefix=a/",
        "--dst-prefix=b/", "--no-relative", "--full-index", "--submodule=short", "--ignore-submodules=none",
        "--no-function-context", "--ws-error-highlight=none", "--end-of-options"}) {
    arguments.push_back(option);
  }
  arguments.push_back(std::string(commit));
  arguments.push_back("--");
  return arguments;
}

std::vector<std::string> CountCommitsCommand(const std::filesystem::path& repository, std::string_view commit) {
  auto arguments = CommandIn(repository, {"rev-list", "--count", "--first-parent", "--end-of-options"});
  arguments.push_back(std::string(commit));
  return arguments;
}

std::vector<std::string> ListFilesCommand(const std::filesystem::path& repository, std::string_view commit) {
  auto arguments = CommandIn(repository, {"ls-tree", "-r", "-z", "--full-tree", "--end-of-options"});
  arguments.push_back(std::string(commit));
  return arguments;
}

std::vector<std::string> ReadBlobsCommand(const std::filesystem::path& repository) {
  return CommandIn(repository, {"cat-file", "--batch", "--buffer"});
}

}  // namespace vemo
