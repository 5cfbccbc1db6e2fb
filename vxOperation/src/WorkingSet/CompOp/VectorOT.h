// The three maps that record, per field, what concurrent operations inserted into its vector and which of its positions are
// tombstones.
//
// Each NameMap is an ordered map from FieldId to the payload beside it; FieldMap.h documents the operations. The bodies are
// compiled once, in VectorOT.cc.
#pragma once

#include "vxOT/TPToQMap.h"
#include "vxOT/VectorInsertions.h"
#include "vxOT/VectorInsertionsAndDeletions.h"
#include "vxOperation/src/WorkingSet/CompOp/FieldMapFill.h"
#include "vxOperation/src/WorkingSet/CompOp/FieldMapInstance.h"
#include "vxOperation/src/WorkingSet/CompOp/FieldMapRecords.h"

// Visible for the sake of the function tables: see platform/object_store.h.
namespace [[gnu::visibility("default")]] vemo {

// Payloads own their buffers and list nodes, none of which points back at the payload.
template <>
inline constexpr bool kIsRelocatable<VectorInsertions> = true;
template <>
inline constexpr bool kIsRelocatable<VectorTombstones> = true;
template <>
inline constexpr bool kIsRelocatable<VectorInsertionsAndDeletions> = true;

VEMO_FIELD_MAP_INSTANCE(FieldIdToVectorInsertionsMap, VectorInsertions, 100)
VEMO_FIELD_MAP_INSTANCE(FieldIdToVectorTombstonesMap, VectorTombstones, 100)
VEMO_FIELD_MAP_INSTANCE(FieldIdToVectorInsertionsAndDeletionsMap, VectorInsertionsAndDeletions, 100)

extern template class TFieldMap<FieldIdToVectorInsertionsMapTraits>;
extern template class TFieldMapInternalNode<FieldIdToVectorInsertionsMapTraits>;
extern template class TFieldMapLeafNode<FieldIdToVectorInsertionsMapTraits>;
extern template class TFieldMap<FieldIdToVectorTombstonesMapTraits>;
extern template class TFieldMapInternalNode<FieldIdToVectorTombstonesMapTraits>;
extern template class TFieldMapLeafNode<FieldIdToVectorTombstonesMapTraits>;
extern template class TFieldMap<FieldIdToVectorInsertionsAndDeletionsMapTraits>;
extern template class TFieldMapInternalNode<FieldIdToVectorInsertionsAndDeletionsMapTraits>;
extern template class TFieldMapLeafNode<FieldIdToVectorInsertionsAndDeletionsMapTraits>;

}  // namespace vemo
