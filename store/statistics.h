// How large a space and its maps are, and how full.
//
// Of one commit, as a snapshot sees it. What an open transaction has changed and not yet committed is no part
// of it.
#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "store/snapshot.h"

namespace vemo {

// The nodes at one height of a map. Bytes are those of whole sealed records, as the engine holds them.
struct LevelStatistics {
  std::uint64_t nodes = 0;
  std::uint64_t entries = 0;       // of all nodes; an internal node has one child more than entries
  std::uint64_t leastEntries = 0;  // of the emptiest node
  std::uint64_t mostEntries = 0;   // of the fullest
  std::uint64_t capacity = 0;      // of one node
  std::uint64_t recordBytes = 0;

  // Shares of the capacity, 0 to 1.
  double LeastFill() const noexcept { return Share(leastEntries, 1); }
  double MeanFill() const noexcept { return Share(entries, nodes); }
  double MostFill() const noexcept { return Share(mostEntries, 1); }

 private:
  double Share(std::uint64_t part, std::uint64_t ofNodes) const noexcept {
    return static_cast<double>(part) / (static_cast<double>(capacity) * static_cast<double>(ofNodes));
  }
};

struct MapStatistics {
  std::string root;       // the root's name; empty for an owned map, which is known by its id
  std::string className;  // "vemo::FieldIdToVectorTombstonesMap" or the like
  OID oid;
  std::uint64_t entries = 0;
  std::uint64_t nodes = 0;
  ssize_t height = -1;                  // -1: no node at all; 0: the root is a leaf
  std::vector<LevelStatistics> levels;  // by height: the leaves first, the root last
  std::uint64_t payloadBytes = 0;       // of all entries, in byte form, without keys
  std::uint64_t largestPayloadBytes = 0;
  std::uint64_t recordBytes = 0;  // of the map's own record and all nodes

  double MeanPayloadBytes() const noexcept {
    return entries == 0 ? 0 : static_cast<double>(payloadBytes) / static_cast<double>(entries);
  }
};

// A number of records, or of named values, and their bytes.
struct Amount {
  std::uint64_t count = 0;
  std::uint64_t bytes = 0;

  friend bool operator==(const Amount&, const Amount&) = default;
};

// Every record is counted in one map, in `awaitingDeletion` or in `unreachable`.
struct SpaceStatistics {
  std::uint64_t commit = 0;  // the number of commits that the space has had
  Amount records;
  std::uint64_t mediumBytes = 0;    // taken on the medium now, with what older snapshots still see
  std::vector<MapStatistics> maps;  // owned maps first, then by name
  std::uint64_t queuedDeletions =
      0;                    // entries of the queue: subtrees whose deletion goes on with later commits
  Amount awaitingDeletion;  // the records of these and below them
  Amount unreachable;       // reached neither from a root nor from the queue: to be collected
  Amount meta;              // the user's named values; bytes of names and values, without their seals
  std::vector<ReaderInfo> readers;  // as CSpace::Readers lists them, the snapshot that was asked included
};

// Reads every record once and keeps none of them in memory: the snapshot does not grow, beyond its root maps.
// Takes the memory of one path from a root, and a bit for each record. `progress` is told how many records are done. Throws CorruptRecord
// where a record of a map is damaged or missing (VerifySpace finds all such), IncompatibleSpace, or what the
// engine throws.
SpaceStatistics CollectStatistics(Snapshot& snapshot,
                                  const std::function<void(std::uint64_t done)>& progress = {});

}  // namespace vemo
