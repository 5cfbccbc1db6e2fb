#include "scripted_source.h"

#include <algorithm>
#include <random>
#include <set>

#include "recorded_fields.h"

namespace vemo::test {

ScriptedSource& ScriptedSource::Insert(char site, const FieldId& field, ssize_t position,
                                       const std::string& text) {
  std::string& content = contents[field];
  if (position >= 0 && position <= static_cast<ssize_t>(content.size()))
    content.insert(static_cast<std::size_t>(position), text);
  m_steps.push_back({Kind::kEdit, site, field, position, 0, text});
  return *this;
}

ScriptedSource& ScriptedSource::Delete(char site, const FieldId& field, ssize_t position, ssize_t n) {
  contents[field].erase(static_cast<std::size_t>(position), static_cast<std::size_t>(n));
  m_steps.push_back({Kind::kEdit, site, field, position, n, ""});
  return *this;
}

ScriptedSource& ScriptedSource::CommitBy(char site, const std::string& id) {
  m_steps.push_back({Kind::kCommit, site, {}, 0, 0, id});
  return *this;
}

ScriptedSource& ScriptedSource::Object(std::uint64_t object, const std::string& path) {
  m_steps.push_back({Kind::kObject, 0, Field(object), 0, 0, path});
  return *this;
}

ScriptedSource& ScriptedSource::DeleteFile(const FieldId& field) {
  contents.erase(field);
  return *this;
}

namespace {

std::string RandomText(std::mt19937_64& random) {
  std::string text(1 + random() % 5, ' ');
  for (char& c : text) c = static_cast<char>('a' + random() % 26);
  return text;
}

void AddRandomEdit(ScriptedSource& source, std::mt19937_64& random, char site, const FieldId& field) {
  const auto length = static_cast<ssize_t>(source.contents[field].size());
  const auto position = static_cast<ssize_t>(random() % static_cast<std::uint64_t>(length + 1));
  if (position < length && random() % 3 == 0) {
    const auto n = 1 + static_cast<ssize_t>(random() % 4);
    source.Delete(site, field, position, std::min(n, length - position));
  } else {
    source.Insert(site, field, position, RandomText(random));
  }
}

}  // namespace

ScriptedSource ScriptedSource::Random(std::uint64_t seed, int edits, int sites, int fields) {
  std::mt19937_64 random(seed);
  ScriptedSource source;
  std::set<std::uint64_t> known;
  for (int i = 0; i < edits; ++i) {
    const char site = static_cast<char>('A' + random() % static_cast<std::uint64_t>(sites));
    const std::uint64_t object = 1 + random() % static_cast<std::uint64_t>(fields);
    if (random() % 3 == 0) source.CommitBy(site, "c0ffee" + std::to_string(i));
    if (known.insert(object).second) source.Object(object, "file " + std::to_string(object));
    AddRandomEdit(source, random, site, Field(object));
  }
  source.CommitBy('A', "e0f").Object(static_cast<std::uint64_t>(fields) + 1, "empty file");
  return source;
}

ScriptedSource ScriptedSource::RandomRecording(std::uint64_t seed, int edits, const FieldId& field) {
  std::mt19937_64 random(seed);
  ScriptedSource source(field);
  for (int i = 0; i < edits; ++i) AddRandomEdit(source, random, 'A', field);
  return source;
}

std::uint64_t ScriptedSource::CountEdits() {
  return static_cast<std::uint64_t>(std::count_if(m_steps.begin(), m_steps.end(),
                                                  [](const Step& step) { return step.kind == Kind::kEdit; }));
}

void ScriptedSource::Visit(const Step& step, EditVisitor& visitor) {
  if (step.kind == Kind::kObject) return visitor.OnObject(step.field.oid, step.text);
  const std::string author = AuthorOf(step.site);
  if (step.kind == Kind::kCommit) return visitor.OnCommit({step.text, author, Site(step.site)});
  std::vector<std::string_view> inserted;
  for (std::size_t i = 0; i < step.text.size(); ++i)
    inserted.push_back(std::string_view(step.text).substr(i, 1));
  visitor.OnEdit({Site(step.site), step.field, step.position, step.deleted, inserted});
}

void ScriptedSource::Replay(EditVisitor& visitor) {
  std::set<char> introduced;
  std::uint64_t index = 0;
  for (const Step& step : m_steps) {
    if (step.kind == Kind::kEdit) {
      if (beforeEdit) beforeEdit(index);
      ++index;
      if (introduced.insert(step.site).second) visitor.OnSite(Site(step.site), AuthorOf(step.site));
    }
    Visit(step, visitor);
  }
}

void ScriptedSource::ForEachFinalContent(const std::function<void(const FinalContent&)>& visit) {
  for (const auto& [field, text] : contents) visit({field, "text " + FieldIdText(field), text});
}

}  // namespace vemo::test
