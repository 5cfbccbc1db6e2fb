// The two passes over a git log: which files there are, then what happened to them.
#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <set>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "history/edit_source.h"
#include "history/git_log_parser.h"

namespace vemo {

// A path that was a regular file at some time.
struct GitHistoryFile {
  OID object;  // null where the file is skipped
  bool isBinary = false;
  std::uint64_t edits = 0;
};

struct GitHistory {
  std::map<std::string, GitHistoryFile, std::less<>> files;  // by path
  std::uint64_t edits = 0;                                   // those of the files that are not skipped
  SkippedFiles skipped;
};

FieldId FieldOfGitObject(OID object);

// The first pass. It comes to its end before the other one starts because a file may show in its last version
// that it is binary.
class GitHistoryScan : public GitLogVisitor {
 public:
  void OnLogCommit(std::string_view id, std::string_view author) override;
  void OnLogFile(std::string_view path, GitFileKind kind) override;
  void OnLogBinary() override;
  void OnLogHunk(const GitHunk& hunk) override;

  // Call once, after the log.
  GitHistory Take();

 private:
  GitHistory m_history;
  std::vector<GitHistoryFile*> m_byAppearance;
  std::set<std::string, std::less<>> m_symlinks;
  std::set<std::string, std::less<>> m_submodules;
  GitHistoryFile* m_file = nullptr;  // null where it is not a regular file
};

// The second pass, over the same log. Throws SourceError where the log is not the same.
class GitHistoryReplay : public GitLogVisitor {
 public:
  GitHistoryReplay(const GitHistory& history, EditVisitor& visitor)
      : m_history(history), m_visitor(visitor) {}

  void OnLogCommit(std::string_view id, std::string_view author) override;
  void OnLogFile(std::string_view path, GitFileKind kind) override;
  void OnLogBinary() override;
  void OnLogHunk(const GitHunk& hunk) override;

  // Call after the log.
  void CheckComplete() const;

 private:
  void ReportEdit(const Edit& edit);

  const GitHistory& m_history;
  EditVisitor& m_visitor;
  std::uint64_t m_edits = 0;
  std::set<OID> m_objects;                        // those that the visitor knows of
  OID m_object;                                   // null where the file is skipped
  std::unordered_map<std::string, Guid> m_sites;  // by author; those that the visitor knows of
  std::string m_author;
  Guid m_site;
};

}  // namespace vemo
