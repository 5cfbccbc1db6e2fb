// Who asks the system for the times of a file. Linking watched_times.cc replaces stat, lstat, fstat, fstatat
// and statx of the whole program, those of shared libraries included.
#pragma once

#include <string>
#include <vector>

namespace vemo::test {

// While it lives, sees those calls of this thread. One at a time.
class WatchedTimes {
 public:
  WatchedTimes() noexcept;
  ~WatchedTimes();
  WatchedTimes(const WatchedTimes&) = delete;
  WatchedTimes& operator=(const WatchedTimes&) = delete;

  // The names, without their folders, of the files whose times were asked for, one for each call.
  const std::vector<std::string>& Asked() const noexcept { return m_asked; }

 private:
  std::vector<std::string> m_asked;
};

}  // namespace vemo::test
