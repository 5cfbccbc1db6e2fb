#include "engines/lmdb/log_scan.h"

#include <algorithm>
#include <cstring>

#include "platform/error.h"

namespace vemo {

namespace {

std::optional<LoggedCommit> Parse(ByteView payload) {
  try {
    return ParseLoggedCommit(Bytes(payload.begin(), payload.end()));
  } catch (const MalformedBytes&) {
    return std::nullopt;
  }
}

}  // namespace

std::optional<std::size_t> FindLogEntry(ByteView log, const LogPlace& least, std::uint64_t identity) {
  for (std::size_t at = 0; at + kLogHeaderBytes <= log.size(); at += kLogAlignment) {
    std::uint64_t commit;  // what stands first in a header: most of the file is zeros
    std::memcpy(&commit, &log[at], sizeof commit);
    if (commit < least.commit || !CanBeInLog({commit, least.base})) continue;
    const std::optional<LogEntry> entry = ReadLogEntry(log.subspan(at), identity);
    if (entry && entry->place.base == least.base) return at;
  }
  return std::nullopt;
}

std::vector<ScannedCommit> ScanLog(ByteView log, const LogPlace& next, std::uint64_t identity, std::uint64_t lastSealed,
                                   ScanUntil until) {
  std::vector<ScannedCommit> commits;
  std::size_t at = 0;
  LogPlace place = next;
  while (CanBeInLog(place) && (until == ScanUntil::kLastWhole || place.commit <= lastSealed)) {
    const std::optional<LogEntry> entry = ReadLogEntry(log.subspan(at), identity);
    if (entry && entry->place == place) {
      at = std::min(at + entry->bytes, log.size());
      commits.push_back({Parse(entry->payload), at});
      ++place.commit;
      continue;
    }
    // A whole entry further on tells that this one was whole too.
    const std::optional<std::size_t> later = FindLogEntry(log.subspan(at), {place.commit + 1, place.base}, identity);
    const std::uint64_t resumed =
        later ? PlaceOfLogHeader(log.subspan(at + *later), identity)->commit : lastSealed + 1;
    if (resumed <= place.commit) break;
    at = later ? at + *later : log.size();
    for (; place.commit < resumed && CanBeInLog(place); ++place.commit) commits.push_back({std::nullopt, at});
  }
  return commits;
}

}  // namespace vemo
