#include "vxUtils/FieldForm.h"

#include <algorithm>

namespace vemo {

std::uint64_t FieldForm::Head(const std::uint8_t* steps, std::size_t bytes) noexcept {
  std::uint64_t head = 0;
  for (std::size_t i = 0; i < sizeof(head); ++i) head = head << 8 | (i < bytes ? steps[i] : 0u);
  return head;
}

bool FieldForm::IsBeforeInSteps(const std::uint8_t* a, std::size_t aBytes, const std::uint8_t* b, std::size_t bBytes) noexcept {
  const int order = std::memcmp(a, b, std::min(aBytes, bBytes));
  return order != 0 ? order < 0 : aBytes < bBytes;
}

}  // namespace vemo
