#include "store/class_registry.h"

#include <array>
#include <map>
#include <mutex>

#include "store/object_memory.h"

namespace vemo {

// The classes by name. Registration happens once, before any space is open, and under the lock of RegisterMapClasses.
class XTarget {
 public:
  ENameSpaceError Add(const ReflectedClass* reflected) {
    return m_classes.emplace(reflected->m_name, reflected).second ? NSE_OK : NSE_NAME_ALREADY_IN_USE;
  }

 private:
  std::map<std::string_view, const ReflectedClass*> m_classes;
};

XTarget& Vemo_vxOperation_GetXTarget() {
  static XTarget target;
  return target;
}

ENameSpaceError RegisterReflectedClass(const ReflectedClass* reflectedClass, XTarget& target) {
  return target.Add(reflectedClass);
}

const ReflectedInterface& _GetReflected(const IObject*) {
  static const ReflectedInterface record{"vemo::IObject"};
  return record;
}

const ReflectedInterface& _GetReflected(const IPersistable*) {
  static const ReflectedInterface record{"vemo::IPersistable"};
  return record;
}

namespace {

template <class T>
ClassEntry MakeEntry(bool isMap) {
  return {GetReflectedClass<T>(), IPersistable::Stubs<T>::GetTable(),
          [](BoundedReader& reader) { CheckForm(reader, static_cast<const T*>(nullptr)); },
          [](const void* object) { return MemoryBytesOf(static_cast<const T*>(object)); }, isMap};
}

const std::array<ClassEntry, 9>& Entries() {
  static const std::array<ClassEntry, 9> entries = {
      MakeEntry<FieldIdToVectorInsertionsMap>(true),
      MakeEntry<FieldIdToVectorInsertionsMapInternalNode>(false),
      MakeEntry<FieldIdToVectorInsertionsMapLeafNode>(false),
      MakeEntry<FieldIdToVectorTombstonesMap>(true),
      MakeEntry<FieldIdToVectorTombstonesMapInternalNode>(false),
      MakeEntry<FieldIdToVectorTombstonesMapLeafNode>(false),
      MakeEntry<FieldIdToVectorInsertionsAndDeletionsMap>(true),
      MakeEntry<FieldIdToVectorInsertionsAndDeletionsMapInternalNode>(false),
      MakeEntry<FieldIdToVectorInsertionsAndDeletionsMapLeafNode>(false),
  };
  return entries;
}

}  // namespace

void RegisterMapClasses() {
  static std::once_flag once;
  std::call_once(once, [] {
    _Register_FieldIdToVectorInsertionsMap();
    _Register_FieldIdToVectorInsertionsMapInternalNode();
    _Register_FieldIdToVectorInsertionsMapLeafNode();
    _Register_FieldIdToVectorTombstonesMap();
    _Register_FieldIdToVectorTombstonesMapInternalNode();
    _Register_FieldIdToVectorTombstonesMapLeafNode();
    _Register_FieldIdToVectorInsertionsAndDeletionsMap();
    _Register_FieldIdToVectorInsertionsAndDeletionsMapInternalNode();
    _Register_FieldIdToVectorInsertionsAndDeletionsMapLeafNode();
  });
}

const ClassEntry* FindClass(std::string_view name) {
  for (const ClassEntry& entry : Entries()) {
    if (entry.Name() == name) return &entry;
  }
  return nullptr;
}

const ClassEntry* FindClass(const IPersistable::FnTable* table) {
  for (const ClassEntry& entry : Entries()) {
    if (entry.table == table) return &entry;
  }
  return nullptr;
}

}  // namespace vemo
