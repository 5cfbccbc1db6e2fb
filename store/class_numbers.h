// The numbers by which the records of a space name their classes.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "store/class_registry.h"
#include "store/engine.h"

namespace vemo {

// Numbers begin at 1 and are given out once: the first commit that writes an object of a class stores its number.
class ClassNumbers {
 public:
  // Takes over what `state` stores. Throws CorruptRecord, which leaves everything as it was.
  void Read(const EngineSnapshot& state, const std::string& spaceName);
  void Clear() noexcept { m_classes.clear(); }

  // How many numbers are given out.
  std::size_t Size() const noexcept { return m_classes.size(); }

  // The class of that number; null where there is none, or none that this program knows.
  const ClassEntry* Find(std::uint32_t number) const noexcept;
  // The number of a class; 0 when it has none yet.
  std::uint32_t NumberOf(const ClassEntry& classEntry) const noexcept;

  // Gives a class the next number, which the open transaction has to store, or take back.
  std::uint32_t Add(const ClassEntry& classEntry);
  void Truncate(std::size_t count) noexcept { m_classes.resize(count); }
  // What a commit stores for the class of that number.
  CommitBatch::NamedValue StoredValue(std::size_t number) const;

 private:
  std::vector<const ClassEntry*> m_classes;  // number - 1 -> class; null where this program does not know it
};

}  // namespace vemo
