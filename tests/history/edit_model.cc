#include "edit_model.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <set>

#include "history/site.h"
#include "history/source_error.h"

namespace vemo::test {

void GapSequence::MoveGapTo(std::size_t position) {
  while (m_before.size() > position) {
    m_after.push_back(std::move(m_before.back()));
    m_before.pop_back();
  }
  while (m_before.size() < position) {
    m_before.push_back(std::move(m_after.back()));
    m_after.pop_back();
  }
}

void GapSequence::Delete(std::size_t position, std::size_t count) {
  MoveGapTo(position);
  m_after.resize(m_after.size() - count);
}

void GapSequence::Insert(std::size_t position, std::span<const std::string_view> elements) {
  MoveGapTo(position);
  m_before.insert(m_before.end(), elements.begin(), elements.end());
}

std::vector<std::string> GapSequence::Elements() const {
  std::vector<std::string> elements = m_before;
  elements.insert(elements.end(), m_after.rbegin(), m_after.rend());
  return elements;
}

std::string GapSequence::Joined() const {
  std::string joined;
  for (const std::string& element : Elements()) joined += element;
  return joined;
}

void EditModel::OnSite(const Guid& site, std::string_view author) {
  EXPECT_EQ(GuidText(site), GuidText(SiteOfAuthor(author)));
  for (const Author& known : authors) EXPECT_NE(known.text, author) << "a site was reported twice";
  authors.push_back({site, std::string(author)});
}

void EditModel::OnObject(OID object, std::string_view path) {
  paths.emplace_back(path);
  EXPECT_EQ(object.m_value, paths.size()) << "objects are numbered in the order of their appearance";
  fields[FieldId{object, Path{0}}];
}

void EditModel::OnCommit(const Commit& commit) {
  EXPECT_EQ(GuidText(commit.site), GuidText(SiteOfAuthor(commit.author)));
  commits.emplace_back(commit.author);
  commitIds.emplace_back(commit.id);
}

void EditModel::OnEdit(const Edit& edit) {
  ++edits;
  EXPECT_NE(edit.deleted != 0, !edit.inserted.empty()) << "an edit is one deletion or one insertion";
  EXPECT_TRUE(std::any_of(authors.begin(), authors.end(), [&](const Author& a) {
    return a.site == edit.site;
  })) << "an edit of a site that was not reported";
  const std::string what =
      FieldIdText(edit.field) + " @" + std::to_string(edit.position) +
      (edit.deleted != 0 ? " -" + std::to_string(edit.deleted) : " +" + std::to_string(edit.inserted.size()));
  log.push_back(what);
  GapSequence& field = fields[edit.field];
  const auto size = static_cast<ssize_t>(field.size());
  ASSERT_TRUE(0 <= edit.position && 0 <= edit.deleted && edit.position + edit.deleted <= size)
      << what << " in a sequence of " << size;
  const auto position = static_cast<std::size_t>(edit.position);
  field.Delete(position, static_cast<std::size_t>(edit.deleted));
  field.Insert(position, edit.inserted);
}

EditModel ReplayAndCheck(EditSource& source) {
  EditModel model, again;
  source.Replay(model);
  source.Replay(again);
  EXPECT_EQ(model.log, again.log);
  EXPECT_EQ(model.paths, again.paths);
  EXPECT_EQ(model.commitIds, again.commitIds);
  EXPECT_EQ(model.authors.size(), again.authors.size());
  EXPECT_EQ(source.CountEdits(), model.edits);
  std::set<FieldId> withContent;
  source.ForEachFinalContent([&](const FinalContent& content) {
    EXPECT_TRUE(withContent.insert(content.field).second) << content.label << " is reported twice";
    EXPECT_EQ(model.fields[content.field].Joined(), content.bytes) << content.label;
    EXPECT_EQ(again.fields[content.field].Joined(), content.bytes) << content.label;
  });
  for (const auto& [field, sequence] : model.fields) {
    const std::string content = withContent.contains(field) ? "" : sequence.Joined();
    EXPECT_EQ(content, "") << FieldIdText(field) << " of a deleted file";
  }
  return model;
}

std::string SourceErrorOf(const std::function<void()>& action) {
  try {
    action();
  } catch (const SourceError& error) {
    const std::string message = error.what();
    EXPECT_EQ(message.find('\n'), std::string::npos) << message;
    return message;
  }
  ADD_FAILURE() << "no SourceError was thrown";
  return {};
}

}  // namespace vemo::test
