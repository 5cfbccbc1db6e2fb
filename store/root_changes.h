// The roots of a space as the open transaction has left them.
#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "store/view.h"

namespace vemo {

// What the transaction makes is entered in the view's root maps at once, without being committed; what it removes and renames
// stands here, since the engine's state still has the old name.
class RootChanges {
 public:
  RootChanges(View& view, const std::string& spaceName) noexcept : m_view(view), m_spaceName(spaceName) {}

  // Null when there is none of that name any longer, or yet.
  RootMaps::Root* Find(std::string_view name) const;
  // The same; throws UsageError for one of another class.
  RootMaps::Root* FindOfClass(std::string_view name, const ClassEntry& classEntry) const;
  // Throw UsageError when there is none.
  RootMaps::Root& Require(std::string_view name) const { return RequireFound(Find(name), name); }
  RootMaps::Root& RequireOfClass(std::string_view name, const ClassEntry& classEntry) const {
    return RequireFound(FindOfClass(name, classEntry), name);
  }
  // Of all with a name, in order.
  std::vector<std::string> Names() const;

  // Throws UsageError when there is no root `from`, or one of the name `to`.
  void Rename(std::string_view from, std::string_view to);
  // Takes name and map away, what the map held having been deleted. Throws std::bad_alloc, which leaves everything as it was.
  void Remove(const std::string& name, RootMaps::Root& root);

  bool HasRemoved() const noexcept { return !m_removed.empty(); }
  // Gives the maps the names back that they had, for an abort.
  void UndoRenames();
  void AddRemovedTo(CommitBatch& batch) const;

 private:
  // A name that is to go, and the record of its map where that goes too.
  struct Removed {
    std::string name;
    OID oid;
  };
  struct Renamed {
    std::string from;
    std::string to;
  };

  RootMaps::Root& RequireFound(RootMaps::Root* root, std::string_view name) const;
  bool IsRemoved(std::string_view name) const;

  View& m_view;
  const std::string& m_spaceName;
  std::vector<Removed> m_removed;
  std::vector<Renamed> m_renamed;
};

}  // namespace vemo
