#include "store/root_changes.h"

#include <algorithm>
#include <set>

#include "store/names.h"

namespace vemo {

RootMaps::Root* RootChanges::Find(std::string_view name) const {
  RootMaps::Table& roots = m_view.Roots().All();
  const auto found = roots.find(name);
  if (found != roots.end() && !found->second.oid.IsNull()) return &found->second;
  return IsRemoved(name) ? nullptr : m_view.Roots().Find(name);
}

RootMaps::Root* RootChanges::FindOfClass(std::string_view name, const ClassEntry& classEntry) const {
  RootMaps::Root* root = Find(name);
  if (root != nullptr && root->classEntry != &classEntry) {
    throw UsageError(m_spaceName + ": root \"" + std::string(name) + "\" is a " + std::string(root->classEntry->Name()) +
                     ", not a " + std::string(classEntry.Name()));
  }
  return root;
}

RootMaps::Root& RootChanges::RequireFound(RootMaps::Root* root, std::string_view name) const {
  if (root == nullptr) throw UsageError(m_spaceName + ": it has no root map \"" + std::string(name) + "\"");
  return *root;
}

std::vector<std::string> RootChanges::Names() const {
  std::set<std::string> names;
  m_view.State().ScanNamed(NamedTable::kRoots, "", [&](std::string_view name, ByteView) {
    if (!IsOwnedRootName(name) && !IsRemoved(name)) names.emplace(name);
    return true;
  });
  for (const auto& [name, root] : m_view.Roots().All()) {
    if (!root.oid.IsNull() && !IsOwnedRootName(name)) names.insert(name);
  }
  return {names.begin(), names.end()};
}

bool RootChanges::IsRemoved(std::string_view name) const {
  return std::any_of(m_removed.begin(), m_removed.end(), [name](const Removed& removed) { return removed.name == name; });
}

void RootChanges::Rename(std::string_view from, std::string_view to) {
  Require(from);
  if (Find(to) != nullptr) throw UsageError(m_spaceName + ": it has a root map \"" + std::string(to) + "\" already");
  m_removed.push_back({std::string(from), OID()});
  m_renamed.push_back({std::string(from), std::string(to)});
  m_view.Roots().Rename(from, to).committed = false;
}

void RootChanges::Remove(const std::string& name, RootMaps::Root& root) {
  m_removed.push_back({name, root.oid});
  root.oid = OID();
  root.committed = false;
  m_view.Roots().ResetInPlace(root);
}

void RootChanges::UndoRenames() {
  for (auto renamed = m_renamed.rbegin(); renamed != m_renamed.rend(); ++renamed) {
    m_view.Roots().Rename(renamed->to, renamed->from);
  }
}

void RootChanges::AddRemovedTo(CommitBatch& batch) const {
  const RootMaps::Table& roots = m_view.Roots().All();
  for (const Removed& removed : m_removed) {
    const auto again = roots.find(removed.name);  // another root may have got the name since
    if (again == roots.end() || again->second.oid.IsNull()) {
      batch.namedValues.push_back({NamedTable::kRoots, removed.name, std::nullopt});
    }
    if (!removed.oid.IsNull()) batch.removedRecords.push_back(removed.oid);
  }
}

}  // namespace vemo
