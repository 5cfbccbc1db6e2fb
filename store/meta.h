// Small named values of the user's own.
#pragma once

#include <functional>
#include <map>
#include <optional>
#include <string>
#include <string_view>

#include "store/engine.h"

namespace vemo {

// Gets a name and its value, and returns whether to go on.
using MetaVisitor = std::function<bool(std::string_view name, std::string_view value)>;

// Reading those of an engine's state. Throw CorruptRecord.
std::optional<std::string> ReadMeta(const EngineSnapshot& state, const std::string& spaceName, std::string_view name);
void ScanStoredMeta(const EngineSnapshot& state, const std::string& spaceName, std::string_view prefix, const MetaVisitor& visit);

// Those that a transaction has set and erased, before the ones of the state that it began with.
class MetaChanges {
 public:
  void Set(std::string_view name, std::string_view value);
  void Erase(std::string_view name);

  // The value that was set, or nothing for one that was erased; null for a name that was not touched.
  const std::optional<std::string>* Find(std::string_view name) const;
  // Visits those whose names start with `prefix`, as they would be in `state` after a commit, in order.
  void Scan(const EngineSnapshot& state, const std::string& spaceName, std::string_view prefix, const MetaVisitor& visit) const;

  void AddTo(CommitBatch& batch) const;

 private:
  std::map<std::string, std::optional<std::string>, std::less<>> m_values;  // nothing: erased
};

}  // namespace vemo
