// One commit in commits.log, the file of commits that have not reached data.mdb yet.
//
//   header, 40 bytes, little-endian: the commit (8) | the base: the commit that data.mdb is of (8) | the
//   bytes of the payload (8) |
//       XXH3-64 of the payload (8) | XXH3-64 of the 32 bytes before (8); both are seeded with the identity of
//       the log
//   payload:  how many bytes of changes (variable-length), the changes (change_blob.h), then how many values
//   of the user's table of
//       names, and for each, in the order of names: the bytes of the name, the name, 0 where it is removed,
//       else 1 more than the bytes of the value, the value (all numbers of variable length)
//   zeros up to a multiple of 8 bytes
//
// A log is used again from its start: entries of an older base are left-overs.
#pragma once

#include <cstdint>
#include <optional>
#include <string_view>
#include <vector>

#include "store/engine.h"

namespace vemo {

// Views point into `payload`, or into what it was made from.
struct LoggedCommit {
  struct MetaValue {
    std::string_view name;
    std::optional<ByteView> value;  // nothing: the name is removed
  };

  LoggedCommit() = default;
  LoggedCommit(LoggedCommit&&) = default;
  LoggedCommit& operator=(LoggedCommit&&) = default;
  LoggedCommit(const LoggedCommit&) = delete;
  LoggedCommit& operator=(const LoggedCommit&) = delete;

  Bytes payload;
  ByteView changes;  // empty where no record was changed
  std::uint64_t numRecords = 0;
  std::vector<MetaValue> meta;  // in the order of names, each once
};

// Throws MalformedBytes.
LoggedCommit ParseLoggedCommit(Bytes payload);
Bytes PayloadOf(ByteView changes, const std::vector<LoggedCommit::MetaValue>& meta);

// Where an entry belongs.
struct LogPlace {
  std::uint64_t commit = 0;
  std::uint64_t base = 0;
  friend bool operator==(const LogPlace& a, const LogPlace& b) {
    return a.commit == b.commit && a.base == b.base;
  }
};

struct LogEntry {
  LogPlace place;
  ByteView payload;
  std::size_t bytes = 0;  // from one entry to the next
};

inline constexpr std::size_t kLogBytes = std::size_t{256} << 10;
inline constexpr std::size_t kLogHeaderBytes = 40;
inline constexpr std::size_t kLogAlignment = 8;  // of entries
std::size_t LogEntryBytes(std::size_t payloadBytes) noexcept;

// Whether a log behind that base has room for so many commits: a number that was made up must not be counted up to.
inline bool CanBeInLog(const LogPlace& place) noexcept {
  return place.commit > place.base && place.commit - place.base <= kLogBytes / kLogHeaderBytes;
}

Bytes EncodeLogEntry(const LogPlace& place, ByteView payload, std::uint64_t identity);

// What the header says that `bytes` begin with, or nothing where there is none.
std::optional<LogPlace> PlaceOfLogHeader(ByteView bytes, std::uint64_t identity) noexcept;
// The entry that `bytes` begin with, or nothing where there is no whole one.
std::optional<LogEntry> ReadLogEntry(ByteView bytes, std::uint64_t identity) noexcept;

}  // namespace vemo
