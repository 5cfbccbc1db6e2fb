// What stands around every stored value.
//
//   record:       format (1 byte) | class number (variable-length) | commit (8 bytes) | body | checksum (8 bytes)
//   named value:  format (1 byte) | value | checksum (8 bytes)
//
// Numbers of fixed width are little-endian. The checksum is XXH3-64 (xxhash.com) of all bytes before it, seeded with the
// object's id, or with the XXH3-64 of the table's number and the name: a value that is read under another id or name fails.
#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

#include "platform/oid.h"
#include "platform/types.h"
#include "store/engine.h"

namespace vemo {

inline constexpr std::uint8_t kEnvelopeFormat = 1;

struct RecordEnvelope {
  std::uint32_t classNumber = 0;
  std::uint64_t commit = 0;  // the commit that wrote the record
  ByteView body;             // into the bytes that were opened
};

// Appends the envelope's head to `out`; the body follows, then SealRecord with the place where the head began.
void BeginRecord(Bytes& out, std::uint32_t classNumber, std::uint64_t commit);
void SealRecord(Bytes& out, std::size_t begin, OID oid);

// Throws MalformedBytes when the bytes are not what was sealed for `oid`.
RecordEnvelope OpenRecord(ByteView bytes, OID oid);

// The commit that wrote a record, read without checking anything; 0 for bytes that are too short.
std::uint64_t CommitOfRecord(ByteView bytes) noexcept;

// The class number in a record's head, read without checking anything; 0 where there is none.
std::uint32_t ClassNumberOfRecord(ByteView bytes) noexcept;

Bytes SealNamed(NamedTable table, std::string_view name, ByteView value);
ByteView OpenNamed(NamedTable table, std::string_view name, ByteView bytes);

}  // namespace vemo
