// Which commits the bytes of commits.log have.
#pragma once

#include <cstdint>
#include <optional>
#include <vector>

#include "engines/lmdb/log_entry.h"

namespace vemo {

// A commit, nothing where it is damaged, and the byte behind it.
struct ScannedCommit {
  std::optional<LoggedCommit> commit;
  std::size_t end = 0;
};

// How far a log is scanned: to the last commit that is sealed, or to the last one that is whole.
enum class ScanUntil { kLastSealed, kLastWhole };

// Where in `log` the first whole entry of the base of `least` begins whose commit is that of `least` or a later one that a log
// can reach from there; nothing where there is none.
std::optional<std::size_t> FindLogEntry(ByteView log, const LogPlace& least, std::uint64_t identity);

// The commits from `next` on, without a gap. `log` begins where the entry of `next` belongs. What is not whole is damaged where
// it is not behind `lastSealed`, or a whole entry stands behind it; else it is the end. Linear in the length of `log` as long as
// nothing is damaged, and never yields more commits than a log has room for behind its base.
std::vector<ScannedCommit> ScanLog(ByteView log, const LogPlace& next, std::uint64_t identity, std::uint64_t lastSealed,
                                   ScanUntil until);

}  // namespace vemo
