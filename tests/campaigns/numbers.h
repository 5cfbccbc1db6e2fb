// The command line of a campaign.
#pragma once

#include <charconv>
#include <cstdint>
#include <map>
#include <stdexcept>
#include <string>
#include <string_view>

namespace vemo::campaign {

// The numbers of the command line by name. Each is to be asked for, so that a misspelt one is found.
class Numbers {
 public:
  Numbers(int argc, char** argv) {
    for (int i = 2; i < argc; i += 2) {
      const std::string_view name(argv[i]);
      const std::string_view text(i + 1 < argc ? argv[i + 1] : "");
      std::uint64_t value = 0;
      const auto result = std::from_chars(text.data(), text.data() + text.size(), value);
      if (!name.starts_with("--") || result.ec != std::errc() || result.ptr != text.data() + text.size()) {
        throw std::invalid_argument(std::string(name) + ": options are --NAME NUMBER");
      }
      m_values[std::string(name.substr(2))] = value;
    }
  }

  template <class Number>
  void Take(const std::string& name, Number& number) {
    const auto found = m_values.find(name);
    if (found == m_values.end()) return;
    number = static_cast<Number>(found->second);
    m_values.erase(found);
  }

  void RequireAllTaken() const {
    if (!m_values.empty()) throw std::invalid_argument("there is no option --" + m_values.begin()->first);
  }

 private:
  std::map<std::string, std::uint64_t> m_values;
};

}  // namespace vemo::campaign
