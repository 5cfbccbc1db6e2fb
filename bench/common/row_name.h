// Names of rows: WORKLOAD/SIZE/PEER.
#pragma once

#include <charconv>
#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

namespace vemo::bench {

struct RowName {
  std::string workload;
  std::size_t size = 0;
  std::string peer;
};

// Nothing where `text` is no such name, or where its size is 0.
inline std::optional<RowName> ParseRowName(std::string_view text) {
  const std::size_t first = text.find('/');
  const std::size_t second = first == text.npos ? text.npos : text.find('/', first + 1);
  if (second == text.npos) return std::nullopt;
  RowName name{std::string(text.substr(0, first)), 0, std::string(text.substr(second + 1))};
  const char* const end = text.data() + second;
  const auto read = std::from_chars(text.data() + first + 1, end, name.size);
  if (read.ec != std::errc{} || read.ptr != end || name.size == 0) return std::nullopt;
  return name;
}

}  // namespace vemo::bench
