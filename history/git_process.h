// A git command whose output is read while it runs.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "history/file_descriptor.h"
#include "history/pipe_reader.h"

namespace vemo {

// How a git command ended, and the line of its messages that says why.
struct GitExit {
  bool succeeded;
  std::string reason;  // empty where it succeeded
};

// Runs git without a shell, with messages in English and without the GIT_ variables that would lead it to
// another repository or change its output. Messages are collected in memory. A command that is not read to
// its end is killed when its object goes; no process is left behind either way. Views returned are valid
// until the next read.
class GitProcess {
 public:
  // Starts `git ARGUMENTS`; it reads `input` from its standard input. Throws SourceError where git cannot be
  // run.
  explicit GitProcess(const std::vector<std::string>& arguments, std::string_view input = {});
  GitProcess(const GitProcess&) = delete;
  GitProcess& operator=(const GitProcess&) = delete;
  ~GitProcess();

  // As PipeReader's. The end of the output does not mean success: ask Finish or Wait.
  std::optional<std::string_view> ReadLine(char terminator = '\n') { return m_output->ReadLine(terminator); }
  std::string_view ReadBlock(std::size_t size) { return m_output->ReadBlock(size); }

  // Waits for the end of the command, whose output has been read. Call one of them, once. Finish throws
  // SourceError where the command failed.
  GitExit Wait();
  void Finish();

 private:
  std::string FirstMessage() const;

  pid_t m_pid = -1;  // -1 when there is no process to wait for
  FileDescriptor m_messages;
  std::optional<PipeReader> m_output;
};

}  // namespace vemo
