#include "store/verify.h"

#include "platform/error.h"
#include "store/commit_builder.h"
#include "store/decoded_object.h"
#include "store/envelope.h"
#include "store/id_set.h"
#include "store/map_check.h"
#include "store/raw_check.h"
#include "store/root_value.h"
#include "vxOperation/src/WorkingSet/CompOp/VectorOT.h"

namespace vemo {

namespace {

class SpaceCheck {
 public:
  SpaceCheck(Snapshot& snapshot, const std::function<void(std::uint64_t, std::uint64_t)>& progress)
      : m_snapshot(snapshot), m_progress(progress) {}

  VerifyReport Run() {
    for (const StorageFinding& finding : State().CheckStorage()) {
      FindInSpace((finding.page ? "page " + std::to_string(*finding.page) + ": " : "") + finding.what);
    }
    CheckNamedValues();
    for (const std::string& name : RootNames()) CheckRoot(name);
    CheckRecords();
    m_report.space = Objects().Place(OID()).space;
    return std::move(m_report);
  }

 private:
  void Find(std::string root, std::string path, OID oid, std::string className, std::string fault) {
    if (className.empty() && !oid.IsNull()) className = ClassInHead(oid);
    m_report.findings.push_back({std::move(root), std::move(path), oid, std::move(className), std::move(fault)});
  }
  void FindInSpace(std::string fault) { Find("", "", OID(), "", std::move(fault)); }

  std::string ClassInHead(OID oid) {
    try {
      const std::optional<ByteView> record = State().Read(oid);
      return record ? std::string(Objects().ClassInHead(*record)) : "";
    } catch (const StoreError&) {
      return "";
    }
  }

  // What an exception about an object says, without what a finding says beside it.
  std::string ReasonIn(std::string what, OID oid, const std::string& className) {
    const std::string prefix = Objects().Describe(oid, className, "");
    constexpr std::string_view kAdvice = " (run vemo verify)";
    if (what.starts_with(prefix)) what.erase(0, prefix.size());
    if (what.ends_with(kAdvice)) what.erase(what.size() - kAdvice.size());
    return what;
  }

  View& Objects() { return m_snapshot.Objects(); }
  const EngineSnapshot& State() { return Objects().State(); }

  // Runs a step that the engine may have to leave where it meets damage; what is behind it goes unchecked.
  template <typename Step>
  void AsFarAsReadable(const Step& step) {
    try {
      step();
    } catch (const DamagedStorage& damaged) {
      FindInSpace(damaged.what());
    }
  }

  // Calls `visit` for all records that the engine can read.
  void ScanReadableRecords(const std::function<void(OID, ByteView)>& visit) {
    for (OID first(1);;) {
      try {
        State().ScanRecords(first, [&](OID oid, ByteView record) {
          visit(oid, record);
          return true;
        });
        return;
      } catch (const DamagedStorage& damaged) {
        if (!(first < damaged.next())) return;
        first = damaged.next();
      }
    }
  }

  // Owned maps too, which have names of the store's own.
  std::vector<std::string> RootNames() {
    std::vector<std::string> names;
    AsFarAsReadable([&] {
      State().ScanNamed(NamedTable::kRoots, "", [&](std::string_view name, ByteView) {
        names.emplace_back(name);
        return true;
      });
    });
    return names;
  }

  void CheckNamedValues() {
    for (const NamedTable table : {NamedTable::kInfo, NamedTable::kMeta}) {
      AsFarAsReadable([&] { CheckNamedValuesOf(table); });
    }
  }

  void CheckNamedValuesOf(NamedTable table) {
    State().ScanNamed(table, "", [&](std::string_view name, ByteView sealed) {
      try {
        OpenNamed(table, name, sealed);
      } catch (const MalformedBytes& malformed) {
        FindInSpace("named value \"" + std::string(name) + "\": " + malformed.what());
      }
      return true;
    });
  }

  void CheckRoot(const std::string& name) {
    try {
      const ptr<IPersistable> map = m_snapshot.RootMap(name);
      m_reached.Insert(PersistStateOf(map).m_oid);
      ++m_report.maps;
      CheckMapOfClass<FieldIdToVectorInsertionsMap>(name, map);
      CheckMapOfClass<FieldIdToVectorTombstonesMap>(name, map);
      CheckMapOfClass<FieldIdToVectorInsertionsAndDeletionsMap>(name, map);
    } catch (const CorruptRecord& corrupt) {
      const std::string& className = corrupt.place().className;
      const RootValue value = ValueOfRoot(name);
      if (!value.oid.IsNull()) m_reached.Insert(value.oid);
      Find(name, corrupt.oid().IsNull() ? "" : "map", corrupt.oid(), className.empty() ? value.className : className,
           ReasonIn(corrupt.what(), corrupt.oid(), className));
    } catch (const IncompatibleSpace& unknown) {
      Find(name, "", OID(), ValueOfRoot(name).className, unknown.what());
    }
  }

  // Empty where it cannot be read.
  RootValue ValueOfRoot(const std::string& name) {
    try {
      const std::optional<ByteView> sealed = State().ReadNamed(NamedTable::kRoots, name);
      return sealed ? DecodeRootValue(name, *sealed) : RootValue();
    } catch (const Error&) {
      return {};
    }
  }

  template <class Map>
  void CheckMapOfClass(const std::string& name, ptr<IPersistable> object) {
    if (object.Table() != IPersistable::Stubs<Map>::GetTable()) return;
    const auto& map = *static_cast<const Map*>(object.m_self);
    const auto reach = [&](OID oid, const std::string& where) {
      if (!m_reached.Insert(oid)) Find(name, where, oid, "", "the node belongs to two maps");
    };
    MapCheck<Map, NodeReader> check(map, NodeReader(m_snapshot.Objects()), reach);
    for (const MapFinding& finding : check.Run()) {
      const OID oid = finding.oid.IsNull() ? PersistStateOf(object).m_oid : finding.oid;
      std::string className = finding.className;
      if (className.empty() && finding.expected != nullptr) className = FindClass(finding.expected)->Name();
      Find(name, finding.where, oid, className, ReasonIn(finding.fault, oid, finding.className));
    }
    m_report.entries += static_cast<std::uint64_t>(map.m_size);
    m_report.nodes += check.NumVisited();
  }

  // The records that no root reaches: what hangs below the queue of deletions is on its way out, the rest is to be collected.
  void CheckRecords() {
    std::uint64_t total = 0;
    ScanReadableRecords([&](OID, ByteView) { ++total; });
    IdSet awaitingDeletion;
    AsFarAsReadable([&] { awaitingDeletion = ReadQueue(); });
    ScanReadableRecords([&](OID oid, ByteView record) {
      if (!m_reached.Contains(oid)) {
        CheckForm(oid, record);
        if (!awaitingDeletion.Contains(oid)) ++m_report.unreachable;
      }
      ++m_report.records;
      if (m_progress) m_progress(m_report.records, total);
    });
  }

  // The queued objects and all that they own.
  IdSet ReadQueue() {
    IdSet ids;
    std::vector<OID> pending = State().QueuedDeletions(SIZE_MAX);
    while (!pending.empty()) {
      const OID oid = pending.back();
      pending.pop_back();
      const std::optional<ByteView> record = State().Read(oid);
      if (!record || !ids.Insert(oid)) continue;
      if (m_reached.Contains(oid)) {
        Find("", "", oid, "", "it awaits deletion, and a root map reaches it");
        continue;
      }
      const DecodedObject object = CheckForm(oid, *record);
      if (object.Get().m_self == nullptr) continue;
      for (const prefbase& child : OwnedReferences(object.Get())) pending.push_back(child.m_oid);
    }
    return ids;
  }

  // The object of a record, or nothing after a finding.
  DecodedObject CheckForm(OID oid, ByteView record) {
    try {
      return DecodedObject(m_snapshot.Objects().Decode(oid, record));
    } catch (const CorruptRecord& corrupt) {
      const std::string& className = corrupt.place().className;
      if (m_faulty.Insert(oid)) Find("", "", oid, className, ReasonIn(corrupt.what(), oid, className));
      return {};
    }
  }

  Snapshot& m_snapshot;
  const std::function<void(std::uint64_t, std::uint64_t)>& m_progress;
  VerifyReport m_report;
  IdSet m_reached;
  IdSet m_faulty;  // unreached records that were found damaged
};

}  // namespace

VerifyReport VerifySpace(Snapshot& snapshot, const std::function<void(std::uint64_t, std::uint64_t)>& progress) {
  return SpaceCheck(snapshot, progress).Run();
}

std::string FindingText(const Finding& finding) {
  return RawFindingText({finding.root, finding.path, finding.oid, finding.className, finding.fault});
}

}  // namespace vemo
