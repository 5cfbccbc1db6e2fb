// The nodes of a field map and the ways in which entries move between them.
//
// A map is a B+tree (Bayer and McCreight, Acta Informatica 1, 1972; Comer, "The Ubiquitous B-Tree", ACM Computing Surveys
// 11, 1979) with all entries in the leaves, of which each node is an object of the store.
//
// Traits of an instance: Map, InternalNode, LeafNode (its three final classes), Payload, kCapacity (even, at least 4) and
// the names that VEMO_FIELD_MAP_INSTANCE (FieldMapInstance.h) generates. The production capacity is 100; tests run the same
// code at 4, where every repair happens within a few dozen keys. Assertion texts are the production ones at any capacity.
//
// Invariants of a node:
//   N1. Slots 0 .. m_numKeyEntrys-1 hold constructed entries in strictly increasing key order; the other slots are raw.
//   N2. Every entry has one owner: a slot that was moved from is raw, and both counts say so before anything can throw.
//   N3. Child i of an internal node (-1 is m_ptr) holds the keys k with entry[i].m_key <= k < entry[i+1].m_key.
#pragma once

#include <cstddef>
#include <cstring>
#include <new>
#include <utility>

#include "platform/field_id.h"
#include "platform/relocate.h"
#include "platform/types.h"
#include "vxPersistStore/IPersistable.h"
#include "vxPersistStore/pref.h"

namespace vemo {

struct ReflectedClass;

// The order of the whole map: by object, then by path.
inline int CompareKeys(const FieldId& a, const FieldId& b) noexcept { return FieldId::Compare(a, b); }

// A separator key and the child to its right.
struct FieldMapInternalKeyEntry {
  FieldId m_key;
  cref<void> m_ptr;

  void swap(FieldMapInternalKeyEntry& other) noexcept { memswap(this, &other, sizeof(*this)); }
};
template <>
inline constexpr bool kIsRelocatable<FieldMapInternalKeyEntry> = true;

// Raw storage for `Capacity` entries, of which the node says how many live. Copying copies the bytes.
template <class Entry, ssize_t Capacity>
class EntrySlots {
 public:
  static_assert(kIsRelocatable<Entry>);

  Entry* Slot(ssize_t i) noexcept { return reinterpret_cast<Entry*>(m_bytes) + i; }
  const Entry* Slot(ssize_t i) const noexcept { return reinterpret_cast<const Entry*>(m_bytes) + i; }
  Entry& operator[](ssize_t i) noexcept { return *std::launder(Slot(i)); }
  const Entry& operator[](ssize_t i) const noexcept { return *std::launder(Slot(i)); }

 private:
  alignas(Entry) std::byte m_bytes[sizeof(Entry) * static_cast<std::size_t>(Capacity)];
};

// Destroys `n` consecutive elements in increasing order.
template <class T>
void DestructArrayElements(T* first, ssize_t n) noexcept {
  for (ssize_t i = 0; i < n; ++i) std::destroy_at(first + i);
}

// Constructs or destroys the tail, so that `newCount` elements live where `oldCount` did.
template <class T>
void ResizeArrayElements(T* first, ssize_t oldCount, ssize_t newCount) {
  for (ssize_t i = oldCount; i < newCount; ++i) ::new (static_cast<void*>(first + i)) T();
  if (newCount < oldCount) DestructArrayElements(first + newCount, oldCount - newCount);
}

template <class Traits>
class TFieldMapInternalNode : public PersistableMixin<IObjectBaseMixin<typename Traits::InternalNode, EmptyBase>> {
 public:
  using Mixin = PersistableMixin<IObjectBaseMixin<typename Traits::InternalNode, EmptyBase>>;
  using KeyEntry = FieldMapInternalKeyEntry;

  TFieldMapInternalNode() = default;
  ~TFieldMapInternalNode() { DestructArrayElements(m_entrys.Slot(0), m_numKeyEntrys); }

  // A raw image of the other node: its entries are not copied one by one, so only one of the two may ever destroy them.
  TFieldMapInternalNode(const TFieldMapInternalNode&) = default;
  TFieldMapInternalNode& operator=(const TFieldMapInternalNode&) = default;

  KeyEntry& GetEntry(ssize_t i) noexcept { return m_entrys[i]; }
  const KeyEntry& GetEntry(ssize_t i) const noexcept { return m_entrys[i]; }

  // The reference to child `i`, -1 .. m_numKeyEntrys-1.
  const cref<void>& ChildReference(ssize_t i) const noexcept { return i < 0 ? m_ptr : GetEntry(i).m_ptr; }

  // The child whose range contains `key` and its index, -1 meaning m_ptr. Loads the child; `expected` is the table of its
  // class where the caller knows it, which guards against damaged data.
  std::pair<void*, ssize_t> FindChildGivenKey2(const FieldId& key,
                                               const IPersistable::FnTable* expected = nullptr) const;
  void* FindChildGivenKey(const FieldId& key, const IPersistable::FnTable* expected = nullptr) const;
  // The index alone, without loading.
  ssize_t FindChildIndexGivenKey(const FieldId& key) const;

  void Serialise(Archive& ar) const;
  void Deserialise(InputArchive& ar);
  void VisitObjects(IObjectVisitor& visitor) const;
  void VisitPrefs(IPrefVisitor& visitor) const;
  const ReflectedClass* GetReflectedClass() const { return Traits::GetReflectedInternalNode(); }

  cref<void> m_ptr;  // the leftmost child
  ssize_t m_numKeyEntrys = 0;
  EntrySlots<KeyEntry, Traits::kCapacity> m_entrys;
};

template <class Traits>
class TFieldMapLeafNode : public PersistableMixin<IObjectBaseMixin<typename Traits::LeafNode, EmptyBase>> {
 public:
  using Mixin = PersistableMixin<IObjectBaseMixin<typename Traits::LeafNode, EmptyBase>>;
  using value_type = std::pair<const FieldId, typename Traits::Payload>;
  using KeyEntry = value_type;

  TFieldMapLeafNode() = default;
  ~TFieldMapLeafNode() { DestructArrayElements(m_entrys.Slot(0), m_numKeyEntrys); }

  // A raw image, as for internal nodes.
  TFieldMapLeafNode(const TFieldMapLeafNode&) = default;
  TFieldMapLeafNode& operator=(const TFieldMapLeafNode&) = default;

  KeyEntry& GetEntry(ssize_t i) noexcept { return m_entrys[i]; }
  const KeyEntry& GetEntry(ssize_t i) const noexcept { return m_entrys[i]; }

  void Serialise(Archive& ar) const;
  void Deserialise(InputArchive& ar);
  void VisitObjects(IObjectVisitor& visitor) const;
  void VisitPrefs(IPrefVisitor&) const {}  // neighbours are not owned, payloads hold no references
  const ReflectedClass* GetReflectedClass() const { return Traits::GetReflectedLeafNode(); }

  cref<typename Traits::LeafNode> m_prev;
  cref<typename Traits::LeafNode> m_next;
  ssize_t m_numKeyEntrys = 0;
  EntrySlots<KeyEntry, Traits::kCapacity> m_entrys;
};

// Moves entries to another node, or within one where the ranges may overlap. They arrive as they lie in memory; where they
// were is raw afterwards, and the caller sets the counts.
template <class Node>
void MoveLeafEntries(Node* source, ssize_t from, Node* destination, ssize_t to, ssize_t count) noexcept {
  Relocate(destination->m_entrys.Slot(to), source->m_entrys.Slot(from), count);
}
template <class Node>
void ShiftLeafEntries(Node* leaf, ssize_t from, ssize_t to, ssize_t count) noexcept {
  Relocate(leaf->m_entrys.Slot(to), leaf->m_entrys.Slot(from), count);
}
template <class Node>
void MoveInternalEntries(Node* source, ssize_t from, Node* destination, ssize_t to, ssize_t count) noexcept {
  Relocate(destination->m_entrys.Slot(to), source->m_entrys.Slot(from), count);
}
template <class Node>
void ShiftInternalEntries(Node* node, ssize_t from, ssize_t to, ssize_t count) noexcept {
  Relocate(node->m_entrys.Slot(to), node->m_entrys.Slot(from), count);
}

template <class Node>
void CopyConstructInternalEntry(Node* node, ssize_t i, const FieldMapInternalKeyEntry& entry) {
  ::new (static_cast<void*>(node->m_entrys.Slot(i))) FieldMapInternalKeyEntry(entry);
}
template <class Node>
void DestructInternalEntry(Node* node, ssize_t i) noexcept {
  std::destroy_at(&node->GetEntry(i));
}
template <class Node>
void DestructLeafEntry(Node* leaf, ssize_t i) noexcept {
  std::destroy_at(&leaf->GetEntry(i));
}

// A value that was built before its place in a node is free. Building is the step that can throw; taking the value to its
// slot is a relocation. A value that was not taken is destroyed.
template <class T>
class PendingValue {
 public:
  explicit PendingValue(const T& value) { ::new (static_cast<void*>(m_bytes)) T(value); }
  ~PendingValue() {
    if (m_owned) std::destroy_at(std::launder(reinterpret_cast<T*>(m_bytes)));
  }
  PendingValue(const PendingValue&) = delete;
  PendingValue& operator=(const PendingValue&) = delete;

  // The raw bytes, which the caller relocates: the value is no longer this object's.
  T* Release() noexcept {
    m_owned = false;
    return reinterpret_cast<T*>(m_bytes);
  }

 private:
  alignas(T) std::byte m_bytes[sizeof(T)];
  bool m_owned = true;
};

}  // namespace vemo
