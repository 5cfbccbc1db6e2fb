// How far a long command has come, for people.
#pragma once

#include <chrono>
#include <cstdint>
#include <string>

namespace vemo::tool {

// Draws "verb  42% [====    ] 1,234/5,678  90,123/s  0:07 left" on standard error where that is a terminal, from one
// second on and a few times a second; elsewhere it does nothing. The destructor wipes it.
class ProgressBar {
 public:
  ProgressBar(std::string verb, std::uint64_t total);
  ~ProgressBar();
  ProgressBar(const ProgressBar&) = delete;
  ProgressBar& operator=(const ProgressBar&) = delete;

  // Cheap enough to call for every item.
  void Update(std::uint64_t done) {
    if (m_enabled && done >= m_nextLook) Look(done);
  }

 private:
  using Clock = std::chrono::steady_clock;
  void Look(std::uint64_t done);
  void Draw(std::uint64_t done, double seconds);

  std::string m_verb;
  std::uint64_t m_total;
  bool m_enabled;
  bool m_drawn = false;
  std::uint64_t m_nextLook = 0;
  Clock::time_point m_start;
  Clock::time_point m_lastDraw;
};

}  // namespace vemo::tool
