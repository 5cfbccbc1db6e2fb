#include "command_line.h"

#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cstdio>
#include <memory>
#include <stdexcept>

namespace vemo::test {

namespace {

using File = std::unique_ptr<std::FILE, int (*)(std::FILE*)>;

// A file without a name: however much the process prints, it never waits for a reader.
File Capture() {
  File file(std::tmpfile(), &std::fclose);
  if (file == nullptr) throw std::runtime_error("no temporary file");
  return file;
}

std::string ContentOf(std::FILE* file) {
  std::rewind(file);
  std::string content;
  std::array<char, 4096> block;
  for (std::size_t got; (got = std::fread(block.data(), 1, block.size(), file)) > 0;)
    content.append(block.data(), got);
  return content;
}

}  // namespace

Outcome RunProgram(const std::vector<std::string>& command, const std::function<void()>& inChild) {
  const File out = Capture();
  const File err = Capture();
  std::vector<char*> arguments;
  for (const std::string& argument : command) arguments.push_back(const_cast<char*>(argument.c_str()));
  arguments.push_back(nullptr);
  const pid_t pid = ::fork();
  if (pid < 0) throw std::runtime_error("cannot fork");
  if (pid == 0) {
    ::dup2(::open("/dev/null", O_RDONLY), STDIN_FILENO);
    ::dup2(::fileno(out.get()), STDOUT_FILENO);
    ::dup2(::fileno(err.get()), STDERR_FILENO);
    if (inChild) inChild();
    ::execvp(arguments[0], arguments.data());
    ::_exit(127);
  }
  int status = 0;
  if (::waitpid(pid, &status, 0) != pid) throw std::runtime_error("cannot wait");
  Outcome outcome;
  if (WIFEXITED(status)) outcome.exitCode = WEXITSTATUS(status);
  if (WIFSIGNALED(status)) outcome.signal = WTERMSIG(status);
  outcome.out = ContentOf(out.get());
  outcome.err = ContentOf(err.get());
  return outcome;
}

Outcome Vemo(std::vector<std::string> arguments, const std::function<void()>& inChild) {
  arguments.insert(arguments.begin(), VEMO_BINARY_DIR "/vemo");
  return RunProgram(arguments, inChild);
}

std::string RecordingText(const std::vector<std::string>& patches, std::string_view endContent) {
  std::string text = R"({"startContent":"","endContent":")" + std::string(endContent) + R"(","txns":[)";
  for (std::size_t i = 0; i < patches.size(); ++i) {
    if (i > 0) text += ',';
    text += R"({"time":"2020-01-01T00:00:00Z","patches":[[)" + patches[i] + "]]}";
  }
  return text + "]}";
}

}  // namespace vemo::test
