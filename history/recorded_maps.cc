#include "history/recorded_maps.h"

#include <algorithm>

#include "history/recorder.h"
#include "history/replay.h"
#include "store/scan.h"
#include "store/statistics.h"

namespace vemo {

namespace {

ssize_t RunsOf(const VectorInsertions& payload) { return payload.m_c.size(); }
ssize_t RunsOf(const VectorTombstones& payload) { return payload.m_tombstones.size(); }
ssize_t RunsOf(const VectorInsertionsAndDeletions& payload) {
  return payload.m_insertions.m_c.size() + payload.m_deletions.size();
}

template <class Map>
RecordedMap Measure(Snapshot& snapshot, const SpaceStatistics& statistics, const char* root) {
  const Map& stored = snapshot.Root<Map>(root);
  const auto measured = std::find_if(statistics.maps.begin(), statistics.maps.end(),
                                     [root](const MapStatistics& map) { return map.root == root; });
  RecordedMap map{root, measured->entries, measured->nodes, measured->height, 0};
  ScanMap(snapshot, stored, FieldId(), [&map](const FieldId&, const auto& payload) {
    map.runs += static_cast<std::uint64_t>(RunsOf(payload));
    return true;
  });
  return map;
}

}  // namespace

std::vector<RecordedMap> MeasureRecordedMaps(Snapshot& snapshot) {
  const SpaceStatistics statistics = CollectStatistics(snapshot);
  return {Measure<FieldIdToVectorInsertionsMap>(snapshot, statistics, kInsertionsRoot),
          Measure<FieldIdToVectorTombstonesMap>(snapshot, statistics, kTombstonesRoot),
          Measure<FieldIdToVectorInsertionsAndDeletionsMap>(snapshot, statistics, kHistoryRoot)};
}

}  // namespace vemo
