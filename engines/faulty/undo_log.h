// Taking back the newest commits of an engine.
#pragma once

#include <cstddef>
#include <deque>
#include <vector>

#include "store/engine.h"

namespace vemo {

// Remembers what the last commits replaced. An engine's generation only rises, so what takes a commit back is a commit too;
// `Offset` says by how many the engine stands higher than the space it shows.
class UndoLog {
 public:
  std::uint64_t Offset() const noexcept { return m_offset; }

  // Remembers the state that `batch` is about to change, and forgets all but the newest `kept` ones.
  void Remember(const EngineSnapshot& before, const CommitBatch& batch, std::size_t kept);
  // The batch remembered last was not committed after all.
  void Forget() noexcept;
  // Takes the newest `commits` back, or as many as are remembered.
  void TakeBack(Engine& engine, std::size_t commits);

 private:
  struct Undo {
    std::vector<std::pair<OID, std::optional<Bytes>>> records;
    std::vector<CommitBatch::NamedValue> namedValues;
    std::vector<OID> queue;      // as it was
    std::vector<OID> joined;     // what the commit added to it
  };
  std::deque<Undo> m_undos;
  std::uint64_t m_offset = 0;
};

}  // namespace vemo
