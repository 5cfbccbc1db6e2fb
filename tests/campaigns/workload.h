// A seeded random workload over a space, and what the space must hold after each of its commits.
//
// Commit n follows from the seed, n and the state after commit n - 1 alone, so that a process can take the workload up where
// another one was killed, and whoever judges knows every state in between.
#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <vector>

#include "store/snapshot.h"
#include "store/transaction.h"

namespace vemo::campaign {

enum class MapKind : std::uint8_t { kInsertions, kTombstones, kHistories };

struct ModelMap {
  MapKind kind = MapKind::kInsertions;
  std::map<std::uint64_t, std::uint64_t> entries;  // key number -> payload number
  friend bool operator==(const ModelMap&, const ModelMap&) = default;
};

// What a space holds, in numbers. Owned maps go by a name that the workload gives them.
struct Model {
  std::uint64_t commits = 0;
  std::map<std::string, ModelMap> roots;
  std::map<std::string, ModelMap> owned;
  std::map<std::string, std::string> meta;
};

// One operation of a transaction.
struct Step {
  enum class Kind : std::uint8_t {
    kMakeRoot,
    kInsert,
    kEdit,
    kDelete,
    kClear,
    kRenameRoot,
    kDeleteRoot,
    kOwn,
    kFillOwned,
    kDisown,
    kSetMeta,
    kEraseMeta,
    kSwap,
    kCopyAssign,   // the nodes held before are left to collection; the first step of its transaction
    kMoveAssign,
    kReplaceFromStack,
    kBulkLoad,     // into the map, cleared first
  };
  Kind kind;
  std::string name;   // the root, owned map or meta value
  std::string other;  // a second root, a new name, a meta value's text
  MapKind mapKind = MapKind::kInsertions;
  std::uint64_t first = 1, last = 0, stride = 1, shift = 0;  // of key numbers; payload = key + shift
};

struct WorkloadOptions {
  std::uint64_t seed = 1;
  std::uint64_t keys = 3'000;  // key numbers are 1 .. keys
};

class Workload {
 public:
  explicit Workload(const WorkloadOptions& options) : m_options(options) {}

  // What the space holds after the commits so far.
  const Model& model() const noexcept { return m_model; }

  // Goes on by one commit without a space.
  void Skip();
  // Makes the next commit in `space`, which holds what model() says. The number of the commit is among the meta values.
  void Commit(CSpace& space);
  // Opens a transaction, changes something and ends it without a commit.
  void Abort(CSpace& space) const;

 private:
  std::vector<Step> Plan(std::uint64_t salt, Model& model) const;

  WorkloadOptions m_options;
  Model m_model;
};

// How many commits of a workload a space has had.
std::uint64_t CommitsIn(Snapshot& snapshot);

// What assignments have left to collection: all of it must be there still, or perhaps not.
enum class LeftBehind : std::uint8_t { kIsThere, kPerhapsCollected };

// What is wrong with the space behind the snapshot if it should hold `model`: differences, findings of the checker, records
// that nothing reaches beyond those that the workload has left behind. Empty when nothing is.
std::string Differences(Snapshot& snapshot, const Model& model, LeftBehind leftBehind = LeftBehind::kIsThere);

}  // namespace vemo::campaign
