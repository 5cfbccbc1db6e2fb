#include "history/git_process.h"

#include <fcntl.h>
#include <spawn.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstring>

#include "history/git_environment.h"
#include "history/source_error.h"

namespace vemo {

namespace {

constexpr std::size_t kMessageBytes = 1 << 14;  // as much of git's messages as is looked at

[[noreturn]] void ThrowCannotRun(int error) {
  throw SourceError(std::string("cannot run git: ") + std::strerror(error) +
                    (error == ENOENT ? " (is git installed and in PATH?)" : ""));
}

// Input and messages pass through files in memory rather than pipes: a full pipe would stop both sides for
// ever.
FileDescriptor MemoryFile(const char* name, std::string_view content) {
  FileDescriptor file(::memfd_create(name, MFD_CLOEXEC));
  if (file.get() < 0) ThrowCannotRun(errno);
  for (std::size_t written = 0; written < content.size();) {
    const ssize_t now =
        ::pwrite(file.get(), content.data() + written, content.size() - written, static_cast<off_t>(written));
    if (now < 0 && errno != EINTR) ThrowCannotRun(errno);
    if (now > 0) written += static_cast<std::size_t>(now);
  }
  return file;
}

std::vector<char*> PointersTo(std::vector<std::string>& strings) {
  std::vector<char*> pointers;
  for (std::string& string : strings) pointers.push_back(string.data());
  pointers.push_back(nullptr);
  return pointers;
}

// What the new process starts with: its three streams, default handling of SIGPIPE (it ends when nobody reads
// on) and no blocked signals, whatever this process has.
class SpawnSettings {
 public:
  SpawnSettings(int input, int output, int messages) {
    ::posix_spawn_file_actions_init(&m_actions);
    ::posix_spawn_file_actions_adddup2(&m_actions, input, STDIN_FILENO);
    ::posix_spawn_file_actions_adddup2(&m_actions, output, STDOUT_FILENO);
    ::posix_spawn_file_actions_adddup2(&m_actions, messages, STDERR_FILENO);
    sigset_t signals;
    ::sigemptyset(&signals);
    ::posix_spawnattr_init(&m_attributes);
    ::posix_spawnattr_setsigmask(&m_attributes, &signals);
    ::sigaddset(&signals, SIGPIPE);
    ::posix_spawnattr_setsigdefault(&m_attributes, &signals);
    ::posix_spawnattr_setflags(&m_attributes, POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF);
  }
  SpawnSettings(const SpawnSettings&) = delete;
  SpawnSettings& operator=(const SpawnSettings&) = delete;
  ~SpawnSettings() {
    ::posix_spawnattr_destroy(&m_attributes);
    ::posix_spawn_file_actions_destroy(&m_actions);
  }

  pid_t Spawn(std::vector<std::string> command, std::vector<std::string> environment) {
    pid_t pid = -1;
    const int error = ::posix_spawnp(&pid, command.front().c_str(), &m_actions, &m_attributes,
                                     PointersTo(command).data(), PointersTo(environment).data());
    if (error != 0) ThrowCannotRun(error);
    return pid;
  }

 private:
  posix_spawn_file_actions_t m_actions;
  posix_spawnattr_t m_attributes;
};

// Returns false where the process cannot be waited for, as in a program that ignores SIGCHLD.
bool WaitFor(pid_t pid, int& status) {
  for (;;) {
    if (::waitpid(pid, &status, 0) == pid) return true;
    if (errno != EINTR) return false;
  }
}

}  // namespace

GitProcess::GitProcess(const std::vector<std::string>& arguments, std::string_view input) {
  std::vector<std::string> command = {"git"};
  command.insert(command.end(), arguments.begin(), arguments.end());
  const FileDescriptor inputFile = MemoryFile("vemo-git-input", input);
  m_messages = MemoryFile("vemo-git-messages", {});
  int ends[2];
  if (::pipe2(ends, O_CLOEXEC) != 0) ThrowCannotRun(errno);
  const FileDescriptor writingEnd(ends[1]);
  m_output.emplace(FileDescriptor(ends[0]));
  m_pid = SpawnSettings(inputFile.get(), writingEnd.get(), m_messages.get())
              .Spawn(std::move(command), GitEnvironment());
}

GitProcess::~GitProcess() {
  if (m_pid < 0) return;
  ::kill(m_pid, SIGKILL);
  int status = 0;
  WaitFor(m_pid, status);
}

GitExit GitProcess::Wait() {
  m_output->Close();
  int status = 0;
  const bool known = WaitFor(std::exchange(m_pid, -1), status);
  if (!known) return {false, "how it ended cannot be learnt"};
  if (WIFSIGNALED(status)) return {false, "it was ended by signal " + std::to_string(WTERMSIG(status))};
  if (WEXITSTATUS(status) == 0) return {true, {}};
  std::string message = FirstMessage();
  if (message.empty()) message = "it ended with status " + std::to_string(WEXITSTATUS(status));
  return {false, std::move(message)};
}

void GitProcess::Finish() {
  const GitExit exit = Wait();
  if (!exit.succeeded) throw SourceError("git failed: " + exit.reason);
}

// The first fatal message, or the first line where there is none.
std::string GitProcess::FirstMessage() const {
  std::string messages(kMessageBytes, '\0');
  const ssize_t size = ::pread(m_messages.get(), messages.data(), messages.size(), 0);
  messages.resize(size > 0 ? static_cast<std::size_t>(size) : 0);
  constexpr std::string_view kFatal = "fatal: ";
  std::size_t begin = 0;
  if (messages.starts_with(kFatal)) {
    begin = kFatal.size();
  } else if (const std::size_t found = messages.find("\nfatal: "); found != std::string::npos) {
    begin = found + 1 + kFatal.size();
  }
  return messages.substr(begin, messages.find('\n', begin) - begin);
}

}  // namespace vemo
