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

// A reference names an object of which the space has no record.
class DanglingReference : public CorruptRecord {
 public:
  using CorruptRecord::CorruptRecord;
  std::error_code code() const noexcept override { return make_error_code(ErrorCode::kDanglingReference); }
};

}  // namespace vemo
