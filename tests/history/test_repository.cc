#include "test_repository.h"

#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>

namespace vemo::test {

namespace {

std::string ReadAll(int fd) {
  std::string text;
  char block[4096];
  for (ssize_t got; (got = ::read(fd, block, sizeof block)) > 0;)
    text.append(block, static_cast<std::size_t>(got));
  return text;
}

std::string Run(const std::vector<std::string>& command, const std::vector<std::string>& variables) {
  std::vector<char*> arguments;
  for (const std::string& argument : command) arguments.push_back(const_cast<char*>(argument.c_str()));
  arguments.push_back(nullptr);
  int ends[2];
  if (::pipe2(ends, O_CLOEXEC) != 0) throw std::runtime_error("no pipe");
  const pid_t pid = ::fork();
  if (pid == 0) {
    for (const std::string& variable : variables) ::putenv(const_cast<char*>(variable.c_str()));
    ::dup2(ends[1], STDOUT_FILENO);
    ::execvp(arguments[0], arguments.data());
    ::_exit(127);
  }
  ::close(ends[1]);
  std::string output = ReadAll(ends[0]);
  ::close(ends[0]);
  int status = 0;
  if (pid < 0 || ::waitpid(pid, &status, 0) != pid || status != 0) {
    std::string text;
    for (const std::string& argument : command) text += argument + " ";
    throw std::runtime_error("failed: " + text);
  }
  if (output.ends_with('\n')) output.pop_back();
  return output;
}

}  // namespace

TestRepository::TestRepository() {
  if (const char* home = std::getenv("HOME")) m_outerHome = home;
  std::filesystem::create_directory(folder() / "home");
  ::setenv("HOME", (folder() / "home").c_str(), 1);
  ::unsetenv("XDG_CONFIG_HOME");
  ::setenv("GIT_CONFIG_NOSYSTEM", "1", 1);
  std::filesystem::create_directory(path());
  Git({"init", "-q", "-b", "main"});
}

TestRepository::~TestRepository() {
  ::setenv("HOME", m_outerHome.c_str(), 1);
}

std::string TestRepository::Git(const std::vector<std::string>& arguments) {
  std::vector<std::string> command = {"git", "-C", path().string()};
  command.insert(command.end(), arguments.begin(), arguments.end());
  const std::string date = std::to_string(m_seconds) + " +0000";
  return Run(command, {"GIT_AUTHOR_NAME=" + m_author, "GIT_AUTHOR_EMAIL=" + m_address,
                       "GIT_AUTHOR_DATE=" + date, "GIT_COMMITTER_NAME=Committer",
                       "GIT_COMMITTER_EMAIL=c@example.org", "GIT_COMMITTER_DATE=" + date, "LC_ALL=C"});
}

std::string TestRepository::Commit() {
  Git({"add", "-A"});
  return CommitIndex();
}

std::string TestRepository::CommitIndex() {
  m_seconds += 60;
  Git({"commit", "-q", "--allow-empty", "-m", "a commit"});
  return Git({"rev-parse", "HEAD"});
}

void TestRepository::SetAuthor(std::string name, std::string address) {
  m_author = std::move(name);
  m_address = std::move(address);
}

void TestRepository::ConfigureUser(std::string_view text) {
  std::ofstream(folder() / "home" / ".gitconfig", std::ios::app) << text << '\n';
}

}  // namespace vemo::test
