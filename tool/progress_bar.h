// How far a long command has come, for people.
#pragma once

#include <chrono>
#include <cstdint>
#include <cstdio>
#include <functional>
#include <string>

namespace vemo::tool {

// Draws "verb  42% [====    ] 1,234/5,678  90,123/s  0:07 left" on standard error where that is a terminal,
// from one second on and a few times a second; elsewhere it does nothing. The destructor wipes it.
class ProgressBar {
 public:
  using Clock = std::chrono::steady_clock;

  ProgressBar(std::string verb, std::uint64_t total);
  // Draws on `terminal`, or not at all where that is null, by the time that `now` tells.
  ProgressBar(std::string verb, std::uint64_t total, std::FILE* terminal,
              std::function<Clock::time_point()> now);
  ~ProgressBar();
  ProgressBar(const ProgressBar&) = delete;
  ProgressBar& operator=(const ProgressBar&) = delete;

  // Cheap enough to call for every item.
  void Update(std::uint64_t done) {
    if (m_terminal != nullptr && done >= m_nextLook) Look(done);
  }

 private:
  void Look(std::uint64_t done);
  void Draw(std::uint64_t done, double seconds);

  std::string m_verb;
  std::uint64_t m_total;
  std::FILE* m_terminal;
  std::function<Clock::time_point()> m_now;
  bool m_drawn = false;
  std::uint64_t m_nextLook = 0;
  Clock::time_point m_start;
  Clock::time_point m_lastDraw;
};

}  // namespace vemo::tool
