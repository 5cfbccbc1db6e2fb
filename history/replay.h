// Replaying an edit source into a space, and checking what was recorded against the source.
//
// Beside the three root maps (recorder.h) the space's meta tells what their numbers mean:
//   site/GUID                        the author
//   next/GUID                        the site's next operation number, in decimal
//   commit/GUID/NUMBER               git: the commit of which NUMBER (16 hexadecimal digits) is the site's first operation
//   object/ID                        git: the path of object ID (16 hexadecimal digits)
//   replay/KEY/edits                 how many edits of the source are recorded: the last one applied
//   replay/KEY/digest                XXH3-64 of these, by which a source is known again
//   replay/KEY/start/GUID            the site's next operation number when the replay began
// KEY is "git" for a repository and the field for a recording.
#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>

#include "history/edit_source.h"
#include "store/space.h"

namespace vemo {

inline constexpr char kInsertionsRoot[] = "insertions";
inline constexpr char kTombstonesRoot[] = "tombstones";
inline constexpr char kHistoryRoot[] = "history";

struct ReplayOptions {
  std::uint64_t batchEdits = 10'000;  // a commit after this many edits
  bool resume = false;                // go on after the last edit applied
  std::function<void(std::uint64_t editsDone)> progress;  // may be empty
};

struct ReplayReport {
  std::uint64_t edits = 0;  // of the source, those applied before included
  std::uint64_t editsApplied = 0;
  std::uint64_t elementsInserted = 0;
  std::uint64_t elementsDeleted = 0;
  std::uint64_t sites = 0;
  std::uint64_t objects = 0;        // git: regular files
  std::uint64_t sourceCommits = 0;  // git
  std::uint64_t storeCommits = 0;
};

// Records all edits of `source` in the root maps "insertions", "tombstones" and "history", in commits of a batch each.
// Throws UsageError when the fields are there already and `resume` is not asked for, or when the space was replayed from
// another source; SourceError and StoreError as they come. Whatever it throws, the batches committed before stay.
ReplayReport Replay(CSpace& space, EditSource& source, const ReplayOptions& options);

// Rebuilds the content of every field of the source from the stored maps and the inserted texts, and compares it with the
// source's own final content, byte for byte; live elements and, for a repository, fields that are none of the source's
// differ as well. Returns what differs first, or nothing. Holds the inserted texts in memory, and of the maps one field on top of a
// snapshot's share of SpaceOptions::cacheBytes.
// `progress`, which may be empty, is told how many of the source's edits have been read.
std::optional<std::string> CheckReplay(CSpace& space, EditSource& source,
                                       const std::function<void(std::uint64_t editsRead)>& progress = {});

// The names of meta values.
std::string SiteMetaName(const Guid& site);
std::string NextNumberMetaName(const Guid& site);
std::string CommitMetaName(const Guid& site, ssize_t firstNumber);
std::string ObjectMetaName(OID object);
std::string ReplayMetaPrefix(const EditSource& source);

}  // namespace vemo
