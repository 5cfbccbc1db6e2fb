// Times, memory, and the lines in which a benchmark reports them.
#pragma once

#include <chrono>
#include <cstdint>
#include <ctime>
#include <string>
#include <string_view>
#include <vector>

namespace vemo::bench {

// What one run of one row found. `answers` is a number made of all the answers that the peer gave: equal for
// peers that did the same work.
struct Measurement {
  std::string row;  // workload, payload
  std::string unit;
  double value = 0;
  std::uint64_t answers = 0;
};

// The processor time of this process. Rows that never wait are measured by it, so that another program's turn
// on the core does not count.
inline double ProcessorNanoseconds() {
  std::timespec now{};
  ::clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &now);
  return static_cast<double>(now.tv_sec) * 1e9 + static_cast<double>(now.tv_nsec);
}

inline double WallNanoseconds() {
  return std::chrono::duration<double, std::nano>(std::chrono::steady_clock::now().time_since_epoch())
      .count();
}

// Calls `section`, the part of a row that is measured. A function of its own and never inlined, so that an
// instruction counter can be told to count inside of it alone.
template <class Section>
[[gnu::noinline]] auto MeasuredSection(Section& section) {
  return section();
}

// Bytes that malloc has given out and not got back, its own headers included.
std::uint64_t AllocatedBytes();
// From now on the peak counts anew; returns what is resident now, in bytes.
std::uint64_t ResetPeakResident();
// The most memory that this process has had resident since then, in bytes, pages of mapped files included.
std::uint64_t PeakResidentBytes();

// One line of JSON on standard output, which bench/driver.py reads.
std::string ToJsonLine(const Measurement& measurement, std::size_t size, std::string_view peer);

}  // namespace vemo::bench
