// Which commits of a space are known to be what was committed.
//
// All that is read hangs from a meta page and the roots of a few tables, and all that is overwritten was free before. The
// seal of a commit (seal_file.h) vouches for these. Where a commit has no seal, because its process died before it wrote
// one, or the folder was copied without it, or a power loss left an older one, all its pages are checked once, and then it
// is sealed.
//
// 1. A seal that is newer than the newest commit: a commit was lost, or its meta page is damaged. Nothing is read.
// 2. A seal that does not match its commit: meta page, main table or list of free pages are damaged. Of the first two
//    nothing is read; without the last nothing is written.
// 3. No seal, and a fault is found: nothing is written, and what can be read is; nothing is where the two meta pages
//    contradict each other.
//
// Any thread may call.
#pragma once

#include <chrono>
#include <cstdint>
#include <filesystem>
#include <memory>
#include <mutex>
#include <string>

#include "engines/lmdb/lmdb_layout.h"
#include "engines/lmdb/seal_file.h"
#include "engines/lmdb/space_state.h"

namespace vemo {

struct KnownState {
  std::shared_ptr<PageFile> file;
  std::shared_ptr<const SpaceState> state;
  std::string doubt;          // why nothing may be written; empty where all is well
  std::uint64_t records = 0;  // in the commit
  SpaceNumbers numbers;       // all 0 where there is no space yet
};
using KnownStatePtr = std::shared_ptr<const KnownState>;

class SealedSpace {
 public:
  // Opens data.mdb and data.seal in `folder`. Throws as PageFile and SealFile do.
  // `mapBytes` is how far data.mdb can grow as it is mapped.
  SealedSpace(const std::filesystem::path& folder, const std::string& space, bool readOnly, std::uint64_t mapBytes);

  const std::shared_ptr<PageFile>& file() const noexcept { return m_file; }

  enum class Answer {
    kKnown,
    kAnotherCommit,    // the commit is not the newest any more: begin another transaction
    kUnsealed,         // ask again with `mayWait`
  };
  // The state of `transaction`, which a read transaction of LMDB keeps. With `mayWait` the caller commits nothing in this
  // process meanwhile, and a commit without a seal is checked. Throws DamagedStorage, IncompatibleSpace where the
  // environment holds no space, SpaceBusy when another process stays in the middle of a commit.
  Answer Ask(std::uint64_t transaction, bool mayWait, KnownStatePtr& state);

  // The reason why Ask goes on answering kAnotherCommit.
  [[noreturn]] void ThrowLostCommit(std::uint64_t transaction) const;

  // Held while a commit is made, across processes. Waits.
  void LockCommits() { m_seal.Lock(); }
  void UnlockCommits() noexcept { m_seal.Unlock(); }
  // False when another process stays in the middle of a commit.
  bool TryLockCommits(std::chrono::milliseconds timeout);

  SealFile& seal() noexcept { return m_seal; }

  // The state of `transaction`, the newest one, if it is known already and nothing forbids to go on from it; else null.
  KnownStatePtr Known(std::uint64_t transaction);

  // The newest state, which the caller is about to change, with commits locked. What LMDB will read at once is read anew,
  // whatever was known. Throws as Ask does, and DamagedStorage where nothing may be written.
  KnownStatePtr RequireWritable(std::uint64_t transaction);

  // `transaction` was committed: seals it. Where that fails it stays without a seal.
  void Committed(std::uint64_t transaction) noexcept;

 private:
  KnownStatePtr Read(const MetaPage& meta) const;
  void CheckSealed(const SpaceState& state, const CommitSeal& seal) const;
  KnownStatePtr CheckUnsealed(const MetaPage& meta);
  std::string FaultOfOtherMeta(const SpaceState& state) const;
  KnownStatePtr Remember(KnownStatePtr state);
  [[noreturn]] void Throw(const std::string& fault) const;

  const std::string m_space;
  const bool m_readOnly;
  const std::shared_ptr<PageFile> m_file;
  SealFile m_seal;
  std::mutex m_mutex;  // guards m_known
  KnownStatePtr m_known;
};

}  // namespace vemo
