#include "tests/campaigns/verdict.h"

#include <algorithm>

namespace vemo::campaign {

void Verdict::Count(const std::string& what, std::uint64_t n) {
  const auto found = std::find_if(m_counts.begin(), m_counts.end(), [&](const auto& count) { return count.first == what; });
  if (found == m_counts.end()) {
    m_counts.emplace_back(what, n);
  } else {
    found->second += n;
  }
}

std::uint64_t Verdict::CountOf(const std::string& what) const {
  const auto found = std::find_if(m_counts.begin(), m_counts.end(), [&](const auto& count) { return count.first == what; });
  return found == m_counts.end() ? 0 : found->second;
}

std::string Verdict::Line() const {
  std::string line = m_campaign + ": seed " + std::to_string(m_seed);
  for (const auto& [what, n] : m_counts) line += ", " + std::to_string(n) + " " + what;
  return line + ", " + std::to_string(m_faults.size()) + " faults: " + (IsSound() ? "sound" : "NOT SOUND");
}

}  // namespace vemo::campaign
