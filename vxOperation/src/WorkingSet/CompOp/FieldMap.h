// The persistent ordered map from FieldId to a payload.
//
// Threads: a map and its nodes are used by one thread at a time, under whatever lock the store gives its writer.
//
// Lifetimes: iterators and payload pointers end with the next insertion or deletion in the map, and whenever the store
// drops nodes from memory. The map owns no node: the store does, and destroying a map frees none.
//
// Errors: a missing key is an ordinary result. A broken invariant is an assertion. Exceptions come from the store (a
// record that cannot be read, a refused mark) and from allocation; an operation that changes the map and is left by one
// leaves the tree as far as it got, and the store is told that it must not be committed.
//
// Cost: find, insert and delete visit one node per level, with a binary search in each; deletion loads two neighbours per
// level besides.
//
// Invariants of a map:
//   M1. m_height is -1 (no node at all), 0 (the root is a leaf) or the number of internal levels above the leaves; all
//       leaves lie at the same depth.
//   M2. Nodes other than the root hold kCapacity/2 .. kCapacity entries; an internal root at least one, a root leaf any.
//   M3. The leaves form one chain through m_prev and m_next in key order, from m_firstLeaf to m_lastLeaf.
//   M4. A separator is greater than every key to its left and not greater than any key to its right. It is the smallest key
//       of its right subtree at the time it was made, and may have no entry any more.
//   M5. m_size is the number of entries.
#pragma once

#include <functional>
#include <iterator>
#include <optional>
#include <utility>
#include <vector>

#include "vxOperation/src/WorkingSet/CompOp/FieldMapIterator.h"
#include "vxOperation/src/WorkingSet/CompOp/FieldMapNodes.h"
#include "platform/xostream.h"
#include "vxPersistStore/MutationScope.h"

namespace vemo {

// A payload that a caller passed by reference. It may lie in an entry of the very map that is about to move its entries.
template <class Payload>
class PayloadArgument {
 public:
  explicit PayloadArgument(const Payload& payload) noexcept : m_payload(&payload) {}
  explicit PayloadArgument(Payload&& payload) noexcept : m_payload(&payload), m_movable(&payload) {}

  // Gives the payload to `target`: moved where the caller allowed it.
  void AssignTo(Payload& target) {
    if (m_held) {
      target = std::move(*m_held);
    } else if (m_movable != nullptr) {
      target = std::move(*m_movable);
    } else {
      target = *m_payload;
    }
  }

  // Takes the payload out of harm's way if it lies in the bytes [begin, end).
  void HoldIfWithin(const void* begin, const void* end) {
    const std::less<const void*> before;
    if (before(m_payload, begin) || !before(m_payload, end)) return;
    if (m_movable != nullptr) {
      m_held.emplace(std::move(*m_movable));
    } else {
      m_held.emplace(*m_payload);
    }
  }

 private:
  const Payload* m_payload;
  Payload* m_movable = nullptr;
  std::optional<Payload> m_held;
};

// Two iterators as a range.
template <class Iterator>
class FieldMapRange {
 public:
  FieldMapRange(Iterator first, Iterator last) : m_first(first), m_last(last) {}
  Iterator begin() const { return m_first; }
  Iterator end() const { return m_last; }
  bool empty() const { return m_first == m_last; }

 private:
  Iterator m_first;
  Iterator m_last;
};

template <class Traits>
class TFieldMap : public PersistableMixin<IObjectBaseMixin<typename Traits::Map, EmptyBase>> {
 public:
  using Map = typename Traits::Map;
  using InternalNode = typename Traits::InternalNode;
  using LeafNode = typename Traits::LeafNode;
  using InternalKeyEntry = FieldMapInternalKeyEntry;
  using Payload = typename Traits::Payload;

  using key_type = FieldId;
  using mapped_type = Payload;
  using value_type = std::pair<const FieldId, Payload>;
  using size_type = ssize_t;
  using difference_type = std::ptrdiff_t;
  using reference = value_type&;
  using const_reference = const value_type&;
  using IteratorPolicy = FieldMapIteratorPolicy<LeafNode>;
  using iterator = make_iterator<IteratorPolicy>;
  using const_iterator = make_const_iterator<IteratorPolicy>;
  using reverse_iterator = std::reverse_iterator<iterator>;
  using const_reverse_iterator = std::reverse_iterator<const_iterator>;

  // Where a write look-up found or made an entry; null and -1 where it did neither.
  struct wFindRet {
    ptr<IPersistable> m_containingNode;
    Payload* m_payload;
    LeafNode* m_leaf;
    ssize_t m_index;
    bool m_created;
  };

  // An empty map. A map that the store does not own (one on the stack) gets its nodes from the transaction of its thread
  // and must not be used after that has ended.
  TFieldMap() = default;
  // Inserts all entries of `other` into new nodes, in ascending order: the shape is that of ascending insertion.
  TFieldMap(const TFieldMap& other);
  // Copy and swap. The nodes held before are not deleted: the store collects what nothing names.
  Map& operator=(const TFieldMap& other);
  // Takes over the nodes of `other`, which is marked and left empty.
  TFieldMap(TFieldMap&& other);
  // The same; the nodes held before are deleted as by clear().
  Map& operator=(TFieldMap&& other);
  ~TFieldMap() = default;

  // --- Looking up: no entry changes, nothing is marked, nodes may be loaded. ---

  ssize_t size() const noexcept { return m_size; }
  bool empty() const noexcept { return m_size == 0; }
  const_iterator find(const FieldId& key) const;
  // The payload under `key`, or null. The cheapest way to read.
  const Payload* rFind(const FieldId& key) const;
  bool contains(const FieldId& key) const { return rFind(key) != nullptr; }
  ssize_t count(const FieldId& key) const { return contains(key) ? 1 : 0; }
  const_iterator lower_bound(const FieldId& key) const;
  const_iterator upper_bound(const FieldId& key) const;
  std::pair<const_iterator, const_iterator> equal_range(const FieldId& key) const {
    return {lower_bound(key), upper_bound(key)};
  }
  // The entries of one object, and those at or below one of its fields: for (const auto& [key, payload] : map.FieldsOf(id)).
  FieldMapRange<const_iterator> FieldsOf(OID object) const { return FieldsBelow(FieldId{object, Path()}); }
  FieldMapRange<const_iterator> FieldsBelow(const FieldId& prefix) const;

  // Dereferencing an `iterator` marks its leaf dirty, so a loop that only reads should run over a constant map or from
  // cbegin() to cend().
  iterator begin() { return iterator(FirstPosition()); }
  iterator end() { return iterator(EndPosition()); }
  const_iterator begin() const { return const_iterator(FirstPosition()); }
  const_iterator end() const { return const_iterator(EndPosition()); }
  const_iterator cbegin() const { return begin(); }
  const_iterator cend() const { return end(); }
  reverse_iterator rbegin() { return reverse_iterator(end()); }
  reverse_iterator rend() { return reverse_iterator(begin()); }
  const_reverse_iterator rbegin() const { return const_reverse_iterator(end()); }
  const_reverse_iterator rend() const { return const_reverse_iterator(begin()); }
  const_reverse_iterator crbegin() const { return rbegin(); }
  const_reverse_iterator crend() const { return rend(); }

  // Searches of one leaf: the slot of `key` or -1; the first slot whose key is not less; the first whose key is greater.
  ssize_t SearchLeaf(const FieldId& key, const LeafNode* leaf) const;
  ssize_t LowerBoundInLeaf(const FieldId& key, const LeafNode* leaf) const;
  ssize_t UpperBoundInLeaf(const FieldId& key, const LeafNode* leaf) const;

  // --- Inserting. `value`, `key` and `payload` may lie in this map. ---

  // Looks `key` up for writing and, with `create`, makes a missing entry with a default payload. Marks nothing when the
  // key exists: whoever then changes the payload in place marks `m_leaf`. On an empty map it makes an empty root leaf,
  // whatever `create` says.
  void wFind(wFindRet& ret, const FieldId& key, bool create, PayloadArgument<Payload>* argument = nullptr);
  // An existing key keeps its payload.
  std::pair<iterator, bool> insert(const value_type& value);
  std::pair<iterator, bool> insert(value_type&& value);
  // True when the key was new. With `replace`, the payload of an existing key is assigned.
  bool Insert(const FieldId& key, const Payload& payload, bool replace);
  bool Insert(const FieldId& key, Payload&& payload, bool replace);
  // Marks the leaf of an existing key once and calls `change(payload)`; false when there is no such key. An exception of
  // `change` passes through, and the transaction cannot be committed any more.
  template <class Change>
  bool Edit(const FieldId& key, Change&& change);
  // Fills an empty map with entries in strictly ascending order of keys. Leaves get `fill` (0.5 to 1) of their capacity (one by
  // one, ascending, they stay half full), as do the levels above. Linear; holds a reference and a key a leaf. Throws UsageError
  // if the map is not empty, `fill` out of range, or a key out of order, which is met on the way and poisons the transaction.
  template <class Iterator>
  void BulkLoad(Iterator first, Iterator last, double fill = 1.0);
  // The payload under `key`, made if missing, for changing: the leaf is marked.
  Payload& operator[](const FieldId& key);

  // --- Deleting ---

  // True when the key was there. Deleting the last key leaves an empty root leaf.
  bool Delete(const FieldId& key);
  ssize_t erase(const FieldId& key) { return Delete(key) ? 1 : 0; }
  // Returns the position after the erased entry, or entries.
  iterator erase(const_iterator position);
  iterator erase(const_iterator first, const_iterator last);
  // Hands the whole tree to the store for deletion; the map is then as if newly made.
  void clear();

  // --- The map as a value ---

  // Exchanges contents; marks both maps.
  void swap(TFieldMap& other);
  // Same keys, equal payloads. Payload equality is partial: see the payload types.
  bool operator==(const TFieldMap& other) const;
  ssize_t GetNumNodes() const;
  // Asserts the order, the fill and the bounds of every node. Each level is compared with its own parent only.
  void Validate() const;
  // The tree as text.
  void Write(xostream& os) const;

  void Serialise(Archive& ar) const;
  void Deserialise(InputArchive& ar);
  void VisitObjects(IObjectVisitor& visitor) const;
  void VisitPrefs(IPrefVisitor& visitor) const;
  const ReflectedClass* GetReflectedClass() const { return Traits::GetReflectedMap(); }

  // --- Steps of insertion and deletion ---

  void wFindInNode(wFindRet& ret, void* node, ssize_t height, const FieldId& key, InternalKeyEntry& splitEntry, bool create,
                   PayloadArgument<Payload>* argument = nullptr);
  void wRecursiveFind(wFindRet& ret, InternalNode* node, ssize_t height, const FieldId& key, InternalKeyEntry& splitEntry,
                      bool create, PayloadArgument<Payload>* argument = nullptr);
  // Returns the new right leaf when the leaf was split, else null.
  LeafNode* wFindInLeaf(wFindRet& ret, LeafNode* leaf, const FieldId& key, bool create,
                        PayloadArgument<Payload>* argument = nullptr);
  void InsertIntoInternalNode(InternalNode* node, const InternalKeyEntry& entry, InternalKeyEntry& splitEntry);

  bool RecursiveDelete(ssize_t height, void* thisNode, void* lNode, void* rNode, InternalNode* lAnchor,
                       InternalNode* rAnchor, InternalNode* parent, void*& nextNode, const FieldId& key);
  void MergeLeafRightToLeft(LeafNode* left, LeafNode* right);
  void MergeInternalRightToLeft(InternalNode* left, InternalNode* right, InternalNode* anchor);
  void BalanceLeafRightToLeft(LeafNode* left, LeafNode* right, InternalNode* anchor);
  void BalanceLeafLeftToRight(LeafNode* left, LeafNode* right, InternalNode* anchor);
  void BalanceInternalRightToLeft(InternalNode* left, InternalNode* right, InternalNode* anchor);
  void BalanceInternalLeftToRight(InternalNode* left, InternalNode* right, InternalNode* anchor);
  void ReplaceKeyInAnchor(InternalNode* node, const FieldId& oldKey, const FieldId& newKey);

  ssize_t GetNumNodes(ssize_t height, void* node) const;
  void ValidateNode(ssize_t height, void* node, bool isRoot, const FieldId* k1, const FieldId* k2) const;
  void WriteNode(xostream& os, ssize_t height, void* node) const;

  // How far behind its key a payload lies in a leaf entry, in bytes.
  static constexpr ssize_t GetPayloadOffset() {
    return (sizeof(FieldId) + alignof(Payload) - 1) / alignof(Payload) * alignof(Payload);
  }

  ssize_t m_size = 0;
  cref<LeafNode> m_firstLeaf;
  cref<LeafNode> m_lastLeaf;
  cref<void> m_root;
  ssize_t m_height = -1;

 private:
  static constexpr ssize_t kCapacity = Traits::kCapacity;
  static constexpr ssize_t kHalf = kCapacity / 2;
  static_assert(kCapacity >= 4 && kCapacity % 2 == 0);

  static LeafNode* AsLeafNode(void* node) { return Traits::AsLeafNode(node); }
  static InternalNode* AsInternalNode(void* node) { return Traits::AsInternalNode(node); }
  // The table of nodes at that height.
  static const IPersistable::FnTable* TableAt(ssize_t height) {
    return height < 1 ? IPersistable::Stubs<LeafNode>::GetTable() : IPersistable::Stubs<InternalNode>::GetTable();
  }

  IteratorPolicy FirstPosition() const { return {m_firstLeaf.Get(), 0}; }
  IteratorPolicy EndPosition() const;
  LeafNode* DescendToLeaf(const FieldId& key) const;
  std::pair<iterator, bool> InsertArgument(const FieldId& key, PayloadArgument<Payload>& argument);
  bool InsertArgument(const FieldId& key, PayloadArgument<Payload>& argument, bool replace);
  // A subtree that BulkLoad has finished, and its smallest key.
  struct LoadedNode {
    FieldId firstKey;
    cref<void> node;
  };
  template <class Iterator>
  std::vector<LoadedNode> LoadLeaves(Iterator first, Iterator last, ssize_t perLeaf);
  void FillLastLeaf(std::vector<LoadedNode>& leaves);
  std::vector<LoadedNode> LoadLevel(std::vector<LoadedNode>& children, ssize_t perNode);
  IteratorPolicy BoundPosition(LeafNode* leaf, ssize_t j) const;

  static void AssignPayload(wFindRet& ret, PayloadArgument<Payload>& argument);
  void MakeRootLeaf();
  void GrowRoot(InternalKeyEntry& splitEntry);
  LeafNode* LeafToAppendTo(const FieldId& key) const noexcept;
  void AppendToLeaf(wFindRet& ret, LeafNode* last, const FieldId& key);
  void CountNewEntry(wFindRet& ret);
  static void FillSlot(wFindRet& ret, LeafNode* leaf, ssize_t slot, PendingValue<FieldId>& key);
  static void PlaceNewEntry(LeafNode* leaf, ssize_t slot, PendingValue<FieldId>& key);
  LeafNode* LinkRightLeaf(LeafNode* leaf);
  void SplitLeaf(wFindRet& ret, LeafNode* leaf, LeafNode* right, ssize_t insertPos, PendingValue<FieldId>& key);
  void SplitInternalNode(InternalNode* node, const InternalKeyEntry& entry, ssize_t insertPos,
                         InternalKeyEntry& splitEntry);

  bool DeleteInLeaf(LeafNode* leaf, LeafNode* lLeaf, LeafNode* rLeaf, InternalNode* lAnchor, InternalNode* rAnchor,
                    InternalNode* parent, void*& nextNode, const FieldId& key);
  void RepairLeaf(LeafNode* leaf, LeafNode* lLeaf, LeafNode* rLeaf, InternalNode* lAnchor, InternalNode* rAnchor,
                  InternalNode* parent, void*& nextNode);
  bool DeleteBelow(ssize_t height, InternalNode* iThisNode, InternalNode* ilNode, InternalNode* irNode,
                   InternalNode* lAnchor, InternalNode* rAnchor, InternalNode* parent, void*& nextNode,
                   const FieldId& key);
  void RepairInternalNode(InternalNode* node, InternalNode* lNode, InternalNode* rNode, InternalNode* lAnchor,
                          InternalNode* rAnchor, InternalNode* parent, void*& nextNode);
  void CollapseRoot(InternalNode* root);
  static void LinkNeighbours(LeafNode* left, LeafNode* right);
  static ssize_t AnchorIndex(InternalNode* left, InternalNode* right, InternalNode* anchor, bool checkLeft);
};

}  // namespace vemo
