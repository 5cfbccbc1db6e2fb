#include <charconv>
#include <optional>
#include <utility>
#include <vector>

#include "history/edit_source.h"
#include "history/git_commands.h"
#include "history/git_history.h"
#include "history/git_log_parser.h"
#include "history/git_process.h"
#include "history/source_error.h"

namespace vemo {

namespace {

// The settings of diff drivers in the user's configuration that decide what is binary.
std::vector<std::string> BinarySettings(const std::filesystem::path& repository) {
  GitProcess git(ListBinarySettingsCommand(repository));
  std::vector<std::string> names;
  while (const auto name = git.ReadLine('\0')) {
    // On the command line the name would end at an equals sign.
    if (name->find('=') == std::string_view::npos) names.emplace_back(*name);
  }
  git.Wait();  // fails where there is no such setting
  return names;
}

struct TreeFile {
  std::string blob;
  std::string path;
  OID object;
};

// The size in the line "ID blob SIZE" that precedes a content.
std::optional<std::size_t> BlobSize(std::string_view header, std::string_view blob) {
  constexpr std::string_view kType = " blob ";
  if (!header.starts_with(blob) || !header.substr(blob.size()).starts_with(kType)) return std::nullopt;
  const std::string_view digits = header.substr(blob.size() + kType.size());
  std::size_t size = 0;
  const auto [end, error] = std::from_chars(digits.data(), digits.data() + digits.size(), size);
  if (error != std::errc() || end != digits.data() + digits.size()) return std::nullopt;
  return size;
}

using ScanProgress = std::function<void(std::uint64_t done, std::uint64_t of)>;

// The first pass, telling how many of `of` commits it has read.
class ReportingScan : public GitHistoryScan {
 public:
  ReportingScan(const ScanProgress& progress, std::uint64_t of) : m_progress(progress), m_of(of) {}
  void OnLogCommit(std::string_view id, std::string_view author) override {
    GitHistoryScan::OnLogCommit(id, author);
    if (m_progress) m_progress(++m_done, m_of);
  }

 private:
  const ScanProgress& m_progress;
  std::uint64_t m_of;
  std::uint64_t m_done = 0;
};

class GitSource : public EditSource {
 public:
  GitSource(std::filesystem::path repository, std::string commit)
      : m_repository(std::move(repository)),
        m_commit(std::move(commit)),
        m_binarySettings(BinarySettings(m_repository)) {}

  std::optional<FieldId> OnlyField() const override { return std::nullopt; }
  std::string Describe() const override {
    return "git repository " + m_repository.string() + " at " + m_commit;
  }
  void ReportScanTo(ScanProgress progress) override { m_scanProgress = std::move(progress); }
  std::uint64_t CountEdits() override { return History().edits; }
  SkippedFiles Skipped() override { return History().skipped; }

  void Replay(EditVisitor& visitor) override {
    GitHistoryReplay replay(History(), visitor);
    ReadLog(replay);
    replay.CheckComplete();
  }

  void ForEachFinalContent(const std::function<void(const FinalContent&)>& visit) override;

 private:
  const GitHistory& History();
  std::uint64_t CountCommits() const;
  void ReadLog(GitLogVisitor& visitor) const;
  std::vector<TreeFile> ListTextFiles();

  std::filesystem::path m_repository;
  std::string m_commit;
  std::vector<std::string> m_binarySettings;
  ScanProgress m_scanProgress;
  std::optional<GitHistory> m_history;  // after the first pass
};

const GitHistory& GitSource::History() {
  if (!m_history) {
    ReportingScan scan(m_scanProgress, m_scanProgress ? CountCommits() : 0);
    ReadLog(scan);
    m_history = scan.Take();
  }
  return *m_history;
}

std::uint64_t GitSource::CountCommits() const {
  GitProcess git(CountCommitsCommand(m_repository, m_commit));
  const std::string line(git.ReadLine().value_or(""));
  git.Finish();
  std::uint64_t commits = 0;
  if (std::from_chars(line.data(), line.data() + line.size(), commits).ec != std::errc()) {
    throw SourceError("git printed a count of commits that cannot be understood");
  }
  return commits;
}

void GitSource::ReadLog(GitLogVisitor& visitor) const {
  GitProcess git(LogCommand(m_repository, m_binarySettings, m_commit));
  GitLogParser parser(visitor);
  while (const auto line = git.ReadLine()) parser.Line(*line);
  git.Finish();
  parser.End();
}

std::vector<TreeFile> GitSource::ListTextFiles() {
  const GitHistory& history = History();
  GitProcess git(ListFilesCommand(m_repository, m_commit));
  std::vector<TreeFile> textFiles;
  while (const auto line = git.ReadLine('\0')) {
    const std::size_t tab = line->find('\t');
    const std::size_t id = line->rfind(' ', tab) + 1;
    if (tab == std::string_view::npos || id == 0)
      throw SourceError("git printed a file that cannot be understood");
    if (!line->starts_with("100")) continue;
    const std::string_view path = line->substr(tab + 1);
    const auto file = history.files.find(path);
    if (file == history.files.end()) throw SourceError("the history has no trace of " + std::string(path));
    if (file->second.object.IsNull()) continue;
    textFiles.push_back({std::string(line->substr(id, tab - id)), std::string(path), file->second.object});
  }
  git.Finish();
  return textFiles;
}

void GitSource::ForEachFinalContent(const std::function<void(const FinalContent&)>& visit) {
  const std::vector<TreeFile> textFiles = ListTextFiles();
  std::string blobs;
  for (const TreeFile& file : textFiles) blobs.append(file.blob).push_back('\n');
  GitProcess git(ReadBlobsCommand(m_repository), blobs);
  for (const TreeFile& file : textFiles) {
    const std::optional<std::string_view> header = git.ReadLine();
    if (!header) git.Finish();
    const std::optional<std::size_t> size = header ? BlobSize(*header, file.blob) : std::nullopt;
    if (!size) throw SourceError("git cannot read the content of " + file.path + " (" + file.blob + ")");
    FinalContent content{FieldOfGitObject(file.object), file.path, std::string(git.ReadBlock(*size))};
    if (content.bytes.size() != *size || git.ReadBlock(1) != "\n") {
      throw SourceError("git printed the content of " + file.path + " in part only");
    }
    visit(content);
  }
  git.Finish();
}

void CheckRepository(const std::filesystem::path& repository) {
  const std::string name = repository.string();
  if (name.empty()) throw SourceError("the name of the git repository is empty");
  GitProcess git(FindRepositoryCommand(repository));
  const std::string place(git.ReadLine().value_or(""));
  const GitExit exit = git.Wait();
  if (!exit.succeeded) throw SourceError("cannot read a git repository at " + name + ": " + exit.reason);
  if (!place.empty()) {
    throw SourceError(name + " is not a git repository but lies in one, as " + place +
                      ": name the repository's top folder");
  }
}

std::string ResolveRevision(const std::filesystem::path& repository, std::string_view revision) {
  GitProcess git(ResolveRevisionCommand(repository, revision));
  std::string commit(git.ReadLine().value_or(""));
  // A revision such as ^HEAD, which leaves commits out, has a sign before its id.
  const bool isId = !commit.empty() && commit.find_first_not_of("0123456789abcdef") == std::string::npos;
  if (git.Wait().succeeded && isId) return commit;
  if (revision == "HEAD")
    throw SourceError("the git repository " + repository.string() + " has no commit at HEAD yet");
  throw SourceError("the git repository " + repository.string() + " has no commit named \"" +
                    std::string(revision) + "\"");
}

}  // namespace

std::unique_ptr<EditSource> OpenGitHistory(const std::filesystem::path& repository,
                                           std::string_view revision) {
  CheckRepository(repository);
  return std::make_unique<GitSource>(repository, ResolveRevision(repository, revision));
}

}  // namespace vemo
