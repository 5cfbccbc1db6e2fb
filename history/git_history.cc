#include "history/git_history.h"

#include <utility>

#include "history/site.h"
#include "history/source_error.h"

namespace vemo {

namespace {

// What git calls binary can change with the working tree's .gitattributes, for one.
[[noreturn]] void ThrowChanged() {
  throw SourceError("the repository changed while its history was read: try again");
}

}  // namespace

FieldId FieldOfGitObject(OID object) {
  return FieldId{object, Path{0}};
}

void GitHistoryScan::OnLogCommit(std::string_view, std::string_view) {}

void GitHistoryScan::OnLogFile(std::string_view path, GitFileKind kind) {
  m_file = nullptr;
  if (kind == GitFileKind::kSymlink) m_symlinks.emplace(path);
  if (kind == GitFileKind::kSubmodule) m_submodules.emplace(path);
  if (kind != GitFileKind::kRegular) return;
  const auto [entry, isNew] = m_history.files.try_emplace(std::string(path));
  m_file = &entry->second;
  if (isNew) m_byAppearance.push_back(m_file);
}

void GitHistoryScan::OnLogBinary() {
  if (m_file != nullptr) m_file->isBinary = true;
}

void GitHistoryScan::OnLogHunk(const GitHunk& hunk) {
  if (m_file == nullptr) return;
  if (hunk.deleted != 0) ++m_file->edits;
  if (!hunk.inserted.empty()) ++m_file->edits;
}

GitHistory GitHistoryScan::Take() {
  std::uint64_t lastObject = 0;
  for (GitHistoryFile* file : m_byAppearance) {
    if (file->isBinary) {
      ++m_history.skipped.binary;
    } else {
      file->object = OID(++lastObject);
      m_history.edits += file->edits;
    }
  }
  m_history.skipped.symlinks = m_symlinks.size();
  m_history.skipped.submodules = m_submodules.size();
  return std::move(m_history);
}

void GitHistoryReplay::OnLogCommit(std::string_view id, std::string_view author) {
  m_author = author;
  const auto known = m_sites.find(m_author);
  m_site = known != m_sites.end() ? known->second : SiteOfAuthor(author);
  m_visitor.OnCommit(Commit{id, author, m_site});
}

void GitHistoryReplay::OnLogFile(std::string_view path, GitFileKind kind) {
  m_object = OID();
  if (kind != GitFileKind::kRegular) return;
  const auto file = m_history.files.find(path);
  if (file == m_history.files.end()) ThrowChanged();
  m_object = file->second.object;
  if (!m_object.IsNull() && m_objects.insert(m_object).second) m_visitor.OnObject(m_object, path);
}

void GitHistoryReplay::OnLogBinary() {
  if (!m_object.IsNull()) ThrowChanged();
}

void GitHistoryReplay::OnLogHunk(const GitHunk& hunk) {
  if (m_object.IsNull()) return;
  Edit edit;
  edit.site = m_site;
  edit.field = FieldOfGitObject(m_object);
  edit.position = hunk.position;
  edit.deleted = hunk.deleted;
  if (edit.deleted != 0) ReportEdit(edit);
  edit.deleted = 0;
  edit.inserted = hunk.inserted;
  if (!edit.inserted.empty()) ReportEdit(edit);
}

void GitHistoryReplay::ReportEdit(const Edit& edit) {
  if (m_sites.try_emplace(m_author, m_site).second) m_visitor.OnSite(m_site, m_author);
  ++m_edits;
  m_visitor.OnEdit(edit);
}

void GitHistoryReplay::CheckComplete() const {
  if (m_edits != m_history.edits) ThrowChanged();
}

}  // namespace vemo
