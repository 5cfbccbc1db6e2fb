#include "vxOT/TPToQMap.h"

namespace vemo {

void WriteRepeatedChars(xostream& os, char c, std::int32_t count) {
  for (std::int32_t i = 0; i < count; ++i) os << c;
}

}  // namespace vemo
