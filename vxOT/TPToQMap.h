// Which positions of a vector are tombstones: elements that were deleted and keep their place.
//
// Positions over the whole vector, live elements and tombstones together, are q positions; positions over the
// live elements alone are p positions. Both start at 0. Only tombstones are stored, so a vector has no end
// here: behind the last run everything is live.
#pragma once

#include <cstdint>
#include <type_traits>

#include "platform/assertion.h"
#include "platform/types.h"
#include "platform/xostream.h"
#include "vxUtils/Archive.h"
#include "vxUtils/BoundedReader.h"
#include "vxUtils/Interval.h"

namespace vemo {

// Writes `c` `count` times; a count of 0 or below writes nothing.
void WriteRepeatedChars(xostream& os, char c, std::int32_t count);

// Maps p positions to q positions and back. Invariant: the runs of m_tombstones begin at 0 or later, ascend,
// are not empty and do not touch, so that equal sets of tombstones have equal maps.
//
// Positions and counts are not negative, and sums of them must fit T; the byte form carries the low 32 bits
// of gaps and lengths only. Every operation is linear in the number of runs. Insert and Erasep allocate only
// where a list grows; when that throws std::bad_alloc, the map has not changed.
template <class T>
class TPtoQMap {
 public:
  static_assert(std::is_signed_v<T>);

  using Interval = HalfOpenInterval<T>;

  const Interval* begin() const noexcept { return m_tombstones.begin(); }
  const Interval* end() const noexcept { return m_tombstones.end(); }

  // --- Asking ---

  // The q position of the live element at `p`.
  T GetQ(T p) const;
  // How many live elements lie before `q`: the p position of `q` where that is live.
  T GetP(T q) const { return q - NumTombstonesBefore(q); }
  // Is the element at `q` live?
  bool Exists(T q) const;
  T NumTombstones() const;
  // How many of the positions before `q` are tombstones.
  T NumTombstonesBefore(T q) const;
  // Asserts the invariant.
  void AssertValid() const;

  // --- Changing ---

  // `n` live elements appear at `q`: what was at `q` or behind it moves back by `n`, and a run that `q` lies
  // inside is split around them.
  void Insert(T q, T n);
  // The `n` live elements from live position `p` on become tombstones. `erased`, which must not be
  // m_tombstones, is replaced by the maximal runs of q positions that were live before, in ascending order;
  // when the call throws, it is empty.
  void Erasep(T p, T n, IntervalList<T>& erased);
  // The same for callers who need not know which positions died.
  void Erasep(T p, T n) {
    IntervalList<T> erased;
    Erasep(p, n, erased);
  }

  void swap(TPtoQMap& other) noexcept { m_tombstones.swap(other.m_tombstones); }

  // --- The map as a value ---

  // The byte form: the number of runs, then for each its distance from the end of the run before it (the
  // first: from 0) and its length.
  void Serialise(Archive& ar) const;
  [[gnu::always_inline]] void Deserialise(InputArchive& ar);
  // The text form: a dot for every live position up to the last run and a star for every tombstone, in
  // brackets; then the runs. The runs [1,3) and [5,6) are "[.**..*]{[1,3)[5,6)}".
  void Write(xostream& os) const;

  friend bool operator==(const TPtoQMap& a, const TPtoQMap& b) { return a.m_tombstones == b.m_tombstones; }

  IntervalList<T> m_tombstones;

 private:
  void ReplaceRuns(ssize_t first, ssize_t count, const Interval& merged);
};

typedef TPtoQMap<ssize_t> PtoQMap;
typedef PtoQMap VectorTombstones;

template <class T>
T TPtoQMap<T>::GetQ(T p) const {
  VEMO_ASSERT(0 <= p);
  // q is where the element would lie if no tombstones followed: a run that begins there or before pushes it
  // back.
  T q = p;
  for (const Interval* i = begin(); i != end() && i->t1 <= q; ++i) q += i->size();
  return q;
}

template <class T>
bool TPtoQMap<T>::Exists(T q) const {
  VEMO_ASSERT(0 <= q);
  const Interval* i = begin();
  while (i != end() && i->t2 <= q) ++i;
  return i == end() || q < i->t1;
}

template <class T>
T TPtoQMap<T>::NumTombstones() const {
  T count = 0;
  for (const Interval& i : *this) count += i.size();
  return count;
}

template <class T>
T TPtoQMap<T>::NumTombstonesBefore(T q) const {
  VEMO_ASSERT(0 <= q);
  T count = 0;
  for (const Interval* i = begin(); i != end() && i->t1 < q; ++i) count += (i->t2 < q ? i->t2 : q) - i->t1;
  return count;
}

template <class T>
void TPtoQMap<T>::AssertValid() const {
  for (const Interval* i = begin(); i != end(); ++i) {
    VEMO_ASSERT(!i->empty());
    VEMO_ASSERT(i != begin() || 0 <= i->t1);
    VEMO_ASSERT_TEXT(i == begin() || (i - 1)->t2 < i->t1, "(i-1)->t2 < i->t1");
  }
}

template <class T>
void TPtoQMap<T>::Insert(T q, T n) {
  VEMO_ASSERT(0 <= q);
  VEMO_ASSERT(0 <= n);
  if (n == 0) return;  // a split would leave two runs that touch
  ssize_t k = 0;
  while (k < m_tombstones.size() && m_tombstones[k].t2 <= q) ++k;
  if (k < m_tombstones.size() && m_tombstones[k].t1 < q) {
    m_tombstones.insert(k, Interval{m_tombstones[k].t1, q});
    ++k;
    m_tombstones[k].t1 = q;
  }
  for (; k < m_tombstones.size(); ++k) {
    m_tombstones[k].t1 += n;
    m_tombstones[k].t2 += n;
  }
}

template <class T>
void TPtoQMap<T>::Erasep(T p, T n, IntervalList<T>& erased) {
  VEMO_ASSERT(0 <= p);
  VEMO_ASSERT(0 <= n);
  erased.clear();
  if (n == 0) return;
  const ssize_t numRuns = m_tombstones.size();
  Interval merged{GetQ(p), 0};
  ssize_t first = 0;  // the first run behind the elements that die
  while (first < numRuns && m_tombstones[first].t2 <= merged.t1) ++first;

  // The elements that die lie in the gaps before the runs from `first` to before `last`, and in one gap more.
  ssize_t last = first;
  merged.t2 = merged.t1 + n;
  for (; last < numRuns && m_tombstones[last].t1 < merged.t2; ++last) merged.t2 += m_tombstones[last].size();

  m_tombstones.ReserveMore(1);
  erased.ReserveMore(last - first + 1);
  T q = merged.t1;
  for (ssize_t k = first; k < last; ++k) {
    erased.safe_push_back({q, m_tombstones[k].t1});
    q = m_tombstones[k].t2;
  }
  erased.safe_push_back({q, merged.t2});

  // Everything from the first dead element to the last is one run now, which takes in the runs that it
  // touches.
  if (first > 0 && m_tombstones[first - 1].t2 == merged.t1) merged.t1 = m_tombstones[--first].t1;
  if (last < numRuns && m_tombstones[last].t1 == merged.t2) merged.t2 = m_tombstones[last++].t2;
  ReplaceRuns(first, last - first, merged);
}

// Puts `merged` in the place of `count` runs from `first` on. There is room for one run more.
template <class T>
void TPtoQMap<T>::ReplaceRuns(ssize_t first, ssize_t count, const Interval& merged) {
  if (count == 0) {
    m_tombstones.insert(first, merged);
  } else {
    m_tombstones[first] = merged;
    m_tombstones.erase(first + 1, count - 1);
  }
}

template <class T>
void TPtoQMap<T>::Serialise(Archive& ar) const {
  // Asked for once: for all that the compiler knows, what is written could be the list itself.
  const Interval* const first = begin();
  const Interval* const last = end();
  const auto n = static_cast<std::size_t>(last - first);
  T t = 0;
  if (std::uint8_t* p = ar.BeginWriteIfRoom((1 + 2 * n) * MAX_VARIABLE_LENGTH_UINT_SIZE)) {
    p = SerialiseVariableLengthInteger(p, n);
    for (const Interval* i = first; i != last; ++i) {
      VEMO_ASSERT(t <= i->t1);
      p = SerialiseVariableLengthInteger(p, i->t1 - t);
      p = SerialiseVariableLengthInteger(p, i->size());
      t = i->t2;
    }
    ar.EndWrite(p);
    return;
  }
  SerialiseVariableLengthUint(ar, n);
  for (const Interval* i = first; i != last; ++i) {
    VEMO_ASSERT(t <= i->t1);
    SerialiseVariableLengthUint(ar, i->t1 - t);
    SerialiseVariableLengthUint(ar, i->size());
    t = i->t2;
  }
}

template <class T>
inline void TPtoQMap<T>::Deserialise(InputArchive& ar) {
  ssize_t n = 0;
  const std::uint8_t* p = DeserialiseVariableLengthInteger(ar.ptr(), n);
  VEMO_ASSERT(0 <= n);
  m_tombstones.clear();
  Interval* const runs = m_tombstones.AppendRaw(n);
  T position = 0;
  for (ssize_t i = 0; i < n; ++i) {
    T dt = 0;
    p = DeserialiseVariableLengthInteger(p, dt);
    VEMO_ASSERT(0 <= dt);
    T size = 0;
    p = DeserialiseVariableLengthInteger(p, size);
    VEMO_ASSERT(0 <= size);
    const Interval run{position + dt, position + dt + size};
    AssertMayFollow(i == 0, position, run);
    runs[i] = run;
    position = run.t2;
  }
  ar.SetPtr(p);
}

template <class T>
void TPtoQMap<T>::Write(xostream& os) const {
  os << '[';
  T previousEnd = 0;
  for (const Interval* i = begin(); i != end(); ++i) {
    const T dp = i->t1 - previousEnd;
    VEMO_ASSERT(dp >= 0);
    WriteRepeatedChars(os, '.', static_cast<std::int32_t>(dp));
    WriteRepeatedChars(os, '*', static_cast<std::int32_t>(i->size()));
    previousEnd = i->t2;
  }
  os << ']' << m_tombstones;
}

template <class T>
void Serialise(Archive& ar, const TPtoQMap<T>& map) {
  map.Serialise(ar);
}

template <class T>
[[gnu::always_inline]] inline void Deserialise(InputArchive& ar, TPtoQMap<T>& map) {
  map.Deserialise(ar);
}

template <class T>
void CheckForm(BoundedReader& reader, const TPtoQMap<T>*) {
  std::uint32_t n = reader.ReadCount(2);
  if (n == 0) return;
  reader.ReadUint32();  // the first run may begin at once
  while (true) {
    if (reader.ReadUint32() == 0) reader.Fail("a run of tombstones is empty");
    if (--n == 0) return;
    if (reader.ReadUint32() == 0) reader.Fail("a run of tombstones touches the one before it");
  }
}

template <class T>
xostream& operator<<(xostream& os, const TPtoQMap<T>& map) {
  map.Write(os);
  return os;
}

}  // namespace vemo
