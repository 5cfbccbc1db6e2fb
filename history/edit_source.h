// Where the edits come from that a recorder is fed with: recorded sessions and the histories of git
// repositories.
//
// An edit source is used on one thread at a time. It holds no store and writes nothing; what it reads from
// may not be changed while it exists, and a source that notices a change throws SourceError.
#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "platform/field_id.h"
#include "platform/guid.h"
#include "platform/types.h"

namespace vemo {

// One deletion or one insertion, never both and never empty.
struct Edit {
  Guid site;
  FieldId field;
  ssize_t position = 0;  // live: counts the elements there are at this moment
  ssize_t deleted = 0;   // number of elements deleted from `position` on
  std::span<const std::string_view>
      inserted;  // the elements inserted before `position`; valid during OnEdit only
};

struct Commit {
  std::string_view id;      // hexadecimal
  std::string_view author;  // "Name <address>" as recorded in the commit
  Guid site;
};

// Receives the edits in the order in which they were made. The views that it is given are valid during the
// call. Whatever it throws ends the replay and reaches the caller of Replay.
class EditVisitor {
 public:
  virtual ~EditVisitor() = default;

  // Once for each site, directly before its first edit.
  virtual void OnSite(const Guid& site, std::string_view author) = 0;

  // Git only: a regular file appears for the first time, perhaps empty and so without an edit. `path` is as
  // git stores it: any bytes but NUL.
  virtual void OnObject(OID object, std::string_view path) = 0;

  // Git only: the calls up to the next OnCommit belong to this commit. A commit may have none.
  virtual void OnCommit(const Commit& commit) = 0;

  virtual void OnEdit(const Edit& edit) = 0;
};

// What a field holds after all edits. A field of a deleted file is not reported: it is empty.
struct FinalContent {
  FieldId field;
  std::string label;  // the path of the file, for messages
  std::string bytes;  // the elements one after another
};

// Paths that are no text files and so have no edits, each counted once however often it changed. A path that
// was a symbolic link or a submodule at one time and a regular file at another is counted here and is an
// object as well.
struct SkippedFiles {
  std::uint64_t binary = 0;
  std::uint64_t symlinks = 0;
  std::uint64_t submodules = 0;
};

class EditSource {
 public:
  virtual ~EditSource() = default;

  // A few words that name the source in messages.
  virtual std::string Describe() const = 0;

  // The one field that a recording edits; nothing for a repository, which has a field for each file.
  virtual std::optional<FieldId> OnlyField() const = 0;

  // From now on, `progress` is told how far the first reading of a whole history has come. A recording has no such reading.
  virtual void ReportScanTo(std::function<void(std::uint64_t done, std::uint64_t of)>) {}

  // How many times Replay calls OnEdit. Git: the first call reads the whole history.
  virtual std::uint64_t CountEdits() = 0;

  // Calls the visitor for the whole history. Can be repeated: the same calls each time.
  virtual void Replay(EditVisitor& visitor) = 0;

  // Calls `visit` for every field that the source has a final content of. Holds one content at a time.
  virtual void ForEachFinalContent(const std::function<void(const FinalContent&)>& visit) = 0;

  // Git: the first call reads the whole history. Nothing of a recording is ever skipped.
  virtual SkippedFiles Skipped() = 0;
};

// A recorded session of one author in the sequential JSON format, plain or compressed with gzip; an element
// is a Unicode code point in UTF-8. Reads and checks the whole file, so that nothing can fail later but the
// visitor. Throws SourceError where the file cannot be read, is damaged, is no such recording, or has an edit
// outside of its document.
std::unique_ptr<EditSource> OpenTrace(const std::filesystem::path& file, const FieldId& field,
                                      std::string_view author);

// The first-parent history of the commit that `revision` names, oldest commit first. An element is a line
// with its line feed, if it has one. Regular files are objects, with ids from 1 in the order of first
// appearance, for ever; the field is at path 0. A path that git calls binary in any version is skipped whole.
//
// `repository` is the top folder of a working tree or a git folder, such as a bare repository. The revision
// is resolved here, once. The user's configuration of git does not matter; the .gitattributes of the working
// tree do, and those in the repository's info/attributes, as they decide what git calls binary. Throws
// SourceError where git cannot be run, where there is no repository or no such commit, and, here and in each
// call of the source, where git fails.
std::unique_ptr<EditSource> OpenGitHistory(const std::filesystem::path& repository,
                                           std::string_view revision = "HEAD");

}  // namespace vemo
