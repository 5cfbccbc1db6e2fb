#include <boost/container/flat_map.hpp>
#include <iterator>

#include "bench/maps/map_workloads.h"
#include "bench/maps/standard_map.h"

namespace vemo::bench {

namespace {

// A sorted vector: what reading costs at the least. Inserting into it moves half of it, so that it is only
// filled as a whole.
template <class Payload>
class FlatMap : public StandardMap<boost::container::flat_map<FieldId, Payload>> {
 public:
  static constexpr bool kGrows = false;

  FlatMap(const std::vector<FieldId>& keys, const PayloadPool<Payload>& payloads)
      : StandardMap<boost::container::flat_map<FieldId, Payload>>(keys, payloads) {
    std::vector<std::pair<FieldId, Payload>> entries;
    entries.reserve(keys.size());
    for (std::size_t i = 0; i < keys.size(); ++i) entries.emplace_back(keys[i], payloads[i]);
    std::sort(entries.begin(), entries.end(), [](const auto& a, const auto& b) { return a.first < b.first; });
    this->m_map.reserve(keys.size());
    // Moved, so that the payloads' buffers lie as they were made, in the order of insertion, as everywhere
    // else.
    this->m_map.insert(boost::container::ordered_unique_range, std::make_move_iterator(entries.begin()),
                       std::make_move_iterator(entries.end()));
  }
};

}  // namespace

void AddFlatMapRows(std::vector<MapRow>& rows) {
  AddAllMapRows<FlatMap>(rows, "boost::flat_map");
}

}  // namespace vemo::bench
