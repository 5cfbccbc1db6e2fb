// The records of maps and nodes: bodies of the functions that FieldMap.h and FieldMapNodes.h declare, and the checks that
// bytes from outside pass before these readers, which trust their input, see them.
//
//   map        schema, number of entries, first leaf, last leaf, root, height + 1
//   internal   schema, leftmost child, n, n x (key, child to its right)
//   leaf       schema, previous leaf, next leaf, n, n x (key, payload)
//
// No record tells the class of its children: that follows from the map's height.
#pragma once

#include <cstddef>
#include <memory>
#include <string>
#include <utility>

#include "vxOperation/src/WorkingSet/CompOp/FieldMap.h"
#include "vxOperation/src/WorkingSet/CompOp/FieldMapPrefetch.h"
#include "platform/assertion.h"
#include "vxUtils/Archive.h"
#include "vxUtils/BoundedReader.h"

namespace vemo {

// --- Maps ---

template <class Traits>
void TFieldMap<Traits>::Serialise(Archive& ar) const {
  SerialiseSchema(ar, Traits::kMapSchema);
  SerialiseVariableLengthUint(ar, m_size);
  ar << m_firstLeaf << m_lastLeaf << m_root;
  SerialiseVariableLengthUint(ar, m_height + 1);
}

template <class Traits>
void TFieldMap<Traits>::Deserialise(InputArchive& ar) {
  int schema = 0;
  DeserialiseSchema(ar, Traits::kMapSchema, schema);
  DeserialiseVariableLengthUint(ar, m_size);
  ar >> m_firstLeaf >> m_lastLeaf >> m_root;
  DeserialiseVariableLengthUint(ar, m_height);
  --m_height;
  VEMO_ASSERT(m_size >= 0);
  VEMO_ASSERT(m_height >= -1);
}

template <class Traits>
void TFieldMap<Traits>::VisitObjects(IObjectVisitor& visitor) const {
  visitor << m_firstLeaf << m_lastLeaf << m_root;
}

// The owning links alone: the leaves are the tree's, the first and last leaf are short cuts.
template <class Traits>
void TFieldMap<Traits>::VisitPrefs(IPrefVisitor& visitor) const {
  visitor << m_root;
}

// --- Internal nodes ---

template <class Traits>
void TFieldMapInternalNode<Traits>::Serialise(Archive& ar) const {
  SerialiseSchema(ar, Traits::kInternalNodeSchema);
  ar << m_ptr;
  SerialiseVariableLengthUint(ar, m_numKeyEntrys);
  for (ssize_t i = 0; i < m_numKeyEntrys; ++i) ar << GetEntry(i).m_key << GetEntry(i).m_ptr;
}

template <class Traits>
void TFieldMapInternalNode<Traits>::Deserialise(InputArchive& ar) {
  int schema = 0;
  DeserialiseSchema(ar, Traits::kInternalNodeSchema, schema);
  ar >> m_ptr;
  ssize_t n = 0;
  DeserialiseVariableLengthUint(ar, n);
  VEMO_ASSERT_TEXT(0 <= n && n <= Traits::kCapacity, "0 <= n && n <= 100");
  ResizeArrayElements(m_entrys.Slot(0), m_numKeyEntrys, n);
  m_numKeyEntrys = n;
  for (ssize_t i = 0; i < n; ++i) ar >> GetEntry(i).m_key >> GetEntry(i).m_ptr;
}

template <class Traits>
void TFieldMapInternalNode<Traits>::VisitObjects(IObjectVisitor& visitor) const {
  visitor << m_ptr;
  for (ssize_t i = 0; i < m_numKeyEntrys; ++i) visitor << GetEntry(i).m_ptr;
}

template <class Traits>
void TFieldMapInternalNode<Traits>::VisitPrefs(IPrefVisitor& visitor) const {
  visitor << m_ptr;
  for (ssize_t i = 0; i < m_numKeyEntrys; ++i) visitor << GetEntry(i).m_ptr;
}

// --- Leaves ---

template <class Traits>
void TFieldMapLeafNode<Traits>::Serialise(Archive& ar) const {
  SerialiseSchema(ar, Traits::kLeafNodeSchema);
  ar << m_prev << m_next;
  SerialiseVariableLengthUint(ar, m_numKeyEntrys);
  PrefetchFirstLists(*this);
  for (ssize_t i = 0; i < m_numKeyEntrys; ++i) {
    PrefetchListsAhead(*this, i);
    ar << GetEntry(i).first << GetEntry(i).second;
  }
}

template <class Traits>
void TFieldMapLeafNode<Traits>::Deserialise(InputArchive& ar) {
  int schema = 0;
  DeserialiseSchema(ar, Traits::kLeafNodeSchema, schema);
  ar >> m_prev >> m_next;
  ssize_t n = 0;
  DeserialiseVariableLengthUint(ar, n);
  VEMO_ASSERT_TEXT(0 <= n && n <= Traits::kCapacity, "0 <= n && n <= 100");
  DestructArrayElements(m_entrys.Slot(0), std::exchange(m_numKeyEntrys, 0));
  // An entry is counted before it is read, so that the node owns it whatever happens.
  InputArchive entries = ar;  // the loop's own, which stays in a register
  for (ssize_t i = 0; i < n; ++i) {
    auto* raw = reinterpret_cast<std::byte*>(m_entrys.Slot(i));
    auto* key = ::new (raw) FieldId;  // apart from its payload: the key of an entry is constant
    auto* payload = ::new (raw + Traits::Map::GetPayloadOffset()) typename Traits::Payload;
    m_numKeyEntrys = i + 1;
    entries >> *key >> *payload;
  }
  ar = entries;
}

template <class Traits>
void TFieldMapLeafNode<Traits>::VisitObjects(IObjectVisitor& visitor) const {
  visitor << m_prev << m_next;
}

// --- Checks of records from outside ---

// Reads an id that must not be null.
inline void CheckChild(BoundedReader& reader) {
  if (reader.ReadUint64() == 0) reader.Fail("a reference to a child is empty");
}

// Reads the keys of a node and sees that they ascend.
class KeyOrderCheck {
 public:
  [[gnu::always_inline]] void ReadNext(BoundedReader& reader) {
    const FieldForm key = reader.ReadField();
    if (m_previous.steps != nullptr && !FieldForm::IsBefore(m_previous, key)) [[unlikely]] {
      reader.Fail("the keys of a node do not ascend");
    }
    // One by one: as a whole it would be put together in memory first, and the copy wait for that.
    m_previous.object = key.object;
    m_previous.head = key.head;
    m_previous.steps = key.steps;
    m_previous.bytes = key.bytes;
  }
  // The key that was read last.
  const FieldForm& Last() const noexcept { return m_previous; }

 private:
  FieldForm m_previous;  // without steps before the first
};

inline std::uint32_t CheckNodeCount(BoundedReader& reader, std::uint32_t least, ssize_t capacity) {
  const std::uint32_t n = reader.ReadUint32();
  if (n < least || n > static_cast<std::uint64_t>(capacity)) {
    reader.Fail("a node cannot hold " + std::to_string(n) + " entries");
  }
  return n;
}

template <class Traits>
void CheckForm(BoundedReader& reader, const TFieldMap<Traits>*) {
  constexpr std::uint32_t kMaxHeight = 64;  // a valid tree that high would not fit into any memory
  reader.ReadSchema(Traits::kMapSchema);
  const std::uint32_t size = reader.ReadUint32();
  const bool first = reader.ReadUint64() != 0;
  const bool last = reader.ReadUint64() != 0;
  const bool root = reader.ReadUint64() != 0;
  const std::uint32_t levels = reader.ReadUint32();
  if (levels > kMaxHeight) reader.Fail("a map cannot have " + std::to_string(levels) + " levels");
  if (first != (levels > 0) || last != first || root != first || (size > 0 && levels == 0)) {
    reader.Fail("size, references and height of a map contradict one another");
  }
}

template <class Traits>
void CheckForm(BoundedReader& reader, const TFieldMapInternalNode<Traits>*) {
  reader.ReadSchema(Traits::kInternalNodeSchema);
  CheckChild(reader);
  const std::uint32_t n = CheckNodeCount(reader, 1, Traits::kCapacity);
  BoundedReader entries = reader;  // the loop's own, which stays in registers
  KeyOrderCheck keys;
  for (std::uint32_t i = 0; i < n; ++i) {
    keys.ReadNext(entries);
    CheckChild(entries);
  }
  reader = entries;
}

// What stands before a leaf's entries; returns their number.
template <class Traits>
std::uint32_t ReadLeafHead(BoundedReader& reader) {
  reader.ReadSchema(Traits::kLeafNodeSchema);
  const std::uint64_t prev = reader.ReadUint64();
  const std::uint64_t next = reader.ReadUint64();
  if (prev == next && prev != 0) reader.Fail("a leaf has the same neighbour on both sides");
  return CheckNodeCount(reader, 0, Traits::kCapacity);
}

template <class Traits>
void CheckForm(BoundedReader& reader, const TFieldMapLeafNode<Traits>*) {
  const std::uint32_t n = ReadLeafHead<Traits>(reader);
  BoundedReader entries = reader;  // as for internal nodes
  KeyOrderCheck keys;
  for (std::uint32_t i = 0; i < n; ++i) {
    keys.ReadNext(entries);
    CheckForm(entries, static_cast<const typename Traits::Payload*>(nullptr));
  }
  reader = entries;
}

// Goes through the record of a leaf entry by entry, without building the node. Checks as CheckForm does, as far as it is read:
// each function throws MalformedBytes for what does not fit. The record must live as long.
template <class Traits>
class LeafFormReader {
 public:
  using Payload = typename Traits::Payload;

  explicit LeafFormReader(BoundedReader record) : m_record(record), m_left(ReadLeafHead<Traits>(m_record)) {}

  // Whether there is another entry, of which the key is read then. What the entry holds is to be read, or skipped, next.
  bool NextKey() {
    if (m_left == 0) {
      m_record.ExpectEnd();
      return false;
    }
    --m_left;
    m_keyBegin = m_record.at();
    m_keys.ReadNext(m_record);
    return true;
  }
  // As CompareKeys of that key and `other`.
  int CompareKeyWith(const FieldId& other) const {
    const FieldForm& key = m_keys.Last();
    if (key.object != other.oid.m_value) return key.object < other.oid.m_value ? -1 : 1;
    const std::uint8_t* step = key.steps;
    const std::uint8_t* const end = key.steps + key.bytes;
    for (const Path::Element theirs : other.path.elements()) {
      if (step == end) return -1;
      Path::Element ours = 0;
      step = DeserialiseVariableLengthUint32(step, ours);
      if (ours != theirs) return ours < theirs ? -1 : 1;
    }
    return step == end ? 0 : 1;
  }

  void SkipPayload() { CheckForm(m_record, static_cast<const Payload*>(nullptr)); }
  void Read(FieldId& key, Payload& payload) {
    SkipPayload();
    InputArchive entry(m_keyBegin);
    entry >> key >> payload;
  }

 private:
  BoundedReader m_record;
  std::uint32_t m_left;  // entries, of which the key is not read yet
  KeyOrderCheck m_keys;
  const std::uint8_t* m_keyBegin = nullptr;
};

// --- The forms that ToBytes, FromBytes and ToText look for ---

template <class T>
concept FieldMapObject = requires(const T& object, T& target, Archive& ar, InputArchive& in) {
  typename T::FinalClass;
  object.Serialise(ar);
  target.Deserialise(in);
};

template <FieldMapObject T>
void Serialise(Archive& ar, const T& object) {
  object.Serialise(ar);
}
template <FieldMapObject T>
void Deserialise(InputArchive& ar, T& object) {
  object.Deserialise(ar);
}

template <class Traits>
xostream& operator<<(xostream& os, const TFieldMap<Traits>& map) {
  map.Write(os);
  return os;
}

// One node alone: children and neighbours are named by id and not loaded.
template <class Traits>
xostream& operator<<(xostream& os, const TFieldMapInternalNode<Traits>& node) {
  os << "{child=" << std::to_string(node.m_ptr.m_oid.m_value) << '\n';
  for (ssize_t i = 0; i < node.m_numKeyEntrys; ++i) {
    os << node.GetEntry(i).m_key << " child=" << std::to_string(node.GetEntry(i).m_ptr.m_oid.m_value) << '\n';
  }
  return os << "}\n";
}

template <class Traits>
xostream& operator<<(xostream& os, const TFieldMapLeafNode<Traits>& leaf) {
  os << "{prev=" << std::to_string(leaf.m_prev.m_oid.m_value) << " next=" << std::to_string(leaf.m_next.m_oid.m_value) << '\n';
  for (ssize_t i = 0; i < leaf.m_numKeyEntrys; ++i) {
    os << leaf.GetEntry(i).first << " --> " << leaf.GetEntry(i).second << '\n';
  }
  return os << "}\n";
}

}  // namespace vemo
