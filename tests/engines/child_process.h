// A forked process and the two pipes by which it and the test take turns.
#pragma once

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <exception>
#include <functional>
#include <iostream>
#include <string>

namespace vemo::test {

// One end of the conversation. Each call waits for the other side; the other side's death ends the wait.
class Conversation {
 public:
  Conversation(int readEnd, int writeEnd) noexcept : m_read(readEnd), m_write(writeEnd) {}
  void Say(const std::string& line) const {
    const std::string text = line + "\n";
    if (::write(m_write, text.data(), text.size()) != static_cast<ssize_t>(text.size())) std::abort();
  }
  // The next line, or what came of it before the other side ended.
  std::string Hear() const {
    std::string line;
    char c = 0;
    while (::read(m_read, &c, 1) == 1 && c != '\n') line.push_back(c);
    return line;
  }

 private:
  int m_read;
  int m_write;
};

// Runs `act` in a child; an exception or a false makes it fail. Fork with no other thread running.
class ChildProcess {
 public:
  explicit ChildProcess(const std::function<bool(const Conversation&)>& act) {
    if (::pipe(m_toChild) != 0 || ::pipe(m_toParent) != 0) std::abort();
    std::cout.flush();
    m_pid = ::fork();
    if (m_pid < 0) std::abort();
    if (m_pid > 0) {
      ::close(m_toChild[0]);
      ::close(m_toParent[1]);
      return;
    }
    ::close(m_toChild[1]);
    ::close(m_toParent[0]);
    ::_exit(Run(act, Conversation(m_toChild[0], m_toParent[1])));
  }
  ~ChildProcess() {
    if (m_pid > 0) Kill();
    ::close(m_toChild[1]);
    ::close(m_toParent[0]);
  }
  ChildProcess(const ChildProcess&) = delete;
  ChildProcess& operator=(const ChildProcess&) = delete;

  pid_t pid() const noexcept { return m_pid; }
  void Say(const std::string& line) const { Conversation(m_toParent[0], m_toChild[1]).Say(line); }
  std::string Hear() const { return Conversation(m_toParent[0], m_toChild[1]).Hear(); }

  // Waits for the end of the child; whether `act` returned true.
  bool Succeeded() {
    int status = 0;
    ::waitpid(m_pid, &status, 0);
    m_pid = -1;
    return WIFEXITED(status) && WEXITSTATUS(status) == 0;
  }

  // Ends the child; what it has said before can still be heard.
  void Kill() {
    ::kill(m_pid, SIGKILL);
    ::waitpid(m_pid, nullptr, 0);
    m_pid = -1;
  }

 private:
  static int Run(const std::function<bool(const Conversation&)>& act, const Conversation& parent) {
    try {
      return act(parent) ? 0 : 1;
    } catch (const std::exception& error) {
      std::cerr << "in the child: " << error.what() << std::endl;
      return 2;
    }
  }

  int m_toChild[2] = {-1, -1};
  int m_toParent[2] = {-1, -1};
  pid_t m_pid = -1;
};

}  // namespace vemo::test
