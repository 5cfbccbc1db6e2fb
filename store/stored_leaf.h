// Leaves that are read without making the node.
#pragma once

#include "platform/error.h"
#include "store/view.h"
#include "vxOperation/src/WorkingSet/CompOp/FieldMapRecords.h"
#include "vxOperation/src/WorkingSet/CompOp/VectorOT.h"

namespace vemo {

// The reference to the leaf in whose range `key` is, of a map that has nodes. Loads the internal nodes on the way.
template <class Traits>
const prefbase& LeafReferenceFor(const TFieldMap<Traits>& map, const FieldId& key) {
  using InternalNode = typename Traits::InternalNode;
  const cref<void>* reference = &map.m_root;
  for (ssize_t height = map.m_height; height > 0; --height) {
    const auto* node = static_cast<const InternalNode*>(reference->GetAs(IPersistable::Stubs<InternalNode>::GetTable()));
    reference = &node->ChildReference(node->FindChildIndexGivenKey(key));
  }
  return *reference;
}

// The entries of a leaf as they are stored, one by one. Throws CorruptRecord for what is not the form of such a leaf, when it gets there.
template <class Traits>
class StoredLeaf {
 public:
  static const IPersistable::FnTable* Table() noexcept {
    return IPersistable::Stubs<typename Traits::LeafNode>::GetTable();
  }

  // `body` is what View::ReadStored has returned for the leaf `oid`, or a copy, and must live as long.
  StoredLeaf(const View& view, OID oid, ByteView body)
      : m_view(view), m_oid(oid), m_entries(Guarded([&] { return LeafFormReader<Traits>(BoundedReader(body)); })) {}

  // As the functions of LeafFormReader.
  bool NextKey() {
    return Guarded([&] { return m_entries.NextKey(); });
  }
  int CompareKeyWith(const FieldId& key) const { return m_entries.CompareKeyWith(key); }
  void SkipPayload() {
    Guarded([&] { m_entries.SkipPayload(); });
  }
  void Read(FieldId& key, typename Traits::Payload& payload) {
    Guarded([&] { m_entries.Read(key, payload); });
  }

 private:
  template <class Step>
  auto Guarded(Step&& step) const {
    try {
      return step();
    } catch (const MalformedBytes& fault) {
      m_view.RefuseForm(m_oid, Table(), fault);
    }
  }

  const View& m_view;
  const OID m_oid;
  LeafFormReader<Traits> m_entries;
};

}  // namespace vemo
