// The commits behind the state of data.mdb: what commits.log has of them, in memory.
//
// One grows by one commit after another; a commit that goes to data.mdb is the base of another one. A
// snapshot keeps the one that it began with, and finds in it what it needs whatever becomes of the file.
//
// Any thread may call. Views stay as long as the tail.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <shared_mutex>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "engines/lmdb/log_entry.h"

namespace vemo {

class LogTail {
 public:
  // What the commits add up to.
  struct Size {
    std::uint64_t commits = 0;
    std::uint64_t bytes = 0;  // of changes
    std::uint64_t records = 0;
  };

  explicit LogTail(std::uint64_t base) : m_base(base) {}

  // The commit that the state in data.mdb is of.
  std::uint64_t base() const noexcept { return m_base; }
  // The newest commit; the base where there is none.
  std::uint64_t Last() const;
  // Where in the file the next one goes.
  std::uint64_t End() const;
  Size CurrentSize() const;

  // Allocates all that the next Add needs.
  void MakeRoomFor(const std::optional<LoggedCommit>& commit);
  // The next commit, nothing where it is damaged; `end` is behind it in the file. Does not throw after
  // MakeRoomFor.
  void Add(std::optional<LoggedCommit> commit, std::uint64_t end);

  // The commits behind `after` and up to `last` that have changes of records or are damaged, in ascending
  // order.
  std::vector<std::uint64_t> Changing(std::uint64_t after, std::uint64_t last) const;
  // The first and the last of all of these up to `last`, without listing them.
  std::optional<std::pair<std::uint64_t, std::uint64_t>> ChangingBounds(std::uint64_t last) const;

  // What that commit, behind the base and not behind the last one, changed of records: empty for nothing.
  // Nothing where the commit is damaged.
  std::optional<ByteView> Changes(std::uint64_t commit) const;
  // Whether one of the commits up to `commit` is damaged.
  bool HasDamage(std::uint64_t commit) const;

  // The latest value of a name of the user's table up to `commit`. The first is nothing where no commit has
  // one, the second where the name was removed.
  std::optional<std::optional<ByteView>> FindMeta(std::string_view name, std::uint64_t commit) const;
  // The latest values of all names that some commit up to `commit` has, by name.
  std::map<std::string_view, std::optional<ByteView>> Meta(std::uint64_t commit) const;

 private:
  struct MetaVersion {
    std::uint64_t commit;
    std::optional<ByteView> value;
  };

  static const MetaVersion* LatestOf(const std::vector<MetaVersion>& versions, std::uint64_t commit) noexcept;

  const std::uint64_t m_base;
  mutable std::shared_mutex m_mutex;  // guards what follows
  std::vector<std::optional<LoggedCommit>> m_commits;
  std::map<std::string, std::vector<MetaVersion>, std::less<>> m_meta;  // versions in the order of commits
  std::vector<std::uint64_t> m_changing;
  std::uint64_t m_end = 0;
  std::uint64_t m_firstDamaged = 0;  // 0 for none
  Size m_size;
};

// A state of the space: that of `tail`'s base with the commits of the tail up to `commit`.
struct LogPosition {
  std::shared_ptr<const LogTail> tail;
  std::uint64_t commit = 0;
};

}  // namespace vemo
