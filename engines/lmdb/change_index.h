// Which commits hold changes of which records.
//
// A record of a commit is what stands in the table of records, or, where a later commit up to that one has a change of it, that
// changed by the latest of these: a delta leads from the stored record to the whole new version, so that one suffices. Each stored
// record says by which commit it was written, which tells the changes that it includes from those that it does not.
//
// The index knows of each record the latest change, and those before it which an open snapshot of this process needs, up to the
// newest commit that one has seen. It is built from the blobs (change_blob.h) when a space is
// opened, and follows whoever commits, this process or another.
//
// A commit whose blob is damaged is remembered as that: a record is in doubt where the blob might have a change of it.
//
// Any thread may call.
#pragma once

#include <cstdint>
#include <deque>
#include <mutex>
#include <optional>
#include <set>
#include <shared_mutex>
#include <unordered_map>
#include <vector>

#include "engines/lmdb/change_blob.h"

namespace vemo {

class ChangeIndex {
 public:
  struct Version {
    std::uint64_t commit;  // whose blob has the delta
    std::uint32_t offset;  // of the delta in the blob
    std::uint32_t length;
    std::uint32_t check;   // of the delta
  };
  // What the kept changes add up to.
  struct Load {
    std::uint64_t bytes = 0;
    std::uint64_t blobs = 0;
    std::uint64_t records = 0;
  };

  // Held by who takes in what a state keeps (Follow, Add, AddDamaged, Drop, and Open before), so that nobody sees half of it.
  std::mutex& following() noexcept { return m_following; }

  // The state of `commit` is about to be taken in, if it is newer than all before.
  void Follow(std::uint64_t commit);
  // The commit of the newest blob taken in, 0 for none.
  std::uint64_t Newest() const;
  void Add(std::uint64_t commit, const ChangeBlob& blob, std::size_t bytes);
  // The blob of that commit cannot be read.
  void AddDamaged(std::uint64_t commit);
  bool HasDamage() const;
  std::vector<std::uint64_t> Damaged() const;

  // The latest change of a record in commits up to `commit`.
  std::optional<Version> Find(OID oid, std::uint64_t commit) const;
  // Whether a change of later than `since` and up to `commit` may be lost.
  bool IsInDoubt(std::uint64_t since, std::uint64_t commit) const;

  // A snapshot of `commit` is open between these two. False, and it is not: the index may have forgotten what such a snapshot needs,
  // since a newer state was taken in while none was open.
  bool Open(std::uint64_t commit);
  void Close(std::uint64_t commit) noexcept;

  // Blobs before `first` are no longer kept in the state of `commit`, whose records include what they held: forgets them, except
  // for what open snapshots of before may need.
  void Drop(std::uint64_t first, std::uint64_t commit) noexcept;

  // The ids of all records with changes in the blobs that are kept, in ascending order.
  std::vector<OID> Records() const;
  // The commits of the blobs that are kept, in ascending order.
  std::vector<std::uint64_t> Commits() const;
  Load CurrentLoad() const;

 private:
  struct Versions {
    Version newest;
    std::vector<Version> older;  // ascending by commit
  };
  struct Blob {
    std::uint64_t commit;
    std::size_t bytes;
  };

  bool IsNeeded(const Version& version, std::uint64_t nextCommit) const noexcept;
  void DropUnneeded(Versions& versions) const noexcept;

  std::mutex m_following;
  mutable std::shared_mutex m_mutex;  // guards what follows
  std::uint64_t m_followed = 0;       // the newest state
  std::uint64_t m_newest = 0;
  std::unordered_map<OID, Versions> m_versions;
  std::deque<Blob> m_blobs;   // ascending by commit
  std::uint64_t m_bytes = 0;  // of m_blobs
  std::uint64_t m_droppedBefore = 0;
  std::size_t m_retained = 0;  // records in m_versions for the sake of open snapshots alone
  std::uint64_t m_oldestAtDrop = 0;  // the oldest reader for whose sake Drop has kept something; 0 for none
  std::set<std::uint64_t> m_damaged;
  std::multiset<std::uint64_t> m_open;
};

}  // namespace vemo
