#include "engines/batch_check.h"

#include <string>

#include "platform/error.h"

namespace vemo {
namespace {

void CheckValueSize(std::size_t bytes, const std::string& owner) {
  if (bytes > kMaxValueBytes) {
    throw UsageError(owner + " has " + std::to_string(bytes) + " bytes; a value of a space has at most " +
                     std::to_string(kMaxValueBytes));
  }
}

}  // namespace

void CheckBatch(const CommitBatch& batch) {
  for (const CommitBatch::Record& record : batch.records) {
    CheckValueSize(record.bytes.size(), "the record of object " + std::to_string(record.oid.m_value));
  }
  for (const CommitBatch::NamedValue& named : batch.namedValues) {
    if (!IsPossibleName(named.name)) {
      throw UsageError("a name has " + std::to_string(named.name.size()) +
                       " bytes; names of a space have 1 to " + std::to_string(kMaxNameBytes));
    }
    if (named.value) CheckValueSize(named.value->size(), "the value named \"" + named.name + "\"");
  }
}

}  // namespace vemo
