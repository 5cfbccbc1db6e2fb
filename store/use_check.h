// Finding out that something is used in a way that its rules forbid: by another thread than its own, by two at a time, or in a
// process that was forked off the one that opened it.
//
// The checks stand on slow paths and cost a load or two there. They do not make the wrong use safe in every case, they make it
// known: as a UsageError, before a table is touched.
#pragma once

#include <atomic>
#include <cstdint>
#include <string>
#include <thread>

namespace vemo {

// How often this process is the child of a fork, counted from the first call in any ancestor: what was made under another
// number belongs to another process.
std::uint32_t ForkEpoch() noexcept;

class UseCheck {
 public:
  // Belongs to this process, and to no thread in particular.
  UseCheck() noexcept : m_epoch(ForkEpoch()) {}
  UseCheck(const UseCheck&) = delete;
  UseCheck& operator=(const UseCheck&) = delete;

  // Belongs to this thread alone from now on, or to no thread in particular again.
  void BindToThisThread() noexcept { m_thread.store(std::this_thread::get_id(), std::memory_order_relaxed); }
  void Unbind() noexcept { m_thread.store(std::thread::id(), std::memory_order_relaxed); }

  bool IsOfThisProcess() const noexcept { return m_epoch == ForkEpoch(); }

  // Throw UsageError, which names the space and what of it was used, such as "the snapshot".
  void RequireThisProcess(const std::string& space, const char* what) const;
  void RequireThisThread(const std::string& space, const char* what) const;

  // Uses the checked thing for its own lifetime. The constructor throws UsageError where that is forbidden.
  class Scope {
   public:
    Scope(UseCheck& check, const std::string& space, const char* what);
    ~Scope() { m_check.m_inUse.store(false, std::memory_order_release); }
    Scope(const Scope&) = delete;
    Scope& operator=(const Scope&) = delete;

   private:
    UseCheck& m_check;
  };

 private:
  const std::uint32_t m_epoch;
  std::atomic<std::thread::id> m_thread{};
  std::atomic<bool> m_inUse{false};
};

}  // namespace vemo
