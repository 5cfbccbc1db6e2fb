#include "tests/campaigns/damage.h"

#include <algorithm>

#include "store/collect.h"
#include "store/raw_check.h"
#include "store/salvage.h"
#include "store/verify.h"
#include "tests/campaigns/damaged_space.h"

namespace vemo::campaign {

using namespace test;

namespace {

class Campaign {
 public:
  explicit Campaign(const DamageOptions& options)
      : m_options(options), m_random(options.seed), m_verdict("damage", options.seed) {}

  Verdict Run() {
    for (std::uint64_t i = 1; i <= m_options.damages && GoesOn(); ++i) {
      Damage damage = m_space.Draw(m_random);
      if (i % 10 == 0) {
        Damage second = m_space.Draw(m_random);
        if (AreApart(damage, second)) {
          damage.what += "; " + second.what;
          damage.changes.insert(damage.changes.end(), second.changes.begin(), second.changes.end());
        }
      }
      m_damage = &damage;
      m_space.Apply(damage);
      CheckChecks(true);
      CheckReading();
      CheckCollection();
      if (i % m_options.salvageEvery == 0) CheckSalvage(true);
      m_space.Repair(damage);
      Count("damages");
    }
    for (std::uint64_t i = 1; i <= m_options.forgeries && GoesOn(); ++i) {
      const Damage damage = m_space.DrawForged(m_random);
      m_damage = &damage;
      m_space.Apply(damage);
      CheckChecks(false);
      CheckCollection();
      if (i % m_options.salvageEvery == 0) CheckSalvage(false);
      m_space.Repair(damage);
      Count("forgeries");
    }
    static const Damage kNone{"nothing is damaged any more", {}};
    m_damage = &kNone;
    if (!Raw().findings.empty()) Fault("the space is not as it was: " + RawFindingText(Raw().findings.front()));
    return std::move(m_verdict);
  }

 private:
  bool GoesOn() const { return m_verdict.faults().size() < m_options.maxFaults; }
  void Count(const std::string& what) { m_verdict.Count(what); }
  void Fault(const std::string& fault) { m_verdict.AddFault(m_damage->what + ": " + fault); }

  static bool AreApart(const Damage& a, const Damage& b) {
    for (const Tampering& one : a.changes) {
      for (const Tampering& other : b.changes) {
        if (one.oid == other.oid && one.table == other.table && one.name == other.name) return false;
      }
    }
    return true;
  }

  bool IsDamaged(OID oid) const {
    return std::any_of(m_damage->changes.begin(), m_damage->changes.end(),
                       [oid](const Tampering& change) { return change.name.empty() && change.oid == oid; });
  }
  bool IsDamaged(NamedTable table, const std::string& name) const {
    return std::any_of(m_damage->changes.begin(), m_damage->changes.end(),
                       [&](const Tampering& change) { return change.table == table && change.name == name && !name.empty(); });
  }
  // Damage of the table of classes, without which no record can be read, or of the format.
  bool IsInfoDamaged() const {
    return std::any_of(m_damage->changes.begin(), m_damage->changes.end(),
                       [](const Tampering& change) { return change.table == NamedTable::kInfo && !change.name.empty(); });
  }

  RawCheckReport Raw() { return CheckRawSpace(*m_space.engine().OpenSnapshot()); }

  // Both checks find something, or with `mustFind` false, both or none; and they name the same objects.
  void CheckChecks(bool mustFind) {
    const RawCheckReport raw = Raw();
    std::set<OID> rawIds, ids;
    for (const RawFinding& finding : raw.findings) rawIds.insert(finding.oid);
    bool isSound = true;
    bool wasRead = true;
    try {
      Snapshot snapshot(m_space.space());
      const VerifyReport report = VerifySpace(snapshot);
      for (const Finding& finding : report.findings) ids.insert(finding.oid);
      isSound = report.findings.empty();
    } catch (const StoreError&) {
      isSound = false;
      wasRead = false;  // the space's own values are damaged
    }
    if (raw.findings.empty() != isSound) {
      Fault(isSound ? "only the check of bytes finds " + RawFindingText(raw.findings.front()) : "only the check of nodes finds it");
    }
    if (mustFind && raw.findings.empty() && !IsOnlyFormat()) Fault("the check of bytes finds nothing");
    if (mustFind && isSound && !IsOnlyFormat()) Fault("the check of nodes finds nothing");
    if (mustFind && wasRead && !IsInfoDamaged() && rawIds != ids) Fault("the checks name different objects");
    if (!mustFind) Count(isSound ? "forgeries of payloads alone" : "forgeries found");
  }

  // A reader of an open handle does not look at the format number again.
  bool IsOnlyFormat() const { return m_damage->changes.size() == 1 && m_damage->changes.front().name == "format"; }

  // Each map is read as it was, or an exception says what is wrong; what no damaged object leads to is read.
  void CheckReading() {
    try {
      Snapshot snapshot(m_space.space());
      for (const DamagedSpace::Map& map : m_space.maps()) CheckMap(snapshot, map);
    } catch (const CorruptRecord& corrupt) {
      if (!IsInfoDamaged()) Fault(std::string("no snapshot can be taken: ") + corrupt.what());
    }
  }

  void CheckMap(Snapshot& snapshot, const DamagedSpace::Map& known) {
    const bool isRootDamaged = IsDamaged(known.oid) || IsDamaged(NamedTable::kRoots, known.name);
    try {
      const ptr<IPersistable> object = snapshot.RootMap(known.name);
      CheckMapOfClass<TombstonesMap>(object, known);
      CheckMapOfClass<InsertionsMap>(object, known);
      CheckMapOfClass<HistoriesMap>(object, known);
      if (isRootDamaged) Fault("map \"" + known.name + "\" was read");
    } catch (const CorruptRecord& corrupt) {
      if (!isRootDamaged) Fault("map \"" + known.name + "\": " + corrupt.what());
    }
  }

  template <class M>
  void CheckMapOfClass(ptr<IPersistable> object, const DamagedSpace::Map& known) {
    if (object.Table() != IPersistable::Stubs<M>::GetTable()) return;
    const auto& map = *static_cast<const M*>(object.m_self);
    const bool isDamaged =
        std::any_of(known.objects.begin(), known.objects.end(), [this](OID oid) { return IsDamaged(oid); });
    if (isDamaged) {
      for (const auto& [number, entry] : known.entries) CheckKey(map, number, entry);
      return;
    }
    auto expected = known.entries.begin();
    for (const auto& [key, payload] : map) {
      if (expected == known.entries.end() || NumberOf(key) != expected->first ||
          PayloadNumber<typename M::Payload>::Number(payload) != expected->second.number) {
        return Fault("map \"" + known.name + "\": another entry than was written at " + FieldIdText(key));
      }
      ++expected;
    }
    if (expected != known.entries.end()) Fault("map \"" + known.name + "\": entries are missing");
  }

  template <class M>
  void CheckKey(const M& map, std::uint64_t number, const DamagedSpace::Entry& entry) {
    const bool isDamaged = std::any_of(entry.way.begin(), entry.way.end(), [this](OID oid) { return IsDamaged(oid); });
    try {
      const auto* payload = map.rFind(Key(number));
      if (payload == nullptr || PayloadNumber<typename M::Payload>::Number(*payload) != entry.number) {
        Fault("a wrong answer for key " + std::to_string(number));
      } else if (isDamaged) {
        Fault("key " + std::to_string(number) + " was read from a damaged node");
      }
    } catch (const CorruptRecord& corrupt) {
      if (!isDamaged || !IsDamaged(corrupt.oid())) Fault("key " + std::to_string(number) + ": " + corrupt.what());
    }
  }

  // Collection removes nothing while something that a root reaches is damaged.
  void CheckCollection() {
    const auto isReached = [this](const Tampering& change) {
      return change.name.empty() ? m_space.IsReachable(change.oid)
                                 : change.table == NamedTable::kRoots || (change.table == NamedTable::kInfo && change.name != "format");
    };
    const bool mustRefuse = !m_damage->isForged && std::any_of(m_damage->changes.begin(), m_damage->changes.end(), isReached);
    try {
      Collect(m_space.space(), {.dryRun = true});
      if (mustRefuse) Fault("it would be collected");
    } catch (const StoreError& error) {
      if (!mustRefuse && !m_damage->isForged) Fault(std::string("collection is refused: ") + error.what());
    }
  }

  // What is salvaged is sound, and with `mustMatch`, everything but the entries of damaged leaves.
  void CheckSalvage(bool mustMatch) {
    Count("salvages");
    const auto rescued = CSpace::Open("memory:");
    const SalvageReport report = Salvage(*m_space.engine().OpenSnapshot(), *rescued);
    Snapshot snapshot(*rescued);
    const VerifyReport verified = VerifySpace(snapshot);
    if (!verified.findings.empty()) Fault("what was salvaged is not sound: " + verified.findings.front().fault);
    if (!mustMatch) return;
    if (report.losses.empty()) Fault("salvage lists no loss");
    std::uint64_t kept = 0;
    for (const DamagedSpace::Map& map : m_space.maps()) {
      for (const auto& [number, entry] : map.entries) kept += IsDamaged(entry.way.back()) ? 0 : 1;
    }
    if (report.entries < kept) Fault("salvage has " + std::to_string(report.entries) + " entries of " + std::to_string(kept));
    for (const DamagedSpace::Map& map : m_space.maps()) CheckRescued(snapshot, map);
  }

  // Every entry that is there is one that was.
  void CheckRescued(Snapshot& snapshot, const DamagedSpace::Map& known) {
    if (!snapshot.HasRoot(known.name)) return;  // its name is lost, and what it held has another
    const ptr<IPersistable> object = snapshot.RootMap(known.name);
    CompareRescued<TombstonesMap>(object, known);
    CompareRescued<InsertionsMap>(object, known);
    CompareRescued<HistoriesMap>(object, known);
  }

  template <class M>
  void CompareRescued(ptr<IPersistable> object, const DamagedSpace::Map& known) {
    if (object.Table() != IPersistable::Stubs<M>::GetTable()) return;
    for (const auto& [key, payload] : *static_cast<const M*>(object.m_self)) {
      const auto found = known.entries.find(NumberOf(key));
      if (found == known.entries.end() || found->second.number != PayloadNumber<typename M::Payload>::Number(payload)) {
        return Fault("salvaged map \"" + known.name + "\" has an entry that was never there: " + FieldIdText(key));
      }
    }
  }

  const DamageOptions& m_options;
  std::mt19937_64 m_random;
  DamagedSpace m_space;
  Verdict m_verdict;
  const Damage* m_damage = nullptr;
};

}  // namespace

Verdict RunDamage(const DamageOptions& options) { return Campaign(options).Run(); }

}  // namespace vemo::campaign
