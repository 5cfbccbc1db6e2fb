// A space in memory, what is known of it, and ways to damage it.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <random>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "store/space.h"
#include "tests/store/store_fixture.h"

namespace vemo::campaign {

// One value that is to be put or, without bytes, removed: a record, or a named value where there is a name.
struct Tampering {
  OID oid;
  NamedTable table = NamedTable::kInfo;
  std::string name;
  std::optional<Bytes> bytes;
};

struct Damage {
  std::string what;
  std::vector<Tampering> changes;
  bool isForged = false;  // with checksums that are right
};

class DamagedSpace {
 public:
  // An entry of a map: its payload, and the nodes on the way to it from the root node down.
  struct Entry {
    std::uint64_t number = 0;
    std::vector<OID> way;
  };
  struct Map {
    std::string name;
    OID oid;
    std::map<std::uint64_t, Entry> entries;  // by the number of the key
    std::set<OID> objects;                   // the map's own, and its nodes
  };

  // Maps of all classes, one of them with two levels of internal nodes; an owned map; meta values; leftovers of an assignment;
  // a queue of deletions.
  DamagedSpace();

  CSpace& space() { return m_site.space(); }
  Engine& engine() { return m_site.engine(); }
  const test::StoredState& stored() const { return m_stored; }
  const std::vector<Map>& maps() const { return m_maps; }
  // Whether a root reaches the object.
  bool IsReachable(OID oid) const;

  // Something that changes at least one byte, or removes a record that a root reaches.
  Damage Draw(std::mt19937_64& random) const;
  // Flips bits of a record's body and seals it again.
  Damage DrawForged(std::mt19937_64& random) const;
  void Apply(const Damage& damage);
  void Repair(const Damage& damage);

 private:
  template <class M>
  void AddMap(Snapshot& snapshot, const std::string& name);
  OID DrawRecord(std::mt19937_64& random) const;
  Damage DrawNamed(std::mt19937_64& random) const;
  void Write(const std::vector<Tampering>& changes);

  test::SpaceSite m_site{test::EngineKind::kMemory};
  test::StoredState m_stored;
  std::vector<Map> m_maps;
  std::vector<OID> m_ids;
};

inline constexpr std::uint64_t kDeepKeys = 5'400;

}  // namespace vemo::campaign
