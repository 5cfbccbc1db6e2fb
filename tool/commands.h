// The subcommands. Each adds itself to the command line and returns what main runs when it was chosen.
#pragma once

#include <functional>

#include "tool/exit_codes.h"

namespace CLI {
class App;
}

namespace vemo::tool {

// Runs the command. Throws vemo::Error; main prints the message and chooses the exit code.
using Command = std::function<ExitCode()>;

void AddReplayCommand(CLI::App& app, Command& chosen);
void AddDumpCommand(CLI::App& app, Command& chosen);
void AddVerifyCommand(CLI::App& app, Command& chosen);
void AddStatsCommand(CLI::App& app, Command& chosen);
void AddBlameCommand(CLI::App& app, Command& chosen);
void AddCollectCommand(CLI::App& app, Command& chosen);
void AddSalvageCommand(CLI::App& app, Command& chosen);

}  // namespace vemo::tool
