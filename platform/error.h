// The root of vemo's exceptions. Broken invariants are assertions (assertion.h); whatever a user, a file, a disk
// or a network can cause is one of these.
#pragma once

#include <cstddef>
#include <stdexcept>
#include <string>

namespace vemo {

class Error : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
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

 private:
  std::size_t m_offset;
};

}  // namespace vemo
