#include "vxUtils/BoundedReader.h"

#include <string>

namespace vemo {

BoundedReader::Number BoundedReader::ReadLong(const std::uint8_t* begin, const std::uint8_t* at, const std::uint8_t* end,
                                              std::uint64_t greatest) {
  if (static_cast<std::size_t>(end - at) >= kMaxVariableLengthUint64Bytes) [[likely]] {
    const std::size_t bytes = VariableLengthBytes(*at);
    const std::uint64_t value = DeserialiseVariableLengthUint64FromNine(at, bytes);
    if (IsShortest(value, bytes) && value <= greatest) [[likely]] return {value, bytes};
  }
  return ReadNearEnd(begin, at, end, greatest);
}

// Never inlined: ReadLong needs no frame then.
[[gnu::noinline]] BoundedReader::Number BoundedReader::ReadNearEnd(const std::uint8_t* begin, const std::uint8_t* at,
                                                                   const std::uint8_t* end, std::uint64_t greatest) {
  const auto offset = static_cast<std::size_t>(at - begin);
  const auto remaining = static_cast<std::size_t>(end - at);
  if (remaining == 0) FailAt(offset, "the bytes end where a number should begin");
  const std::size_t bytes = VariableLengthBytes(*at);
  if (bytes > remaining) FailAt(offset, "the bytes end inside a number");
  std::uint64_t value = 0;
  DeserialiseVariableLengthUint64(at, value);
  if (bytes > 1 && !IsShortest(value, bytes)) FailAt(offset, "a number is not in its shortest form");
  if (value > greatest) FailAt(offset, "a number has more than 32 bits");
  return {value, bytes};
}

void BoundedReader::FailAt(std::size_t offset, std::string_view reason) { throw MalformedBytes(offset, std::string(reason)); }

void BoundedReader::FailCount(std::size_t offset, std::uint32_t count) {
  FailAt(offset, "the count " + std::to_string(count) + " is more than the bytes can hold");
}

void BoundedReader::FailSchema(std::size_t offset, std::uint32_t schema, std::uint32_t currentSchema) {
  FailAt(offset, "schema " + std::to_string(schema) + " is not one of 1 to " + std::to_string(currentSchema));
}

}  // namespace vemo
