// The tombstones of 1,000 fields, kept by a host of one's own: no object store is linked.
#include <iostream>
#include <utility>

#include "shelf.h"

using namespace vemo;
using Map = FieldIdToVectorTombstonesMap;

namespace {

FieldId FieldOf(int object) { return FieldId{OID(static_cast<std::uint64_t>(object)), Path{0, 3}}; }

void Report(const char* what) {
  const int written = g_shelf.Save();
  g_shelf.Unload();
  std::cout << what << ": " << written << " records written, " << g_shelf.m_objects.size() << " kept\n";
}

}  // namespace

int main() {
  const OID id = DollarNew(new Map)->m_persistObjState.m_oid;
  for (int object = 1; object <= 1000; ++object) g_shelf.Find<Map>(id)[FieldOf(object)].Erasep(object % 10, 2);
  Report("insert");

  ssize_t tombstones = 0;
  for (const auto& [field, positions] : std::as_const(g_shelf.Find<Map>(id))) {
    tombstones += positions.NumTombstones();
  }
  std::cout << "fields: " << g_shelf.Find<Map>(id).size() << ", tombstones: " << tombstones << '\n';

  for (int object = 1; object <= 997; ++object) g_shelf.Find<Map>(id).Delete(FieldOf(object));
  Report("delete");
  for (const auto& [field, positions] : std::as_const(g_shelf.Find<Map>(id))) {
    std::cout << ToText(field) << ' ' << ToText(positions) << '\n';
  }

  g_shelf.Find<Map>(id).clear();
  Report("clear");
}
