// Reads what `git log -p --unified=0` prints, line by line.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "platform/types.h"

namespace vemo {

enum class GitFileKind { kRegular, kSymlink, kSubmodule };

// What one hunk does to a file whose earlier hunks of the commit are done: it deletes lines, then inserts
// lines at the same place.
struct GitHunk {
  ssize_t position = 0;  // the number of lines before it
  ssize_t deleted = 0;
  std::span<const std::string_view> inserted;  // each with its line feed, if it has one
};

// Receives what the parser finds, in the order of the log. Views are valid during the call.
class GitLogVisitor {
 public:
  virtual ~GitLogVisitor() = default;
  virtual void OnLogCommit(std::string_view id, std::string_view author) = 0;
  // A file that the commit creates, changes or deletes, or whose mode it changes. A regular file that becomes
  // a symbolic link, or the like, is two: one deleted, one created. The calls below are about the last file.
  virtual void OnLogFile(std::string_view path, GitFileKind kind) = 0;
  virtual void OnLogBinary() = 0;  // git calls the file binary here
  virtual void OnLogHunk(const GitHunk& hunk) = 0;
};

// The lines are those of the log command of git_commands.h:
//
//   commit ID AUTHOR
//                                            a blank line, where the commit changes anything
//   diff --git a/PATH b/PATH                 both quoted as C strings where there are unusual characters
//   new file mode 100644                     some of these, one of which tells the mode
//   index ID..ID 100644
//   Binary files a/PATH and b/PATH differ    this, or those that follow, or nothing (a file without content)
//   --- a/PATH
//   +++ b/PATH
//   @@ -LINE,COUNT +LINE,COUNT @@ TEXT       a count of 1 is left out
//   -TEXT                                    as many as the first count
//   +TEXT                                    as many as the second count
//   \ No newline at end of file              behind a line that has none
//
// A hunk's header says how many lines of content follow. That many are taken as content, whatever they look
// like.
class GitLogParser {
 public:
  explicit GitLogParser(GitLogVisitor& visitor) : m_visitor(visitor) {}

  // Takes the next line, without its line feed. Throws SourceError where it is none of the above.
  void Line(std::string_view line);

  // Tells that there are no more lines. Throws SourceError where the last hunk is not complete.
  void End();

 private:
  bool IsInHunk() const noexcept { return m_deletedToCome != 0 || m_insertedToCome != 0; }
  void ContentLine(std::string_view line);
  void HeaderLine(std::string_view line);
  void StartCommit(std::string_view rest);
  void StartFile(std::string_view paths);
  void SetMode(std::string_view mode);
  void ReportFile();
  void StartHunk(std::string_view ranges);
  void ReportHunk();
  void DropLastLineFeed();

  GitLogVisitor& m_visitor;

  std::string m_path;
  bool m_hasFile = false;       // a "diff --git" line was read since the last commit line
  bool m_fileReported = false;  // and the visitor knows of it
  bool m_hasMode = false;
  GitFileKind m_kind = GitFileKind::kRegular;

  // The hunk being read; its inserted lines lie one behind another in m_text, m_ends tells where each ends.
  bool m_hasHunk = false;
  bool m_lastWasInserted = false;
  GitHunk m_hunk;
  std::uint64_t m_deletedToCome = 0;
  std::uint64_t m_insertedToCome = 0;
  std::string m_text;
  std::vector<std::size_t> m_ends;
  std::vector<std::string_view> m_lines;
};

}  // namespace vemo
