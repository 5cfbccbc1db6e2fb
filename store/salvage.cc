#include "store/salvage.h"

#include <algorithm>
#include <charconv>
#include <map>
#include <utility>

#include "platform/error.h"
#include "store/salvage_map.h"
#include "store/salvage_sink.h"
#include "store/salvage_source.h"
#include "store/snapshot.h"
#include "store/tolerant_scan.h"

namespace vemo {

namespace {

constexpr std::string_view kOwnedPrefix{"\0owned/", 7};

// The id in the name of an owned map; null where there is none.
OID IdOfOwned(std::string_view name) {
  std::uint64_t id = 0;
  if (!name.starts_with(kOwnedPrefix)) return OID();
  name.remove_prefix(kOwnedPrefix.size());
  const auto parsed = std::from_chars(name.data(), name.data() + name.size(), id);
  return parsed.ec == std::errc() && parsed.ptr == name.data() + name.size() ? OID(id) : OID();
}

class Rescue {
 public:
  Rescue(const EngineSnapshot& state, CSpace& destination, const SalvageOptions& options)
      : m_source(state), m_sink(destination, options.entriesPerCommit), m_walk(m_source, m_sink, m_report, options.progress) {}

  SalvageReport Run() {
    for (const RawClassTable::Fault& fault : m_source.classes().Faults()) {
      Lose({}, OID(), "named value \"" + fault.name + "\": " + fault.fault);
    }
    ReadRootValues();
    LearnClasses();
    m_source.Survey();
    ReserveOwnedIds();
    FindRootsByRemains();
    for (const Root& root : m_roots) SaveMap(root);
    for (const OID oid : UnclaimedMaps()) SaveNamelessMap(oid);
    for (const LeafChain& chain : m_walk.FillGaps()) SaveHomelessChain(chain);
    SaveLostMaps();
    SaveMeta();
    m_sink.Commit();
    ListOtherDamage();
    m_report.leftLeaves = m_walk.NumLeavesLeft();
    return std::move(m_report);
  }

 private:
  struct Root {
    std::string name;
    OID oid;                             // of its map; null where the value does not tell
    std::optional<RawFamily> family;
    ByteView value;
  };

  void Lose(std::string root, OID oid, std::string what) {
    m_report.losses.push_back({std::move(root), oid, std::nullopt, std::nullopt, std::move(what)});
  }

  void ReadRootValues() {
    const auto failure = ScanReadableNamed(m_source.state(), NamedTable::kRoots, [this](std::string_view name, ByteView bytes) {
      Root root{std::string(name), OID(), std::nullopt, bytes};
      try {
        TakeValue(root, OpenRawNamed(NamedTable::kRoots, name, bytes));
      } catch (const RawFault& fault) {
        root.oid = IdOfOwned(name);
        Lose(root.name, OID(), std::string("its value: ") + fault.what());
      }
      m_roots.push_back(std::move(root));
    });
    if (failure) Lose({}, OID(), "the table of roots: " + *failure);
  }

  static void TakeValue(Root& root, ByteView value) {
    const RawRoot raw = ReadRawRoot(value);
    const std::optional<RawClass> rawClass = FindRawClass(raw.className);
    if (!rawClass || rawClass->kind != RawKind::kMap) throw RawFault(0, "no map of the class " + raw.className + " is known");
    root.oid = raw.oid;
    root.family = rawClass->family;
  }

  // A damaged table of classes is made up for by what the roots say: their values name the classes of their maps, and the height
  // of a map tells what hangs below it.
  void LearnClasses() {
    if (m_source.classes().Faults().empty() && !m_source.classes().HasGaps()) return;
    for (const Root& root : m_roots) {
      if (!root.family) continue;
      RawClass rawClass{*root.family, RawKind::kMap};
      OID oid = root.oid;
      for (std::uint32_t level = 0;;) {
        std::string ignored;
        const std::optional<ByteView> bytes = ReadOrFault(m_source.state(), oid, ignored);
        if (!bytes) break;
        try {
          const RawEnvelope envelope = OpenRawRecord(*bytes, oid);
          const RawBody body = ReadRawBody(envelope.body, rawClass);
          m_source.classes().Learn(envelope.classNumber, rawClass);
          if (rawClass.kind == RawKind::kMap) level = body.levels + 1;
          if (--level == 0) break;
          oid = rawClass.kind == RawKind::kMap ? body.root : body.children.front();
          rawClass.kind = level > 1 ? RawKind::kInternalNode : RawKind::kLeaf;
        } catch (const RawFault&) {
          break;
        }
      }
    }
  }

  // Ids of owned maps are kept, so no other object may get one of them.
  void ReserveOwnedIds() {
    OID last;
    for (const Root& root : m_roots) {
      const bool isPossible = !(m_source.largestId() < root.oid);  // a forged one could use up all ids
      if (!IdOfOwned(root.name).IsNull() && isPossible) last = std::max(last, root.oid);
    }
    if (!last.IsNull()) m_sink.ReserveIdsUpTo(last);
  }

  // Maps of which no root tells.
  std::vector<OID> UnclaimedMaps() const {
    std::vector<OID> unclaimed;
    for (const OID oid : m_source.maps()) {
      const auto hasMap = [oid](const Root& root) { return root.oid == oid; };
      if (!m_source.IsAwaitingDeletion(oid) && std::none_of(m_roots.begin(), m_roots.end(), hasMap)) unclaimed.push_back(oid);
    }
    return unclaimed;
  }

  // A root whose value is damaged: its map is the one that the rest of the value names, or the only one that has no root.
  void FindRootsByRemains() {
    const std::vector<OID> unclaimed = UnclaimedMaps();
    std::vector<Root*> lost;
    for (Root& root : m_roots) {
      if (root.oid.IsNull()) lost.push_back(&root);
    }
    for (Root* root : lost) {
      try {
        Root found = *root;
        TakeValue(found, root->value.first(root->value.size() - std::min<std::size_t>(root->value.size(), 8)).subspan(1));
        if (std::find(unclaimed.begin(), unclaimed.end(), found.oid) != unclaimed.end()) *root = found;
      } catch (const std::exception&) {
        continue;  // nothing can be read from it
      }
    }
    if (lost.size() == 1 && lost.front()->oid.IsNull() && unclaimed.size() == 1) lost.front()->oid = unclaimed.front();
  }

  void SaveMap(const Root& root) {
    if (root.oid.IsNull()) {
      m_lost.push_back(root);
      return;
    }
    if (m_source.largestId() < root.oid) {
      Lose(root.name, root.oid, "its map: the space has no object of so high an id");
      return;
    }
    std::string fault;
    const std::optional<SoundRecord> map = m_source.Read(root.oid, &fault);
    if (map && map->rawClass.kind != RawKind::kMap) fault = "it is a " + RawClassName(map->rawClass);
    if (!map || map->rawClass.kind != RawKind::kMap || (root.family && *root.family != map->rawClass.family)) {
      Lose(root.name, root.oid, "the map's record: " + fault);
      m_walk.Forget(root.oid);
      m_lost.push_back(root);
      return;
    }
    if (!m_walk.Claim(root.oid)) {
      Lose(root.name, root.oid, "another root has the same map");
      return;
    }
    OpenMap(root.name, root.oid, map->rawClass.family);
    m_walk.SaveTree(root.name, root.oid, map->rawClass.family, map->body);
    CloseMap();
  }

  void SaveNamelessMap(OID oid) {
    const std::optional<SoundRecord> map = m_source.Read(oid);
    if (!map || !m_walk.Claim(oid)) return;
    const std::string name = FreeName("salvaged/map " + std::to_string(oid.m_value));
    Lose({}, oid, "its name; it is \"" + name + "\" now");
    OpenMap(name, oid, map->rawClass.family);
    m_walk.SaveTree(name, oid, map->rawClass.family, map->body);
    CloseMap();
  }

  // Maps whose own records are lost: put together from chains of leaves, as far as what is left of the record names their ends.
  // Nothing else tells a map's leaves from those of a tree that was replaced.
  void SaveLostMaps() {
    if (m_lost.empty()) return;
    std::vector<LeafChain> chains = m_walk.FindChains();
    for (const Root& root : m_lost) {
      if (!root.family) continue;
      OpenMap(root.name, root.oid, *root.family);
      const std::optional<RawBody> remains =
          root.oid.IsNull() ? std::nullopt : m_source.RemainsOfMap(root.oid, *root.family);
      if (remains) m_walk.SaveChains(root.name, *root.family, *remains, chains);
      CloseMap();
    }
    for (const LeafChain& chain : chains) {
      if (!chain.isSaved) SaveHomelessChain(chain);
    }
  }

  void SaveHomelessChain(const LeafChain& chain) {
    const std::string name = FreeName("salvaged/leaf " + std::to_string(chain.head.m_value));
    const std::string_view doubt = m_source.KnowsAllDeletions() ? "replaced" : "replaced or deleted";
    Lose({}, chain.head, "to which root this leaf and those behind it belong, if they were not " + std::string(doubt) + "; they are \"" + name + "\" now");
    OpenMap(name, OID(), chain.family);
    m_walk.SaveChain(name, chain);
    CloseMap();
  }

  void OpenMap(const std::string& name, OID oid, RawFamily family) {
    m_sink.OpenMap(name, oid, family);
    m_report.maps.push_back({name, 0});
  }
  void CloseMap() {
    m_report.maps.back().entries = m_sink.EntriesOfMap();
    m_report.entries += m_sink.EntriesOfMap();
  }

  std::string FreeName(std::string name) {
    const auto isTaken = [&](const Root& root) { return root.name == name; };
    while (std::any_of(m_roots.begin(), m_roots.end(), isTaken) || m_sink.HasRoot(name)) name += "'";
    return name;
  }

  void SaveMeta() {
    const auto failure = ScanReadableNamed(m_source.state(), NamedTable::kMeta, [this](std::string_view name, ByteView bytes) {
      try {
        const ByteView value = OpenRawNamed(NamedTable::kMeta, name, bytes);
        m_sink.PutMeta(name, {reinterpret_cast<const char*>(value.data()), value.size()});
        ++m_report.metaValues;
      } catch (const RawFault& fault) {
        Lose({}, OID(), "meta value \"" + std::string(name) + "\": " + fault.what());
      }
    });
    if (failure) Lose({}, OID(), "the table of meta values: " + *failure);
  }

  // Damaged records that none of the maps led to.
  void ListOtherDamage() {
    for (const SalvageSource::Damaged& damaged : m_source.damaged()) {
      const auto isListed = [&damaged](const SalvageLoss& loss) { return loss.oid == damaged.oid; };
      if (damaged.oid.IsNull() || std::none_of(m_report.losses.begin(), m_report.losses.end(), isListed)) {
        Lose({}, damaged.oid, damaged.fault);
      }
    }
  }

  SalvageReport m_report;
  SalvageSource m_source;
  SalvageSink m_sink;
  SalvageMapWalk m_walk;
  std::vector<Root> m_roots;
  std::vector<Root> m_lost;  // whose maps are lost
};

void RequireEmpty(CSpace& space) {
  const Snapshot snapshot(space);
  const bool hasRoots = !snapshot.RootNames().empty();
  bool hasMeta = false;
  snapshot.ScanMeta("", [&hasMeta](std::string_view, std::string_view) {
    hasMeta = true;
    return false;
  });
  if (hasRoots || hasMeta) throw UsageError(space.Name() + ": it is not empty; what was salvaged goes into a new space");
}

}  // namespace

SalvageReport Salvage(const EngineSnapshot& source, CSpace& destination, const SalvageOptions& options) {
  RequireEmpty(destination);
  return Rescue(source, destination, options).Run();
}

std::string SalvageLossText(const SalvageLoss& loss) {
  std::string text;
  if (!loss.root.empty()) text += RootNameText(loss.root) + ", ";
  if (!loss.oid.IsNull()) text += "object " + std::to_string(loss.oid.m_value) + ", ";
  if (loss.low || loss.high) {
    text += "keys " + (loss.low ? "from " + FieldIdText(*loss.low) : std::string("from the first")) + " to " +
            (loss.high ? "below " + FieldIdText(*loss.high) : std::string("the last")) + ", ";
  }
  if (text.size() >= 2) text.replace(text.size() - 2, 2, ": ");
  return text + loss.what;
}

}  // namespace vemo
