// Reading stored bytes without the module: a second reader of the formats of docs/format.md, for checking and for rescuing what
// is left of a damaged space. It shares the form of integers (platform/variable_length.h) and the checksum function with the
// first one, and nothing else, so that a fault of the one is not a fault of the other.
#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <optional>
#include <stdexcept>
#include <string>
#include <string_view>
#include <vector>

#include "platform/field_id.h"
#include "store/engine.h"

namespace vemo {

// The bytes are not of the form that they should be; the message says where and why.
class RawFault : public std::runtime_error {
 public:
  RawFault(std::size_t offset, const std::string& reason)
      : std::runtime_error("at byte " + std::to_string(offset) + ": " + reason) {}
};

// The payloads tell the maps apart.
enum class RawFamily : std::uint8_t { kInsertions, kTombstones, kInsertionsAndDeletions };
enum class RawKind : std::uint8_t { kMap, kInternalNode, kLeaf };

struct RawClass {
  RawFamily family = RawFamily::kInsertions;
  RawKind kind = RawKind::kMap;
  friend bool operator==(const RawClass&, const RawClass&) = default;
};
std::string RawClassName(const RawClass& rawClass);
std::optional<RawClass> FindRawClass(std::string_view name);

inline constexpr std::uint32_t kRawNodeCapacity = 100;

struct RawEnvelope {
  std::uint32_t classNumber = 0;
  std::uint64_t commit = 0;
  ByteView body;
  std::size_t bodyOffset = 0;
};

// An entry of a leaf.
struct RawEntry {
  FieldId key;
  ByteView keyBytes;
  ByteView payload;
};

// What a body says, of whichever kind it is. Views point into the bytes that were read.
struct RawBody {
  RawKind kind = RawKind::kMap;
  // A map:
  std::uint32_t entries = 0;
  OID firstLeaf, lastLeaf, root;
  std::uint32_t levels = 0;  // 0: no nodes; 1: the root is a leaf
  // An internal node has one child more than keys; child i + 1 holds the keys from key i on.
  std::vector<FieldId> keys;
  std::vector<OID> children;
  // A leaf:
  OID previous, next;
  std::vector<RawEntry> leafEntries;
};

// Throws RawFault unless the bytes are what was sealed for `oid`.
RawEnvelope OpenRawRecord(ByteView bytes, OID oid);
// The same of bytes that are damaged: does not look at format and checksum, so what it returns need not be what was written.
RawEnvelope ReadRemainsOfRecord(ByteView bytes);
// Whether the checksum is that of a record of `oid`.
bool IsSealedFor(ByteView bytes, OID oid);
// The class number in the head of a record that may be damaged, read without checking anything; 0 where there is none.
std::uint32_t RawClassNumber(ByteView bytes);
ByteView OpenRawNamed(NamedTable table, std::string_view name, ByteView bytes);

// Throws RawFault unless the body is of that class, from the first byte to the last.
RawBody ReadRawBody(ByteView body, const RawClass& rawClass);

// What a root's value says: the map's id and the name of its class. Throws RawFault.
struct RawRoot {
  OID oid;
  std::string className;
};
RawRoot ReadRawRoot(ByteView value);

// The classes by their numbers in records, as far as the space's table of them can be read.
class RawClassTable {
 public:
  struct Fault {
    std::string name;  // of the named value
    std::string fault;
  };

  // Reads the table; faults are collected.
  explicit RawClassTable(const EngineSnapshot& state);

  // Nothing for a number that the table does not tell, or whose class is not known here.
  std::optional<RawClass> Find(std::uint32_t number) const;
  // From now on, `number` is that class, unless the table told otherwise.
  void Learn(std::uint32_t number, const RawClass& rawClass) { m_classes.emplace(number, rawClass); }
  const std::vector<Fault>& Faults() const noexcept { return m_faults; }
  // Whether a number between others is missing: they are given out in sequence.
  bool HasGaps() const noexcept { return m_classes.empty() || m_classes.rbegin()->first != m_classes.size(); }

 private:
  std::map<std::uint32_t, std::optional<RawClass>> m_classes;
  std::vector<Fault> m_faults;
};

// "root \"t\"" or "owned map 12", for people.
std::string RootNameText(std::string_view name);

}  // namespace vemo
