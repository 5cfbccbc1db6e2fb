#include "bench/common/own_process.h"

#include <fmt/core.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdio>
#include <exception>
#include <sstream>
#include <stdexcept>
#include <system_error>

namespace vemo::bench {

namespace {

// The child's side: one line a measurement.
[[noreturn]] void ReportAndExit(const std::function<std::vector<Measurement>()>& work, int out) {
  int status = 0;
  try {
    std::string lines;
    for (const Measurement& m : work())
      lines += fmt::format("{}\t{}\t{}\t{}\n", m.row, m.unit, m.value, m.answers);
    // Far below what a pipe holds, so that it is written as a whole.
    if (::write(out, lines.data(), lines.size()) != static_cast<ssize_t>(lines.size())) status = 1;
  } catch (const std::exception& error) {
    fmt::print(stderr, "{}\n", error.what());
    status = 1;
  }
  std::fflush(stderr);
  ::_exit(status);
}

std::string ReadAll(int in) {
  std::string text;
  std::array<char, 4'096> buffer;
  for (ssize_t count = 0; (count = ::read(in, buffer.data(), buffer.size())) > 0;)
    text.append(buffer.data(), static_cast<std::size_t>(count));
  return text;
}

std::vector<Measurement> ParseLines(const std::string& text) {
  std::vector<Measurement> measured;
  std::istringstream lines(text);
  for (std::string line; std::getline(lines, line);) {
    std::istringstream fields(line);
    Measurement m;
    std::string value;
    std::string answers;
    std::getline(fields, m.row, '\t');
    std::getline(fields, m.unit, '\t');
    std::getline(fields, value, '\t');
    std::getline(fields, answers, '\t');
    m.value = std::stod(value);
    m.answers = std::stoull(answers);
    measured.push_back(m);
  }
  return measured;
}

}  // namespace

std::vector<Measurement> RunInOwnProcess(const std::function<std::vector<Measurement>()>& work) {
  std::array<int, 2> ends;
  if (::pipe(ends.data()) != 0) throw std::system_error(errno, std::generic_category(), "pipe");
  std::fflush(stdout);
  const pid_t child = ::fork();
  if (child < 0) throw std::system_error(errno, std::generic_category(), "fork");
  if (child == 0) {
    ::close(ends[0]);
    ReportAndExit(work, ends[1]);
  }
  ::close(ends[1]);
  const std::string text = ReadAll(ends[0]);
  ::close(ends[0]);
  int status = 0;
  ::waitpid(child, &status, 0);
  if (!WIFEXITED(status) || WEXITSTATUS(status) != 0) throw std::runtime_error("a part of the job failed");
  return ParseLines(text);
}

}  // namespace vemo::bench
