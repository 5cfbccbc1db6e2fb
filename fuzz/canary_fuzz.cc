// A planted fault. A run that does not find it would find no other one either.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size >= 4 && std::memcmp(data, "vemo", 4) == 0) std::abort();
  return 0;
}
