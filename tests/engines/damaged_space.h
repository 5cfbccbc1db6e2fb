// A space of the LMDB engine whose files are damaged at random, and what may come of reading and writing it.
#pragma once

#include <cstdint>
#include <filesystem>
#include <map>
#include <random>
#include <set>
#include <string>
#include <utility>

#include "tests/engines/engine_contract.h"

namespace vemo::test {

// What a space should hold. Values carry a checksum of their own, as the store's do.
struct SpaceModel {
  std::uint64_t generation = 0;
  std::map<std::uint64_t, std::string> records;
  std::map<std::pair<NamedTable, std::string>, std::string> named;
  std::set<std::uint64_t> queue;

  // Commits random changes to `engine` and to the model.
  void Commit(Engine& engine, std::mt19937_64& random, std::size_t changes);
  // Of what is there already, and few bytes of each record.
  void CommitEdits(Engine& engine, std::mt19937_64& random, std::size_t changes);
};

std::string SealedValue(const std::string& key, std::uint64_t version, std::size_t bytes);
bool IsSealedValue(const std::string& key, const std::string& value);

// The files of a closed space.
struct SpaceFiles {
  std::string data;
  std::string seal;
  std::string log;

  static SpaceFiles Read(const std::filesystem::path& folder);
  void Write(const std::filesystem::path& folder) const;
};

// Damages one place of one of the files, and says how.
std::string Damage(SpaceFiles& files, std::mt19937_64& random);

// Opens the space at `folder`, reads it in every way, commits, opens it anew and reads it again. Throws std::logic_error
// for an answer that is neither right nor an exception, and when what could be read before the commit cannot be read
// after it. Returns whether anything was refused.
bool ExamineDamagedSpace(const std::filesystem::path& folder, const SpaceModel& model, std::mt19937_64& random);

}  // namespace vemo::test
