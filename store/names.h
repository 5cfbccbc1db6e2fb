// The names of root maps and of meta values.
#pragma once

#include <string>
#include <string_view>

#include "platform/oid.h"

namespace vemo {

// Throw UsageError for a name that users cannot give: it has 1 to 400 bytes, and a root map's does not start with a zero byte.
void CheckRootName(std::string_view name);
void CheckMetaName(std::string_view name);

// Under what a root map without a name stands: no name of a user's.
std::string OwnedRootName(OID oid);
inline bool IsOwnedRootName(std::string_view name) noexcept { return name.starts_with('\0'); }

}  // namespace vemo
