// The log of commits: any bytes behind right checksums, and any among them, yield no more commits than a log has room for;
// payloads are read within their bounds, and deltas are applied to records or refused.
#include <algorithm>
#include <cstdlib>
#include <cstring>

#include "engines/lmdb/log_scan.h"
#include "engines/record_delta.h"
#include "platform/error.h"

namespace {

using namespace vemo;

constexpr std::uint64_t kIdentity = 7;
constexpr std::uint64_t kBase = 100;

void Require(bool holds) {
  if (!holds) std::abort();
}

// Reads all that views of `commit` lead to, so that one out of bounds is found.
void Touch(const LoggedCommit& commit) {
  volatile std::uint8_t sum = 0;
  for (const std::uint8_t byte : commit.changes) sum = sum + byte;
  for (const LoggedCommit::MetaValue& named : commit.meta) {
    for (const char c : named.name) sum = sum + static_cast<std::uint8_t>(c);
    for (const std::uint8_t byte : named.value.value_or(ByteView())) sum = sum + byte;
  }
}

// Entries and garbage as `input` says: a byte for the kind, one for the length, eight for the number of an entry, and the bytes.
Bytes LogFrom(ByteView input) {
  Bytes log;
  while (input.size() >= 10 && log.size() < kLogBytes) {
    std::uint64_t number;
    std::memcpy(&number, &input[2], sizeof number);
    const bool isGarbage = input[0] % 4 == 0;
    const std::uint64_t commit = input[0] % 4 == 1 ? number : kBase + 1 + number % 16;
    const ByteView bytes = input.subspan(10, std::min<std::size_t>(input[1], input.size() - 10));
    const Bytes entry = isGarbage ? Bytes(bytes.begin(), bytes.end())
                                  : EncodeLogEntry({commit, input[0] % 8 == 7 ? number : kBase}, bytes, kIdentity);
    log.insert(log.end(), entry.begin(), entry.end());
    log.resize((log.size() + kLogAlignment - 1) / kLogAlignment * kLogAlignment, 0);
    input = input.subspan(10 + bytes.size());
  }
  return log;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const ByteView input(data, size);
  std::uint64_t number = 0;
  std::memcpy(&number, data, std::min(size, sizeof number));
  // Mostly a near one: what has been made up takes long to refuse, and there is little to find behind it.
  const std::uint64_t lastSealed = number % 64 == 0 ? number : kBase + number % 32;
  const Bytes log = LogFrom(input.subspan(std::min(size, sizeof number)));
  for (const ScanUntil until : {ScanUntil::kLastSealed, ScanUntil::kLastWhole}) {
    std::size_t end = 0;
    const auto commits = ScanLog(log, {kBase + 1, kBase}, kIdentity, lastSealed, until);
    Require(commits.size() <= kLogBytes / kLogHeaderBytes);
    for (const ScannedCommit& scanned : commits) {
      Require(scanned.end >= end && scanned.end <= log.size());
      end = scanned.end;
      if (scanned.commit) Touch(*scanned.commit);
    }
  }
  const ByteView record = input.first(size / 2);
  const ByteView rest = input.subspan(size / 2);
  Bytes applied;
  try {
    ApplyRecordDelta(record, rest, applied);
  } catch (const MalformedBytes&) {
  }
  if (const auto delta = RecordDelta(record, rest, size + 64)) {
    ApplyRecordDelta(record, *delta, applied);
    Require(applied == Bytes(rest.begin(), rest.end()));
  }
  return 0;
}
