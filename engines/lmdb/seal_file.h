// data.seal: what the newest commits of data.mdb look like, so that damage to what all reading and writing starts from is
// noticed.
//
//   four slots, at bytes 0, 512, 1024 and 1536; transaction n is sealed in slot n & 1, the log up to commit n in
//   slot 2 + (n & 1)
//   slot, 40 bytes, LE      "vemoseal" | transaction (8) | digest of the roots (8) | digest of the free pages (8) |
//                           XXH3-64 of the bytes before, seeded with the slot's number (8)
//   slot of the log         "vemoslog" | the commit that data.mdb is of (8) | the last commit in the log (8) |
//                           where the log ends (8) | the same checksum
//
// It is written behind each commit and not synced, so that a crash may leave it older than the data, torn or missing; it
// is never newer, unless a commit was lost. What it says of the log is also how other processes hear of commits there. Its
// lock, held in turn by processes that commit, tells whether a seal that is older than the data is about to be written.
#pragma once

#include <array>
#include <atomic>
#include <cstdint>
#include <filesystem>
#include <optional>
#include <string>

namespace vemo {

struct CommitSeal {
  std::uint64_t transaction = 0;
  std::uint64_t rootsDigest = 0;
  std::uint64_t freeDigest = 0;
  friend bool operator==(const CommitSeal& a, const CommitSeal& b) {
    return a.transaction == b.transaction && a.rootsDigest == b.rootsDigest && a.freeDigest == b.freeDigest;
  }
};

// How far commits.log goes.
struct LogSeal {
  std::uint64_t base = 0;  // the commit that data.mdb is of
  std::uint64_t last = 0;
  std::uint64_t end = 0;  // in bytes
};

class SealFile {
 public:
  // Opens the file where it is there; one that is not, or may not be read, is as good as an empty one for reading. Throws
  // StoreError when it cannot be opened, for writing too unless `readOnly`, IncompatibleSpace when it is no file.
  SealFile(const std::filesystem::path& path, const std::string& space, bool readOnly);
  ~SealFile();
  SealFile(const SealFile&) = delete;
  SealFile& operator=(const SealFile&) = delete;

  struct Slots {
    std::array<std::optional<CommitSeal>, 2> slots;  // those that are whole
    std::optional<LogSeal> log;                      // the newest one that a log can be of
    std::optional<CommitSeal> Of(std::uint64_t transaction) const;
    std::uint64_t Newest() const;  // 0 where there is none
  };
  Slots Read() const;

  // False when the disk refuses; then the seal is older than the data, which costs time and no safety.
  bool Write(const CommitSeal& seal) noexcept;
  bool Write(const LogSeal& seal) noexcept;

  // Across processes. Lock makes the file where it is missing, and waits; TryLock returns whether it got the lock, or that
  // there is no file to lock. One that is made later by another process is found by the next call.
  void Lock();
  bool TryLock();
  void Unlock() noexcept;

 private:
  int Open(int flags) const;
  int Keep(int opened) const noexcept;
  int File() const;
  bool WriteSlot(std::uint64_t number, std::uint64_t magic, const std::array<std::uint64_t, 3>& numbers) noexcept;

  const std::filesystem::path m_path;
  const std::string m_space;
  const bool m_readOnly;
  mutable std::atomic<int> m_file{-1};  // set once the file is there, while others read
};

}  // namespace vemo
