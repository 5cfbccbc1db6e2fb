// The three maps and their payloads, without a store: whoever links them supplies the operations of platform/README.md.
#pragma once

#include "vxOperation/src/WorkingSet/CompOp/VectorOT.h"  // IWYU pragma: export
#include "vxUtils/ByteForms.h"                           // IWYU pragma: export
