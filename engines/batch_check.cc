#include "engines/batch_check.h"

#include <algorithm>
#include <array>
#include <span>
#include <string>
#include <vector>

#include "platform/error.h"

namespace vemo {
namespace {

// `owner` tells what the value is of, and is asked for a message alone.
template <class Owner>
void CheckValueSize(std::size_t bytes, const Owner& owner) {
  if (bytes <= kMaxValueBytes) return;
  throw UsageError(owner() + " has " + std::to_string(bytes) + " bytes; a value of a space has at most " +
                   std::to_string(kMaxValueBytes));
}

// Which of two bytes an engine keeps for one object would hang on the order in which it writes them.
void CheckEachObjectOnce(const CommitBatch& batch) {
  std::array<OID, 128> few;  // most commits touch no more, and need nothing from the heap
  std::vector<OID> many;
  std::span<OID> touched(few);
  const std::size_t count = batch.records.size() + batch.removedRecords.size();
  if (count > few.size()) {
    many.resize(count);
    touched = many;
  }
  touched = touched.first(count);
  auto next = std::copy(batch.removedRecords.begin(), batch.removedRecords.end(), touched.begin());
  for (const CommitBatch::Record& record : batch.records) *next++ = record.oid;
  std::sort(touched.begin(), touched.end());
  const auto twice = std::adjacent_find(touched.begin(), touched.end());
  if (twice == touched.end()) return;
  throw UsageError("a commit names object " + std::to_string(twice->m_value) +
                   " twice; it puts the record of an object or removes it, once");
}

}  // namespace

void CheckBatch(const CommitBatch& batch) {
  for (const CommitBatch::Record& record : batch.records) {
    CheckValueSize(record.bytes.size(), [&] { return "the record of object " + std::to_string(record.oid.m_value); });
  }
  for (const CommitBatch::NamedValue& named : batch.namedValues) {
    if (!IsPossibleName(named.name)) {
      throw UsageError("a name has " + std::to_string(named.name.size()) +
                       " bytes; names of a space have 1 to " + std::to_string(kMaxNameBytes));
    }
    if (named.value) CheckValueSize(named.value->size(), [&] { return "the value named \"" + named.name + "\""; });
  }
  CheckEachObjectOnce(batch);
}

}  // namespace vemo
