// The allocator of a test program: counts what lives and fails where it is told to.
//
// Linking failing_allocator.cc replaces the global operator new and delete of the whole program.
#pragma once

#include <cstdint>

namespace vemo::test {

// How many allocations of the process live.
std::int64_t LiveAllocations() noexcept;

// While it lives, the `nth` allocation (1 is the next one) throws std::bad_alloc, once. One at a time.
class FailingAllocation {
 public:
  explicit FailingAllocation(std::int64_t nth) noexcept;
  ~FailingAllocation();
  FailingAllocation(const FailingAllocation&) = delete;
  FailingAllocation& operator=(const FailingAllocation&) = delete;

  bool HasFailed() const noexcept;
};

// While it lives, allocations neither fail nor count as one of the n: for what the test's own equipment
// allocates.
class ExemptAllocations {
 public:
  ExemptAllocations() noexcept;
  ~ExemptAllocations();
  ExemptAllocations(const ExemptAllocations&) = delete;
  ExemptAllocations& operator=(const ExemptAllocations&) = delete;
};

}  // namespace vemo::test
