// What can go wrong with the input of a replay.
#pragma once

#include <string>
#include <string_view>

#include "platform/error.h"

namespace vemo {

// `text` on one line: every control character becomes a question mark.
std::string OneLine(std::string_view text);

// A recording or a repository is not there, cannot be read or is not what it should be. The message is one
// line, whatever bytes the names in it have.
class SourceError : public Error {
 public:
  explicit SourceError(std::string_view message) : Error(OneLine(message)) {}
  std::error_code code() const noexcept override { return make_error_code(ErrorCode::kBadInput); }
};

}  // namespace vemo
