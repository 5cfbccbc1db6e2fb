#include "tests/support/failing_allocator.h"

#include <atomic>
#include <cstdlib>
#include <new>

namespace {

std::atomic<std::int64_t> g_live{0};
// Of the thread that tests; 0 means that none is to fail.
thread_local std::int64_t t_untilFailure = 0;
thread_local bool t_failed = false;
thread_local int t_exempt = 0;

void* Allocate(std::size_t bytes) {
  if (t_exempt == 0 && t_untilFailure > 0 && --t_untilFailure == 0) {
    t_failed = true;
    throw std::bad_alloc();
  }
  void* p = std::malloc(bytes == 0 ? 1 : bytes);
  if (p == nullptr) throw std::bad_alloc();
  ++g_live;
  return p;
}

void* AllocateOrNull(std::size_t bytes) noexcept {
  try {
    return Allocate(bytes);
  } catch (const std::bad_alloc&) {
    return nullptr;
  }
}

void Release(void* p) noexcept {
  if (p == nullptr) return;
  --g_live;
  std::free(p);
}

}  // namespace

void* operator new(std::size_t bytes) {
  return Allocate(bytes);
}
void* operator new[](std::size_t bytes) {
  return Allocate(bytes);
}
void* operator new(std::size_t bytes, const std::nothrow_t&) noexcept {
  return AllocateOrNull(bytes);
}
void* operator new[](std::size_t bytes, const std::nothrow_t&) noexcept {
  return AllocateOrNull(bytes);
}
void operator delete(void* p) noexcept {
  Release(p);
}
void operator delete[](void* p) noexcept {
  Release(p);
}
void operator delete(void* p, std::size_t) noexcept {
  Release(p);
}
void operator delete[](void* p, std::size_t) noexcept {
  Release(p);
}
void operator delete(void* p, const std::nothrow_t&) noexcept {
  Release(p);
}
void operator delete[](void* p, const std::nothrow_t&) noexcept {
  Release(p);
}

namespace vemo::test {

std::int64_t LiveAllocations() noexcept {
  return g_live;
}

FailingAllocation::FailingAllocation(std::int64_t nth) noexcept {
  t_failed = false;
  t_untilFailure = nth;
}
FailingAllocation::~FailingAllocation() {
  t_untilFailure = 0;
}
bool FailingAllocation::HasFailed() const noexcept {
  return t_failed;
}

ExemptAllocations::ExemptAllocations() noexcept {
  ++t_exempt;
}
ExemptAllocations::~ExemptAllocations() {
  --t_exempt;
}

}  // namespace vemo::test
