// A space over each engine, which can be closed and opened again, and whose engine can be looked into and
// tampered with.
#pragma once

#include <gtest/gtest.h>

#include <map>
#include <memory>
#include <ostream>
#include <string>
#include <unordered_set>
#include <utility>
#include <vector>

#include "store/map_check.h"
#include "store/snapshot.h"
#include "store/transaction.h"
#include "tests/store/watched_engine.h"
#include "tests/support/keys.h"
#include "tests/support/production_payloads.h"
#include "tests/support/temp_folder.h"
#include "vxUtils/ByteForms.h"

namespace vemo::test {

using InsertionsMap = FieldIdToVectorInsertionsMap;
using TombstonesMap = FieldIdToVectorTombstonesMap;
using HistoriesMap = FieldIdToVectorInsertionsAndDeletionsMap;

// The engine of a space, and with an evicting kind, that no unchanged node stays in memory from one transaction to the next; LMDB also
// writes changes into their records soon.
enum class EngineKind { kMemory, kLmdb, kMemoryEvicting, kLmdbEvicting };
constexpr bool IsLmdb(EngineKind kind) { return kind == EngineKind::kLmdb || kind == EngineKind::kLmdbEvicting; }
constexpr bool Evicts(EngineKind kind) { return kind == EngineKind::kMemoryEvicting || kind == EngineKind::kLmdbEvicting; }
void PrintTo(EngineKind kind, std::ostream* os);

// All that an engine holds.
struct StoredState {
  std::uint64_t generation = 0;
  std::map<OID, Bytes> records;
  std::map<std::string, Bytes> info, roots, meta;
  std::vector<OID> queue;

  friend bool operator==(const StoredState& a, const StoredState& b) {
    return a.generation == b.generation && a.records == b.records && a.info == b.info && a.roots == b.roots &&
           a.meta == b.meta && a.queue == b.queue;
  }
};
void PrintTo(const StoredState& state, std::ostream* os);
StoredState StoredStateOf(Engine& engine);

// A place where a space is. What a memory engine holds outlives the handles that are opened on it here.
class SpaceSite {
 public:
  explicit SpaceSite(EngineKind kind) : m_kind(kind) { Open(); }
  ~SpaceSite() { Close(); }
  SpaceSite(const SpaceSite&) = delete;
  SpaceSite& operator=(const SpaceSite&) = delete;

  CSpace& space() { return *m_space; }
  Engine& engine() { return *m_engine; }
  EngineWatch& watch() { return m_watch; }

  // An evicting kind opens it with a budget of no bytes, unless the options have one.
  void Open(SpaceOptions options = {.create = true});
  void Close();
  void Reopen() {
    Close();
    Open();
  }

  // Writes a record, or without bytes removes it, behind the back of whoever has the space open.
  void Tamper(OID oid, const std::optional<Bytes>& record);
  void TamperNamed(NamedTable table, const std::string& name, const std::optional<Bytes>& value);
  // The number of `className` in the records of the space.
  std::uint32_t ClassNumber(const std::string& className);

 private:
  void CommitBehind(CommitBatch& batch);

  EngineKind m_kind;
  TempFolder m_folder;
  EngineWatch m_watch;
  std::shared_ptr<Engine> m_engine;
  std::unique_ptr<CSpace> m_space;
};

class StoreTest : public testing::TestWithParam<EngineKind> {
 protected:
  StoreTest() : site(GetParam()) {}

  CSpace& space() { return site.space(); }
  EngineWatch& watch() { return site.watch(); }
  StoredState Stored() { return StoredStateOf(site.engine()); }

  // The text of a root map as the newest commit has it.
  template <class Map>
  std::string CommittedText(const std::string& root) {
    Snapshot snapshot(space());
    return ToText(snapshot.Root<Map>(root));
  }

  SpaceSite site;
};

std::string EngineKindName(const testing::TestParamInfo<EngineKind>& info);

#define INSTANTIATE_STORE_TEST(fixture)                                                               \
  INSTANTIATE_TEST_SUITE_P(Engines, fixture,                                                          \
                           testing::Values(EngineKind::kMemory, EngineKind::kLmdb,                    \
                                           EngineKind::kMemoryEvicting, EngineKind::kLmdbEvicting),   \
                           EngineKindName)

template <class Map>
typename Map::Payload PayloadOf(std::uint64_t n) {
  return PayloadNumber<typename Map::Payload>::Make(n);
}

// Inserts the keys first .. last, each with the payload of its number plus `shift`.
template <class Map>
void Fill(Map& map, std::uint64_t first, std::uint64_t last, std::uint64_t shift = 0) {
  for (std::uint64_t n = first; n <= last; ++n) map.Insert(Key(n), PayloadOf<Map>(n + shift), true);
}

// Commits a root map with the keys 1 .. count.
template <class Map>
void CommitFilled(CSpace& space, const std::string& root, std::uint64_t count) {
  WriteTransaction transaction(space);
  Fill(transaction.Root<Map>(root), 1, count);
  transaction.Commit();
}

// Keys and payload numbers, in order.
template <class Map>
std::map<std::uint64_t, std::uint64_t> NumbersOf(const Map& map) {
  std::map<std::uint64_t, std::uint64_t> numbers;
  for (const auto& [key, payload] : map) {
    numbers.emplace(NumberOf(key), PayloadNumber<typename Map::Payload>::Number(payload));
  }
  return numbers;
}

// What is wrong with the tree; empty for a sound one.
template <class Map>
std::string FaultsOf(const Map& map) {
  std::string text;
  for (const MapFinding& finding : MapCheck<Map>(map).Run()) {
    text += finding.where + " (" + std::to_string(finding.oid.m_value) + "): " + finding.fault + "\n";
  }
  return text;
}

// The message of the `E` that `act` throws.
template <class E, class Act>
std::string MessageOf(Act&& act) {
  try {
    act();
  } catch (const E& error) {
    return error.what();
  } catch (const std::exception& other) {
    ADD_FAILURE() << "another exception: " << other.what();
    return {};
  }
  ADD_FAILURE() << "nothing was thrown";
  return {};
}

// The nodes of a tree. Loads all of them.
template <class Map>
std::unordered_set<OID> NodeIds(const Map& map) {
  std::unordered_set<OID> ids;
  MapCheck<Map>(map, {}, [&ids](OID oid, const std::string&) { ids.insert(oid); }).Run();
  return ids;
}

}  // namespace vemo::test
