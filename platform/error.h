// The root of vemo's exceptions. Broken invariants are assertions (assertion.h); whatever a user, a file, a disk
// or a network can cause is one of these.
//
// Every exception has an std::error_code that tells what happened, and that code has an std::error_condition that tells what
// to do about it, so that a caller can decide without knowing the classes:
//
//   catch (const vemo::Error& error) { if (error.code() == vemo::Remedy::kRetry) ... }
#pragma once

#include <cstddef>
#include <stdexcept>
#include <string>
#include <system_error>

namespace vemo {

enum class ErrorCode {
  kBadUse = 1,           // UsageError
  kBadInput,             // a recording or a repository that is not what it should be
  kMalformedBytes,       // MalformedBytes
  kStoreFailed,          // the engine or the machine refused
  kSpaceNotFound,
  kSpaceBusy,
  kIncompatibleSpace,
  kStaleGeneration,
  kPoisonedTransaction,
  kCorruptRecord,
  kDanglingReference,
  kSnapshotExpired,
  kUnknownOutcome,
};

// What a caller can do.
enum class Remedy {
  kCorrectTheCall = 1,     // the call or its input is wrong: the same again fails again
  kRetry,                  // somebody else was in the way: the same again may succeed
  kAbandonTransaction,     // abort this transaction; the next may succeed
  kCloseSpace,             // see to the machine or the program, then open the space again
  kRestoreData,            // what was stored is damaged: salvage or restore it
};

const std::error_category& VemoErrorCategory() noexcept;
const std::error_category& VemoRemedyCategory() noexcept;
std::error_code make_error_code(ErrorCode code) noexcept;
std::error_condition make_error_condition(Remedy remedy) noexcept;

class Error : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
  virtual std::error_code code() const noexcept { return make_error_code(ErrorCode::kBadUse); }
};

// Text that does not name what it should (a field, a Guid, a URI), a call in the wrong state, a number out of range.
class UsageError : public Error {
 public:
  using Error::Error;
};

// Bytes that are not the form they should be. `offset()` is the first byte that does not fit.
class MalformedBytes : public Error {
 public:
  MalformedBytes(std::size_t offset, const std::string& reason)
      : Error("malformed bytes at offset " + std::to_string(offset) + ": " + reason), m_offset(offset) {}
  std::size_t offset() const noexcept { return m_offset; }
  std::error_code code() const noexcept override { return make_error_code(ErrorCode::kMalformedBytes); }

 private:
  std::size_t m_offset;
};

}  // namespace vemo

template <>
struct std::is_error_code_enum<vemo::ErrorCode> : std::true_type {};
template <>
struct std::is_error_condition_enum<vemo::Remedy> : std::true_type {};
