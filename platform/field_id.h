// The key of the maps: a field of a persistent object.
#pragma once

#include <string>
#include <string_view>

#include "platform/oid.h"
#include "platform/path.h"
#include "platform/xostream.h"

namespace vemo {

struct FieldId {
  OID oid;    // the object
  Path path;  // the field inside it

  // -1, 0 or 1 as `a` is before, equal to or behind `b`: by object, then by path.
  static int Compare(const FieldId& a, const FieldId& b) noexcept {
    if (a.oid.m_value != b.oid.m_value) return a.oid.m_value < b.oid.m_value ? -1 : 1;
    return Path::Compare(a.path, b.path);
  }
  friend bool operator==(const FieldId& a, const FieldId& b) noexcept { return Compare(a, b) == 0; }
  friend bool operator<(const FieldId& a, const FieldId& b) noexcept { return Compare(a, b) < 0; }
};

// The text form: the object id in decimal, a colon, the steps of the path with dots between them. Path {0, 3} of object
// 1 is "1:0.3"; an empty path leaves nothing after the colon.
std::string FieldIdText(const FieldId& field);
xostream& operator<<(xostream& os, const FieldId& field);

// Reads the text form; leading zeros, signs and blanks are refused, as is object 0. Throws UsageError.
FieldId ParseFieldId(std::string_view text);

}  // namespace vemo
