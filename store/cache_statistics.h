// What the objects of a space that are in memory cost and bring.
#pragma once

#include <atomic>
#include <cstdint>

namespace vemo {

// Counts since the space was opened, of all its transactions and snapshots together, and what is in memory now. A reference
// that is bound is followed without the store and counted nowhere.
struct CacheStatistics {
  std::uint64_t hits = 0;         // references that were bound to an object in memory
  std::uint64_t cheapMisses = 0;  // of these, to one that was about to leave memory and now stays
  std::uint64_t loads = 0;        // objects that were read from the engine
  std::uint64_t evictions = 0;    // objects that left memory for the sake of the budget
  std::uint64_t passes = 0;       // over the objects in memory, each of which made many leave
  // Nodes, their payloads, and what is kept about each. Root maps are not counted.
  std::uint64_t residentBytes = 0;
  // Of these, new nodes and changed ones, which stay until the transaction ends. They grow unmeasured until the commit.
  std::uint64_t pinnedBytes = 0;
};

// The same while the views of a space count. Each figure is right by itself, two of them need not be of one instant.
class CacheCounters {
 public:
  using Counter = std::atomic<std::uint64_t>;

  static void Add(Counter& counter, std::uint64_t n) noexcept { counter.fetch_add(n, std::memory_order_relaxed); }
  static void Subtract(Counter& counter, std::uint64_t n) noexcept { counter.fetch_sub(n, std::memory_order_relaxed); }

  CacheStatistics Read() const noexcept {
    const auto value = [](const Counter& counter) { return counter.load(std::memory_order_relaxed); };
    return {value(hits),   value(cheapMisses),   value(loads),      value(evictions),
            value(passes), value(residentBytes), value(pinnedBytes)};
  }

  Counter hits{0}, cheapMisses{0}, loads{0}, evictions{0}, passes{0}, residentBytes{0}, pinnedBytes{0};
};

}  // namespace vemo
