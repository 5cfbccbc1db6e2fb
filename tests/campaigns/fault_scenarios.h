// Work on a space that is to be disturbed: what is done, and what the space must hold after each of its commits.
#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "engines/faulty/faulty_engine.h"
#include "store/snapshot.h"
#include "store/transaction.h"
#include "tests/campaigns/scratch_folder.h"

namespace vemo::campaign {

enum class EngineSort : std::uint8_t { kMemory, kLmdb };

// A space whose engine fails on demand. The handle can be closed and opened again; what the engine holds stays.
class Stage {
 public:
  explicit Stage(EngineSort sort);

  FaultPlan plan;

  void Open();
  void Close() noexcept;
  bool IsOpen() const noexcept { return m_space != nullptr; }
  CSpace& space() { return *m_space; }

  // To be called after each commit that has returned.
  void Acknowledge() {
    ++m_acknowledged;
    if (onAcknowledge) onAcknowledge();
  }
  std::function<void()> onAcknowledge;
  std::size_t acknowledged() const noexcept { return m_acknowledged; }
  // Calls `change`, which does one operation of a map. One that an exception leaves must have poisoned the transaction.
  void Mutate(WriteTransaction& transaction, const std::function<void()>& change);
  // An operation that was interrupted could have been committed.
  bool HasMissedPoison() const noexcept { return m_missedPoison; }

 private:
  EngineSort m_sort;
  std::optional<ScratchFolder> m_folder;
  std::shared_ptr<Engine> m_engine;
  std::unique_ptr<CSpace> m_space;
  std::size_t m_acknowledged = 0;
  bool m_missedPoison = false;
};

struct Scenario {
  std::string name;
  bool isPrepared;  // begins with a committed space, none of it in memory; else with nothing
  std::function<void(Stage&)> act;
};

const std::vector<Scenario>& FaultScenarios();
// Commits the maps that prepared scenarios begin with.
void Prepare(Stage& stage);

}  // namespace vemo::campaign
