// What concurrent operations have inserted into a vector.
//
// Byte forms keep the low 32 bits of every number, so that -1 comes back as 4294967295.
#pragma once

#include <cstdint>

#include "platform/types.h"
#include "platform/xostream.h"
#include "vxOT/FrontLinkedList.h"
#include "vxOT/Opid.h"
#include "vxUtils/Archive.h"
#include "vxUtils/BoundedReader.h"

namespace vemo {

// One inserted run of elements.
template <class S, class T, class I>
struct TVectorInsertionInterval {
  static constexpr std::size_t kMinBytes = kMinOpidBytes + 3;

  TOpid<S, T> m_opid;  // the inserting operation
  I m_q = -1;          // where the run lies, tombstones counted
  I m_n = 0;           // how many elements it has
  I m_u = -1;          // a further position of the run

  void Serialise(Archive& ar) const {
    ar << m_opid;
    SerialiseVariableLengthUints(ar, m_q, m_n, m_u);
  }
  void Deserialise(InputArchive& ar) {
    ar >> m_opid;
    DeserialiseVariableLengthUint(ar, m_q);
    DeserialiseVariableLengthUint(ar, m_n);
    DeserialiseVariableLengthUint(ar, m_u);
  }

  // A run is known by its operation and its position; m_n and m_u do not count.
  friend bool operator==(const TVectorInsertionInterval& a, const TVectorInsertionInterval& b) noexcept {
    return a.m_opid == b.m_opid && a.m_q == b.m_q;
  }
};

template <class S, class T, class I>
using TVectorCreateList =
    FrontLinkedList<TVectorInsertionInterval<S, T, I>, TVectorInsertionInterval<S, T, I>, true>;

// The inserted runs of one vector.
template <class S, class T, class I>
class TVectorInsertions {
 public:
  typedef TVectorCreateList<S, T, I> List;

  void Serialise(Archive& ar) const {
    SerialiseVariableLengthUint(ar, m_u2);
    ar << m_c;
  }
  void Deserialise(InputArchive& ar) {
    DeserialiseVariableLengthUint(ar, m_u2);
    ar >> m_c;
  }

  [[gnu::always_inline]] void PrefetchNode(int n) const noexcept { m_c.PrefetchNode(n); }

  // Compares the runs alone.
  friend bool operator==(const TVectorInsertions& a, const TVectorInsertions& b) { return a.m_c == b.m_c; }

  I m_u2 = 0;
  List m_c;
};

typedef TVectorInsertionInterval<Guid, ssize_t, ssize_t> VectorInsertionInterval;
typedef TVectorInsertions<Guid, ssize_t, ssize_t> VectorInsertions;

template <class S, class T, class I>
void Serialise(Archive& ar, const TVectorInsertionInterval<S, T, I>& record) {
  record.Serialise(ar);
}

template <class S, class T, class I>
void Deserialise(InputArchive& ar, TVectorInsertionInterval<S, T, I>& record) {
  record.Deserialise(ar);
}

template <class S, class T, class I>
void CheckForm(BoundedReader& reader, const TVectorInsertionInterval<S, T, I>*) {
  CheckForm(reader, static_cast<const TOpid<S, T>*>(nullptr));
  for (int i = 0; i < 3; ++i) reader.ReadUint32();
}

// The text form: (opid=S...:7 q=3 n=2 u=-1).
template <class S, class T, class I>
xostream& operator<<(xostream& os, const TVectorInsertionInterval<S, T, I>& record) {
  return os << "(opid=" << record.m_opid << " q=" << static_cast<std::int64_t>(record.m_q)
            << " n=" << static_cast<std::int64_t>(record.m_n)
            << " u=" << static_cast<std::int64_t>(record.m_u) << ')';
}

template <class S, class T, class I>
void Serialise(Archive& ar, const TVectorInsertions<S, T, I>& insertions) {
  insertions.Serialise(ar);
}

template <class S, class T, class I>
void Deserialise(InputArchive& ar, TVectorInsertions<S, T, I>& insertions) {
  insertions.Deserialise(ar);
}

template <class S, class T, class I>
void CheckForm(BoundedReader& reader, const TVectorInsertions<S, T, I>*) {
  reader.ReadUint32();
  CheckForm(reader, static_cast<const TVectorCreateList<S, T, I>*>(nullptr));
}

// The text form: insertions(u2=0 c=[...]).
template <class S, class T, class I>
xostream& operator<<(xostream& os, const TVectorInsertions<S, T, I>& insertions) {
  return os << "insertions(u2=" << static_cast<std::int64_t>(insertions.m_u2) << " c=" << insertions.m_c
            << ')';
}

}  // namespace vemo
