#include "tool/numbers.h"

#include <fmt/format.h>

#include <array>

namespace vemo::tool {

std::string Grouped(std::uint64_t number) {
  std::string digits = std::to_string(number);
  for (std::ptrdiff_t i = static_cast<std::ptrdiff_t>(digits.size()) - 3; i > 0; i -= 3) {
    digits.insert(static_cast<std::size_t>(i), 1, ',');
  }
  return digits;
}

std::string ByteSize(std::uint64_t bytes) {
  constexpr std::array<const char*, 5> kUnits = {"bytes", "KiB", "MiB", "GiB", "TiB"};
  if (bytes < 1024) return fmt::format("{} bytes", bytes);
  double size = static_cast<double>(bytes);
  std::size_t unit = 0;
  while (size >= 1024 && unit + 1 < kUnits.size()) {
    size /= 1024;
    ++unit;
  }
  return fmt::format("{:.1f} {}", size, kUnits[unit]);
}

}  // namespace vemo::tool
