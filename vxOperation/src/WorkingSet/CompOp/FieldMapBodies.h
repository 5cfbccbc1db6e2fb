// All bodies of the generic map, for source files that instantiate it.
#pragma once

#include "vxOperation/src/WorkingSet/CompOp/FieldMapDelete.h"
#include "vxOperation/src/WorkingSet/CompOp/FieldMapFill.h"
#include "vxOperation/src/WorkingSet/CompOp/FieldMapInsert.h"
#include "vxOperation/src/WorkingSet/CompOp/FieldMapRecords.h"
#include "vxOperation/src/WorkingSet/CompOp/FieldMapSearch.h"
#include "vxOperation/src/WorkingSet/CompOp/FieldMapWhole.h"
