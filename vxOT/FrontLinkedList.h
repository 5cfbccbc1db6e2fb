// An owning list of records.
//
// Invariants:
//   L1. m_first is the front node, null in an empty list.
//   L2. A node's m_next is the node behind it, null at the back; its m_prev the node before it, null at the
//   front. L3. Every node was allocated with new and belongs to the list. None points to the list object,
//   which may therefore
//       be relocated as raw bytes.
#pragma once

#include <cstddef>
#include <type_traits>
#include <utility>

#include "platform/assertion.h"
#include "platform/types.h"
#include "platform/xostream.h"
#include "vxUtils/Archive.h"
#include "vxUtils/BoundedReader.h"

namespace vemo {

// A list of records T, whose nodes derive from Base. The list frees its nodes (`owns`). Allocation failures
// throw std::bad_alloc; the list is then well-formed. Lists are walked by m_first and m_next.
template <class T, class Base, bool owns>
class FrontLinkedList {
 public:
  static_assert(std::is_same_v<T, Base> && owns, "no other kind of list is in use");

  // A record with its neighbours. Copying a node copies the record: a copy is linked to nothing, and a node
  // that is assigned to stays where it is.
  struct Node : Base {
    Node() = default;
    explicit Node(const Base& record) : Base(record) {}
    Node(const Node& other) : Base(other) {}
    Node& operator=(const Node& other) {
      Base::operator=(other);
      return *this;
    }

    Node* m_prev = nullptr;
    Node* m_next = nullptr;
  };

  FrontLinkedList() noexcept = default;
  FrontLinkedList(const FrontLinkedList& other) : FrontLinkedList() { *this = other; }
  FrontLinkedList(FrontLinkedList&& other) noexcept : m_first(std::exchange(other.m_first, nullptr)) {}

  // A failed allocation leaves the records that were copied so far.
  FrontLinkedList& operator=(const FrontLinkedList& rhs) {
    if (this == &rhs) return *this;
    Clear();
    Node* last = nullptr;
    for (const Node* node = rhs.m_first; node != nullptr; node = node->m_next)
      last = LinkAfter(last, new Node(*node));
    VEMO_ASSERT(*this == rhs);
    return *this;
  }

  // Leaves `other` with what this list held.
  FrontLinkedList& operator=(FrontLinkedList&& other) noexcept {
    swap(other);
    return *this;
  }

  ~FrontLinkedList() { Clear(); }

  // Counts the nodes: linear.
  ssize_t size() const noexcept {
    ssize_t n = 0;
    for (const Node* node = m_first; node != nullptr; node = node->m_next) ++n;
    return n;
  }

  // Frees every node, front to back.
  void Clear() noexcept {
    for (Node* node = m_first; node != nullptr;) delete std::exchange(node, node->m_next);
    m_first = nullptr;
  }

  // Adds a copy of `record`, which may lie in this list, behind `where`, a node of this list, or at the front
  // where that is null. Returns the new node. Constant time; throws std::bad_alloc, which leaves the list as
  // it was.
  Node* InsertAfter(Node* where, const T& record) { return LinkAfter(where, new Node(record)); }

  // Takes `node`, a node of this list, out and frees it. Constant time.
  void Remove(Node* node) noexcept {
    (node->m_prev != nullptr ? node->m_prev->m_next : m_first) = node->m_next;
    if (node->m_next != nullptr) node->m_next->m_prev = node->m_prev;
    delete node;
  }

  // Asks the processor for node `n`, from 0, where there is one. Worth it some time before it is read, once
  // those before it, which are read on the way, are at hand. Inlined always, as whoever calls it must be: GCC
  // leaves out calls of functions that do nothing but prefetch.
  [[gnu::always_inline]] void PrefetchNode(int n) const noexcept {
    const Node* node = m_first;
    for (; node != nullptr && n > 0; --n) node = node->m_next;
    if (node == nullptr) return;
    static_assert(sizeof(Node) <= 65, "first and last byte lie in neighbouring cache lines");
    __builtin_prefetch(node);
    __builtin_prefetch(reinterpret_cast<const std::byte*>(node + 1) - 1);
  }

  void swap(FrontLinkedList& other) noexcept { std::swap(m_first, other.m_first); }

  // The byte form: the number of records, then each.
  void Serialise(Archive& ar) const {
    SerialiseVariableLengthUint(ar, size());
    for (const Node* node = m_first; node != nullptr; node = node->m_next)
      ar << static_cast<const Base&>(*node);
  }

  // A node is linked before its record is read, so that the list owns it whatever happens.
  void Deserialise(InputArchive& ar) {
    Clear();
    ssize_t n = 0;
    DeserialiseVariableLengthUint(ar, n);
    Node* last = nullptr;
    for (ssize_t i = 0; i < n; ++i) {
      last = LinkAfter(last, new Node());
      ar >> static_cast<Base&>(*last);
    }
  }

  // The text form: the records with commas between them, in brackets.
  void Write(xostream& os) const {
    os << '[';
    for (const Node* node = m_first; node != nullptr; node = node->m_next) {
      if (node != m_first) os << ',';
      os << static_cast<const Base&>(*node);
    }
    os << ']';
  }

  // Same length and equal records in the same order, by the records' own equality, which may be partial.
  friend bool operator==(const FrontLinkedList& a, const FrontLinkedList& b) {
    const Node* x = a.m_first;
    const Node* y = b.m_first;
    for (; x != nullptr && y != nullptr; x = x->m_next, y = y->m_next) {
      if (static_cast<const Base&>(*x) != static_cast<const Base&>(*y)) return false;
    }
    return x == y;
  }

  Node* m_first = nullptr;

 private:
  // Links `node`, which is in no list, behind `where`, or at the front where that is null.
  Node* LinkAfter(Node* where, Node* node) noexcept {
    Node*& link = where != nullptr ? where->m_next : m_first;
    node->m_prev = where;
    node->m_next = link;
    if (link != nullptr) link->m_prev = node;
    link = node;
    return node;
  }
};

template <class T, class Base, bool owns>
void Serialise(Archive& ar, const FrontLinkedList<T, Base, owns>& list) {
  list.Serialise(ar);
}

template <class T, class Base, bool owns>
void Deserialise(InputArchive& ar, FrontLinkedList<T, Base, owns>& list) {
  list.Deserialise(ar);
}

// Inlined always, as the functions of the reader are.
template <class T, class Base, bool owns>
[[gnu::always_inline]] inline void CheckForm(BoundedReader& reader, const FrontLinkedList<T, Base, owns>*) {
  const std::uint32_t n = reader.ReadCount(T::kMinBytes);
  for (std::uint32_t i = 0; i < n; ++i) CheckForm(reader, static_cast<const T*>(nullptr));
}

template <class T, class Base, bool owns>
xostream& operator<<(xostream& os, const FrontLinkedList<T, Base, owns>& list) {
  list.Write(os);
  return os;
}

}  // namespace vemo
