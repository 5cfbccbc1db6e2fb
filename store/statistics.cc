#include "store/statistics.h"

#include <algorithm>

#include "platform/error.h"
#include "store/commit_builder.h"
#include "store/decoded_object.h"
#include "store/id_set.h"
#include "store/names.h"
#include "vxOperation/src/WorkingSet/CompOp/VectorOT.h"

namespace vemo {

namespace {

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
    if (!IsOwnedRootName(name)) map.root = name;
    map.className = FindClass(object.Table())->Name();
    map.oid = PersistStateOf(object).m_oid;
    map.recordBytes = Reach(map.oid).size();
    AddMapOfClass<FieldIdToVectorInsertionsMap>(object, map);
    AddMapOfClass<FieldIdToVectorTombstonesMap>(object, map);
    AddMapOfClass<FieldIdToVectorInsertionsAndDeletionsMap>(object, map);
    m_statistics.maps.push_back(std::move(map));
  }

  template <class Map>
  void AddMapOfClass(ptr<IPersistable> object, MapStatistics& statistics) {
    if (object.Table() != IPersistable::Stubs<Map>::GetTable()) return;
    const auto& map = *static_cast<const Map*>(object.m_self);
    statistics.height = map.m_height;
    statistics.levels.resize(static_cast<std::size_t>(map.m_height + 1));
    if (map.m_height >= 0) AddNode<Map>(map.m_height, map.m_root.m_oid, statistics);
    for (const LevelStatistics& level : statistics.levels) {
      statistics.nodes += level.nodes;
      statistics.recordBytes += level.recordBytes;
    }
    if (!statistics.levels.empty()) statistics.entries = statistics.levels.front().entries;
  }

  // Depth first, so that one path from the root is in memory at a time.
  template <class Map>
  void AddNode(ssize_t height, OID oid, MapStatistics& statistics) {
    LevelStatistics& level = statistics.levels[static_cast<std::size_t>(height)];
    const ByteView record = Reach(oid);
    if (height == 0) {
      const DecodedObject leaf = Decode<typename Map::LeafNode>(oid, record);
      AddToLevel<typename Map::LeafNode>(level, leaf, record.size());
      AddPayloads(leaf.As<typename Map::LeafNode>(), statistics);
      return;
    }
    const DecodedObject node = Decode<typename Map::InternalNode>(oid, record);
    AddToLevel<typename Map::InternalNode>(level, node, record.size());
    for (const prefbase& child : OwnedReferences(node.Get())) AddNode<Map>(height - 1, child.m_oid, statistics);
  }

  template <class Node>
  static void AddToLevel(LevelStatistics& level, const DecodedObject& node, std::size_t recordBytes) {
    level.capacity = sizeof(Node::m_entrys) / sizeof(typename Node::KeyEntry);
    CountNode(level, node.As<Node>().m_numKeyEntrys, recordBytes);
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
  DecodedObject Decode(OID oid, ByteView record) {
    DecodedObject object(m_snapshot.Objects().Decode(oid, record));
    if (object.Get().Table() == IPersistable::Stubs<Node>::GetTable()) return object;
    Refuse<CorruptRecord>(oid, "a node of another class should stand here");
  }

  // The record of an object that a map reaches.
  ByteView Reach(OID oid) {
    const std::optional<ByteView> record = State().Read(oid);
    if (!record) Refuse<DanglingReference>(oid, "it is referred to, but there is no record of it");
    if (!m_reached.Insert(oid)) Refuse<CorruptRecord>(oid, "it hangs in the maps twice");
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
      if (!record || !m_reached.Insert(oid)) continue;
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
      if (!m_reached.Contains(oid)) Add(m_statistics.unreachable, record.size());
      return true;
    });
  }

  Snapshot& m_snapshot;
  const std::function<void(std::uint64_t)>& m_progress;
  SpaceStatistics m_statistics;
  std::vector<std::string> m_rootNames;
  IdSet m_reached;  // by the maps, then by the queue
};

}  // namespace

SpaceStatistics CollectStatistics(Snapshot& snapshot, const std::function<void(std::uint64_t)>& progress) {
  return Collector(snapshot, progress).Run();
}

}  // namespace vemo
