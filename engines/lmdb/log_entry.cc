#include "engines/lmdb/log_entry.h"

#define XXH_INLINE_ALL
#include <xxhash.h>

#include <cstring>
#include <utility>

#include "platform/error.h"
#include "platform/variable_length.h"
#include "vxUtils/BoundedReader.h"

namespace vemo {

namespace {

struct Header {
  std::uint64_t commit;
  std::uint64_t base;
  std::uint64_t payloadBytes;
  std::uint64_t payloadCheck;
  std::uint64_t headerCheck;
};
static_assert(sizeof(Header) == kLogHeaderBytes);

std::uint64_t CheckOf(const Header& header, std::uint64_t identity) noexcept {
  return XXH3_64bits_withSeed(&header, offsetof(Header, headerCheck), identity);
}

std::uint64_t CheckOf(ByteView payload, std::uint64_t identity) noexcept {
  return XXH3_64bits_withSeed(payload.data(), payload.size(), identity);
}

std::optional<Header> HeaderIn(ByteView bytes, std::uint64_t identity) noexcept {
  Header header;
  if (bytes.size() < sizeof header) return std::nullopt;
  std::memcpy(&header, bytes.data(), sizeof header);
  if (header.headerCheck != CheckOf(header, identity)) return std::nullopt;
  return header;
}

void AppendNumber(Bytes& bytes, std::uint64_t number) {
  std::uint8_t form[kMaxVariableLengthUint64Bytes];
  bytes.insert(bytes.end(), form, SerialiseVariableLengthUint64(form, number));
}

ByteView Take(BoundedReader& reader, ByteView bytes, std::uint64_t count) {
  const std::size_t from = reader.offset();
  reader.Skip(count);
  return bytes.subspan(from, count);
}

}  // namespace

Bytes PayloadOf(ByteView changes, const std::vector<LoggedCommit::MetaValue>& meta) {
  Bytes payload;
  AppendNumber(payload, changes.size());
  payload.insert(payload.end(), changes.begin(), changes.end());
  AppendNumber(payload, meta.size());
  for (const LoggedCommit::MetaValue& named : meta) {
    AppendNumber(payload, named.name.size());
    payload.insert(payload.end(), named.name.begin(), named.name.end());
    AppendNumber(payload, named.value ? named.value->size() + 1 : 0);
    if (named.value) payload.insert(payload.end(), named.value->begin(), named.value->end());
  }
  return payload;
}

LoggedCommit ParseLoggedCommit(Bytes payload) {
  LoggedCommit logged;
  logged.payload = std::move(payload);
  const ByteView bytes(logged.payload);
  BoundedReader reader(bytes);
  logged.changes = Take(reader, bytes, reader.ReadUint64());
  constexpr std::size_t kLeastBytesOfMeta = 2;
  for (std::uint32_t left = reader.ReadCount(kLeastBytesOfMeta); left > 0; --left) {
    const ByteView name = Take(reader, bytes, reader.ReadUint64());
    LoggedCommit::MetaValue named{{reinterpret_cast<const char*>(name.data()), name.size()}, std::nullopt};
    if (const std::uint64_t size = reader.ReadUint64(); size > 0) named.value = Take(reader, bytes, size - 1);
    logged.meta.push_back(named);
  }
  reader.ExpectEnd();
  if (!logged.changes.empty()) {
    BoundedReader changes(logged.changes);
    changes.ReadUint64();
    logged.numRecords = changes.ReadUint64();
  }
  return logged;
}

std::size_t LogEntryBytes(std::size_t payloadBytes) noexcept {
  return (kLogHeaderBytes + payloadBytes + kLogAlignment - 1) / kLogAlignment * kLogAlignment;
}

Bytes EncodeLogEntry(const LogPlace& place, ByteView payload, std::uint64_t identity) {
  Header header{place.commit, place.base, payload.size(), CheckOf(payload, identity), 0};
  header.headerCheck = CheckOf(header, identity);
  Bytes entry(LogEntryBytes(payload.size()), 0);
  std::memcpy(entry.data(), &header, sizeof header);
  std::memcpy(entry.data() + sizeof header, payload.data(), payload.size());
  return entry;
}

std::optional<LogPlace> PlaceOfLogHeader(ByteView bytes, std::uint64_t identity) noexcept {
  const std::optional<Header> header = HeaderIn(bytes, identity);
  return header ? std::optional(LogPlace{header->commit, header->base}) : std::nullopt;
}

std::optional<LogEntry> ReadLogEntry(ByteView bytes, std::uint64_t identity) noexcept {
  const std::optional<Header> header = HeaderIn(bytes, identity);
  if (!header || header->payloadBytes > bytes.size() - sizeof(Header)) return std::nullopt;
  const ByteView payload = bytes.subspan(sizeof(Header), header->payloadBytes);
  if (CheckOf(payload, identity) != header->payloadCheck) return std::nullopt;
  return LogEntry{{header->commit, header->base}, payload, LogEntryBytes(payload.size())};
}

}  // namespace vemo
