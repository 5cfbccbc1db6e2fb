// The limits of a batch that every engine keeps in the same way.
#pragma once

#include <cstddef>
#include <string_view>

#include "store/engine.h"

namespace vemo {

inline constexpr std::size_t kMaxNameBytes = 400;
inline constexpr std::size_t kMaxValueBytes = std::size_t{1} << 30;

// Whether a named value can be stored under `name`. Asking for any other name is no error: there is nothing
// under it.
inline bool IsPossibleName(std::string_view name) noexcept {
  return !name.empty() && name.size() <= kMaxNameBytes;
}

// Throws UsageError when a name or a value of `batch` is outside the limits of store/engine.h, or when it puts or removes the
// record of one object more than once. Costs sorting the ids.
void CheckBatch(const CommitBatch& batch);

}  // namespace vemo
