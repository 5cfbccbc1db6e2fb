#include "history/git_log_parser.h"

#include <algorithm>
#include <charconv>
#include <optional>

#include "history/git_quoting.h"
#include "history/source_error.h"

namespace vemo {

namespace {

[[noreturn]] void ThrowNotUnderstood(std::string_view line) {
  constexpr std::size_t kShown = 200;
  throw SourceError("git printed a line that cannot be understood: " + std::string(line.substr(0, kShown)));
}

bool TakePrefix(std::string_view& text, std::string_view prefix) {
  if (!text.starts_with(prefix)) return false;
  text.remove_prefix(prefix.size());
  return true;
}

std::optional<std::uint64_t> TakeNumber(std::string_view& text) {
  std::uint64_t number = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (error != std::errc()) return std::nullopt;
  text.remove_prefix(static_cast<std::size_t>(end - text.data()));
  return number;
}

struct LineRange {
  std::uint64_t first;
  std::uint64_t count;
};

// Reads "FIRST,COUNT" or "FIRST", which means one line.
std::optional<LineRange> TakeRange(std::string_view& text) {
  const std::optional<std::uint64_t> first = TakeNumber(text);
  if (!first) return std::nullopt;
  if (!TakePrefix(text, ",")) return LineRange{*first, 1};
  const std::optional<std::uint64_t> count = TakeNumber(text);
  if (!count) return std::nullopt;
  return LineRange{*first, *count};
}

bool IsCommitId(std::string_view id) {
  return (id.size() == 40 || id.size() == 64) &&
         id.find_first_not_of("0123456789abcdef") == std::string_view::npos;
}

}  // namespace

void GitLogParser::Line(std::string_view line) {
  if (IsInHunk()) {
    ContentLine(line);
  } else if (m_hasHunk && line.starts_with('\\')) {
    if (m_lastWasInserted) DropLastLineFeed();
  } else {
    ReportHunk();
    HeaderLine(line);
  }
}

void GitLogParser::End() {
  if (IsInHunk()) throw SourceError("the output of git ends inside a hunk of " + m_path);
  ReportHunk();
  ReportFile();
}

void GitLogParser::ContentLine(std::string_view line) {
  if (m_deletedToCome != 0 && line.starts_with('-')) {
    --m_deletedToCome;
    m_lastWasInserted = false;
  } else if (m_deletedToCome == 0 && m_insertedToCome != 0 && line.starts_with('+')) {
    --m_insertedToCome;
    m_lastWasInserted = true;
    m_text.append(line.substr(1)).push_back('\n');
    m_ends.push_back(m_text.size());
  } else if (m_deletedToCome != 0 || m_lastWasInserted || !line.starts_with('\\')) {
    // The mark of a missing line feed can stand here only between the last deleted and the first inserted
    // line.
    ThrowNotUnderstood(line);
  }
}

void GitLogParser::HeaderLine(std::string_view line) {
  std::string_view rest = line;
  if (TakePrefix(rest, "commit ")) return StartCommit(rest);
  if (TakePrefix(rest, "diff --git ")) return StartFile(rest);
  if (line.empty()) return;
  if (!m_hasFile) ThrowNotUnderstood(line);
  if (TakePrefix(rest, "new file mode ") || TakePrefix(rest, "deleted file mode ") ||
      TakePrefix(rest, "old mode ") || TakePrefix(rest, "new mode ")) {
    SetMode(rest);
  } else if (TakePrefix(rest, "index ")) {
    const std::size_t space = rest.find(' ');
    if (space != std::string_view::npos) SetMode(rest.substr(space + 1));
  } else if (TakePrefix(rest, "Binary files ")) {
    ReportFile();
    m_visitor.OnLogBinary();
  } else if (TakePrefix(rest, "@@ ")) {
    StartHunk(rest);
  } else if (!TakePrefix(rest, "--- ") && !TakePrefix(rest, "+++ ")) {
    ThrowNotUnderstood(line);
  }
}

void GitLogParser::StartCommit(std::string_view rest) {
  ReportFile();
  m_hasFile = false;
  const std::size_t space = rest.find(' ');
  const std::string_view id = rest.substr(0, space);
  if (space == std::string_view::npos || !IsCommitId(id)) ThrowNotUnderstood(rest);
  m_visitor.OnLogCommit(id, rest.substr(space + 1));
}

void GitLogParser::StartFile(std::string_view paths) {
  ReportFile();
  m_path = PathOfDiffLine(paths);
  m_hasFile = true;
  m_fileReported = false;
  m_hasMode = false;
}

void GitLogParser::SetMode(std::string_view mode) {
  if (mode.starts_with("100")) {
    m_kind = GitFileKind::kRegular;
  } else if (mode == "120000") {
    m_kind = GitFileKind::kSymlink;
  } else if (mode == "160000") {
    m_kind = GitFileKind::kSubmodule;
  } else {
    throw SourceError("git printed an unknown file mode for " + m_path + ": " + std::string(mode));
  }
  m_hasMode = true;
}

void GitLogParser::DropLastLineFeed() {
  m_text.pop_back();
  --m_ends.back();
  m_lastWasInserted = false;
}

// Tells the visitor about the file, if it does not know yet: its mode is known when the last header line was
// read.
void GitLogParser::ReportFile() {
  if (!m_hasFile || m_fileReported) return;
  if (!m_hasMode) throw SourceError("git printed no file mode for " + m_path);
  m_fileReported = true;
  m_visitor.OnLogFile(m_path, m_kind);
}

void GitLogParser::StartHunk(std::string_view ranges) {
  ReportFile();
  std::string_view rest = ranges;
  std::optional<LineRange> deleted, inserted;
  if (TakePrefix(rest, "-")) deleted = TakeRange(rest);
  if (TakePrefix(rest, " +")) inserted = TakeRange(rest);
  if (!deleted || !inserted || !rest.starts_with(" @@") || (inserted->count != 0 && inserted->first == 0)) {
    ThrowNotUnderstood(ranges);
  }
  // Without inserted lines git names the line before the hunk, otherwise the first inserted one, counting
  // from 1.
  m_hunk.position = static_cast<ssize_t>(inserted->count != 0 ? inserted->first - 1 : inserted->first);
  m_hunk.deleted = static_cast<ssize_t>(deleted->count);
  m_deletedToCome = deleted->count;
  m_insertedToCome = inserted->count;
  m_hasHunk = true;
  m_lastWasInserted = false;
  m_text.clear();
  m_ends.clear();
}

void GitLogParser::ReportHunk() {
  if (!m_hasHunk) return;
  m_hasHunk = false;
  m_lines.clear();
  std::size_t begin = 0;
  for (const std::size_t end : m_ends) {
    m_lines.push_back(std::string_view(m_text).substr(begin, end - begin));
    begin = end;
  }
  m_hunk.inserted = m_lines;
  m_visitor.OnLogHunk(m_hunk);
}

}  // namespace vemo
