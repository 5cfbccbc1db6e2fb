// The built command as a process of its own.
#pragma once

#include <functional>
#include <string>
#include <string_view>
#include <vector>

namespace vemo::test {

struct Outcome {
  int exitCode = -1;  // -1 when a signal ended the process
  int signal = 0;
  std::string out;
  std::string err;
};

// Runs a program to its end with nothing on standard input. `inChild` is called in the new process before it
// starts.
Outcome RunProgram(const std::vector<std::string>& command, const std::function<void()>& inChild = {});

// Runs `vemo` of this build.
Outcome Vemo(std::vector<std::string> arguments, const std::function<void()>& inChild = {});

// The text of a recorded session with the patches [position, deleted count, "inserted text"], each a
// transaction.
std::string RecordingText(const std::vector<std::string>& patches, std::string_view endContent);

}  // namespace vemo::test
