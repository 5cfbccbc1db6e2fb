#include "store/verify.h"

#include <unordered_set>

#include "platform/error.h"
#include "store/commit_builder.h"
#include "store/envelope.h"
#include "store/map_check.h"
#include "vxOperation/src/WorkingSet/CompOp/VectorOT.h"

namespace vemo {

namespace {

class SpaceCheck {
 public:
  SpaceCheck(Snapshot& snapshot, const std::function<void(std::uint64_t, std::uint64_t)>& progress)
      : m_snapshot(snapshot), m_progress(progress) {}

  VerifyReport Run() {
    CheckNamedValues();
    for (const std::string& name : RootNames()) CheckRoot(name);
    CheckRecords();
    return std::move(m_report);
  }

 private:
  void Find(const std::string& root, OID oid, const std::string& fault) { m_report.findings.push_back({root, oid, fault}); }
  const EngineSnapshot& State() { return m_snapshot.Objects().State(); }

  // Owned maps too, which have names of the store's own.
  std::vector<std::string> RootNames() {
    std::vector<std::string> names;
    State().ScanNamed(NamedTable::kRoots, "", [&](std::string_view name, ByteView) {
      names.emplace_back(name);
      return true;
    });
    return names;
  }

  void CheckNamedValues() {
    for (const NamedTable table : {NamedTable::kInfo, NamedTable::kMeta}) {
      State().ScanNamed(table, "", [&](std::string_view name, ByteView sealed) {
        try {
          OpenNamed(table, name, sealed);
        } catch (const MalformedBytes& malformed) {
          Find("", OID(), "named value \"" + std::string(name) + "\": " + malformed.what());
        }
        return true;
      });
    }
  }

  void CheckRoot(const std::string& name) {
    try {
      const ptr<IPersistable> map = m_snapshot.RootMap(name);
      m_reached.insert(PersistStateOf(map).m_oid);
      ++m_report.maps;
      CheckMapOfClass<FieldIdToVectorInsertionsMap>(name, map);
      CheckMapOfClass<FieldIdToVectorTombstonesMap>(name, map);
      CheckMapOfClass<FieldIdToVectorInsertionsAndDeletionsMap>(name, map);
    } catch (const CorruptRecord& corrupt) {
      Find(name, corrupt.oid(), corrupt.what());
    } catch (const IncompatibleSpace& unknown) {
      Find(name, OID(), unknown.what());
    }
  }

  template <class Map>
  void CheckMapOfClass(const std::string& name, ptr<IPersistable> object) {
    if (object.Table() != IPersistable::Stubs<Map>::GetTable()) return;
    const auto& map = *static_cast<const Map*>(object.m_self);
    MapCheck<Map> check(map);
    const std::vector<MapFinding> findings = check.Run();
    for (const MapFinding& finding : findings) Find(name, finding.oid, finding.where + ": " + finding.fault);
    if (findings.empty()) map.Validate();
    for (const OID oid : check.Visited()) {
      if (!m_reached.insert(oid).second) Find(name, oid, "the node belongs to two maps");
    }
    m_report.entries += static_cast<std::uint64_t>(map.m_size);
    m_report.nodes += check.Visited().size();
  }

  // The records that no root reaches: what hangs below the queue of deletions is on its way out, the rest is to be collected.
  void CheckRecords() {
    std::uint64_t total = 0;
    State().ScanRecords(OID(1), [&](OID, ByteView) { return ++total > 0; });
    std::unordered_set<OID> awaitingDeletion = ReadQueue();
    State().ScanRecords(OID(1), [&](OID oid, ByteView record) {
      if (!m_reached.contains(oid)) {
        if (const ptr<IPersistable> object = CheckForm(oid, record); object.m_self != nullptr) DestroyObject(object);
        if (!awaitingDeletion.contains(oid)) ++m_report.unreachable;
      }
      ++m_report.records;
      if (m_progress) m_progress(m_report.records, total);
      return true;
    });
  }

  // The queued objects and all that they own.
  std::unordered_set<OID> ReadQueue() {
    std::unordered_set<OID> ids;
    std::vector<OID> pending = State().QueuedDeletions(SIZE_MAX);
    while (!pending.empty()) {
      const OID oid = pending.back();
      pending.pop_back();
      const std::optional<ByteView> record = State().Read(oid);
      if (!record || !ids.insert(oid).second) continue;
      if (const ptr<IPersistable> object = CheckForm(oid, *record); object.m_self != nullptr) {
        for (const prefbase& child : OwnedReferences(object)) pending.push_back(child.m_oid);
        DestroyObject(object);
      }
    }
    return ids;
  }

  // The object of a record, or null after a finding; the caller destroys it.
  ptr<IPersistable> CheckForm(OID oid, ByteView record) {
    try {
      return m_snapshot.Objects().Decode(oid, record);
    } catch (const CorruptRecord& corrupt) {
      if (m_faulty.insert(oid).second) Find("", oid, corrupt.what());
      return {};
    }
  }

  Snapshot& m_snapshot;
  const std::function<void(std::uint64_t, std::uint64_t)>& m_progress;
  VerifyReport m_report;
  std::unordered_set<OID> m_reached;
  std::unordered_set<OID> m_faulty;  // unreached records that were found damaged
};

}  // namespace

VerifyReport VerifySpace(Snapshot& snapshot, const std::function<void(std::uint64_t, std::uint64_t)>& progress) {
  return SpaceCheck(snapshot, progress).Run();
}

}  // namespace vemo
