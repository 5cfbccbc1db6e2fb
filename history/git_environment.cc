#include "history/git_environment.h"

#include <unistd.h>

#include <algorithm>
#include <array>
#include <string_view>

namespace vemo {

namespace {

bool IsKept(std::string_view variable) {
  constexpr std::array<std::string_view, 4> kKeptOfGit = {
      "GIT_CONFIG", "GIT_EXEC_PATH=", "GIT_CEILING_DIRECTORIES=", "GIT_DISCOVERY_ACROSS_FILESYSTEM="};
  if (variable.starts_with("LC_ALL=") || variable.starts_with("LANGUAGE=")) return false;
  if (!variable.starts_with("GIT_")) return true;
  return std::any_of(kKeptOfGit.begin(), kKeptOfGit.end(),
                     [&](std::string_view kept) { return variable.starts_with(kept); });
}

}  // namespace

std::vector<std::string> GitEnvironment() {
  std::vector<std::string> environment;
  for (char** variable = environ; *variable != nullptr; ++variable) {
    if (IsKept(*variable)) environment.emplace_back(*variable);
  }
  environment.emplace_back("LC_ALL=C");
  environment.emplace_back("GIT_ATTR_NOSYSTEM=1");
  environment.emplace_back("GIT_OPTIONAL_LOCKS=0");   // nothing is written to the repository
  environment.emplace_back("GIT_TERMINAL_PROMPT=0");  // a partial clone may want a password: fail instead
  return environment;
}

}  // namespace vemo
