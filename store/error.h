// What can go wrong between a space, its engine and the machine below. Codes and remedies stand in platform/error.h.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <utility>

#include "platform/error.h"
#include "platform/oid.h"

namespace vemo {

// Where something went wrong, as far as it applies.
struct ErrorPlace {
  std::string space;
  std::string root;       // the name of a root map
  OID oid;                // the object, or null
  std::string className;  // of that object
  std::optional<std::size_t> offset;  // the first byte at fault, in the object's record
};

// The engine or the machine refused. The message says what happened, where, and what to do.
class StoreError : public Error {
 public:
  explicit StoreError(const std::string& message) : Error(message) {}
  StoreError(const std::string& message, ErrorPlace place) : Error(message), m_place(std::move(place)) {}
  const ErrorPlace& place() const noexcept { return m_place; }
  std::error_code code() const noexcept override { return make_error_code(ErrorCode::kStoreFailed); }

 private:
  ErrorPlace m_place;
};

// There is no space at the place that the URI names.
class SpaceNotFound : public StoreError {
 public:
  using StoreError::StoreError;
  std::error_code code() const noexcept override { return make_error_code(ErrorCode::kSpaceNotFound); }
};

// Somebody else holds what was asked for: the writer lock, or the whole space.
class SpaceBusy : public StoreError {
 public:
  using StoreError::StoreError;
  std::error_code code() const noexcept override { return make_error_code(ErrorCode::kSpaceBusy); }
};

// The space was written by a newer format, or is not a space of this library at all.
class IncompatibleSpace : public StoreError {
 public:
  using StoreError::StoreError;
  std::error_code code() const noexcept override { return make_error_code(ErrorCode::kIncompatibleSpace); }
};

// Somebody else committed since the generation that a batch was made on. Nothing of the batch was applied.
class StaleGeneration : public StoreError {
 public:
  StaleGeneration(std::uint64_t expected, std::uint64_t found)
      : StoreError("the space is at commit " + std::to_string(found) + ", not at " + std::to_string(expected) +
                   " as this transaction expects: begin it again") {}
  std::error_code code() const noexcept override { return make_error_code(ErrorCode::kStaleGeneration); }
};

// Nobody can say whether a commit was made: the engine's answer was lost, and the space could not be read to find out. End
// the transaction; the next one shows whether the change is there.
class UnknownOutcome : public StoreError {
 public:
  using StoreError::StoreError;
  std::error_code code() const noexcept override { return make_error_code(ErrorCode::kUnknownOutcome); }
};

// A mutation of this transaction was interrupted half-way: it can only be aborted.
class PoisonedTransaction : public StoreError {
 public:
  using StoreError::StoreError;
  std::error_code code() const noexcept override { return make_error_code(ErrorCode::kPoisonedTransaction); }
};

// A snapshot has been open for longer than the space allows.
class SnapshotExpired : public StoreError {
 public:
  using StoreError::StoreError;
  std::error_code code() const noexcept override { return make_error_code(ErrorCode::kSnapshotExpired); }
};

// A stored value is not what was written. The rest of the space stays readable.
class CorruptRecord : public StoreError {
 public:
  using StoreError::StoreError;
  OID oid() const noexcept { return place().oid; }  // null where the value is a named one
  std::error_code code() const noexcept override { return make_error_code(ErrorCode::kCorruptRecord); }
};

// What the engine keeps its values in is damaged: a page, an index, a file. The message names it.
class DamagedStorage : public CorruptRecord {
 public:
  DamagedStorage(const std::string& message, ErrorPlace place) : CorruptRecord(message, std::move(place)) {}
  DamagedStorage(const std::string& message, ErrorPlace place, std::string fault, std::uint64_t page, OID next)
      : CorruptRecord(message, std::move(place)), m_fault(std::move(fault)), m_page(page), m_next(next) {}

  // What is wrong, without the space and the advice; empty where no page is at fault, and then there is no page().
  const std::string& fault() const noexcept { return m_fault; }
  std::optional<std::uint64_t> page() const noexcept { return m_page; }

  // Where records cannot be read for it: ScanRecords can go on at this id, behind the damage. Null where the damage
  // concerns no records, or all that follow. oid() is the first id that cannot be read, or null where that is unknown.
  OID next() const noexcept { return m_next; }

 private:
  std::string m_fault;
  std::optional<std::uint64_t> m_page;
  OID m_next;
};

// A reference names an object of which the space has no record.
class DanglingReference : public CorruptRecord {
 public:
  using CorruptRecord::CorruptRecord;
  std::error_code code() const noexcept override { return make_error_code(ErrorCode::kDanglingReference); }
};

}  // namespace vemo
