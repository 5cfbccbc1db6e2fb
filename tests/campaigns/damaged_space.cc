#include "tests/campaigns/damaged_space.h"

#include <algorithm>

#include "store/envelope.h"

namespace vemo::campaign {

using namespace test;

namespace {

std::uint64_t Below(std::mt19937_64& random, std::uint64_t limit) {
  return std::uniform_int_distribution<std::uint64_t>(0, limit - 1)(random);
}

void FlipBits(Bytes& bytes, std::uint64_t count, std::mt19937_64& random) {
  for (std::uint64_t i = 0; i < count; ++i) bytes[Below(random, bytes.size())] ^= static_cast<std::uint8_t>(1u << Below(random, 8));
}

void ZeroRun(Bytes& bytes, std::mt19937_64& random) {
  const std::size_t first = Below(random, bytes.size());
  const std::size_t count = 1 + Below(random, std::min<std::size_t>(64, bytes.size() - first));
  std::fill_n(bytes.begin() + static_cast<std::ptrdiff_t>(first), count, std::uint8_t{0});
}

}  // namespace

DamagedSpace::DamagedSpace() {
  CommitFilled<TombstonesMap>(space(), "cleared", kDeepKeys);
  CommitFilled<TombstonesMap>(space(), "deep", kDeepKeys);
  CommitFilled<TombstonesMap>(space(), "replaced", 260);
  CommitFilled<InsertionsMap>(space(), "insertions", 330);
  CommitFilled<HistoriesMap>(space(), "histories", 180);
  CommitFilled<HistoriesMap>(space(), "one leaf", 30);
  OID owned;
  m_site.Reopen();  // so that little of the cleared map is in memory, and the rest is queued
  {
    WriteTransaction transaction(space());
    TombstonesMap fresh;
    Fill(fresh, 1, 140, 3);
    transaction.Root<TombstonesMap>("replaced") = fresh;
    transaction.Root<TombstonesMap>("cleared").clear();
    transaction.Root<InsertionsMap>("empty");
    auto& map = transaction.Own<InsertionsMap>();
    Fill(map, 1, 120);
    owned = map.GetPersistObjState().m_oid;
    for (int i = 0; i < 12; ++i) transaction.SetMeta("meta " + std::to_string(i), std::string(static_cast<std::size_t>(5 * i), 'm'));
    transaction.Commit();
  }
  m_stored = StoredStateOf(engine());
  for (const auto& [oid, record] : m_stored.records) m_ids.push_back(oid);
  Snapshot snapshot(space());
  for (const char* name : {"cleared", "deep", "replaced"}) AddMap<TombstonesMap>(snapshot, name);
  for (const std::string& name : {std::string("insertions"), std::string("empty"), std::string("\0owned/", 7) + std::to_string(owned.m_value)})
    AddMap<InsertionsMap>(snapshot, name);
  for (const char* name : {"histories", "one leaf"}) AddMap<HistoriesMap>(snapshot, name);
}

template <class M>
void DamagedSpace::AddMap(Snapshot& snapshot, const std::string& name) {
  using Inner = typename M::InternalNode;
  const auto& map = snapshot.Root<M>(name);
  Map known;
  known.name = name;
  known.oid = map.GetPersistObjState().m_oid;
  known.objects.insert(known.oid);
  for (const auto& [key, payload] : map) {
    Entry entry;
    entry.number = PayloadNumber<typename M::Payload>::Number(payload);
    const prefbase* reference = &map.m_root;
    for (ssize_t height = map.m_height; height >= 0; --height) {
      entry.way.push_back(reference->m_oid);
      known.objects.insert(reference->m_oid);
      if (height == 0) break;
      const auto& inner = *static_cast<const Inner*>(reference->Get().m_self);
      reference = &inner.ChildReference(inner.FindChildIndexGivenKey(key));
    }
    known.entries.emplace(NumberOf(key), std::move(entry));
  }
  m_maps.push_back(std::move(known));
}

bool DamagedSpace::IsReachable(OID oid) const {
  return std::any_of(m_maps.begin(), m_maps.end(), [oid](const Map& map) { return map.objects.contains(oid); });
}

OID DamagedSpace::DrawRecord(std::mt19937_64& random) const { return m_ids[Below(random, m_ids.size())]; }

Damage DamagedSpace::DrawNamed(std::mt19937_64& random) const {
  const auto table = static_cast<NamedTable>(Below(random, 3));
  const auto& values = table == NamedTable::kInfo ? m_stored.info : table == NamedTable::kRoots ? m_stored.roots : m_stored.meta;
  const auto& [name, value] = *std::next(values.begin(), static_cast<std::ptrdiff_t>(Below(random, values.size())));
  Bytes bytes = value;
  switch (Below(random, 3)) {
    case 0: FlipBits(bytes, 1, random); break;
    case 1: ZeroRun(bytes, random); break;
    default: bytes.resize(Below(random, bytes.size())); break;
  }
  return {"named value \"" + name + "\"", {{OID(), table, name, std::move(bytes)}}};
}

Damage DamagedSpace::Draw(std::mt19937_64& random) const {
  for (;;) {
    const OID oid = DrawRecord(random);
    Bytes bytes = m_stored.records.at(oid);
    Damage damage{"object " + std::to_string(oid.m_value), {}};
    const std::uint64_t kind = Below(random, 100);
    if (kind < 50) {
      FlipBits(bytes, 1, random);
      damage.what += ", a bit";
    } else if (kind < 60) {
      FlipBits(bytes, 2 + Below(random, 30), random);
      damage.what += ", bits";
    } else if (kind < 68) {
      ZeroRun(bytes, random);
      damage.what += ", zeros";
    } else if (kind < 76) {
      bytes.resize(Below(random, bytes.size()));
      damage.what += ", cut to " + std::to_string(bytes.size());
    } else if (kind < 84) {
      const OID other = DrawRecord(random);
      bytes = m_stored.records.at(other);
      damage.what += ", swapped with object " + std::to_string(other.m_value);
      damage.changes.push_back({other, {}, {}, m_stored.records.at(oid)});
    } else if (kind < 92) {
      if (!IsReachable(oid)) continue;  // nobody misses it
      damage.what += ", removed";
      damage.changes.push_back({oid, {}, {}, std::nullopt});
      return damage;
    } else {
      damage = DrawNamed(random);
      const Tampering& change = damage.changes.front();
      const auto& values = change.table == NamedTable::kInfo    ? m_stored.info
                           : change.table == NamedTable::kRoots ? m_stored.roots
                                                                : m_stored.meta;
      if (change.bytes == values.at(change.name)) continue;
      return damage;
    }
    if (bytes == m_stored.records.at(oid)) continue;
    damage.changes.push_back({oid, {}, {}, std::move(bytes)});
    return damage;
  }
}

Damage DamagedSpace::DrawForged(std::mt19937_64& random) const {
  const OID oid = DrawRecord(random);
  Bytes bytes = m_stored.records.at(oid);
  bytes.resize(bytes.size() - 8);
  const std::uint64_t flips = 1 + Below(random, 3);
  const std::size_t head = 10;  // format, class and commit stay
  for (std::uint64_t i = 0; i < flips; ++i) {
    bytes[head + Below(random, bytes.size() - head)] ^= static_cast<std::uint8_t>(1u << Below(random, 8));
  }
  SealRecord(bytes, 0, oid);
  return {"object " + std::to_string(oid.m_value) + ", forged", {{oid, {}, {}, std::move(bytes)}}, true};
}

void DamagedSpace::Apply(const Damage& damage) { Write(damage.changes); }

void DamagedSpace::Repair(const Damage& damage) {
  std::vector<Tampering> changes = damage.changes;
  for (Tampering& change : changes) {
    if (change.name.empty()) {
      change.bytes = m_stored.records.at(change.oid);
    } else {
      const auto& values = change.table == NamedTable::kInfo    ? m_stored.info
                           : change.table == NamedTable::kRoots ? m_stored.roots
                                                                : m_stored.meta;
      change.bytes = values.at(change.name);
    }
  }
  Write(changes);
}

void DamagedSpace::Write(const std::vector<Tampering>& changes) {
  CommitBatch batch;
  for (const Tampering& change : changes) {
    if (!change.name.empty()) {
      batch.namedValues.push_back({change.table, change.name, change.bytes});
    } else if (change.bytes) {
      batch.records.push_back({change.oid, *change.bytes});
    } else {
      batch.removedRecords.push_back(change.oid);
    }
  }
  batch.expectedGeneration = engine().OpenSnapshot()->Generation();
  engine().Commit(batch);
}

}  // namespace vemo::campaign
