// An engine around an engine that fails on demand: for tests of whatever must live with an engine's failures.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>

#include "store/engine.h"

namespace vemo {

// What can be made to fail. A scan passes once when it begins and once for each value that it visits.
enum class EngineCall : std::uint8_t {
  kOpenSnapshot,
  kRead,
  kScanRecords,
  kReadNamed,
  kScanNamed,
  kQueuedDeletions,
  kCommit,
  kReserveIds,
  kLockWriter,
  kUsage,
  kReadersElsewhere,
};

enum class Fault : std::uint8_t {
  kNoSpace,         // refused for want of space; nothing is done
  kIoError,         // refused by the medium; nothing is done
  kUnknownApplied,  // done, but the answer is lost: UnknownOutcome
  kUnknownDropped,  // not done, and the answer is lost: UnknownOutcome
  kDeliveredTwice,  // done twice, as by a network that repeats a request; the second answer counts
  kStall,           // FaultPlan::onStall is called, then it is done
};

// The failure of an engine, shared with whoever steers it. Thread-safe but for `onStall`, which is set before it is used.
class FaultPlan {
 public:
  // The `nth` call from now on (1 is the next) of that kind (nothing: of any) meets `fault`; `persists`: all later ones too.
  // Calls other than Commit report an unknown outcome as an input/output error: ids that were perhaps reserved are only lost.
  // Calls that change nothing are not delivered twice.
  void Set(Fault fault, std::uint64_t nth, std::optional<EngineCall> call = std::nullopt, bool persists = false);
  void Clear() noexcept;
  // Whether a call has met the fault since it was set.
  bool HasFired() const noexcept;

  // Keeps what is needed to take the last `commits` commits back. To be called before they are made.
  void KeepTail(std::size_t commits) noexcept;
  // The engine forgets the newest `commits` commits, at most those that were kept, before its next call: what a medium does
  // that loses what it has promised to have written. Whoever has the space open should open it anew.
  void LoseTail(std::size_t commits) noexcept;

  std::function<void(EngineCall)> onStall;

  // Of the engine's side: the fault that this call meets; how many commits to keep; how many to lose now.
  std::optional<Fault> Pass(EngineCall call) noexcept;
  std::size_t KeptTail() const noexcept;
  std::size_t TakeTailToLose() noexcept;

 private:
  mutable std::mutex m_mutex;
  std::optional<Fault> m_fault;
  std::optional<EngineCall> m_call;
  std::uint64_t m_untilFault = 0;
  bool m_persists = false;
  bool m_fired = false;
  std::size_t m_keptTail = 0;
  std::size_t m_tailToLose = 0;
};

// What an injected kNoSpace or kIoError throws, so that a test can tell it from a real failure.
class InjectedFault : public StoreError {
 public:
  using StoreError::StoreError;
};

// `plan` outlives the engine and its snapshots. With an empty plan everything is passed on.
std::unique_ptr<Engine> MakeFaultyEngine(std::shared_ptr<Engine> engine, FaultPlan& plan);

}  // namespace vemo
