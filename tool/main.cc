#include <fmt/core.h>

#include <CLI/CLI.hpp>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <exception>

#include "history/source_error.h"
#include "store/error.h"
#include "tool/commands.h"

namespace {

using vemo::tool::Command;
using vemo::tool::ExitCode;

ExitCode Fail(ExitCode code, const std::exception& error) {
  fmt::print(stderr, "vemo: {}\n", vemo::OneLine(error.what()));
  return code;
}

ExitCode Run(const Command& command) {
  try {
    const ExitCode code = command();
    // What was printed can still fail on its last way.
    if (std::fflush(stdout) != 0) {
      throw vemo::StoreError(std::string("standard output cannot be written: ") + std::strerror(errno));
    }
    return code;
  } catch (const vemo::StoreError& error) {
    return Fail(vemo::tool::kStoreFault, error);
  } catch (const vemo::Error& error) {
    return Fail(vemo::tool::kBadInput, error);
  } catch (const std::exception& error) {
    return Fail(vemo::tool::kStoreFault, error);
  }
}

}  // namespace

int main(int argc, char** argv) {
  CLI::App app{"Bookkeeping of concurrent edits of sequence fields, kept in a space.", "vemo"};
  app.footer(
      "A space is named by a URI: lmdb:PATH is a folder on disk, memory: ends with the command.\n"
      "Exit status: 0 good, 1 something was found wrong, 2 bad use or bad input, 3 the store failed.\n"
      "Try: vemo replay --store lmdb:/tmp/history --git . --check");
  app.require_subcommand(1);
  Command chosen;
  vemo::tool::AddReplayCommand(app, chosen);
  vemo::tool::AddDumpCommand(app, chosen);
  vemo::tool::AddVerifyCommand(app, chosen);
  vemo::tool::AddStatsCommand(app, chosen);
  vemo::tool::AddBlameCommand(app, chosen);
  vemo::tool::AddCollectCommand(app, chosen);
  vemo::tool::AddSalvageCommand(app, chosen);
  try {
    app.parse(argc, argv);
  } catch (const CLI::Success& asked) {
    return app.exit(asked);  // --help
  } catch (const CLI::ParseError& error) {
    fmt::print(stderr, "vemo: {} (see vemo --help)\n", vemo::OneLine(error.what()));
    return vemo::tool::kBadInput;
  }
  return Run(chosen);
}
