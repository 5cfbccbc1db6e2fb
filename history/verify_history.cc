#include "history/verify_history.h"

#include <algorithm>
#include <map>

#include "history/recorder.h"
#include "history/replay.h"
#include "store/scan.h"
#include "vxUtils/ByteForms.h"

namespace vemo {

namespace {

struct NumberRange {
  ssize_t first;
  ssize_t count;
  FieldId field;
};

class HistoryCheck {
 public:
  explicit HistoryCheck(Snapshot& snapshot)
      : m_snapshot(snapshot),
        m_insertions(snapshot.Root<FieldIdToVectorInsertionsMap>(kInsertionsRoot)),
        m_tombstones(snapshot.Root<FieldIdToVectorTombstonesMap>(kTombstonesRoot)),
        m_history(snapshot.Root<FieldIdToVectorInsertionsAndDeletionsMap>(kHistoryRoot)) {}

  std::vector<HistoryFinding> Run() {
    ForEach(m_insertions, [this](const FieldId& field, const auto& insertions) { CheckField(field, insertions); });
    ForEach(m_tombstones, [this](const FieldId& field, const auto&) { RequireInserted(field, "tombstones"); });
    ForEach(m_history, [this](const FieldId& field, const auto&) { RequireInserted(field, "a history"); });
    CheckNumbers();
    return std::move(m_findings);
  }

 private:
  template <class Map, class Check>
  void ForEach(const Map& map, const Check& check) {
    ScanMap(m_snapshot, map, FieldId(), [&check](const FieldId& field, const auto& payload) {
      check(field, payload);
      return true;
    });
  }

  void Expect(bool sound, const FieldId& field, const std::string& fault) {
    if (!sound) m_findings.push_back({field, fault});
  }

  void RequireInserted(const FieldId& field, const std::string& what) {
    Expect(m_insertions.contains(field), field, "it has " + what + ", but no insertions");
  }

  void CheckField(const FieldId& field, const VectorInsertions& insertions) {
    CheckInsertions(field, insertions);
    const VectorTombstones* tombstones = m_tombstones.rFind(field);
    const VectorInsertionsAndDeletions* history = m_history.rFind(field);
    Expect(tombstones != nullptr, field, "it has insertions, but no tombstones entry");
    Expect(history != nullptr, field, "it has insertions, but no history");
    if (tombstones == nullptr || history == nullptr) return;
    // By bytes: the payloads' own equality leaves counts out.
    Expect(ToBytes(history->m_insertions) == ToBytes(insertions), field,
           "insertions and history tell different insertions");
    CheckDeletions(field, history->m_deletions, *tombstones, insertions.m_u2);
  }

  void CheckInsertions(const FieldId& field, const VectorInsertions& insertions) {
    ssize_t q = 0;
    for (const auto* run = insertions.m_c.m_first; run != nullptr; run = run->m_next) {
      const std::string where = "the inserted run at " + std::to_string(run->m_q);
      Expect(run->m_q == q, field, where + " should begin at " + std::to_string(q));
      Expect(run->m_n > 0, field, where + " is empty");
      Expect(run->m_u == run->m_opid.t + run->m_n - 1, field,
             where + " has another number for its last element");
      const auto* before = run->m_prev;
      Expect(before == nullptr || !(before->m_opid.s == run->m_opid.s && before->m_u + 1 == run->m_opid.t),
             field, where + " continues the one before it and should be part of it");
      q = run->m_q + run->m_n;
      m_numbers[GuidText(run->m_opid.s)].push_back({run->m_opid.t, run->m_n, field});
    }
    Expect(q == insertions.m_u2, field,
           "the inserted runs end at " + std::to_string(q) + ", not at the field's length " +
               std::to_string(insertions.m_u2));
  }

  // The deleted runs, merged where they touch, must be the tombstones.
  void CheckDeletions(const FieldId& field, const VectorDeletions& deletions,
                      const VectorTombstones& tombstones, ssize_t length) {
    IntervalList<ssize_t> deleted;
    const VectorDeletionInterval* before = nullptr;
    ssize_t end = 0;
    for (const auto* run = deletions.m_first; run != nullptr; run = run->m_next) {
      const std::string where = "the deleted run at " + std::to_string(run->m_q);
      const bool inOrder = run->m_n > 0 && run->m_q >= end;
      Expect(inOrder, field, where + " is empty or overlaps the one before it");
      if (!inOrder) return;
      const bool touches = before != nullptr && run->m_q == end;
      Expect(
          !touches || !(before->m_opid.s == run->m_opid.s && before->m_opid.t + before->m_n == run->m_opid.t),
          field, where + " continues the one before it and should be part of it");
      end = run->m_q + run->m_n;
      if (touches) {
        deleted[deleted.size() - 1].t2 = end;
      } else {
        deleted.safe_push_back({run->m_q, end});
      }
      m_numbers[GuidText(run->m_opid.s)].push_back({run->m_opid.t, run->m_n, field});
      before = run;
    }
    Expect(deleted == tombstones.m_tombstones, field, "the deleted runs are not the tombstones");
    Expect(end <= length, field, "a deleted run lies behind the end of the field");
  }

  // Every number of a site stands for one element.
  void CheckNumbers() {
    for (auto& [site, ranges] : m_numbers) {
      std::sort(ranges.begin(), ranges.end(), [](const auto& a, const auto& b) { return a.first < b.first; });
      const NumberRange* reaching = &ranges.front();  // of those so far, the one with the last number
      for (std::size_t i = 1; i < ranges.size(); ++i) {
        const NumberRange& range = ranges[i];
        Expect(reaching->first + reaching->count <= range.first, range.field,
               "site " + site + " has used number " + std::to_string(range.first) + " twice, also in field " +
                   FieldIdText(reaching->field));
        if (range.first + range.count > reaching->first + reaching->count) reaching = &range;
      }
    }
  }

  Snapshot& m_snapshot;
  const FieldIdToVectorInsertionsMap& m_insertions;
  const FieldIdToVectorTombstonesMap& m_tombstones;
  const FieldIdToVectorInsertionsAndDeletionsMap& m_history;
  std::vector<HistoryFinding> m_findings;
  std::map<std::string, std::vector<NumberRange>> m_numbers;  // by site
};

}  // namespace

bool HasHistory(const Snapshot& snapshot) {
  return snapshot.HasRoot(kInsertionsRoot) && snapshot.HasRoot(kTombstonesRoot) &&
         snapshot.HasRoot(kHistoryRoot);
}

std::vector<HistoryFinding> VerifyHistory(Snapshot& snapshot) {
  return HistoryCheck(snapshot).Run();
}

}  // namespace vemo
