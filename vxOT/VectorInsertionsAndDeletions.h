// What concurrent operations have inserted into a vector and deleted from it.
#pragma once

#include "vxOT/VectorDeletions.h"
#include "vxOT/VectorInsertions.h"

namespace vemo {

// Assignment, byte form and equality take the insertions first, then the deletions. Equality is as partial as
// that of the insertions.
template <class S, class T, class I>
class TVectorInsertionsAndDeletions {
 public:
  void Serialise(Archive& ar) const { ar << m_insertions << m_deletions; }
  void Deserialise(InputArchive& ar) { ar >> m_insertions >> m_deletions; }

  // Node `n` of both lists.
  [[gnu::always_inline]] void PrefetchNode(int n) const noexcept {
    m_insertions.PrefetchNode(n);
    m_deletions.PrefetchNode(n);
  }

  friend bool operator==(const TVectorInsertionsAndDeletions& a, const TVectorInsertionsAndDeletions& b) {
    return a.m_insertions == b.m_insertions && a.m_deletions == b.m_deletions;
  }

  TVectorInsertions<S, T, I> m_insertions;
  TVectorDeletions<S, T, I> m_deletions;
};

typedef TVectorInsertionsAndDeletions<Guid, ssize_t, ssize_t> VectorInsertionsAndDeletions;

template <class S, class T, class I>
void Serialise(Archive& ar, const TVectorInsertionsAndDeletions<S, T, I>& both) {
  both.Serialise(ar);
}

template <class S, class T, class I>
void Deserialise(InputArchive& ar, TVectorInsertionsAndDeletions<S, T, I>& both) {
  both.Deserialise(ar);
}

template <class S, class T, class I>
void CheckForm(BoundedReader& reader, const TVectorInsertionsAndDeletions<S, T, I>*) {
  CheckForm(reader, static_cast<const TVectorInsertions<S, T, I>*>(nullptr));
  CheckForm(reader, static_cast<const TVectorDeletions<S, T, I>*>(nullptr));
}

// The text form: (i=insertions(u2=0 c=[...]) d=[...]).
template <class S, class T, class I>
xostream& operator<<(xostream& os, const TVectorInsertionsAndDeletions<S, T, I>& both) {
  return os << "(i=" << both.m_insertions << " d=" << both.m_deletions << ')';
}

}  // namespace vemo
