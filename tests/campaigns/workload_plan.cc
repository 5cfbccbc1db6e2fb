// What the next commit of a workload does: to the model.
#include <algorithm>
#include <iterator>
#include <random>

#include "tests/campaigns/workload.h"

namespace vemo::campaign {

namespace {

using Kind = Step::Kind;

class Planner {
 public:
  Planner(std::uint64_t seed, std::uint64_t keys, Model& model) : m_random(seed), m_keys(keys), m_model(model) {}

  std::vector<Step> Run() {
    // Small commits, one behind another, are what a log takes.
    if (m_model.commits / 4 % 2 == 1 && !m_model.roots.empty()) return Small();
    if (m_model.roots.size() > 1 && Chance(6)) CopyAssign();
    const std::uint64_t steps = Chance(8) ? 0 : 1 + Draw(5);
    for (std::uint64_t i = 0; i < steps; ++i) AddStep();
    if (m_steps.empty() || Chance(3)) SetMeta();
    return std::move(m_steps);
  }

 private:
  std::uint64_t Draw(std::uint64_t n) { return m_random() % n; }
  bool Chance(std::uint64_t oneIn) { return Draw(oneIn) == 0; }
  MapKind AnyKind() { return static_cast<MapKind>(Draw(3)); }

  // A range of keys: short as a rule, at times most of the map.
  Step Range(Kind kind, std::string name) {
    Step step{kind, std::move(name), "", MapKind::kInsertions};
    const std::uint64_t length = Chance(5) ? Draw(m_keys) : Draw(std::min<std::uint64_t>(m_keys, 120));
    step.first = 1 + Draw(m_keys);
    step.last = std::min(m_keys, step.first + length);
    step.stride = Chance(2) ? 1 : 1 + Draw(7);
    step.shift = Draw(1'000);
    return step;
  }

  template <class Table>
  typename Table::iterator Any(Table& table) {
    return std::next(table.begin(), static_cast<std::ptrdiff_t>(Draw(table.size())));
  }

  std::vector<Step> Small() {
    for (std::uint64_t i = 1 + Draw(3); i > 0; --i) {
      const auto root = Any(m_model.roots);
      auto& entries = root->second.entries;
      if (entries.empty() || Chance(4)) {
        SetMeta();
        continue;
      }
      auto entry = entries.lower_bound(1 + Draw(m_keys));
      if (entry == entries.end()) entry = entries.begin();
      Step step{Kind::kEdit, root->first, "", root->second.kind};
      step.first = step.last = entry->first;
      step.shift = Draw(1'000);
      entry->second = step.first + step.shift;
      m_steps.push_back(std::move(step));
    }
    return std::move(m_steps);
  }

  static void Put(ModelMap& map, const Step& step) {
    for (std::uint64_t n = step.first; n <= step.last; n += step.stride) map.entries[n] = n + step.shift;
  }

  void AddStep() {
    if (m_model.roots.empty() || (m_model.roots.size() < 6 && Chance(6))) return MakeRoot();
    const std::uint64_t kind = Draw(100);
    if (kind < 34) return Change(Kind::kInsert);
    if (kind < 44) return Change(Kind::kEdit);
    if (kind < 66) return Change(Kind::kDelete);
    if (kind < 70) return Change(Kind::kClear);
    if (kind < 74) return RenameRoot();
    if (kind < 77) return DeleteRoot();
    if (kind < 84) return Owned();
    if (kind < 87) return Swap();
    if (kind < 90) return Change(Kind::kMoveAssign);
    if (kind < 94) return Change(Kind::kReplaceFromStack);
    if (kind < 97) return Change(Kind::kBulkLoad);
    SetMeta();
  }

  void MakeRoot() {
    const std::string name = "root " + std::to_string(Draw(9));
    if (m_model.roots.contains(name)) return Change(Kind::kInsert);
    Step step = Range(Kind::kMakeRoot, name);
    step.mapKind = AnyKind();
    Put(m_model.roots[name] = ModelMap{step.mapKind, {}}, step);
    m_steps.push_back(std::move(step));
  }

  void Change(Kind kind) {
    const auto root = Any(m_model.roots);
    auto& entries = root->second.entries;
    Step step = Range(kind, root->first);
    step.mapKind = root->second.kind;
    switch (kind) {
      case Kind::kInsert: Put(root->second, step); break;
      case Kind::kEdit:
        for (std::uint64_t n = step.first; n <= step.last; n += step.stride) {
          if (const auto found = entries.find(n); found != entries.end()) found->second = n + step.shift;
        }
        break;
      case Kind::kDelete:
        for (std::uint64_t n = step.first; n <= step.last; n += step.stride) entries.erase(n);
        break;
      case Kind::kReplaceFromStack:
      case Kind::kBulkLoad:
        entries.clear();
        Put(root->second, step);
        break;
      case Kind::kClear: entries.clear(); break;
      default: break;  // a map that is assigned its own copy
    }
    m_steps.push_back(std::move(step));
  }

  void RenameRoot() {
    const auto root = Any(m_model.roots);
    const std::string to = "root " + std::to_string(Draw(9));
    if (m_model.roots.contains(to)) return;
    m_steps.push_back({Kind::kRenameRoot, root->first, to, root->second.kind});
    auto node = m_model.roots.extract(root);
    node.key() = to;
    m_model.roots.insert(std::move(node));
  }

  void DeleteRoot() {
    const auto root = Any(m_model.roots);
    m_steps.push_back({Kind::kDeleteRoot, root->first, "", root->second.kind});
    m_model.roots.erase(root);
  }

  void Owned() {
    if (m_model.owned.empty() || (m_model.owned.size() < 3 && Chance(2))) {
      const std::string name = "owned " + std::to_string(m_model.commits) + "." + std::to_string(m_steps.size());
      Step step = Range(Kind::kOwn, name);
      step.mapKind = AnyKind();
      Put(m_model.owned[name] = ModelMap{step.mapKind, {}}, step);
      m_steps.push_back(std::move(step));
      return;
    }
    const auto owned = Any(m_model.owned);
    Step step = Range(Chance(3) ? Kind::kDisown : Kind::kFillOwned, owned->first);
    step.mapKind = owned->second.kind;
    if (step.kind == Kind::kDisown) {
      m_model.owned.erase(owned);
    } else {
      Put(owned->second, step);
    }
    m_steps.push_back(std::move(step));
  }

  void Swap() {
    const auto a = Any(m_model.roots), b = Any(m_model.roots);
    if (a == b || a->second.kind != b->second.kind) return;
    m_steps.push_back({Kind::kSwap, a->first, b->first, a->second.kind});
    a->second.entries.swap(b->second.entries);
  }

  void CopyAssign() {
    const auto a = Any(m_model.roots), b = Any(m_model.roots);
    if (a == b || a->second.kind != b->second.kind) return;
    m_steps.push_back({Kind::kCopyAssign, a->first, b->first, a->second.kind});
    a->second.entries = b->second.entries;
  }

  void SetMeta() {
    const std::string name = "meta " + std::to_string(Draw(6));
    if (Chance(4)) {
      m_steps.push_back({Kind::kEraseMeta, name, ""});
      m_model.meta.erase(name);
      return;
    }
    const std::string value(Chance(10) ? 6'000 : Draw(40), static_cast<char>('a' + Draw(26)));
    m_steps.push_back({Kind::kSetMeta, name, value});
    m_model.meta[name] = value;
  }

  std::mt19937_64 m_random;
  std::uint64_t m_keys;
  Model& m_model;
  std::vector<Step> m_steps;
};

}  // namespace

std::vector<Step> Workload::Plan(std::uint64_t salt, Model& model) const {
  const std::uint64_t number = model.commits + 1;
  return Planner(m_options.seed * 1'000'003 + number * 4 + salt, m_options.keys, model).Run();
}

void Workload::Skip() {
  Plan(0, m_model);
  ++m_model.commits;
}

}  // namespace vemo::campaign
