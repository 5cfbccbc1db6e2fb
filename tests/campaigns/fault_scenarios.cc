#include "tests/campaigns/fault_scenarios.h"

#include <utility>

#include "store/collect.h"
#include "store/statistics.h"
#include "store/verify.h"
#include "tests/support/keys.h"
#include "tests/support/production_payloads.h"

namespace vemo::campaign {

namespace {

using test::Key;
using InsertionsMap = FieldIdToVectorInsertionsMap;
using TombstonesMap = FieldIdToVectorTombstonesMap;
using HistoriesMap = FieldIdToVectorInsertionsAndDeletionsMap;

template <class Map>
void Fill(Stage& stage, WriteTransaction& transaction, Map& map, std::uint64_t first, std::uint64_t last) {
  for (std::uint64_t n = first; n <= last; ++n) {
    const auto payload = test::PayloadNumber<typename Map::Payload>::Make(n + last);
    stage.Mutate(transaction, [&] { map.Insert(Key(n), payload, true); });
  }
}

void Commit(Stage& stage, WriteTransaction& transaction) {
  transaction.Commit();
  stage.Acknowledge();
}

void CommitTick(Stage& stage, const std::string& value) {
  WriteTransaction transaction(stage.space());
  transaction.SetMeta("tick", value);
  Commit(stage, transaction);
}

std::uint64_t ReadAll(Snapshot& snapshot) {
  std::uint64_t entries = 0;
  for (const auto& [key, payload] : snapshot.Root<TombstonesMap>("t")) entries += payload.m_tombstones.empty() ? 0 : 1;
  for (const auto& entry : snapshot.Root<InsertionsMap>("i")) entries += entry.first.oid.IsNull() ? 0 : 1;
  snapshot.ScanMeta("", [&](std::string_view, std::string_view) { return ++entries > 0; });
  return entries + snapshot.RootNames().size();
}

void CreateAndFill(Stage& stage) {
  stage.Open();
  stage.Acknowledge();
  WriteTransaction transaction(stage.space());
  Fill(stage, transaction, transaction.Root<TombstonesMap>("t"), 1, 130);
  Commit(stage, transaction);
}

void Split(Stage& stage) {
  for (const std::uint64_t first : {901, 1'100}) {
    WriteTransaction transaction(stage.space());
    Fill(stage, transaction, transaction.Root<TombstonesMap>("t"), first, first + 120);
    Fill(stage, transaction, transaction.Root<HistoriesMap>("h"), 40, 110);
    Commit(stage, transaction);
  }
}

void Delete(Stage& stage) {
  WriteTransaction transaction(stage.space());
  auto& map = transaction.Root<TombstonesMap>("t");
  for (std::uint64_t n = 300; n < 620; ++n) stage.Mutate(transaction, [&] { map.Delete(Key(n)); });
  Commit(stage, transaction);
}

void ClearAndSweep(Stage& stage) {
  {
    WriteTransaction transaction(stage.space());
    auto& map = transaction.Root<TombstonesMap>("t");
    stage.Mutate(transaction, [&] { map.Insert(Key(500), {}, true); });
    stage.Mutate(transaction, [&] { map.clear(); });
    Fill(stage, transaction, map, 1, 10);
    Commit(stage, transaction);
  }
  for (const char* value : {"1", "2"}) CommitTick(stage, value);
}

void ChangeRoots(Stage& stage) {
  OID owned;
  {
    WriteTransaction transaction(stage.space());
    transaction.RenameRoot("t", "renamed");
    transaction.DeleteRoot("h");
    Fill(stage, transaction, transaction.Root<HistoriesMap>("new"), 1, 20);
    auto& map = transaction.Own<InsertionsMap>();
    Fill(stage, transaction, map, 1, 20);
    owned = map.GetPersistObjState().m_oid;
    Commit(stage, transaction);
  }
  WriteTransaction transaction(stage.space());
  transaction.Disown(transaction.Owned<InsertionsMap>(owned));
  transaction.RenameRoot("new", "h");
  Commit(stage, transaction);
}

void ChangeMeta(Stage& stage) {
  WriteTransaction transaction(stage.space());
  transaction.SetMeta("a", std::string(5'000, 'a'));
  transaction.EraseMeta("m");
  transaction.ScanMeta("", [](std::string_view, std::string_view) { return true; });
  Commit(stage, transaction);
}

void AssignAndSwap(Stage& stage) {
  WriteTransaction transaction(stage.space());
  auto& map = transaction.Root<TombstonesMap>("t");
  auto& other = transaction.Root<TombstonesMap>("other");
  stage.Mutate(transaction, [&] { other = map; });
  stage.Mutate(transaction, [&] { map = other; });
  stage.Mutate(transaction, [&] { other = TombstonesMap(map); });
  stage.Mutate(transaction, [&] { other.swap(map); });
  stage.Mutate(transaction, [&] { map.clear(); });
  std::vector<std::pair<FieldId, TombstonesMap::Payload>> entries;
  for (std::uint64_t n = 1; n <= 230; ++n) entries.emplace_back(Key(n), TombstonesMap::Payload());
  stage.Mutate(transaction, [&] { map.BulkLoad(entries.begin(), entries.end()); });
  Commit(stage, transaction);
}

// What is left behind here is swept in one commit.
void LeaveBehindAndCollect(Stage& stage) {
  AssignAndSwap(stage);
  Collect(stage.space());
  stage.Acknowledge();
}

void ReadSnapshots(Stage& stage) {
  Snapshot first(stage.space(), "first");
  ReadAll(first);
  {
    WriteTransaction transaction(stage.space());
    Fill(stage, transaction, transaction.Root<InsertionsMap>("i"), 140, 160);
    Commit(stage, transaction);
  }
  Snapshot second(stage.space(), "second");
  ReadAll(second);
  first.Refresh();
  ReadAll(first);
}

void AbortChanges(Stage& stage) {
  {
    WriteTransaction transaction(stage.space());
    Fill(stage, transaction, transaction.Root<TombstonesMap>("t"), 700, 960);
    auto& cleared = transaction.Root<InsertionsMap>("i");
    stage.Mutate(transaction, [&] { cleared.clear(); });
    transaction.RenameRoot("h", "g");
    transaction.Root<HistoriesMap>("new");
  }
  CommitTick(stage, "after an abort");
}

void Reopen(Stage& stage) {
  stage.Close();
  stage.Open();
  Snapshot snapshot(stage.space());
  ReadAll(snapshot);
}

void Examine(Stage& stage) {
  Snapshot snapshot(stage.space());
  VerifySpace(snapshot);
  CollectStatistics(snapshot);
  stage.space().Usage();
  stage.space().Readers();
}

}  // namespace

const std::vector<Scenario>& FaultScenarios() {
  static const std::vector<Scenario> scenarios{
      {"create a space and commit", false, CreateAndFill},
      {"commit splits", true, Split},
      {"commit deletions", true, Delete},
      {"clear a map and sweep the queue", true, ClearAndSweep},
      {"rename, delete, make and own roots", true, ChangeRoots},
      {"change meta values", true, ChangeMeta},
      {"assign, swap and load maps", true, AssignAndSwap},
      {"collect", true, LeaveBehindAndCollect},
      {"read and refresh snapshots", true, ReadSnapshots},
      {"abort", true, AbortChanges},
      {"reopen", true, Reopen},
      {"verify and measure", true, Examine},
  };
  return scenarios;
}

void Prepare(Stage& stage) {
  stage.Open();
  {
    WriteTransaction transaction(stage.space());
    Fill(stage, transaction, transaction.Root<TombstonesMap>("t"), 1, 900);
    Fill(stage, transaction, transaction.Root<InsertionsMap>("i"), 1, 150);
    Fill(stage, transaction, transaction.Root<HistoriesMap>("h"), 1, 60);
    transaction.SetMeta("m", "0");
    transaction.Commit();
  }
  stage.Close();
  stage.Open();
}

}  // namespace vemo::campaign
