#include "store/dump.h"

#include "platform/assertion.h"
#include "store/decoded_object.h"
#include "vxOperation/src/WorkingSet/CompOp/VectorOT.h"

namespace vemo {

namespace {

template <class Map>
class MapDump {
 public:
  MapDump(Snapshot& snapshot, xostream& os) : m_reader(snapshot.Objects()), m_os(os) {}

  // Whether the map is of this class.
  bool Write(ptr<IPersistable> object) {
    if (object.Table() != IPersistable::Stubs<Map>::GetTable()) return false;
    const auto& map = *static_cast<const Map*>(object.m_self);
    m_os << "Height = " << map.m_height << '\n';
    if (map.m_height >= 0) WriteNode(map.m_height, map.m_root);
    return true;
  }

 private:
  using InternalNode = typename Map::InternalNode;
  using LeafNode = typename Map::LeafNode;

  void WriteNode(ssize_t height, const prefbase& reference) {
    m_os << "{\n";
    {
      const Indenter indenter(m_os, 4);
      if (height > 0) {
        WriteInternalNode(height, m_reader.Read(reference, IPersistable::Stubs<InternalNode>::GetTable()));
      } else {
        WriteEntries(m_reader.Read(reference, IPersistable::Stubs<LeafNode>::GetTable()));
      }
    }
    m_os << "}\n";
  }

  void WriteInternalNode(ssize_t height, const DecodedObject& object) {
    const auto& node = object.As<InternalNode>();
    WriteNode(height - 1, node.m_ptr);
    for (ssize_t i = 0; i < node.m_numKeyEntrys; ++i) {
      m_os << node.GetEntry(i).m_key << '\n';
      WriteNode(height - 1, node.GetEntry(i).m_ptr);
    }
  }

  void WriteEntries(const DecodedObject& object) {
    const auto& leaf = object.As<LeafNode>();
    for (ssize_t i = 0; i < leaf.m_numKeyEntrys; ++i) {
      m_os << leaf.GetEntry(i).first << " --> " << leaf.GetEntry(i).second << '\n';
    }
  }

  NodeReader m_reader;
  xostream& m_os;
};

}  // namespace

void DumpMap(Snapshot& snapshot, std::string_view root, xostream& os) {
  const ptr<IPersistable> map = snapshot.RootMap(root);
  [[maybe_unused]] const bool written = MapDump<FieldIdToVectorInsertionsMap>(snapshot, os).Write(map) ||
                       MapDump<FieldIdToVectorTombstonesMap>(snapshot, os).Write(map) ||
                       MapDump<FieldIdToVectorInsertionsAndDeletionsMap>(snapshot, os).Write(map);
  VEMO_ASSERT(written);
}

}  // namespace vemo
