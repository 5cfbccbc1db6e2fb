// What the tests of the LMDB engine share.
#pragma once

#include <cstdint>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <memory>
#include <set>
#include <string>

#include "engines/lmdb/lmdb_engine.h"
#include "tests/engines/engine_contract.h"

namespace vemo::test {

inline std::unique_ptr<Engine> OpenAt(const std::filesystem::path& path, bool create = false,
                                      std::uint64_t mapBytes = 0) {
  LmdbOptions options;
  options.path = path;
  options.create = create;
  options.mapBytes = mapBytes;
  return OpenLmdbEngine(options);
}

// A record of which a few bytes follow from `version`, less than 9,000.
inline std::string EditedRecord(std::uint64_t oid, std::uint64_t version) {
  std::string text(500, static_cast<char>('a' + oid));
  text.replace(100, 4, std::to_string(1000 + version));
  return text;
}

// The message of the `E` that `act` throws.
template <typename E, typename Act>
std::string MessageOf(Act&& act) {
  try {
    act();
  } catch (const E& error) {
    return error.what();
  }
  ADD_FAILURE() << "nothing was thrown";
  return {};
}

inline std::set<std::string> FilesIn(const std::filesystem::path& folder) {
  std::set<std::string> names;
  for (const auto& entry : std::filesystem::directory_iterator(folder))
    names.insert(entry.path().filename().string());
  return names;
}

inline void WriteFile(const std::filesystem::path& path, const std::string& text) {
  std::ofstream(path, std::ios::binary) << text;
}

inline std::string ReadFile(const std::filesystem::path& path) {
  std::ifstream file(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(file), {}};
}

inline bool Contains(const std::string& text, const std::string& part) {
  return text.find(part) != std::string::npos;
}

}  // namespace vemo::test
