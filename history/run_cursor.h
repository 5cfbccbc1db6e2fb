// A moving place in a list of runs, so that editing a vector costs the way from the last edit and not the
// whole list.
//
// Inserting n elements moves every run behind them by n. The cursor keeps that shift aside for all runs
// behind itself and pays it out as it passes them (the idea of a gap buffer, applied to positions):
//
//      before()        after()
//         |               |
//   [r0] [r1]  cursor  [r2] [r3] [r4]
//   positions right    positions too small by m_pending
//
// Settle() pays out what is left. The list must not be changed but through its cursor until then; its nodes
// keep their addresses, so the payload that holds the list may be relocated meanwhile.
#pragma once

#include "platform/types.h"

namespace vemo {

template <class List>
class RunCursor {
 public:
  using Node = typename List::Node;

  explicit RunCursor(const List& list) noexcept : m_after(list.m_first) {}

  // The last run that starts before the place sought last, and the first that does not; null where there is
  // none.
  Node* before() const noexcept { return m_before; }
  Node* after() const noexcept { return m_after; }

  // Moves to position `q`. Linear in the number of runs passed.
  void Seek(ssize_t q) noexcept {
    while (m_after != nullptr && m_after->m_q + m_pending < q) {
      m_after->m_q += m_pending;
      m_before = m_after;
      m_after = m_after->m_next;
    }
    while (m_before != nullptr && m_before->m_q >= q) {
      m_before->m_q -= m_pending;
      m_after = m_before;
      m_before = m_before->m_prev;
    }
  }

  // All runs behind the cursor move by `n`.
  void Shift(ssize_t n) noexcept { m_pending += n; }

  // Adds a run on either side of the cursor; its m_q is its position. May throw std::bad_alloc and has then
  // done nothing.
  template <class Run>
  void InsertBefore(List& list, const Run& run) {
    m_before = list.InsertAfter(m_before, run);
  }
  template <class Run>
  void InsertAfter(List& list, Run run) {
    run.m_q -= m_pending;
    m_after = list.InsertAfter(m_before, run);
  }

  void Settle() noexcept {
    if (m_pending != 0) {
      for (Node* node = m_after; node != nullptr; node = node->m_next) node->m_q += m_pending;
    }
    m_pending = 0;
  }

 private:
  Node* m_before = nullptr;
  Node* m_after;
  ssize_t m_pending = 0;
};

}  // namespace vemo
