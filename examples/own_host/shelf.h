// A host of one's own for the maps: objects in a table by id, their records beside them.
#pragma once

#include <vemo/maps.h>

#include <map>
#include <vector>

namespace vemo {

// The name is the module's, the class is the host's. A program has one, g_shelf.
class CSpace {
 public:
  ~CSpace() { Unload(); }

  // Writes a record of every object that is new or was changed, ends what was deleted; returns how many it wrote.
  int Save();
  // Ends all objects, and references and iterators with them. What is asked for then is read from its record.
  void Unload();
  ptr<IPersistable> Resolve(OID id, const IPersistable::FnTable* expected);
  template <class Map>
  Map& Find(OID id) { return *static_cast<Map*>(Resolve(id, IPersistable::Stubs<Map>::GetTable()).m_self); }

  struct Held {
    ptr<IPersistable> object;  // null while the record alone is there
    const ReflectedClass* reflected = nullptr;
    Bytes record;
  };
  std::map<OID, Held> m_objects;
  std::vector<OID> m_deleted;
  bool m_interrupted = false;
};
extern CSpace g_shelf;

}  // namespace vemo
