// Text in code points.
#pragma once

#include <cstddef>
#include <string_view>
#include <vector>

namespace vemo {

// The number of code points of `text`. Throws MalformedBytes where it is not UTF-8: a stray or missing
// continuation byte, an overlong form, a surrogate, or a number past U+10FFFF.
std::size_t CountCodePoints(std::string_view text);

// Replaces `codePoints` by views of the code points of `text`, one each; they live as long as its bytes.
// Throws as CountCodePoints, `codePoints` is then unspecified.
void SplitCodePoints(std::string_view text, std::vector<std::string_view>& codePoints);

}  // namespace vemo
