// The identity of an operation.
#pragma once

#include <cstdint>

#include "platform/guid.h"
#include "platform/types.h"
#include "platform/xostream.h"
#include "vxUtils/Archive.h"
#include "vxUtils/BoundedReader.h"

namespace vemo {

// The site that no operation comes from.
template <class S>
S NullSiteId() noexcept;
template <>
inline Guid NullSiteId<Guid>() noexcept {
  return Guid_NULL;
}

// The site that issued an operation, and the operation's number there.
template <class S, class T>
struct TOpid {
  S s = NullSiteId<S>();
  T t = -1;

  // The byte form keeps the low 32 bits of the number, so that a negative one does not come back as it went.
  void Serialise(Archive& ar) const {
    ar << s;
    SerialiseVariableLengthUint(ar, t);
  }
  void Deserialise(InputArchive& ar) {
    ar >> s;
    DeserialiseVariableLengthUint(ar, t);
  }

  friend bool operator==(const TOpid& a, const TOpid& b) noexcept { return a.s == b.s && a.t == b.t; }
};

typedef TOpid<Guid, ssize_t> Opid;

template <class S, class T>
void Serialise(Archive& ar, const TOpid<S, T>& opid) {
  opid.Serialise(ar);
}

template <class S, class T>
void Deserialise(InputArchive& ar, TOpid<S, T>& opid) {
  opid.Deserialise(ar);
}

template <class S, class T>
void CheckForm(BoundedReader& reader, const TOpid<S, T>*) {
  CheckForm(reader, static_cast<const S*>(nullptr));
  reader.ReadUint32();
}

// The text form: S01234567-89ab-cdef-0123-456789abcdef:7.
template <class S, class T>
xostream& operator<<(xostream& os, const TOpid<S, T>& opid) {
  return os << 'S' << opid.s << ':' << static_cast<std::int64_t>(opid.t);
}

// The fewest bytes of the byte form.
inline constexpr std::size_t kMinOpidBytes = sizeof(Guid) + 1;

}  // namespace vemo
