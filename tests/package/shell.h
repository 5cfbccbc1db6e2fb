// Running a command line as a test does.
#pragma once

#include <sys/wait.h>

#include <cstdio>
#include <stdexcept>
#include <string>

namespace vemo::test {

struct CommandResult {
  int status;          // the exit code, or -1 when a signal ended it
  std::string output;  // standard output and standard error
};

inline CommandResult RunCommand(const std::string& command) {
  std::FILE* pipe = ::popen(("{ " + command + "\n} 2>&1").c_str(), "r");
  if (pipe == nullptr) throw std::runtime_error("cannot run " + command);
  std::string output;
  char buffer[4096];
  for (std::size_t count; (count = std::fread(buffer, 1, sizeof buffer, pipe)) > 0;) output.append(buffer, count);
  const int status = ::pclose(pipe);
  return {WIFEXITED(status) ? WEXITSTATUS(status) : -1, output};
}

}  // namespace vemo::test
