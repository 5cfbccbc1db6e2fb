// Numbers among a space's meta values.
#pragma once

#include <cstdint>
#include <string>

namespace vemo {

// Reads the decimal number that stands under `name`. Throws UsageError when `text` is none.
std::uint64_t ParseMetaNumber(const std::string& name, const std::string& text);

}  // namespace vemo
