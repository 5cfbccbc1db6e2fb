// What can go wrong between a space, its engine and the machine below.
#pragma once

#include <cstdint>
#include <string>

#include "platform/error.h"
#include "platform/oid.h"

namespace vemo {

// The engine or the machine refused. The message says what happened, where, and what to do.
class StoreError : public Error {
 public:
  using Error::Error;
};

// There is no space at the place that the URI names.
class SpaceNotFound : public StoreError {
 public:
  using StoreError::StoreError;
};

// Somebody else holds what was asked for: the writer lock, or the whole space.
class SpaceBusy : public StoreError {
 public:
  using StoreError::StoreError;
};

// The space was written by a newer format, or is not a space of this library at all.
class IncompatibleSpace : public StoreError {
 public:
  using StoreError::StoreError;
};

// Somebody else committed since the generation that a batch was made on. Nothing of the batch was applied.
class StaleGeneration : public StoreError {
 public:
  StaleGeneration(std::uint64_t expected, std::uint64_t found)
      : StoreError("the space is at commit " + std::to_string(found) + ", not at " + std::to_string(expected) +
                   " as this transaction expects: begin it again") {}
};

// A mutation of this transaction was interrupted half-way: it can only be aborted.
class PoisonedTransaction : public StoreError {
 public:
  using StoreError::StoreError;
};

// A stored value is not what was written. The rest of the space stays readable.
class CorruptRecord : public StoreError {
 public:
  CorruptRecord(const std::string& message, OID oid) : StoreError(message), m_oid(oid) {}
  OID oid() const noexcept { return m_oid; }  // null where the value is a named one

 private:
  OID m_oid;
};

// A reference names an object of which the space has no record.
class DanglingReference : public CorruptRecord {
 public:
  using CorruptRecord::CorruptRecord;
};

}  // namespace vemo
