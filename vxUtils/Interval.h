// Half-open intervals of positions and ordered lists of them.
#pragma once

#include <cstdint>

#include "platform/assertion.h"
#include "platform/xostream.h"
#include "vxUtils/xvector.h"

namespace vemo {

// The positions p with t1 <= p < t2. An inverted interval is empty as well, and its size is negative.
template <class T>
struct HalfOpenInterval {
  T t1 = 0;
  T t2 = 0;

  bool empty() const noexcept { return t1 >= t2; }
  T size() const noexcept { return t2 - t1; }
  T end() const noexcept { return t2; }

  friend bool operator==(const HalfOpenInterval& a, const HalfOpenInterval& b) noexcept {
    return a.t1 == b.t1 && a.t2 == b.t2;
  }
};

// The text form: [3,7).
template <class T>
xostream& operator<<(xostream& os, const HalfOpenInterval<T>& interval) {
  return os << '[' << static_cast<std::int64_t>(interval.t1) << ',' << static_cast<std::int64_t>(interval.t2)
            << ')';
}

// Asserts that `h` is not empty and that, unless it is the first of a list, a position lies between it and the one before, which
// ends at `endBefore`.
template <class T>
void AssertMayFollow(bool isFirst, T endBefore, const HalfOpenInterval<T>& h) {
  VEMO_ASSERT(!h.empty());
  VEMO_ASSERT_TEXT(isFirst || endBefore < h.t1, "(*this)[n-1].t2 < h.t1");
}

// Intervals in increasing order. What is built by safe_push_back alone holds no empty interval, and between
// neighbours lies at least one position; the operations inherited from the vector do not look after that.
template <class T>
class IntervalList : public xvector<HalfOpenInterval<T>> {
 public:
  // Appends an interval that is not empty and starts behind the last one's end. Touching intervals are the
  // caller's to merge. Amortised constant time; throws std::bad_alloc, which leaves the list as it was.
  void safe_push_back(const HalfOpenInterval<T>& h) {
    const ssize_t n = this->size();
    AssertMayFollow(n == 0, n == 0 ? T() : this->data()[n - 1].t2, h);
    this->push_back(h);
  }

  // The text form: the intervals without separators, in braces.
  void Write(xostream& os) const {
    os << '{';
    for (const HalfOpenInterval<T>& interval : *this) os << interval;
    os << '}';
  }
};

template <class T>
xostream& operator<<(xostream& os, const IntervalList<T>& list) {
  list.Write(os);
  return os;
}

}  // namespace vemo
