#include "bench/common/measure.h"

#include <fmt/core.h>
#include <malloc.h>

#include <fstream>

namespace vemo::bench {

std::uint64_t AllocatedBytes() {
  const struct mallinfo2 info = ::mallinfo2();
  return info.uordblks + info.hblkhd;
}

// Not getrusage: its maximum is inherited from the program that started this one.
std::uint64_t PeakResidentKib() {
  std::ifstream status("/proc/self/status");
  for (std::string line; std::getline(status, line);) {
    if (line.rfind("VmHWM:", 0) == 0) return std::stoull(line.substr(6));
  }
  return 0;
}

std::string ToJsonLine(const Measurement& measurement, std::size_t size, std::string_view peer) {
  return fmt::format(
      R"({{"row": "{}", "size": {}, "peer": "{}", "unit": "{}", "value": {:.3f}, "answers": "{:x}", "peak_kib": {}}})",
      measurement.row, size, peer, measurement.unit, measurement.value, measurement.answers,
      PeakResidentKib());
}

}  // namespace vemo::bench
