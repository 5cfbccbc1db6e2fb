#include "store/raw_record.h"

#define XXH_INLINE_ALL
#include <xxhash.h>

#include <algorithm>
#include <array>
#include <charconv>
#include <limits>
#include <utility>

#include "platform/variable_length.h"

namespace vemo {

namespace {

constexpr std::uint8_t kFormat = 1;
constexpr std::uint32_t kSchema = 1;
constexpr std::uint32_t kMaxLevels = 64;
constexpr std::size_t kChecksumBytes = 8;
constexpr std::size_t kGuidBytes = 16;

constexpr std::array<std::string_view, 3> kFamilyNames{"vemo::FieldIdToVectorInsertionsMap",
                                                       "vemo::FieldIdToVectorTombstonesMap",
                                                       "vemo::FieldIdToVectorInsertionsAndDeletionsMap"};
constexpr std::array<std::string_view, 3> kKindSuffixes{"", "InternalNode", "LeafNode"};

std::uint64_t LittleEndian(const std::uint8_t* p) {
  std::uint64_t value = 0;
  for (int i = 7; i >= 0; --i) value = value << 8 | p[i];
  return value;
}

// Walks bytes that nobody vouches for.
class Cursor {
 public:
  explicit Cursor(ByteView bytes) : m_bytes(bytes) {}

  std::size_t offset() const { return m_offset; }
  std::size_t left() const { return m_bytes.size() - m_offset; }
  ByteView Since(std::size_t start) const { return m_bytes.subspan(start, m_offset - start); }
  ByteView Rest() const { return m_bytes.subspan(m_offset); }
  [[noreturn]] void Fail(const std::string& reason) const { throw RawFault(m_offset, reason); }

  std::uint64_t Number() {
    if (left() == 0) Fail("a number is missing");
    const std::size_t length = VariableLengthBytes(m_bytes[m_offset]);
    if (length > left()) Fail("a number is cut off");
    std::uint64_t value = 0;
    DeserialiseVariableLengthUint64(&m_bytes[m_offset], value);
    // A form of k bytes is the shortest when the value does not fit the 7 (k - 1) bits of the next shorter one.
    if (length > 1 && value >> (7 * (length - 1)) == 0) Fail("a number is longer than it needs to be");
    m_offset += length;
    return value;
  }
  std::uint32_t Number32() {
    const std::size_t start = m_offset;
    const std::uint64_t value = Number();
    if (value > std::numeric_limits<std::uint32_t>::max()) throw RawFault(start, "a number of more than 32 bits");
    return static_cast<std::uint32_t>(value);
  }
  void Skip(std::size_t count) {
    if (count > left()) Fail("the bytes end too early");
    m_offset += count;
  }
  std::uint64_t Fixed64() {
    Skip(8);
    return LittleEndian(&m_bytes[m_offset - 8]);
  }
  OID Id() { return OID(Number()); }
  OID IdOfChild() {
    const OID oid = Id();
    if (oid.IsNull()) Fail("an empty reference to a child");
    return oid;
  }

  FieldId Key() {
    FieldId key;
    key.oid = Id();
    const std::uint32_t steps = Number32();
    if (steps > left()) Fail("a path is longer than the bytes");
    std::vector<Path::Element> path(steps);
    for (Path::Element& step : path) step = Number32();
    key.path = Path(std::span<const Path::Element>(path));
    return key;
  }

 private:
  ByteView m_bytes;
  std::size_t m_offset = 0;
};

void SkipTombstones(Cursor& cursor) {
  const std::uint32_t runs = cursor.Number32();
  for (std::uint32_t i = 0; i < runs; ++i) {
    const std::uint32_t distance = cursor.Number32();
    if (i > 0 && distance == 0) cursor.Fail("two runs of tombstones touch");
    if (cursor.Number32() == 0) cursor.Fail("an empty run of tombstones");
  }
}

// A list of runs: each an operation id and `numbers` numbers.
void SkipRuns(Cursor& cursor, int numbers) {
  const std::uint32_t runs = cursor.Number32();
  for (std::uint32_t i = 0; i < runs; ++i) {
    cursor.Skip(kGuidBytes);
    for (int n = 0; n < 1 + numbers; ++n) cursor.Number32();
  }
}

void SkipPayload(Cursor& cursor, RawFamily family) {
  if (family == RawFamily::kTombstones) return SkipTombstones(cursor);
  cursor.Number32();
  SkipRuns(cursor, 3);
  if (family == RawFamily::kInsertionsAndDeletions) SkipRuns(cursor, 2);
}

std::uint32_t NodeCount(Cursor& cursor, std::uint32_t least) {
  const std::uint32_t count = cursor.Number32();
  if (count < least || count > kRawNodeCapacity) cursor.Fail("a node of " + std::to_string(count) + " entries");
  return count;
}

void ReadMap(Cursor& cursor, RawBody& body) {
  body.entries = cursor.Number32();
  body.firstLeaf = cursor.Id();
  body.lastLeaf = cursor.Id();
  body.root = cursor.Id();
  body.levels = cursor.Number32();
  if (body.levels > kMaxLevels) cursor.Fail("a map of " + std::to_string(body.levels) + " levels");
  const bool isEmpty = body.levels == 0;
  for (const OID oid : {body.firstLeaf, body.lastLeaf, body.root}) {
    if (oid.IsNull() != isEmpty) cursor.Fail("the references of a map do not go with its levels");
  }
  if (isEmpty && body.entries != 0) cursor.Fail("a map with entries and without nodes");
}

void ReadInternalNode(Cursor& cursor, RawBody& body) {
  body.children.push_back(cursor.IdOfChild());
  const std::uint32_t count = NodeCount(cursor, 1);
  for (std::uint32_t i = 0; i < count; ++i) {
    body.keys.push_back(cursor.Key());
    if (i > 0 && !(body.keys[i - 1] < body.keys[i])) cursor.Fail("keys that do not ascend");
    body.children.push_back(cursor.IdOfChild());
  }
}

void ReadLeaf(Cursor& cursor, RawBody& body, RawFamily family) {
  body.previous = cursor.Id();
  body.next = cursor.Id();
  if (body.previous == body.next && !body.next.IsNull()) cursor.Fail("one neighbour on both sides");
  const std::uint32_t count = NodeCount(cursor, 0);
  for (std::uint32_t i = 0; i < count; ++i) {
    RawEntry entry;
    const std::size_t keyAt = cursor.offset();
    entry.key = cursor.Key();
    entry.keyBytes = cursor.Since(keyAt);
    if (i > 0 && !(body.leafEntries.back().key < entry.key)) cursor.Fail("keys that do not ascend");
    const std::size_t payloadAt = cursor.offset();
    SkipPayload(cursor, family);
    entry.payload = cursor.Since(payloadAt);
    body.leafEntries.push_back(std::move(entry));
  }
}

bool HasChecksum(ByteView bytes, std::uint64_t seed) {
  if (bytes.size() <= kChecksumBytes) return false;
  const std::size_t length = bytes.size() - kChecksumBytes;
  return XXH3_64bits_withSeed(bytes.data(), length, seed) == LittleEndian(bytes.data() + length);
}

// What stands between format and checksum.
ByteView Unseal(ByteView bytes, std::uint64_t seed) {
  if (bytes.size() <= kChecksumBytes) throw RawFault(0, "too few bytes for a format and a checksum");
  const ByteView sealed = bytes.first(bytes.size() - kChecksumBytes);
  if (!HasChecksum(bytes, seed)) throw RawFault(sealed.size(), "a checksum that does not match");
  if (sealed[0] != kFormat) throw RawFault(0, "format " + std::to_string(sealed[0]) + " is not known");
  return sealed.subspan(1);
}

RawEnvelope ReadEnvelope(ByteView bytes) {
  Cursor cursor(bytes);
  RawEnvelope envelope;
  envelope.classNumber = cursor.Number32();
  envelope.commit = cursor.Fixed64();
  envelope.body = cursor.Rest();
  envelope.bodyOffset = 1 + cursor.offset();
  return envelope;
}

}  // namespace

std::string RawClassName(const RawClass& rawClass) {
  return std::string(kFamilyNames[static_cast<std::size_t>(rawClass.family)]) +
         std::string(kKindSuffixes[static_cast<std::size_t>(rawClass.kind)]);
}

std::optional<RawClass> FindRawClass(std::string_view name) {
  for (const RawFamily family : {RawFamily::kInsertions, RawFamily::kTombstones, RawFamily::kInsertionsAndDeletions}) {
    for (const RawKind kind : {RawKind::kMap, RawKind::kInternalNode, RawKind::kLeaf}) {
      if (RawClassName({family, kind}) == name) return RawClass{family, kind};
    }
  }
  return std::nullopt;
}

RawEnvelope OpenRawRecord(ByteView bytes, OID oid) { return ReadEnvelope(Unseal(bytes, oid.m_value)); }

RawEnvelope ReadRemainsOfRecord(ByteView bytes) {
  if (bytes.size() <= kChecksumBytes) throw RawFault(0, "too few bytes for a format and a checksum");
  return ReadEnvelope(bytes.first(bytes.size() - kChecksumBytes).subspan(1));
}

bool IsSealedFor(ByteView bytes, OID oid) { return HasChecksum(bytes, oid.m_value); }

std::uint32_t RawClassNumber(ByteView bytes) {
  try {
    Cursor cursor(bytes);
    cursor.Skip(1);
    return cursor.Number32();
  } catch (const RawFault&) {
    return 0;
  }
}

ByteView OpenRawNamed(NamedTable table, std::string_view name, ByteView bytes) {
  return Unseal(bytes, XXH3_64bits_withSeed(name.data(), name.size(), static_cast<std::uint64_t>(table)));
}

RawBody ReadRawBody(ByteView bytes, const RawClass& rawClass) {
  Cursor cursor(bytes);
  RawBody body;
  body.kind = rawClass.kind;
  if (const std::uint32_t schema = cursor.Number32(); schema != kSchema) {
    throw RawFault(0, "schema " + std::to_string(schema) + " is not known");
  }
  switch (rawClass.kind) {
    case RawKind::kMap: ReadMap(cursor, body); break;
    case RawKind::kInternalNode: ReadInternalNode(cursor, body); break;
    case RawKind::kLeaf: ReadLeaf(cursor, body, rawClass.family); break;
  }
  if (cursor.left() != 0) cursor.Fail("bytes behind the end");
  return body;
}

RawRoot ReadRawRoot(ByteView value) {
  Cursor cursor(value);
  RawRoot root;
  root.oid = cursor.Id();
  const ByteView name = cursor.Rest();
  root.className.assign(name.begin(), name.end());
  return root;
}

RawClassTable::RawClassTable(const EngineSnapshot& state) {
  constexpr std::string_view kPrefix = "class/";
  constexpr std::uint32_t kMaxNumber = 1'000'000;
  state.ScanNamed(NamedTable::kInfo, kPrefix, [&](std::string_view name, ByteView bytes) {
    const std::string_view digits = name.substr(kPrefix.size());
    std::uint32_t number = 0;
    const auto parsed = std::from_chars(digits.data(), digits.data() + digits.size(), number);
    try {
      const ByteView value = OpenRawNamed(NamedTable::kInfo, name, bytes);
      if (parsed.ec != std::errc() || parsed.ptr != digits.data() + digits.size() || number == 0 || number > kMaxNumber) {
        throw RawFault(0, "its name ends in no class number");
      }
      m_classes[number] = FindRawClass({reinterpret_cast<const char*>(value.data()), value.size()});
    } catch (const RawFault& fault) {
      m_faults.push_back({std::string(name), fault.what()});
    }
    return true;
  });
}

std::optional<RawClass> RawClassTable::Find(std::uint32_t number) const {
  const auto found = m_classes.find(number);
  return found == m_classes.end() ? std::nullopt : found->second;
}

std::string RootNameText(std::string_view name) {
  if (!name.empty() && name.front() == '\0') return "owned map " + std::string(name.substr(std::min(name.size(), name.find('/') + 1)));
  return "root \"" + std::string(name) + "\"";
}

}  // namespace vemo
