#include "store/names.h"

#include "store/error.h"

namespace vemo {

namespace {

constexpr std::size_t kMaxNameBytes = 400;

void CheckName(std::string_view what, std::string_view name) {
  if (name.empty() || name.size() > kMaxNameBytes) {
    throw UsageError("the name of a " + std::string(what) + " has 1 to " + std::to_string(kMaxNameBytes) + " bytes, not " +
                     std::to_string(name.size()));
  }
}

}  // namespace

void CheckRootName(std::string_view name) {
  CheckName("root map", name);
  if (IsOwnedRootName(name)) throw UsageError("the name of a root map cannot start with a zero byte");
}

void CheckMetaName(std::string_view name) { CheckName("meta value", name); }

std::string OwnedRootName(OID oid) { return std::string("\0owned/", 7) + std::to_string(oid.m_value); }

}  // namespace vemo
