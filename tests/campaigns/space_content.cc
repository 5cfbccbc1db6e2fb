#include "tests/campaigns/space_content.h"

#include "tests/support/keys.h"
#include "tests/support/production_payloads.h"
#include "store/class_registry.h"

namespace vemo::campaign {

namespace {

template <class Map>
std::string EntriesText(const Map& map) {
  std::string text;
  for (const auto& [key, payload] : map) {
    text += " " + std::to_string(test::NumberOf(key)) + "=" +
            std::to_string(test::PayloadNumber<typename Map::Payload>::Number(payload));
  }
  return text;
}

// Calls `act` with the class of the map that stands behind `object`.
template <class Act>
auto WithClassOf(ptr<IPersistable> object, Act&& act) {
  if (object.Table() == IPersistable::Stubs<FieldIdToVectorInsertionsMap>::GetTable()) {
    return act(static_cast<const FieldIdToVectorInsertionsMap*>(object.m_self));
  }
  if (object.Table() == IPersistable::Stubs<FieldIdToVectorTombstonesMap>::GetTable()) {
    return act(static_cast<const FieldIdToVectorTombstonesMap*>(object.m_self));
  }
  return act(static_cast<const FieldIdToVectorInsertionsAndDeletionsMap*>(object.m_self));
}

}  // namespace

std::string ContentOf(Snapshot& snapshot) {
  std::string text = "commit " + std::to_string(snapshot.Generation()) + "\n";
  snapshot.Objects().State().ScanNamed(NamedTable::kRoots, "", [&](std::string_view name, ByteView) {
    const ptr<IPersistable> map = snapshot.RootMap(name);
    text += name.front() == '\0' ? "owned" : std::string(name);
    text += " " + std::string(FindClass(map.Table())->Name()) + ":";
    text += WithClassOf(map, [](const auto* typed) { return EntriesText(*typed); }) + "\n";
    return true;
  });
  snapshot.ScanMeta("", [&](std::string_view name, std::string_view value) {
    text += "meta " + std::string(name) + "=" + std::string(value) + "\n";
    return true;
  });
  return text;
}

bool SeesTheSame(WriteTransaction& transaction, Snapshot& snapshot) {
  if (transaction.RootNames() != snapshot.RootNames()) return false;
  for (const std::string& name : snapshot.RootNames()) {
    const bool same = WithClassOf(snapshot.RootMap(name), [&]<class Map>(const Map* map) {
      return EntriesText(transaction.View<Map>(name)) == EntriesText(*map);
    });
    if (!same) return false;
  }
  return true;
}

}  // namespace vemo::campaign
