#include <algorithm>
#include <unordered_map>
#include <unordered_set>
#include <vector>

#include "history/meta_number.h"
#include "history/recorder.h"
#include "history/replay.h"
#include "platform/error.h"
#include "store/scan.h"
#include "store/snapshot.h"
#include "vxUtils/ByteForms.h"

namespace vemo {

namespace {

// The elements of one site by operation number: element i lies at ends[i-1] .. ends[i] of the text.
struct SiteTexts {
  ssize_t start = 0;
  std::string text;
  std::vector<std::uint64_t> ends;

  // Nothing where the site has not inserted an element with that number.
  std::string_view Element(ssize_t number) const {
    const ssize_t i = number - start;
    if (i < 0 || i >= static_cast<ssize_t>(ends.size())) return {};
    const std::uint64_t begin = i == 0 ? 0 : ends[static_cast<std::size_t>(i) - 1];
    return std::string_view(text).substr(begin, ends[static_cast<std::size_t>(i)] - begin);
  }
};

// Numbers the source's elements as the recorder did.
class TextCollector : public EditVisitor {
 public:
  TextCollector(const Snapshot& snapshot, std::string prefix,
                const std::function<void(std::uint64_t editsRead)>& progress)
      : m_snapshot(snapshot), m_prefix(std::move(prefix)), m_progress(progress) {}

  void OnSite(const Guid& site, std::string_view) override {
    const std::string name = m_prefix + "start/" + GuidText(site);
    const auto start = m_snapshot.Meta(name);
    m_texts[site].start = start ? static_cast<ssize_t>(ParseMetaNumber(name, *start)) : 0;
  }
  void OnObject(OID, std::string_view) override {}
  void OnCommit(const Commit&) override {}
  void OnEdit(const Edit& edit) override {
    SiteTexts& texts = m_texts[edit.site];
    for (ssize_t i = 0; i < edit.deleted; ++i) texts.ends.push_back(texts.text.size());
    for (const std::string_view element : edit.inserted) {
      texts.text += element;
      texts.ends.push_back(texts.text.size());
    }
    m_fields.insert(edit.field);
    ++m_editsRead;
    if (m_progress) m_progress(m_editsRead);
  }

  const SiteTexts* TextsOf(const Guid& site) const {
    const auto found = m_texts.find(site);
    return found == m_texts.end() ? nullptr : &found->second;
  }
  const std::unordered_set<FieldId, FieldIdHash>& Fields() const { return m_fields; }

 private:
  const Snapshot& m_snapshot;
  std::string m_prefix;
  const std::function<void(std::uint64_t editsRead)>& m_progress;
  std::uint64_t m_editsRead = 0;
  std::unordered_map<Guid, SiteTexts, GuidHash> m_texts;
  std::unordered_set<FieldId, FieldIdHash> m_fields;
};

struct Rebuilt {
  std::string content;   // the live elements one after another
  std::string stranger;  // the first live element that the source has not inserted, for messages
};

Rebuilt Rebuild(const TextCollector& texts, const VectorInsertions& insertions,
                const VectorTombstones* tombstones) {
  Rebuilt rebuilt;
  ssize_t next = 0;  // the tombstone run at or behind q
  const ssize_t runs = tombstones == nullptr ? 0 : tombstones->m_tombstones.size();
  for (const auto* run = insertions.m_c.m_first; run != nullptr; run = run->m_next) {
    const SiteTexts* site = texts.TextsOf(run->m_opid.s);
    for (ssize_t i = 0; i < run->m_n; ++i) {
      const ssize_t q = run->m_q + i;
      while (next < runs && tombstones->m_tombstones[next].t2 <= q) ++next;
      const bool isTombstone = next < runs && tombstones->m_tombstones[next].t1 <= q;
      if (isTombstone) continue;
      const Opid opid{run->m_opid.s, run->m_opid.t + i};
      const std::string_view element = site == nullptr ? std::string_view() : site->Element(opid.t);
      rebuilt.content += element;
      if (element.empty() && rebuilt.stranger.empty())
        rebuilt.stranger = "element " + ToText(opid) + " at " + std::to_string(q);
    }
  }
  return rebuilt;
}

std::string Excerpt(const std::string& text, std::size_t at) {
  std::string excerpt;
  for (const char c : text.substr(at, 24)) excerpt += c >= ' ' && c <= '~' ? c : '?';
  return at >= text.size() ? "its end" : "\"" + excerpt + "\"";
}

// How the maps differ from what the source says of a field, or nothing.
std::optional<std::string> Difference(const FinalContent& expected, const Rebuilt& rebuilt) {
  const std::string field = "field " + FieldIdText(expected.field) + " (" + expected.label + ")";
  if (rebuilt.content == expected.bytes) {
    if (rebuilt.stranger.empty()) return std::nullopt;
    return field + " differs: " + rebuilt.stranger + " is none that the source inserted";
  }
  const auto differs = std::mismatch(expected.bytes.begin(), expected.bytes.end(), rebuilt.content.begin(),
                                     rebuilt.content.end());
  const auto at = static_cast<std::size_t>(differs.first - expected.bytes.begin());
  const auto line = 1 + std::count(expected.bytes.begin(), differs.first, '\n');
  return field + " differs at byte " + std::to_string(at) + ", line " + std::to_string(line) +
         ": the source has " + Excerpt(expected.bytes, at) + ", the maps give " +
         Excerpt(rebuilt.content, at);
}

}  // namespace

std::optional<std::string> CheckReplay(CSpace& space, EditSource& source,
                                       const std::function<void(std::uint64_t editsRead)>& progress) {
  Snapshot snapshot(space);
  const auto& insertions = snapshot.Root<FieldIdToVectorInsertionsMap>(kInsertionsRoot);
  const auto& tombstones = snapshot.Root<FieldIdToVectorTombstonesMap>(kTombstonesRoot);
  TextCollector texts(snapshot, ReplayMetaPrefix(source), progress);
  source.Replay(texts);

  const auto compare = [&](const FinalContent& expected) {
    snapshot.Trim();  // nothing of the field before is looked at any more
    const VectorInsertions* stored = insertions.rFind(expected.field);
    return Difference(
        expected, stored == nullptr ? Rebuilt() : Rebuild(texts, *stored, tombstones.rFind(expected.field)));
  };
  std::optional<std::string> difference;
  std::unordered_set<FieldId, FieldIdHash> compared;
  source.ForEachFinalContent([&](const FinalContent& expected) {
    compared.insert(expected.field);
    if (!difference) difference = compare(expected);
  });
  for (const FieldId& field : texts.Fields()) {
    if (difference) return difference;
    if (!compared.contains(field)) difference = compare({field, "deleted in the source", ""});
  }
  if (source.OnlyField()) return difference;
  // A repository has the space to itself.
  ScanMap(snapshot, insertions, FieldId(), [&](const FieldId& field, const auto&) {
    if (!difference && !texts.Fields().contains(field))
      difference = "field " + FieldIdText(field) + " is in the maps, but not in the source";
    return !difference;
  });
  return difference;
}

}  // namespace vemo
