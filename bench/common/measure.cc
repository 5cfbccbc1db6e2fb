#include "bench/common/measure.h"

#include <fmt/core.h>
#include <malloc.h>

#include <fstream>
#include <stdexcept>

namespace vemo::bench {

std::uint64_t AllocatedBytes() {
  const struct mallinfo2 info = ::mallinfo2();
  return info.uordblks + info.hblkhd;
}

namespace {

// A line of /proc/self/status that counts KiB.
std::uint64_t StatusKib(std::string_view name) {
  std::ifstream status("/proc/self/status");
  for (std::string line; std::getline(status, line);) {
    if (line.rfind(name, 0) == 0) return std::stoull(line.substr(name.size() + 1));
  }
  throw std::runtime_error("/proc/self/status has no line " + std::string(name));
}

}  // namespace

// Not getrusage: its maximum is inherited from the program that started this one, and cannot be reset.
std::uint64_t ResetPeakResident() {
  std::ofstream("/proc/self/clear_refs") << '5';
  return StatusKib("VmHWM") * 1'024;
}

std::uint64_t PeakResidentBytes() {
  return StatusKib("VmHWM") * 1'024;
}

std::string ToJsonLine(const Measurement& measurement, std::size_t size, std::string_view peer) {
  return fmt::format(
      R"({{"row": "{}", "size": {}, "peer": "{}", "unit": "{}", "value": {:.3f}, "answers": "{:x}"}})",
      measurement.row, size, peer, measurement.unit, measurement.value, measurement.answers);
}

}  // namespace vemo::bench
