// Paths as git prints them.
#pragma once

#include <string>
#include <string_view>

namespace vemo {

// The path of a "diff --git" line, given what follows these words: "a/PATH b/PATH", both sides equal but for
// their first letter, or both between quotation marks with the escapes of C. The path may have any bytes but
// NUL. Throws SourceError where it is something else.
std::string PathOfDiffLine(std::string_view paths);

}  // namespace vemo
