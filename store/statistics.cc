#include "store/statistics.h"

#include <algorithm>
#include <unordered_set>

#include "platform/error.h"
#include "store/commit_builder.h"
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

class DiscardingStream : public IOutputStream {
 public:
  void WriteStream(const void*, ssize_t) override {}
};

void CountNode(LevelStatistics& level, ssize_t entries, std::size_t recordBytes) {
  const auto n = static_cast<std::uint64_t>(entries);
  level.leastEntries = level.nodes == 0 ? n : std::min(level.leastEntries, n);
  level.mostEntries = std::max(level.mostEntries, n);
  level.entries += n;
  level.recordBytes += recordBytes;
  ++level.nodes;
}

class Collector {
 public:
  Collector(Snapshot& snapshot, const std::function<void(std::uint64_t)>& progress)
      : m_snapshot(snapshot), m_progress(progress) {}

  SpaceStatistics Run() {
    m_statistics.commit = m_snapshot.Generation();
    m_statistics.mediumBytes = m_snapshot.Space().Usage().bytes;
    m_statistics.readers = m_snapshot.Space().Readers();
    State().ScanNamed(NamedTable::kRoots, "", [this](std::string_view name, ByteView) {
      m_rootNames.emplace_back(name);
      return true;
    });
    for (const std::string& name : m_rootNames) AddRoot(name);
    AddQueue();
    AddRecords();
    m_snapshot.ScanMeta("", [this](std::string_view name, std::string_view value) {
      Add(m_statistics.meta, name.size() + value.size());
      return true;
    });
    return std::move(m_statistics);
  }

 private:
  const EngineSnapshot& State() { return m_snapshot.Objects().State(); }

  static void Add(Amount& amount, std::size_t bytes) {
    ++amount.count;
    amount.bytes += bytes;
  }

  void AddRoot(const std::string& name) {
    const ptr<IPersistable> object = m_snapshot.RootMap(name);
    MapStatistics map;
    if (name.front() != '\0') map.root = name;
    map.className = FindClass(object.Table())->Name();
    map.oid = PersistStateOf(object).m_oid;
    map.recordBytes = Reach(map.oid).size();
    AddMapOfClass<FieldIdToVectorInsertionsMap>(object, map);
    AddMapOfClass<FieldIdToVectorTombstonesMap>(object, map);
    AddMapOfClass<FieldIdToVectorInsertionsAndDeletionsMap>(object, map);
    m_statistics.maps.push_back(std::move(map));
  }

  // Walks the tree from the root down, a level at a time.
  template <class Map>
  void AddMapOfClass(ptr<IPersistable> object, MapStatistics& statistics) {
    if (object.Table() != IPersistable::Stubs<Map>::GetTable()) return;
    const auto& map = *static_cast<const Map*>(object.m_self);
    statistics.height = map.m_height;
    statistics.levels.resize(static_cast<std::size_t>(map.m_height + 1));
    std::vector<OID> nodes;
    if (map.m_height >= 0) nodes.push_back(map.m_root.m_oid);
    for (ssize_t height = map.m_height; height >= 0; --height) {
      LevelStatistics& level = statistics.levels[static_cast<std::size_t>(height)];
      nodes = height > 0 ? AddInternalLevel<typename Map::InternalNode>(nodes, level)
                         : AddLeaves<typename Map::LeafNode>(nodes, level, statistics);
      statistics.nodes += level.nodes;
      statistics.recordBytes += level.recordBytes;
    }
    if (!statistics.levels.empty()) statistics.entries = statistics.levels.front().entries;
  }

  // Returns the children.
  template <class Node>
  std::vector<OID> AddInternalLevel(const std::vector<OID>& nodes, LevelStatistics& level) {
    level.capacity = Capacity<Node>();
    std::vector<OID> children;
    for (const OID oid : nodes) {
      const ByteView record = Reach(oid);
      const DecodedObject decoded(Decode<Node>(oid, record));
      CountNode(level, As<Node>(decoded).m_numKeyEntrys, record.size());
      for (const prefbase& child : OwnedReferences(decoded.Get())) children.push_back(child.m_oid);
    }
    return children;
  }

  template <class Node>
  std::vector<OID> AddLeaves(const std::vector<OID>& leaves, LevelStatistics& level,
                             MapStatistics& statistics) {
    level.capacity = Capacity<Node>();
    for (const OID oid : leaves) {
      const ByteView record = Reach(oid);
      const DecodedObject decoded(Decode<Node>(oid, record));
      CountNode(level, As<Node>(decoded).m_numKeyEntrys, record.size());
      AddPayloads(As<Node>(decoded), statistics);
    }
    return {};
  }

  template <class Node>
  static void AddPayloads(const Node& leaf, MapStatistics& statistics) {
    DiscardingStream stream;
    Archive archive(&stream);
    for (ssize_t i = 0; i < leaf.m_numKeyEntrys; ++i) {
      const ssize_t before = archive.GetNumBytesWritten();
      archive << leaf.GetEntry(i).second;
      const auto bytes = static_cast<std::uint64_t>(archive.GetNumBytesWritten() - before);
      statistics.payloadBytes += bytes;
      statistics.largestPayloadBytes = std::max(statistics.largestPayloadBytes, bytes);
    }
  }

  template <class Node>
  static constexpr std::uint64_t Capacity() {
    return sizeof(Node::m_entrys) / sizeof(typename Node::KeyEntry);
  }

  template <class Node>
  static const Node& As(const DecodedObject& decoded) {
    return *static_cast<const Node*>(decoded.Get().m_self);
  }

  template <class Node>
  ptr<IPersistable> Decode(OID oid, ByteView record) {
    const ptr<IPersistable> object = m_snapshot.Objects().Decode(oid, record);
    if (object.Table() == IPersistable::Stubs<Node>::GetTable()) return object;
    const DecodedObject other(object);
    Refuse<CorruptRecord>(oid, "a node of another class should stand here");
  }

  // The record of an object that a map reaches.
  ByteView Reach(OID oid) {
    const std::optional<ByteView> record = State().Read(oid);
    if (!record) Refuse<DanglingReference>(oid, "it is referred to, but there is no record of it");
    if (!m_reached.insert(oid).second) Refuse<CorruptRecord>(oid, "it hangs in the maps twice");
    if (m_progress) m_progress(m_reached.size());
    return *record;
  }

  template <class Exception>
  [[noreturn]] void Refuse(OID oid, const char* reason) {
    throw Exception(m_snapshot.Objects().Describe(oid, "", std::string(reason) + " (run vemo verify)"),
                    m_snapshot.Objects().Place(oid));
  }

  // What hangs below the queue. A record that cannot be read is deleted all the same, but nothing below it.
  void AddQueue() {
    std::vector<OID> pending = State().QueuedDeletions(SIZE_MAX);
    m_statistics.queuedDeletions = pending.size();
    while (!pending.empty()) {
      const OID oid = pending.back();
      pending.pop_back();
      const std::optional<ByteView> record = State().Read(oid);
      if (!record || !m_reached.insert(oid).second) continue;
      Add(m_statistics.awaitingDeletion, record->size());
      if (m_progress) m_progress(m_reached.size());
      try {
        const DecodedObject decoded(m_snapshot.Objects().Decode(oid, *record));
        for (const prefbase& child : OwnedReferences(decoded.Get())) pending.push_back(child.m_oid);
      } catch (const CorruptRecord&) {
        continue;
      }
    }
  }

  void AddRecords() {
    State().ScanRecords(OID(1), [this](OID oid, ByteView record) {
      Add(m_statistics.records, record.size());
      if (!m_reached.contains(oid)) Add(m_statistics.unreachable, record.size());
      return true;
    });
  }

  Snapshot& m_snapshot;
  const std::function<void(std::uint64_t)>& m_progress;
  SpaceStatistics m_statistics;
  std::vector<std::string> m_rootNames;
  std::unordered_set<OID> m_reached;  // by the maps, then by the queue
};

}  // namespace

SpaceStatistics CollectStatistics(Snapshot& snapshot, const std::function<void(std::uint64_t)>& progress) {
  return Collector(snapshot, progress).Run();
}

}  // namespace vemo
