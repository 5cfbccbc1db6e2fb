#include "store/reach.h"

#include "platform/error.h"
#include "store/commit_builder.h"
#include "store/names.h"
#include "vxOperation/src/WorkingSet/CompOp/VectorOT.h"

namespace vemo {

namespace {

// An object that belongs to nobody else.
class DecodedObject {
 public:
  explicit DecodedObject(ptr<IPersistable> object) noexcept : m_object(object) {}
  ~DecodedObject() { DestroyObject(m_object); }
  DecodedObject(const DecodedObject&) = delete;
  DecodedObject& operator=(const DecodedObject&) = delete;

  ptr<IPersistable> Get() const noexcept { return m_object; }

 private:
  ptr<IPersistable> m_object;
};

// As messages name a root.
std::string RootText(std::string_view name) {
  if (IsOwnedRootName(name)) return "the owned map " + std::string(name.substr(name.find('/') + 1));
  return "root \"" + std::string(name) + "\"";
}

constexpr std::string_view kAdvice = "; nothing was removed (run vemo verify)";

// Leaves are visited from left to right, so each can be compared with the one before it.
template <class Map>
class ChainCheck {
 public:
  using Leaf = typename Map::LeafNode;

  explicit ChainCheck(const Map& map) : m_map(map), m_expected(map.m_firstLeaf.m_oid) {}

  // Whether the leaf is the one that the chain leads to, and names the one before it.
  bool Visit(OID oid, const Leaf& leaf) {
    const bool isSound = oid == m_expected && leaf.m_prev.m_oid == m_last;
    m_last = oid;
    m_expected = leaf.m_next.m_oid;
    return isSound;
  }
  bool EndsAsTheMapSays() const { return m_expected.IsNull() && m_last == m_map.m_lastLeaf.m_oid; }

 private:
  const Map& m_map;
  OID m_last;
  OID m_expected;
};

}  // namespace

bool Reach::Run() {
  std::vector<std::string> names;
  State().ScanNamed(NamedTable::kRoots, "", [&names](std::string_view name, ByteView) {
    names.emplace_back(name);
    return true;
  });
  for (const std::string& name : names) {
    if (!WalkRoot(name)) return false;
  }
  return WalkQueue() && (!m_goOn || m_goOn(m_visited));
}

bool Reach::WalkRoot(const std::string& name) {
  const ptr<IPersistable> map = m_snapshot.RootMap(name);
  const OID oid = PersistStateOf(map).m_oid;
  if (!m_reached.Insert(oid)) Refuse(name, oid, FindClass(map.Table())->Name(), "two roots have the same map");
  return Count() && WalkMap<FieldIdToVectorInsertionsMap>(name, map) &&
         WalkMap<FieldIdToVectorTombstonesMap>(name, map) &&
         WalkMap<FieldIdToVectorInsertionsAndDeletionsMap>(name, map);
}

// Children are visited from left to right.
template <class Map>
bool Reach::WalkMap(const std::string& name, ptr<IPersistable> object) {
  if (object.Table() != IPersistable::Stubs<Map>::GetTable()) return true;
  struct Pending {
    OID oid;
    ssize_t height;
  };
  const auto& map = *static_cast<const Map*>(object.m_self);
  ChainCheck<Map> chain(map);
  std::vector<Pending> pending;
  if (map.m_height >= 0) pending.push_back({map.m_root.m_oid, map.m_height});
  while (!pending.empty()) {
    const Pending node = pending.back();
    pending.pop_back();
    const auto* table = node.height > 0 ? IPersistable::Stubs<typename Map::InternalNode>::GetTable()
                                        : IPersistable::Stubs<typename Map::LeafNode>::GetTable();
    const std::string_view className = FindClass(table)->Name();
    if (!m_reached.Insert(node.oid)) Refuse(name, node.oid, className, "it hangs in the trees twice");
    const DecodedObject decoded(Decode(name, node.oid, table));
    if (node.height == 0) {
      const auto& leaf = *static_cast<const typename Map::LeafNode*>(decoded.Get().m_self);
      if (!chain.Visit(node.oid, leaf)) Refuse(name, node.oid, className, "its neighbours are not the tree's");
    }
    const std::vector<prefbase> children = OwnedReferences(decoded.Get());
    for (auto child = children.rbegin(); child != children.rend(); ++child) {
      pending.push_back({child->m_oid, node.height - 1});
    }
    if (!Count()) return false;
  }
  if (!chain.EndsAsTheMapSays()) {
    Refuse(name, PersistStateOf(object).m_oid, FindClass(object.Table())->Name(), "the chain of its leaves goes on elsewhere");
  }
  return true;
}

// What hangs there may have left already, and what cannot be read leaves all the same: what was below it is unreachable then.
bool Reach::WalkQueue() {
  std::vector<OID> pending = State().QueuedDeletions(SIZE_MAX);
  IdSet queued;
  while (!pending.empty()) {
    const OID oid = pending.back();
    pending.pop_back();
    const std::optional<ByteView> record = State().Read(oid);
    if (!record || !queued.Insert(oid)) continue;
    if (!m_reached.Insert(oid)) Refuse("", oid, "", "it awaits deletion, and a root map reaches it");
    ++m_awaiting;
    try {
      const DecodedObject decoded(m_snapshot.Objects().Decode(oid, *record));
      for (const prefbase& child : OwnedReferences(decoded.Get())) pending.push_back(child.m_oid);
    } catch (const CorruptRecord&) {
      continue;
    }
    if (!Count()) return false;
  }
  return true;
}

ptr<IPersistable> Reach::Decode(const std::string& root, OID oid, const IPersistable::FnTable* expected) {
  const View& view = m_snapshot.Objects();
  const std::string_view className = FindClass(expected)->Name();
  const std::optional<ByteView> record = State().Read(oid);
  if (!record) {
    throw DanglingReference(view.Describe(oid, className, RootText(root) + " reaches it, but there is no record of it" +
                                std::string(kAdvice)),
                            view.Place(oid, className, root));
  }
  ptr<IPersistable> object;
  try {
    object = m_snapshot.Objects().Decode(oid, *record, expected);
  } catch (const CorruptRecord& corrupt) {
    ErrorPlace place = corrupt.place();
    place.root = root;
    throw CorruptRecord(std::string(corrupt.what()) + " (" + RootText(root) + ", where a " + std::string(className) +
                            " should stand)" + std::string(kAdvice),
                        std::move(place));
  }
  if (object.Table() == expected) return object;
  const std::string found(FindClass(object.Table())->Name());
  DestroyObject(object);
  Refuse(root, oid, found, "a " + std::string(className) + " should stand here");
}

void Reach::Refuse(const std::string& root, OID oid, std::string_view className, const std::string& reason) const {
  const View& view = m_snapshot.Objects();
  throw CorruptRecord(view.Describe(oid, className, (root.empty() ? "" : RootText(root) + ": ") + reason + std::string(kAdvice)),
                      view.Place(oid, className, root));
}

}  // namespace vemo
