#include "tool/progress_bar.h"

#include <fmt/core.h>
#include <unistd.h>

#include <algorithm>

#include "tool/numbers.h"

namespace vemo::tool {

namespace {

constexpr std::chrono::seconds kFirstDraw{1};
constexpr std::chrono::milliseconds kBetweenDraws{100};
constexpr std::uint64_t kLooks = 2'000;  // the clock is read this often over the whole run
constexpr int kWidth = 24;

}  // namespace

ProgressBar::ProgressBar(std::string verb, std::uint64_t total)
    : ProgressBar(std::move(verb), total, isatty(STDERR_FILENO) != 0 ? stderr : nullptr, &Clock::now) {}

ProgressBar::ProgressBar(std::string verb, std::uint64_t total, std::FILE* terminal,
                         std::function<Clock::time_point()> now)
    : m_verb(std::move(verb)),
      m_total(std::max<std::uint64_t>(total, 1)),
      m_terminal(terminal),
      m_now(std::move(now)),
      m_start(m_now()),
      m_lastDraw(m_start) {}

ProgressBar::~ProgressBar() {
  if (!m_drawn) return;
  fmt::print(m_terminal, "\r\033[K");
  std::fflush(m_terminal);
}

void ProgressBar::Look(std::uint64_t done) {
  m_nextLook = done + m_total / kLooks + 1;
  const Clock::time_point now = m_now();
  if (now - m_start < kFirstDraw || now - m_lastDraw < kBetweenDraws) return;
  m_lastDraw = now;
  Draw(done, std::chrono::duration<double>(now - m_start).count());
}

void ProgressBar::Draw(std::uint64_t done, double seconds) {
  const double share = std::min(1.0, static_cast<double>(done) / static_cast<double>(m_total));
  const int filled = static_cast<int>(share * kWidth);
  const double rate = static_cast<double>(done) / seconds;
  const auto left = static_cast<std::uint64_t>(
      rate > 0 ? static_cast<double>(m_total - std::min(done, m_total)) / rate : 0);
  fmt::print(m_terminal, "\r\033[K{} {:3.0f}% [{:<{}}] {}/{}  {}/s  {}:{:02} left", m_verb, share * 100,
             std::string(static_cast<std::size_t>(filled), '='), kWidth, Grouped(done), Grouped(m_total),
             Grouped(static_cast<std::uint64_t>(rate)), left / 60, left % 60);
  std::fflush(m_terminal);
  m_drawn = true;
}

}  // namespace vemo::tool
