// commits.log: small commits on their way to data.mdb.
//
// A commit of LMDB writes pages that lie apart, and flushes the disk twice. A commit that only changes
// records which are there, and values of the user's table of names, is appended here instead and flushed
// once. The file is as long as it will ever be from the beginning, since a file that grows costs another
// write of the file system. The next commit that goes to data.mdb takes with it what the log has, and from
// then on the log is empty: its entries are of an older base, and the next one is written over the first of
// them.
//
// What is in the log is believed as far as data.seal says, and beyond that by whoever holds the lock of
// commits: an entry that is whole is a commit, since it may have been acknowledged; one that is not never
// was. What lies before the last commit that is sealed, or before a whole entry, and is not whole is damage.
//
// The idea of a log that is flushed once for each commit, ahead of the pages that it is about, is that of
// Mohan, Haderle, Lindsay, Pirahesh and Schwarz, "ARIES" (ACM TODS 17, 1992).
#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "engines/lmdb/log_file.h"
#include "engines/lmdb/log_scan.h"
#include "engines/lmdb/log_tail.h"
#include "engines/lmdb/seal_file.h"

namespace vemo {

// What data.mdb says of the log that goes behind it.
struct LogBase {
  std::uint64_t commit = 0;    // that data.mdb is of
  std::uint64_t identity = 0;  // of the log; 0 while there is none
};

// Any thread may call. Recover, Begin, Make and Append are called with commits locked, across processes and
// threads; between Recover and Append nobody else changes the tail.
class CommitLog {
 public:
  // With `sync` a commit is flushed before Append returns.
  CommitLog(const std::filesystem::path& folder, const std::string& space, bool readOnly, bool sync);

  enum class Answer {
    kKnown,
    kOvertaken,  // data.mdb has a newer commit than `base`
    kInDoubt,    // whether the last commit was made is not known: Recover
  };
  // The newest state behind `base` that is sealed. Where entries are not whole, `isNewest` tells whether
  // data.mdb still is at `base`: while it is, nothing in the log is written over. Costs one small read where
  // there is nothing new. Throws StoreError.
  Answer Follow(const LogBase& base, const SealFile& seal, const std::function<bool()>& isNewest,
                LogPosition& position);

  // The newest state behind `base`, the newest one in data.mdb; what is whole and not sealed is written
  // again, flushed and sealed. Throws DamagedStorage where the log is missing and may have had commits, or is
  // not of this base; StoreError.
  LogPosition Recover(const LogBase& base, SealFile& seal);
  // Whether entries may wait behind what Follow finds. Throws StoreError.
  bool NeedsRecovery(const LogBase& base, const SealFile& seal);

  // data.mdb has just got the commit of `base`, after that of `before` and with all that the log had: seals that it is empty.
  void Begin(const LogBase& before, const LogBase& base, SealFile& seal) noexcept;

  // Whether the log is there, and nothing has failed in it.
  bool IsUsable(const LogBase& base);
  // Whether a payload of so many bytes fits behind what Recover has found.
  bool HasRoom(std::size_t payloadBytes);

  // Makes the file, of an identity that the commit under way must write into data.mdb. Nothing where the log
  // of before still has commits, or the disk refuses: commits can do without.
  std::optional<std::uint64_t> Make();

  // Makes `commit`, the one after what Recover has found. Throws when it was not made, UnknownOutcome when
  // that is not known.
  void Append(const char* operation, const LogBase& base, std::uint64_t commit, Bytes payload,
              SealFile& seal);

  // Makes the name of the file survive a loss of power. Throws StoreError.
  void SyncName();
  // Waits until the disk has the file and its name, as far as it can.
  void SyncAll() noexcept;

  // Taken on the disk.
  std::uint64_t DiskBytes();

 private:
  LogTail& TailBehind(std::uint64_t commit);
  LogPosition Position() const { return {m_tail, m_tail->Last()}; }
  LogPlace Next() const { return {m_tail->Last() + 1, m_tail->base()}; }
  std::optional<LogPlace> PlaceAt(std::uint64_t offset, const LogBase& base) const;
  void TakeIn(std::vector<ScannedCommit> commits);
  void RequireRightFile(const LogBase& base, const std::optional<LogSeal>& sealed) const;
  void Search(const LogBase& base, const std::optional<LogSeal>& sealed, std::uint64_t lastSealed, SealFile& seal);
  void WriteAgain(ByteView entries);
  [[noreturn]] void TakeBack(std::uint64_t offset, const char* operation, int failure);
  [[noreturn]] void ThrowDamaged(const std::string& fault, const LogBase& base) const;

  const std::string m_space;
  std::mutex m_mutex;  // guards what follows
  LogFile m_file;
  std::shared_ptr<LogTail> m_tail;
  bool m_isSearched = false;  // what lies behind the tail
  bool m_isInDoubt = false;   // whether the entry behind the tail is on the disk
  bool m_hasFailed = false;   // a write, so that commits go to data.mdb
};

}  // namespace vemo
