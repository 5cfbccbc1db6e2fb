#include "store/raw_check.h"

#include <optional>
#include <utility>

#include "platform/error.h"
#include "platform/variable_length.h"
#include "store/id_set.h"
#include "store/raw_record.h"
#include "store/tolerant_scan.h"

namespace vemo {

namespace {

constexpr std::size_t kLeastFill = kRawNodeCapacity / 2;
constexpr std::uint64_t kSpaceFormat = 1;

// A record that could be read to its end.
struct Opened {
  RawClass rawClass;
  RawBody body;
};

class Checker {
 public:
  Checker(const EngineSnapshot& state, const std::function<void(std::uint64_t)>& progress)
      : m_state(state), m_progress(progress), m_classes(state) {}

  RawCheckReport Run() {
    for (const StorageFinding& finding : m_state.CheckStorage()) {
      const std::string page = finding.page ? "page " + std::to_string(*finding.page) + ": " : "";
      Find("", "", OID(), "", page + finding.what);
    }
    CheckInfo();
    CheckMeta();
    for (const auto& [name, bytes] : RootValues()) CheckRoot(name, bytes);
    CheckQueue();
    CheckUnreached();
    return std::move(m_report);
  }

 private:
  struct Bounds {  // keys are in [low, high); null is unbounded
    const FieldId* low = nullptr;
    const FieldId* high = nullptr;
  };
  // The map that is being walked.
  struct Map {
    std::string root;
    RawFamily family = RawFamily::kInsertions;
    IdSet nodes;
    std::uint64_t entries = 0;
    OID lastLeaf;               // the last one visited
    OID nextOfLastLeaf;         // what it names as its right neighbour
    bool chainIsKnown = true;   // nothing was unreadable between that leaf and the next one
    bool isComplete = true;
  };

  void Find(std::string root, std::string path, OID oid, std::string className, std::string fault) {
    m_report.findings.push_back({std::move(root), std::move(path), oid, std::move(className), std::move(fault)});
  }

  // --- Named values ---

  void CheckInfo() {
    for (const RawClassTable::Fault& fault : m_classes.Faults()) {
      Find("", "", OID(), "", "named value \"" + fault.name + "\": " + fault.fault);
    }
    bool hasFormat = false;
    const auto failure = ScanReadableNamed(m_state, NamedTable::kInfo, [&](std::string_view name, ByteView bytes) {
      if (name.starts_with("class/")) return;
      const std::optional<ByteView> value = CheckNamed(NamedTable::kInfo, name, bytes);
      if (name != "format") return;
      hasFormat = true;
      if (value) CheckFormat(*value);
    });
    if (failure) Find("", "", OID(), "", "the table of the store's own values: " + *failure);
    if (!hasFormat && !failure && m_state.Generation() != 0) Find("", "", OID(), "", "the space has no format number");
  }

  void CheckFormat(ByteView value) {
    std::uint64_t format = 0;
    if (!value.empty() && value.size() == VariableLengthBytes(value[0])) {
      DeserialiseVariableLengthUint64(value.data(), format);
    }
    if (format != kSpaceFormat) Find("", "", OID(), "", "the space's format number is not " + std::to_string(kSpaceFormat));
  }

  void CheckMeta() {
    const auto failure = ScanReadableNamed(m_state, NamedTable::kMeta, [this](std::string_view name, ByteView bytes) {
      CheckNamed(NamedTable::kMeta, name, bytes);
    });
    if (failure) Find("", "", OID(), "", "the table of meta values: " + *failure);
  }

  std::optional<ByteView> CheckNamed(NamedTable table, std::string_view name, ByteView bytes) {
    try {
      return OpenRawNamed(table, name, bytes);
    } catch (const RawFault& fault) {
      Find("", "", OID(), "", "named value \"" + std::string(name) + "\": " + fault.what());
      return std::nullopt;
    }
  }

  std::vector<std::pair<std::string, ByteView>> RootValues() {
    std::vector<std::pair<std::string, ByteView>> values;
    const auto failure = ScanReadableNamed(m_state, NamedTable::kRoots, [&values](std::string_view name, ByteView bytes) {
      values.emplace_back(name, bytes);
    });
    if (failure) Find("", "", OID(), "", "the table of roots: " + *failure);
    return values;
  }

  // --- Maps ---

  void CheckRoot(const std::string& name, ByteView bytes) {
    RawRoot root;
    try {
      root = ReadRawRoot(OpenRawNamed(NamedTable::kRoots, name, bytes));
    } catch (const RawFault& fault) {
      return Find(name, "", OID(), "", std::string("its value: ") + fault.what());
    }
    const std::optional<RawClass> rawClass = FindRawClass(root.className);
    if (!rawClass || rawClass->kind != RawKind::kMap) {
      return Find(name, "", OID(), root.className, "no map of that class is known");
    }
    if (!m_reached.Insert(root.oid)) Find(name, "map", root.oid, root.className, "the map belongs to two roots");
    const std::optional<Opened> opened = Open(name, "map", root.oid, *rawClass);
    if (!opened) return;
    ++m_report.maps;
    CheckMap(name, root.oid, *rawClass, opened->body);
  }

  void CheckMap(const std::string& name, OID oid, const RawClass& rawClass, const RawBody& body) {
    if (body.levels == 0) return;
    Map map;
    map.root = name;
    map.family = rawClass.family;
    map.nextOfLastLeaf = body.firstLeaf;
    CheckNode(map, body.root, body.levels - 1, {}, true, "root");
    const std::string className = RawClassName(rawClass);
    if (map.isComplete && map.entries != body.entries) {
      Find(name, "map", oid, className,
           "it says that it has " + std::to_string(body.entries) + " entries and has " + std::to_string(map.entries));
    }
    if (m_firstLeafIsWrong) Find(name, "map", oid, className, "its first leaf is not the tree's");
    m_firstLeafIsWrong = false;
    if (map.chainIsKnown) {
      if (!map.nextOfLastLeaf.IsNull()) {
        Find(name, "", map.lastLeaf, RawClassName({map.family, RawKind::kLeaf}), "the last leaf has a right neighbour");
      }
      if (body.lastLeaf != map.lastLeaf) Find(name, "map", oid, className, "its last leaf is not the tree's");
    }
    m_report.entries += map.entries;
    m_report.nodes += map.nodes.size();
  }

  void CheckNode(Map& map, OID oid, std::uint32_t height, Bounds bounds, bool isRoot, const std::string& path) {
    const RawClass rawClass{map.family, height > 0 ? RawKind::kInternalNode : RawKind::kLeaf};
    const bool isNew = map.nodes.Insert(oid);
    if (!isNew) Find(map.root, path, oid, RawClassName(rawClass), "it hangs in the tree twice");
    if (isNew && !m_reached.Insert(oid)) Find(map.root, path, oid, RawClassName(rawClass), "it belongs to two maps");
    std::optional<Opened> opened;
    if (isNew) opened = Open(map.root, path, oid, rawClass);
    if (!opened) {
      map.isComplete = false;
      map.chainIsKnown = false;
      return;
    }
    const std::size_t fill = height > 0 ? opened->body.keys.size() : opened->body.leafEntries.size();
    if (!isRoot && fill < kLeastFill) Find(map.root, path, oid, RawClassName(rawClass), "it has only " + std::to_string(fill) + " entries");
    if (height > 0) {
      CheckChildren(map, oid, height, opened->body, bounds, path);
    } else {
      CheckLeaf(map, oid, opened->body, bounds, path);
    }
  }

  void CheckChildren(Map& map, OID oid, std::uint32_t height, const RawBody& body, Bounds bounds, const std::string& path) {
    for (const FieldId& key : body.keys) CheckKey(map, {map.family, RawKind::kInternalNode}, oid, key, bounds, path);
    for (std::size_t i = 0; i < body.children.size(); ++i) {
      const Bounds childBounds{i == 0 ? bounds.low : &body.keys[i - 1], i == body.keys.size() ? bounds.high : &body.keys[i]};
      CheckNode(map, body.children[i], height - 1, childBounds, false,
                path + "." + std::to_string(static_cast<std::ptrdiff_t>(i) - 1));
    }
  }

  void CheckLeaf(Map& map, OID oid, const RawBody& body, Bounds bounds, const std::string& path) {
    const RawClass rawClass{map.family, RawKind::kLeaf};
    for (const RawEntry& entry : body.leafEntries) CheckKey(map, rawClass, oid, entry.key, bounds, path);
    map.entries += body.leafEntries.size();
    if (map.chainIsKnown) {
      if (map.nextOfLastLeaf != oid) {
        if (map.lastLeaf.IsNull()) {
          m_firstLeafIsWrong = true;
        } else {
          Find(map.root, path, map.lastLeaf, RawClassName(rawClass), "its right neighbour is not the tree's");
        }
      }
      if (body.previous != map.lastLeaf) Find(map.root, path, oid, RawClassName(rawClass), "its left neighbour is not the tree's");
    }
    map.lastLeaf = oid;
    map.nextOfLastLeaf = body.next;
    map.chainIsKnown = true;
  }

  void CheckKey(const Map& map, const RawClass& rawClass, OID oid, const FieldId& key, Bounds bounds, const std::string& path) {
    const bool isBelow = bounds.low != nullptr && key < *bounds.low;
    const bool isAbove = bounds.high != nullptr && !(key < *bounds.high);
    if (!isBelow && !isAbove) return;
    Find(map.root, path, oid, RawClassName(rawClass), "key " + FieldIdText(key) + (isBelow ? " is below its range" : " is above its range"));
  }

  // --- Records ---

  // The record of an object that something refers to, or nothing after a finding.
  std::optional<Opened> Open(const std::string& root, const std::string& path, OID oid, const RawClass& expected) {
    std::string fault = "there is no record of it";
    const std::optional<ByteView> record = ReadOrFault(m_state, oid, fault);
    if (!record) {
      Find(root, path, oid, RawClassName(expected), fault);
      return std::nullopt;
    }
    std::optional<Opened> opened = OpenBytes(root, path, oid, *record, RawClassName(expected));
    if (!opened || opened->rawClass == expected) return opened;
    Find(root, path, oid, RawClassName(opened->rawClass), "a " + RawClassName(expected) + " should stand here");
    return std::nullopt;
  }

  std::optional<Opened> OpenBytes(const std::string& root, const std::string& path, OID oid, ByteView record,
                                  std::string className = "") {
    ++m_read;
    if (m_progress) m_progress(m_read);
    try {
      const RawEnvelope envelope = OpenRawRecord(record, oid);
      const std::optional<RawClass> rawClass = m_classes.Find(envelope.classNumber);
      if (!rawClass) throw RawFault(1, "no class of the number " + std::to_string(envelope.classNumber) + " is known");
      className = RawClassName(*rawClass);
      return Opened{*rawClass, ReadRawBody(envelope.body, *rawClass)};
    } catch (const RawFault& fault) {
      Find(root, path, oid, className.empty() ? ClassInHead(record) : std::move(className), fault.what());
      return std::nullopt;
    }
  }

  std::string ClassInHead(ByteView record) const {
    const std::optional<RawClass> rawClass = m_classes.Find(RawClassNumber(record));
    return rawClass ? RawClassName(*rawClass) : "";
  }

  // What hangs below the queue may be missing already.
  void CheckQueue() {
    std::vector<OID> pending;
    try {
      pending = m_state.QueuedDeletions(SIZE_MAX);
    } catch (const StoreError& error) {
      Find("", "", OID(), "", std::string("the queue of deletions: ") + error.what());
    }
    while (!pending.empty()) {
      const OID oid = pending.back();
      pending.pop_back();
      std::string fault;
      const std::optional<ByteView> record = ReadOrFault(m_state, oid, fault);
      if (!record || !m_awaitingDeletion.Insert(oid)) continue;
      if (m_reached.Contains(oid)) {
        Find("", "", oid, ClassInHead(*record), "it awaits deletion, and a root map reaches it");
        continue;
      }
      const std::optional<Opened> opened = OpenBytes("", "", oid, *record);
      if (!opened) continue;
      if (opened->rawClass.kind == RawKind::kMap && !opened->body.root.IsNull()) pending.push_back(opened->body.root);
      pending.insert(pending.end(), opened->body.children.begin(), opened->body.children.end());
    }
  }

  void CheckUnreached() {
    ScanReadableRecords(
        m_state,
        [this](OID oid, ByteView record) {
          ++m_report.records;
          if (m_reached.Contains(oid) || m_awaitingDeletion.Contains(oid)) return;
          ++m_report.unreachable;
          OpenBytes("", "", oid, record);
        },
        [this](OID oid, const std::string& fault) {
          Find("", "", OID(), "", "the records from object " + std::to_string(oid.m_value) + " on: " + fault);
        });
  }

  const EngineSnapshot& m_state;
  const std::function<void(std::uint64_t)>& m_progress;
  RawClassTable m_classes;
  RawCheckReport m_report;
  IdSet m_reached;
  IdSet m_awaitingDeletion;
  bool m_firstLeafIsWrong = false;
  std::uint64_t m_read = 0;
};

}  // namespace

RawCheckReport CheckRawSpace(const EngineSnapshot& state, const std::function<void(std::uint64_t)>& progress) {
  return Checker(state, progress).Run();
}

std::string RawFindingText(const RawFinding& finding) {
  std::string text;
  const auto add = [&text](const std::string& part) {
    if (!text.empty()) text += ", ";
    text += part;
  };
  if (!finding.root.empty()) add(RootNameText(finding.root));
  if (!finding.path.empty()) add(finding.path);
  if (!finding.oid.IsNull()) {
    add("object " + std::to_string(finding.oid.m_value) + (finding.className.empty() ? "" : " (" + finding.className + ")"));
  }
  return text.empty() ? finding.fault : text + ": " + finding.fault;
}

}  // namespace vemo
