#include "store/use_check.h"

#include <pthread.h>

#include "platform/error.h"

namespace vemo {

namespace {

std::atomic<std::uint32_t> s_forks{0};

void CountFork() { s_forks.fetch_add(1, std::memory_order_relaxed); }

}  // namespace

std::uint32_t ForkEpoch() noexcept {
  static const int registered = pthread_atfork(nullptr, nullptr, &CountFork);
  static_cast<void>(registered);
  return s_forks.load(std::memory_order_relaxed);
}

void UseCheck::RequireThisProcess(const std::string& space, const char* what) const {
  if (IsOfThisProcess()) return;
  throw UsageError(space + ": " + what + " was opened by the process that forked this one; open the space anew in this process");
}

void UseCheck::RequireThisThread(const std::string& space, const char* what) const {
  RequireThisProcess(space, what);
  const std::thread::id owner = m_thread.load(std::memory_order_relaxed);
  if (owner == std::thread::id() || owner == std::this_thread::get_id()) return;
  throw UsageError(space + ": " + what + " belongs to another thread; use it there alone, and read in a Snapshot of this thread's own");
}

UseCheck::Scope::Scope(UseCheck& check, const std::string& space, const char* what) : m_check(check) {
  check.RequireThisThread(space, what);
  if (check.m_inUse.exchange(true, std::memory_order_acquire)) {
    throw UsageError(space + ": " + what + " is being used by two threads at the same time; give each thread a Snapshot of its own");
  }
}

}  // namespace vemo
