#include "store/residents.h"

#include <utility>

#include "store/class_registry.h"

namespace vemo {

namespace {

// A choice ends this far below the allowance, so that the next one is a tenth of it away.
constexpr std::size_t kGoalTenths = 9;
constexpr std::size_t kCoolingShare = 10;  // one in so many of what stays

// Exchanges the element at `i` for the last one, which is removed.
OID TakeOut(std::vector<OID>& ids, std::size_t i) noexcept {
  const OID taken = std::exchange(ids[i], ids.back());
  ids.pop_back();
  return taken;
}

}  // namespace

Residents::Residents(CacheCounters& counters, std::uint64_t seed)
    : m_counters(counters), m_random(static_cast<std::minstd_rand::result_type>(seed)) {}

Residents::~Residents() {
  for (const auto& [oid, resident] : m_table) Uncount(resident);
}

// The object, and what the table takes for it: an entry with its link on the heap, and a bucket.
std::size_t Residents::Measure(ptr<IPersistable> object) noexcept {
  constexpr std::size_t kEntryBytes = sizeof(Table::value_type) + 3 * sizeof(void*);
  return FindClass(object.Table())->memoryBytes(object.m_self) + kEntryBytes;
}

void Residents::Count(const Resident& resident) noexcept {
  m_bytes += resident.bytes;
  CacheCounters::Add(m_counters.residentBytes, resident.bytes);
  if (!IsPinned(resident.state)) return;
  m_pinnedBytes += resident.bytes;
  CacheCounters::Add(m_counters.pinnedBytes, resident.bytes);
}

void Residents::Uncount(const Resident& resident) noexcept {
  m_bytes -= resident.bytes;
  CacheCounters::Subtract(m_counters.residentBytes, resident.bytes);
  if (!IsPinned(resident.state)) return;
  m_pinnedBytes -= resident.bytes;
  CacheCounters::Subtract(m_counters.pinnedBytes, resident.bytes);
}

ptr<IPersistable> Residents::Find(OID oid) const noexcept {
  const auto found = m_table.find(oid);
  return found == m_table.end() ? ptr<IPersistable>() : found->second.object;
}

ptr<IPersistable> Residents::Use(OID oid) noexcept {
  const auto found = m_table.find(oid);
  if (found == m_table.end()) return {};
  CacheCounters::Add(m_counters.hits, 1);
  if (found->second.state == State::kCooling) {
    found->second.state = State::kClean;
    CacheCounters::Add(m_counters.cheapMisses, 1);
  }
  return found->second.object;
}

void Residents::Add(OID oid, ptr<IPersistable> object, std::uint64_t commit) {
  const Resident resident{object, commit, Measure(object), commit == 0 ? State::kNew : State::kClean};
  m_table.emplace(oid, resident);
  Count(resident);
}

void Residents::MarkedDirty(OID oid) noexcept {
  const auto found = m_table.find(oid);
  if (found == m_table.end() || IsPinned(found->second.state)) return;
  Uncount(found->second);
  found->second.state = State::kDirty;
  Count(found->second);
}

void Residents::Written(OID oid, std::uint64_t commit, std::size_t bytes) noexcept {
  const auto found = m_table.find(oid);
  if (found == m_table.end()) return;
  Uncount(found->second);
  found->second.commit = commit;
  found->second.bytes = bytes;
  found->second.state = State::kClean;
  Count(found->second);
}

void Residents::Remove(OID oid) noexcept {
  const auto found = m_table.find(oid);
  if (found == m_table.end()) return;
  Uncount(found->second);
  m_table.erase(found);
}

Residents::Table Residents::TakeAll() noexcept {
  for (const auto& [oid, resident] : m_table) Uncount(resident);
  return std::exchange(m_table, Table());
}

Residents::Choice Residents::Choose(std::size_t allowance) {
  const std::size_t goal = allowance / 10 * kGoalTenths;
  std::size_t bytes = EvictableBytes();
  Choice choice;
  std::vector<OID> candidates;
  const auto leave = [&](OID oid) {
    choice.leaving.push_back(oid);
    bytes -= m_table.find(oid)->second.bytes;
  };
  for (const auto& [oid, resident] : m_table) {
    if (resident.state == State::kCooling) leave(oid);
    if (resident.state == State::kClean) candidates.push_back(oid);
  }
  while (bytes > goal && !candidates.empty()) {
    const OID oid = TakeOut(candidates, Draw(candidates.size()));
    leave(oid);
    choice.unbound.Insert(oid);
  }
  std::vector<OID> cooling;
  for (std::size_t n = candidates.size() / kCoolingShare; n > 0; --n) {
    cooling.push_back(TakeOut(candidates, Draw(candidates.size())));
    choice.unbound.Insert(cooling.back());
  }
  for (const OID oid : cooling) m_table.find(oid)->second.state = State::kCooling;
  return choice;
}

}  // namespace vemo
