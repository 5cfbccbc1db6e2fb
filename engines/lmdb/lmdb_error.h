// LMDB's return codes as exceptions.
#pragma once

#include <string>

#include "store/error.h"

namespace vemo {

// "cannot OPERATION SPACE: REASON", with advice where the user can help.
class LmdbError : public StoreError {
 public:
  LmdbError(const std::string& operation, const std::string& space, int code);
  int lmdbCode() const noexcept { return m_code; }  // of LMDB where negative, otherwise an errno

 private:
  int m_code;
};

// Throws LmdbError unless `code` is success. `operation` reads like "commit to".
void CheckLmdb(int code, const char* operation, const std::string& space);

}  // namespace vemo
