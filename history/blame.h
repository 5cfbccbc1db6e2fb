// Who wrote what is live: the operations behind the live elements of a field.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/field_id.h"
#include "store/snapshot.h"
#include "vxOT/Opid.h"

namespace vemo {

// Live elements that lie side by side, tombstones counted, and were inserted by operations of one site with
// ascending numbers: element i by number first.t + i. In the field of a git file they are of one commit
// besides.
struct BlameRun {
  ssize_t p = 0;       // where the run begins among the live elements, from 0
  ssize_t q = 0;       // and among all
  ssize_t n = 0;       // how many elements it has
  Opid first;          // the operation of its first element
  std::string author;  // of the site, as a replay has recorded it; empty where none has
  std::string commit;  // git: in hexadecimal; empty for any other field
};

// The live elements of `field` in order, in runs that are as long as they can be, from the maps and meta
// values that a recorder and a replay leave. A file of a replayed repository that never had a line has no
// runs; any other field that is not recorded is a UsageError, as is a space without the recorder's maps.
// Linear in the number of runs and tombstones of the field, and, for a git file, in the number of commits of
// its authors.
std::vector<BlameRun> BlameField(Snapshot& snapshot, const FieldId& field);

// The field of the file that a replayed repository has at `path`, or had; nothing where there is none. Linear
// in the number of files.
std::optional<FieldId> FindGitField(const Snapshot& snapshot, std::string_view path);

}  // namespace vemo
