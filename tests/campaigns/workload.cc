// What the next commit of a workload does: to a space.
#include "tests/campaigns/workload.h"

#include <utility>

#include "platform/error.h"
#include "store/verify.h"
#include "tests/support/keys.h"
#include "tests/support/production_payloads.h"

namespace vemo::campaign {

namespace {

using Kind = Step::Kind;
using test::Key;
using test::NumberOf;

constexpr const char* kCommits = "workload/commits";
constexpr const char* kLeftBehind = "workload/left behind";
constexpr const char* kOwnedPrefix = "workload/id of ";

template <class Map>
typename Map::Payload PayloadOf(std::uint64_t n) {
  return test::PayloadNumber<typename Map::Payload>::Make(n);
}

// Calls `act` with a null pointer to the class of maps that `kind` names.
template <class Act>
decltype(auto) WithMapClass(MapKind kind, Act&& act) {
  switch (kind) {
    case MapKind::kInsertions: return act(static_cast<FieldIdToVectorInsertionsMap*>(nullptr));
    case MapKind::kTombstones: return act(static_cast<FieldIdToVectorTombstonesMap*>(nullptr));
    case MapKind::kHistories: break;
  }
  return act(static_cast<FieldIdToVectorInsertionsAndDeletionsMap*>(nullptr));
}

template <class Map>
void Put(Map& map, const Step& step) {
  for (std::uint64_t n = step.first; n <= step.last; n += step.stride) {
    map.Insert(Key(n), PayloadOf<Map>(n + step.shift), true);
  }
}

std::uint64_t NumberIn(const std::optional<std::string>& text) { return text ? std::stoull(*text) : 0; }

class Player {
 public:
  explicit Player(WriteTransaction& transaction) : m_transaction(transaction) {}

  void Play(const Step& step) {
    if (step.kind == Kind::kSetMeta) return m_transaction.SetMeta(step.name, step.other);
    if (step.kind == Kind::kEraseMeta) return m_transaction.EraseMeta(step.name);
    if (step.kind == Kind::kRenameRoot) return m_transaction.RenameRoot(step.name, step.other);
    if (step.kind == Kind::kDeleteRoot) return m_transaction.DeleteRoot(step.name);
    WithMapClass(step.mapKind, [&]<class Map>(Map*) { PlayOn<Map>(step); });
  }

 private:
  template <class Map>
  void PlayOn(const Step& step) {
    switch (step.kind) {
      case Kind::kOwn: {
        Map& map = m_transaction.Own<Map>();
        m_transaction.SetMeta(kOwnedPrefix + step.name, std::to_string(map.GetPersistObjState().m_oid.m_value));
        return Put(map, step);
      }
      case Kind::kFillOwned: return Put(Owned<Map>(step.name), step);
      case Kind::kDisown:
        m_transaction.Disown(Owned<Map>(step.name));
        return m_transaction.EraseMeta(kOwnedPrefix + step.name);
      default: return PlayOnRoot(m_transaction.Root<Map>(step.name), step);
    }
  }

  template <class Map>
  Map& Owned(const std::string& name) {
    return m_transaction.Owned<Map>(OID(NumberIn(m_transaction.Meta(kOwnedPrefix + name))));
  }

  template <class Map>
  void PlayOnRoot(Map& map, const Step& step) {
    switch (step.kind) {
      case Kind::kMakeRoot:
      case Kind::kInsert: return Put(map, step);
      case Kind::kEdit:
        for (std::uint64_t n = step.first; n <= step.last; n += step.stride) {
          map.Edit(Key(n), [&](auto& payload) { payload = PayloadOf<Map>(n + step.shift); });
        }
        return;
      case Kind::kDelete:
        for (std::uint64_t n = step.first; n <= step.last; n += step.stride) map.Delete(Key(n));
        return;
      case Kind::kClear: return map.clear();
      case Kind::kSwap: return map.swap(m_transaction.Root<Map>(step.other));
      case Kind::kCopyAssign:
        m_transaction.SetMeta(kLeftBehind, std::to_string(NumberIn(m_transaction.Meta(kLeftBehind)) +
                                                          static_cast<std::uint64_t>(map.GetNumNodes())));
        map = m_transaction.Root<Map>(step.other);
        return;
      case Kind::kMoveAssign: map = Map(map); return;
      case Kind::kReplaceFromStack: {
        Map stack;
        Put(stack, step);
        stack.swap(map);
        stack.clear();
        return;
      }
      case Kind::kBulkLoad: {
        std::vector<std::pair<FieldId, typename Map::Payload>> entries;
        for (std::uint64_t n = step.first; n <= step.last; n += step.stride) {
          entries.emplace_back(Key(n), PayloadOf<Map>(n + step.shift));
        }
        map.clear();
        map.BulkLoad(entries.begin(), entries.end());
        return;
      }
      default: throw UsageError("a step that is not one of a root");
    }
  }

  WriteTransaction& m_transaction;
};

template <class Map>
std::map<std::uint64_t, std::uint64_t> EntriesOf(const Map& map) {
  std::map<std::uint64_t, std::uint64_t> entries;
  for (const auto& [key, payload] : map) {
    entries.emplace_hint(entries.end(), NumberOf(key), test::PayloadNumber<typename Map::Payload>::Number(payload));
  }
  return entries;
}

std::string CompareMap(Snapshot& snapshot, const std::string& storedName, const std::string& name, const ModelMap& model) {
  return WithMapClass(model.kind, [&]<class Map>(Map*) -> std::string {
    const auto entries = EntriesOf(snapshot.Root<Map>(storedName));
    if (entries == model.entries) return {};
    return name + " has " + std::to_string(entries.size()) + " entries that are not the " +
           std::to_string(model.entries.size()) + " it should have\n";
  });
}

std::string CompareMeta(Snapshot& snapshot, const Model& model) {
  std::map<std::string, std::string> stored;
  snapshot.ScanMeta("", [&](std::string_view name, std::string_view value) {
    if (!name.starts_with("workload/")) stored.emplace(name, value);
    return true;
  });
  return stored == model.meta ? "" : "other meta values\n";
}

}  // namespace

void Workload::Commit(CSpace& space) {
  Model after = m_model;
  const std::vector<Step> steps = Plan(0, after);
  WriteTransaction transaction(space);
  Player player(transaction);
  for (const Step& step : steps) player.Play(step);
  transaction.SetMeta(kCommits, std::to_string(++after.commits));
  transaction.Commit();
  m_model = std::move(after);
}

void Workload::Abort(CSpace& space) const {
  Model scratch = m_model;
  const std::vector<Step> steps = Plan(1, scratch);
  WriteTransaction transaction(space);
  Player player(transaction);
  for (const Step& step : steps) player.Play(step);
}

std::uint64_t CommitsIn(Snapshot& snapshot) { return NumberIn(snapshot.Meta(kCommits)); }

std::string Differences(Snapshot& snapshot, const Model& model, LeftBehind leftBehind) {
  std::string text;
  const VerifyReport report = VerifySpace(snapshot);
  for (const Finding& finding : report.findings) text += finding.root + ": " + finding.fault + "\n";
  const std::uint64_t left = NumberIn(snapshot.Meta(kLeftBehind));
  if (report.unreachable > left || (report.unreachable < left && leftBehind == LeftBehind::kIsThere)) {
    text += std::to_string(report.unreachable) + " records are reached by nothing, " + std::to_string(left) +
            " were left behind by assignments\n";
  }
  if (!text.empty()) return text;
  std::vector<std::string> names;
  for (const auto& [name, map] : model.roots) names.push_back(name);
  if (snapshot.RootNames() != names) text += "other roots\n";
  for (const auto& [name, map] : model.roots) {
    if (snapshot.HasRoot(name)) text += CompareMap(snapshot, name, name, map);
  }
  for (const auto& [name, map] : model.owned) {
    const std::optional<std::string> oid = snapshot.Meta(kOwnedPrefix + name);
    text += oid ? CompareMap(snapshot, std::string("\0owned/", 7) + *oid, name, map) : name + " is missing\n";
  }
  return text + CompareMeta(snapshot, model);
}

}  // namespace vemo::campaign
