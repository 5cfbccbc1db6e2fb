#include <algorithm>
#include <unordered_map>
#include <unordered_set>
#include <vector>

#include "history/recorder.h"
#include "history/replay.h"
#include "platform/error.h"
#include "store/snapshot.h"

namespace vemo {

namespace {

// The elements of one site by operation number: element i lies at ends[i-1] .. ends[i] of the text.
struct SiteTexts {
  ssize_t start = 0;
  std::string text;
  std::vector<std::uint64_t> ends;

  // Nothing where the number is not the site's or deleted something.
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
  TextCollector(const Snapshot& snapshot, std::string prefix)
      : m_snapshot(snapshot), m_prefix(std::move(prefix)) {}

  void OnSite(const Guid& site, std::string_view) override {
    const auto start = m_snapshot.Meta(m_prefix + "start/" + GuidText(site));
    m_texts[site].start = start ? std::stol(*start) : 0;
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
  }

  const SiteTexts* TextsOf(const Guid& site) const {
    const auto found = m_texts.find(site);
    return found == m_texts.end() ? nullptr : &found->second;
  }
  const std::unordered_set<FieldId, FieldIdHash>& Fields() const { return m_fields; }

 private:
  const Snapshot& m_snapshot;
  std::string m_prefix;
  std::unordered_map<Guid, SiteTexts, GuidHash> m_texts;
  std::unordered_set<FieldId, FieldIdHash> m_fields;
};

// The live elements of a field, one after another.
std::string Rebuild(const TextCollector& texts, const VectorInsertions& insertions,
                    const VectorTombstones* tombstones) {
  std::string content;
  ssize_t next = 0;  // the tombstone run at or behind q
  const ssize_t runs = tombstones == nullptr ? 0 : tombstones->m_tombstones.size();
  for (const auto* run = insertions.m_c.m_first; run != nullptr; run = run->m_next) {
    const SiteTexts* site = texts.TextsOf(run->m_opid.s);
    for (ssize_t i = 0; i < run->m_n; ++i) {
      const ssize_t q = run->m_q + i;
      while (next < runs && tombstones->m_tombstones[next].t2 <= q) ++next;
      const bool isTombstone = next < runs && tombstones->m_tombstones[next].t1 <= q;
      if (!isTombstone && site != nullptr) content += site->Element(run->m_opid.t + i);
    }
  }
  return content;
}

std::string Excerpt(const std::string& text, std::size_t at) {
  std::string excerpt;
  for (const char c : text.substr(at, 24)) excerpt += c >= ' ' && c <= '~' ? c : '?';
  return at >= text.size() ? "its end" : "\"" + excerpt + "\"";
}

std::string Difference(const FinalContent& expected, const std::string& rebuilt) {
  const auto differs =
      std::mismatch(expected.bytes.begin(), expected.bytes.end(), rebuilt.begin(), rebuilt.end());
  const auto at = static_cast<std::size_t>(differs.first - expected.bytes.begin());
  const auto line = 1 + std::count(expected.bytes.begin(), differs.first, '\n');
  return "field " + FieldIdText(expected.field) + " (" + expected.label + ") differs at byte " +
         std::to_string(at) + ", line " + std::to_string(line) + ": the source has " +
         Excerpt(expected.bytes, at) + ", the maps give " + Excerpt(rebuilt, at);
}

}  // namespace

std::optional<std::string> CheckReplay(CSpace& space, EditSource& source) {
  Snapshot snapshot(space);
  const auto& insertions = snapshot.Root<FieldIdToVectorInsertionsMap>(kInsertionsRoot);
  const auto& tombstones = snapshot.Root<FieldIdToVectorTombstonesMap>(kTombstonesRoot);
  TextCollector texts(snapshot, ReplayMetaPrefix(source));
  source.Replay(texts);

  const auto rebuild = [&](const FieldId& field) {
    const VectorInsertions* stored = insertions.rFind(field);
    return stored == nullptr ? std::string() : Rebuild(texts, *stored, tombstones.rFind(field));
  };
  std::optional<std::string> difference;
  std::unordered_set<FieldId, FieldIdHash> compared;
  source.ForEachFinalContent([&](const FinalContent& expected) {
    compared.insert(expected.field);
    const std::string rebuilt = rebuild(expected.field);
    if (!difference && rebuilt != expected.bytes) difference = Difference(expected, rebuilt);
  });
  for (const FieldId& field : texts.Fields()) {
    if (difference || compared.contains(field)) continue;
    const std::string rebuilt = rebuild(field);
    if (!rebuilt.empty()) difference = Difference({field, "deleted in the source", ""}, rebuilt);
  }
  return difference;
}

}  // namespace vemo
