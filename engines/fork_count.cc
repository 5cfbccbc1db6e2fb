#include "engines/fork_count.h"

#include <pthread.h>

#include <atomic>

namespace vemo {
namespace {

std::atomic<std::uint64_t> g_forks{0};

void CountInChild() { g_forks.fetch_add(1, std::memory_order_relaxed); }

}  // namespace

std::uint64_t ForkCount() noexcept {
  static const int registered = ::pthread_atfork(nullptr, nullptr, CountInChild);
  static_cast<void>(registered);
  return g_forks.load(std::memory_order_relaxed);
}

}  // namespace vemo
