#include "store/root_maps.h"

#include <algorithm>
#include <optional>
#include <utility>

#include "platform/error.h"
#include "store/root_value.h"
#include "store/view.h"

namespace vemo {

RootMaps::~RootMaps() {
  for (auto& [name, root] : m_roots) DestroyObject(root.map);
  for (Root& root : m_retired) DestroyObject(root.map);
}

RootMaps::Root* RootMaps::Find(std::string_view name) {
  if (m_areStale) Reload();
  auto found = m_roots.find(name);
  if (found != m_roots.end() && !found->second.oid.IsNull()) return &found->second;
  const std::optional<ByteView> sealed = m_view.State().ReadNamed(NamedTable::kRoots, name);
  if (!sealed) return nullptr;
  RootValue value;
  try {
    value = DecodeRootValue(name, *sealed);
  } catch (const MalformedBytes& malformed) {
    throw CorruptRecord(m_view.SpaceName() + ": root \"" + std::string(name) + "\": " + malformed.what(),
                        m_view.Place(OID(), "", name));
  }
  const ClassEntry* classEntry = FindClass(value.className);
  if (classEntry == nullptr || !classEntry->isMap) {
    throw IncompatibleSpace(m_view.SpaceName() + ": root \"" + std::string(name) + "\" is a " + value.className +
                            ", which this program does not know");
  }
  Root& root = Add(name, *classEntry, value.oid);
  try {
    Read(name, root);
  } catch (...) {
    root.oid = OID();
    throw;
  }
  return &root;
}

RootMaps::Root& RootMaps::Add(std::string_view name, const ClassEntry& classEntry, OID oid) {
  const std::lock_guard lock(m_mutex);
  auto found = m_roots.find(name);
  if (found != m_roots.end() && found->second.classEntry != &classEntry) {
    m_retired.push_back(found->second);
    m_retired.back().oid = OID();
    m_roots.erase(found);
    found = m_roots.end();
  }
  if (found == m_roots.end()) {
    found = m_roots.emplace(std::string(name), Root{&classEntry, OID(), {}, false}).first;
    try {
      found->second.map = ptr<IPersistable>(classEntry.reflected->m_createFn().m_self, classEntry.table);
    } catch (...) {
      m_roots.erase(found);
      throw;
    }
  }
  found->second.oid = oid;
  m_view.Own(found->second.map, oid);
  return found->second;
}

RootMaps::Root& RootMaps::Rename(std::string_view from, std::string_view to) {
  const std::lock_guard lock(m_mutex);
  if (const auto absent = m_roots.find(to); absent != m_roots.end()) {
    m_retired.push_back(absent->second);
    m_roots.erase(absent);
  }
  auto node = m_roots.extract(m_roots.find(from));
  node.key() = std::string(to);
  return m_roots.insert(std::move(node)).position->second;
}

// Reads the record of a root into its map, which is in the default state.
void RootMaps::Read(std::string_view name, Root& root) {
  const std::optional<ByteView> record = m_view.State().Read(root.oid);
  if (!record) {
    throw DanglingReference(m_view.Describe(root.oid, root.classEntry->Name(),
                                            "root \"" + std::string(name) + "\" has no record (run vemo verify)"),
                            m_view.Place(root.oid, root.classEntry->Name(), name));
  }
  const ptr<IPersistable> read = m_view.Decode(root.oid, *record, root.classEntry->table);
  const bool isOfClass = read.Table() == root.map.Table();
  if (isOfClass) m_view.DecodeInto(root.map, root.oid, *record);
  DestroyObject(read);
  if (!isOfClass) {
    const std::string_view className = FindClass(read.Table())->Name();
    throw CorruptRecord(m_view.Describe(root.oid, className,
                                        "root \"" + std::string(name) + "\" should be a " +
                                            std::string(root.classEntry->Name())),
                        m_view.Place(root.oid, className, name));
  }
  root.committed = true;
}

void RootMaps::ResetInPlace(Root& root) noexcept {
  SysStateOf(root.map).ClearFlag(ObjSysState::kDirtyFlag);
  const TypeOps& ops = root.classEntry->reflected->m_ops;
  ops.m_DestructArrayFn(root.map.m_self, ops.m_size, 1);
  ops.m_ConstructArrayFn(root.map.m_self, ops.m_size, 1);
  m_view.Own(root.map, root.oid);
}

void RootMaps::VisitObjects(IObjectVisitor& visitor) const {
  const auto visit = [&visitor](ptr<const IPersistable> map) { map.Table()->_IObject.VisitObjects(map.m_self, visitor); };
  for (const auto& [name, root] : m_roots) visit(root.map);
  for (const Root& root : m_retired) visit(root.map);
}

bool RootMaps::Holds(const void* self) const {
  const std::lock_guard lock(m_mutex);
  return std::any_of(m_roots.begin(), m_roots.end(), [self](const auto& entry) { return entry.second.map.m_self == self; });
}

void RootMaps::Forget() noexcept {
  for (auto& [name, root] : m_roots) {
    if (!root.committed) root.oid = OID();
    ResetInPlace(root);
  }
  for (Root& root : m_retired) ResetInPlace(root);  // a refused change may have left them half-changed
  m_areStale = true;
}

void RootMaps::Reload() {
  std::vector<std::string> names;
  for (auto& [name, root] : m_roots) {
    root.oid = OID();
    root.committed = false;
    m_view.Own(root.map, OID());
    names.push_back(name);
  }
  m_areStale = false;
  try {
    for (const std::string& name : names) Find(name);
  } catch (...) {
    m_areStale = true;
    throw;
  }
}

}  // namespace vemo
