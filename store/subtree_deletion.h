// Deleting a node of the writer's view with all below it.
#pragma once

#include "store/object_changes.h"

namespace vemo {

// What is in memory is deleted now, since nodes there may be changed or new; what is not is clean, and its id is queued: later
// commits delete it a slice at a time. Throws UsageError when a node was deleted already, and what reading throws.
void DeleteSubTree(View& view, ObjectChanges& changes, ptr<IPersistable> root);

}  // namespace vemo
