// An engine around an engine, which counts the calls and fails where it is told to.
#pragma once

#include <atomic>
#include <memory>
#include <vector>

#include "store/engine.h"

namespace vemo::test {

class InjectedFailure : public StoreError {
 public:
  using StoreError::StoreError;
};

// Counts down to a failure, once.
class FailurePoint {
 public:
  // The nth call from now on fails; 1 is the next one, 0 none.
  void Set(std::int64_t n) noexcept { m_untilFailure = n; }
  void Pass(const char* what) {
    if (m_untilFailure > 0 && --m_untilFailure == 0)
      throw InjectedFailure(std::string("injected failure of ") + what);
  }

 private:
  std::atomic<std::int64_t> m_untilFailure{0};
};

struct EngineWatch {
  std::atomic<std::uint64_t> reads{0};  // records read by id, from any state
  std::atomic<std::uint64_t> commits{0};
  FailurePoint failingRead;
  FailurePoint failingReservation;
  FailurePoint failingCommit;  // the engine does not commit
  std::uint64_t idOffset = 0;  // added to every id that is given out
  // What the last commit held that the engine was given.
  std::vector<OID> written, removed, queued, finished;
};

// `engine` and `watch` outlive what is returned.
std::unique_ptr<Engine> WatchEngine(std::shared_ptr<Engine> engine, EngineWatch& watch);

}  // namespace vemo::test
