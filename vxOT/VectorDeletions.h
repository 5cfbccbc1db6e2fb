// What concurrent operations have deleted from a vector.
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

// One deleted run of elements.
template <class S, class T, class I>
struct TVectorDeletionInterval {
  static constexpr std::size_t kMinBytes = kMinOpidBytes + 2;

  TOpid<S, T> m_opid;  // the deleting operation
  I m_q = -1;          // where the run lies, tombstones counted
  I m_n = -1;  // how many elements it has; unlike an insertion, a deletion of none is never the default

  void Serialise(Archive& ar) const {
    ar << m_opid;
    SerialiseVariableLengthUints(ar, m_q, m_n);
  }
  void Deserialise(InputArchive& ar) {
    ar >> m_opid;
    DeserialiseVariableLengthUint(ar, m_q);
    DeserialiseVariableLengthUint(ar, m_n);
  }

  friend bool operator==(const TVectorDeletionInterval& a, const TVectorDeletionInterval& b) noexcept {
    return a.m_opid == b.m_opid && a.m_q == b.m_q && a.m_n == b.m_n;
  }
};

// The deleted runs of one vector; byte form, text form and equality are those of the list.
template <class S, class T, class I>
class TVectorDeletions
    : public FrontLinkedList<TVectorDeletionInterval<S, T, I>, TVectorDeletionInterval<S, T, I>, true> {};

typedef TVectorDeletionInterval<Guid, ssize_t, ssize_t> VectorDeletionInterval;
typedef TVectorDeletions<Guid, ssize_t, ssize_t> VectorDeletions;

template <class S, class T, class I>
void Serialise(Archive& ar, const TVectorDeletionInterval<S, T, I>& record) {
  record.Serialise(ar);
}

template <class S, class T, class I>
void Deserialise(InputArchive& ar, TVectorDeletionInterval<S, T, I>& record) {
  record.Deserialise(ar);
}

template <class S, class T, class I>
void CheckForm(BoundedReader& reader, const TVectorDeletionInterval<S, T, I>*) {
  CheckForm(reader, static_cast<const TOpid<S, T>*>(nullptr));
  for (int i = 0; i < 2; ++i) reader.ReadUint32();
}

// The text form: (opid=S...:7 q=3 n=2).
template <class S, class T, class I>
xostream& operator<<(xostream& os, const TVectorDeletionInterval<S, T, I>& record) {
  return os << "(opid=" << record.m_opid << " q=" << static_cast<std::int64_t>(record.m_q)
            << " n=" << static_cast<std::int64_t>(record.m_n) << ')';
}

}  // namespace vemo
