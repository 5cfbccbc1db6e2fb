// Values that the tests of the payloads share.
#pragma once

#include <initializer_list>

#include "vxOT/TPToQMap.h"
#include "vxOT/VectorInsertionsAndDeletions.h"

namespace vemo::test {

inline const Guid kSite{0x01234567u, 0x89AB, 0xCDEF, {0x01, 0x23, 0x45, 0x67, 0x89, 0xAB, 0xCD, 0xEF}};
inline const char* const kSiteText = "01234567-89ab-cdef-0123-456789abcdef";

// The 16 bytes of kSite.
inline const Bytes kSiteBytes = {0x67, 0x45, 0x23, 0x01, 0xAB, 0x89, 0xEF, 0xCD,
                                 0x01, 0x23, 0x45, 0x67, 0x89, 0xAB, 0xCD, 0xEF};

// The bytes of its arguments one after the other.
inline Bytes Joined(std::initializer_list<Bytes> parts) {
  Bytes all;
  for (const Bytes& part : parts) all.insert(all.end(), part.begin(), part.end());
  return all;
}

inline IntervalList<ssize_t> Intervals(std::initializer_list<HalfOpenInterval<ssize_t>> intervals) {
  IntervalList<ssize_t> list;
  for (const auto& interval : intervals) list.push_back(interval);
  return list;
}

inline VectorTombstones Tombstones(std::initializer_list<HalfOpenInterval<ssize_t>> runs) {
  VectorTombstones map;
  map.m_tombstones = Intervals(runs);
  return map;
}

// Appends copies of the records to the list.
template <class List, class Record>
void AppendRecords(List& list, std::initializer_list<Record> records) {
  auto* last = list.m_first;
  while (last != nullptr && last->m_next != nullptr) last = last->m_next;
  for (const Record& record : records) last = list.InsertAfter(last, record);
}

inline VectorInsertions Insertions(ssize_t u2, std::initializer_list<VectorInsertionInterval> records) {
  VectorInsertions insertions;
  insertions.m_u2 = u2;
  AppendRecords(insertions.m_c, records);
  return insertions;
}

inline VectorDeletions Deletions(std::initializer_list<VectorDeletionInterval> records) {
  VectorDeletions deletions;
  AppendRecords(deletions, records);
  return deletions;
}

}  // namespace vemo::test
