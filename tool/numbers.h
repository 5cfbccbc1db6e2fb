// Numbers as people read them.
#pragma once

#include <cstdint>
#include <string>

namespace vemo::tool {

// 1234567 is "1,234,567".
std::string Grouped(std::uint64_t number);

// 1536 is "1.5 KiB".
std::string ByteSize(std::uint64_t bytes);

}  // namespace vemo::tool
