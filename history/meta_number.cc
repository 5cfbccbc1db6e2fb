#include "history/meta_number.h"

#include <charconv>

#include "platform/error.h"

namespace vemo {

std::uint64_t ParseMetaNumber(const std::string& name, const std::string& text) {
  std::uint64_t value = 0;
  const auto result = std::from_chars(text.data(), text.data() + text.size(), value);
  if (result.ec != std::errc() || result.ptr != text.data() + text.size()) {
    throw UsageError("meta value \"" + name + "\" should be a number, not \"" + text + "\"");
  }
  return value;
}

}  // namespace vemo
