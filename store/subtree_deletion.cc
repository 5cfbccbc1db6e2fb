#include "store/subtree_deletion.h"

#include <optional>
#include <utility>
#include <vector>

#include "store/commit_builder.h"
#include "store/decoded_object.h"

namespace vemo {

namespace {

// A leaf is also reached along the chain of leaves, and unchanged nodes leave memory before changed ones, so a changed node
// can be in memory below nodes that are not. While the transaction has changed nodes left, the internal nodes are looked at
// to see whether it is they that hang there.
class SubTreeDeletion {
 public:
  SubTreeDeletion(View& view, ObjectChanges& changes) : m_view(view), m_changes(changes) {}

  void Run(ptr<IPersistable> root) {
    DeleteResidents(root);
    while (!m_absent.empty()) {
      std::vector<OID> siblings = std::move(m_absent.back());
      m_absent.pop_back();
      for (const OID oid : siblings) m_changes.QueueDeletion(oid);
      DeleteResidentsBelow(std::move(siblings));
    }
  }

 private:
  void DeleteResidents(ptr<IPersistable> root) {
    std::vector<ptr<IPersistable>> pending{root};
    while (!pending.empty()) {
      const ptr<IPersistable> object = pending.back();
      pending.pop_back();
      std::vector<OID> missing;
      for (const prefbase& child : OwnedReferences(object)) {
        const ptr<IPersistable> resident = m_view.Find(child.m_oid);
        if (resident.m_self != nullptr) {
          pending.push_back(resident);
        } else if (!m_changes.IsDeleted(child.m_oid)) {
          missing.push_back(child.m_oid);
        }
      }
      if (!missing.empty()) m_absent.push_back(std::move(missing));
      m_changes.Delete(object);
    }
  }

  // Deletes what is in memory below nodes that are not, and that the queue takes with all else below them.
  void DeleteResidentsBelow(std::vector<OID> siblings) {
    std::vector<std::vector<OID>> pending{std::move(siblings)};
    while (!pending.empty() && m_changes.HasDirtyNodes()) {
      const std::vector<OID> nodes = std::move(pending.back());
      pending.pop_back();
      for (const OID node : nodes) {
        const std::optional<std::vector<OID>> children = ReadOwnedIds(node);
        if (!children) continue;
        if (children->empty()) break;  // a leaf, and so are the others
        std::vector<OID> missing;
        for (const OID child : *children) {
          const ptr<IPersistable> resident = m_view.Find(child);
          if (resident.m_self != nullptr) {
            DeleteResidents(resident);
          } else if (!m_changes.IsDeleted(child)) {
            missing.push_back(child);
          }
        }
        if (!missing.empty()) pending.push_back(std::move(missing));
      }
    }
  }

  // What a stored object owns, read without keeping it; nothing where it cannot be read, since whoever works off the queue of
  // deletions deletes it all the same.
  std::optional<std::vector<OID>> ReadOwnedIds(OID oid) {
    const std::optional<ByteView> record = m_view.State().Read(oid);
    if (!record) return std::nullopt;
    try {
      const DecodedObject object(m_view.Decode(oid, *record));
      std::vector<OID> ids;
      for (const prefbase& child : OwnedReferences(object.Get())) ids.push_back(child.m_oid);
      return ids;
    } catch (const CorruptRecord&) {
      return std::nullopt;
    }
  }

  View& m_view;
  ObjectChanges& m_changes;
  std::vector<std::vector<OID>> m_absent;  // children that are not in memory, those of one node together
};

}  // namespace

void DeleteSubTree(View& view, ObjectChanges& changes, ptr<IPersistable> root) { SubTreeDeletion(view, changes).Run(root); }

}  // namespace vemo
