// Rescuing what is sound in a damaged space.
#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/field_id.h"
#include "store/space.h"

namespace vemo {

// Something of the source that is not in the destination, or not under its name.
struct SalvageLoss {
  std::string root;            // below which it lay, as the name is stored; empty where that is not known
  OID oid;                     // the object that cannot be used, or null
  // For a node of a map: its keys were in [low, high), as far as that is known; nothing is unbounded.
  std::optional<FieldId> low, high;
  std::string what;
};

// One line for people.
std::string SalvageLossText(const SalvageLoss& loss);

struct SalvageReport {
  struct Map {
    std::string root;           // in the destination
    std::uint64_t entries = 0;
  };
  std::vector<Map> maps;
  std::vector<SalvageLoss> losses;
  std::uint64_t entries = 0;
  std::uint64_t metaValues = 0;
  std::uint64_t leftLeaves = 0;  // sound, named by no map that is left and needed by none: mostly what collection would remove
};

struct SalvageOptions {
  std::uint64_t entriesPerCommit = 20'000;
  // Told how many of how many leaves were copied.
  std::function<void(std::uint64_t done, std::uint64_t of)> progress = nullptr;
};

// Copies what can be read of `source` into `destination`, which must hold nothing yet: every entry of every sound leaf, under its
// root's name, owned maps under their ids, and meta values. The trees are built anew, so the destination passes every check.
//
// Leaves below a node that is lost are reached along the chain of leaves, from both sides and across lost leaves. A map whose own
// record is lost is put together from chains of leaves, where what is left of the record names their ends. Other chains that
// nothing leads to become roots "salvaged/leaf ID", and a map whose name is lost becomes "salvaged/map ID".
//
// What was deleted or replaced stays away from the maps' names as far as that can be told:
// - Leaves in or below the queue of deletions are left out. Where the queue, or a node in it or below it, cannot be read, chains
//   that nothing leads to may have hung there, and what says that they are "salvaged/leaf ID" now says so.
// - An assignment leaves the old tree behind, in no queue. Parts of it that have lost the leaves on both their sides can be taken
//   for a map's whose own record, or a node of whose tree, is lost besides, if they have no keys in common with what was found of
//   it.
//
// Reads the source alone; throws UsageError when the destination is not empty, and what its engine throws. Faults of the
// source's engine are losses. Memory: a few bits for each id, some bytes for each lost object, one batch of the
// destination, and what the destination's cache keeps.
SalvageReport Salvage(const EngineSnapshot& source, CSpace& destination, const SalvageOptions& options = {});

}  // namespace vemo
