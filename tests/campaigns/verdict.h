// What a campaign has found.
#pragma once

#include <cstdint>
#include <string>
#include <utility>
#include <vector>

namespace vemo::campaign {

class Verdict {
 public:
  Verdict(std::string campaign, std::uint64_t seed) : m_campaign(std::move(campaign)), m_seed(seed) {}

  // Counts are printed in the order in which they were first named.
  void Count(const std::string& what, std::uint64_t n = 1);
  std::uint64_t CountOf(const std::string& what) const;
  void AddFault(std::string fault) { m_faults.push_back(std::move(fault)); }

  bool IsSound() const noexcept { return m_faults.empty(); }
  const std::vector<std::string>& faults() const noexcept { return m_faults; }
  // "kill_loop: seed 1, 2000 kills, 0 faults: sound"
  std::string Line() const;

 private:
  std::string m_campaign;
  std::uint64_t m_seed;
  std::vector<std::pair<std::string, std::uint64_t>> m_counts;
  std::vector<std::string> m_faults;
};

}  // namespace vemo::campaign
