// Transactions and snapshots as the scope of a function.
#pragma once

#include <type_traits>
#include <utility>

#include "store/snapshot.h"
#include "store/transaction.h"

namespace vemo {

// Opens a transaction, calls `change(transaction)`, commits, and returns what the call returned. An exception of the call or
// of the commit aborts and passes through.
template <class Change>
auto InTransaction(CSpace& space, Change&& change) {
  WriteTransaction transaction(space);
  if constexpr (std::is_void_v<std::invoke_result_t<Change, WriteTransaction&>>) {
    std::forward<Change>(change)(transaction);
    transaction.Commit();
  } else {
    auto result = std::forward<Change>(change)(transaction);
    transaction.Commit();
    return result;
  }
}

// Opens a snapshot and calls `read(snapshot)`. What the call returns must not point into the snapshot, which ends.
template <class Read>
auto InSnapshot(CSpace& space, Read&& read) {
  Snapshot snapshot(space);
  return std::forward<Read>(read)(snapshot);
}

}  // namespace vemo
