// The classes that records can be of.
#pragma once

#include <cstddef>
#include <string_view>

#include "vxPersistStore/Reflection.h"
#include "vxUtils/BoundedReader.h"

namespace vemo {

struct ClassEntry {
  const ReflectedClass* reflected;
  const IPersistable::FnTable* table;
  void (*checkForm)(BoundedReader& reader);  // throws MalformedBytes on a body that Deserialise must not see
  std::size_t (*memoryBytes)(const void* object);  // what it takes in memory, its heap included
  bool isMap;

  std::string_view Name() const noexcept { return reflected->m_name; }
};

// Registers the nine classes of the maps, once per process; later calls do nothing. Thread-safe.
void RegisterMapClasses();

// Null when there is none. The classes must have been registered. Entries live as long as the process.
const ClassEntry* FindClass(std::string_view name);
const ClassEntry* FindClass(const IPersistable::FnTable* table);

}  // namespace vemo
