#include "store/envelope.h"

#define XXH_INLINE_ALL
#include <xxhash.h>

#include <cstring>

#include "platform/error.h"
#include "platform/variable_length.h"
#include "vxUtils/BoundedReader.h"

namespace vemo {

namespace {

constexpr std::size_t kChecksumBytes = 8;
constexpr std::size_t kCommitBytes = 8;

void AppendUint64(Bytes& out, std::uint64_t value) {
  for (int i = 0; i < 8; ++i) out.push_back(static_cast<std::uint8_t>(value >> (8 * i)));
}

std::uint64_t ReadUint64At(const std::uint8_t* p) {
  std::uint64_t value = 0;
  for (int i = 7; i >= 0; --i) value = value << 8 | p[i];
  return value;
}

std::uint64_t NamedSeed(NamedTable table, std::string_view name) {
  return XXH3_64bits_withSeed(name.data(), name.size(), static_cast<std::uint64_t>(table));
}

// The bytes before the checksum, once format and checksum are right.
ByteView OpenSealed(ByteView bytes, std::uint64_t seed) {
  if (bytes.size() < 1 + kChecksumBytes) throw MalformedBytes(bytes.size(), "too short for an envelope");
  const std::size_t sealed = bytes.size() - kChecksumBytes;
  if (XXH3_64bits_withSeed(bytes.data(), sealed, seed) != ReadUint64At(bytes.data() + sealed)) {
    throw MalformedBytes(sealed, "the checksum does not match");
  }
  if (bytes[0] != kEnvelopeFormat) {
    throw MalformedBytes(0, "format " + std::to_string(bytes[0]) + " is not known to this program, which reads format " +
                                std::to_string(kEnvelopeFormat));
  }
  return bytes.first(sealed);
}

}  // namespace

void BeginRecord(Bytes& out, std::uint32_t classNumber, std::uint64_t commit) {
  out.push_back(kEnvelopeFormat);
  std::uint8_t number[MAX_VARIABLE_LENGTH_UINT_SIZE];
  out.insert(out.end(), number, SerialiseVariableLengthUint32(number, classNumber));
  AppendUint64(out, commit);
}

void SealRecord(Bytes& out, std::size_t begin, OID oid) {
  AppendUint64(out, XXH3_64bits_withSeed(out.data() + begin, out.size() - begin, oid.m_value));
}

RecordEnvelope OpenRecord(ByteView bytes, OID oid) {
  const ByteView sealed = OpenSealed(bytes, oid.m_value);
  BoundedReader reader(sealed.subspan(1));
  RecordEnvelope envelope;
  envelope.classNumber = reader.ReadUint32();
  const std::size_t commitAt = 1 + reader.offset();
  if (sealed.size() < commitAt + kCommitBytes) throw MalformedBytes(commitAt, "too short for an envelope");
  envelope.commit = ReadUint64At(sealed.data() + commitAt);
  envelope.body = sealed.subspan(commitAt + kCommitBytes);
  return envelope;
}

std::uint64_t CommitOfRecord(ByteView bytes) noexcept {
  if (bytes.size() < 2) return 0;
  const std::size_t commitAt = 1 + VariableLengthBytes(bytes[1]);
  return bytes.size() < commitAt + kCommitBytes ? 0 : ReadUint64At(bytes.data() + commitAt);
}

std::uint32_t ClassNumberOfRecord(ByteView bytes) noexcept {
  if (bytes.size() < 2 || bytes.size() < 1 + VariableLengthBytes(bytes[1])) return 0;
  std::uint64_t number = 0;
  DeserialiseVariableLengthUint64(&bytes[1], number);
  return number > UINT32_MAX ? 0 : static_cast<std::uint32_t>(number);
}

Bytes SealNamed(NamedTable table, std::string_view name, ByteView value) {
  Bytes out;
  out.reserve(1 + value.size() + kChecksumBytes);
  out.push_back(kEnvelopeFormat);
  out.insert(out.end(), value.begin(), value.end());
  AppendUint64(out, XXH3_64bits_withSeed(out.data(), out.size(), NamedSeed(table, name)));
  return out;
}

ByteView OpenNamed(NamedTable table, std::string_view name, ByteView bytes) {
  return OpenSealed(bytes, NamedSeed(table, name)).subspan(1);
}

}  // namespace vemo
