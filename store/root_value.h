// The stored value of a root: which map stands behind a name.
#pragma once

#include <string>
#include <string_view>

#include "store/engine.h"

namespace vemo {

struct RootValue {
  std::string className;
  OID oid;
};

// Sealed for the table of roots, under that name.
Bytes EncodeRootValue(std::string_view name, const RootValue& value);
// Throws MalformedBytes.
RootValue DecodeRootValue(std::string_view name, ByteView sealed);

}  // namespace vemo
