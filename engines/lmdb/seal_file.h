// data.seal: what the newest commits of data.mdb look like, so that damage to what all reading and writing starts from is
// noticed.
//
//   two slots, at byte 0 and at byte 512; that of transaction n is n & 1
//   slot, 40 bytes, LE      "vemoseal" | transaction (8) | digest of the roots (8) | digest of the free pages (8) |
//                           XXH3-64 of the bytes before, seeded with the slot's number (8)
//
// It is written behind each commit and not synced, so that a crash may leave it older than the data, torn or missing; it
// is never newer, unless a commit was lost. Its lock, held in turn by processes that commit, tells whether a seal that is
// older than the data is about to be written.
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
    std::optional<CommitSeal> Of(std::uint64_t transaction) const;
    std::uint64_t Newest() const;  // 0 where there is none
  };
  Slots Read() const;

  // False when the disk refuses; then the seal is older than the data, which costs time and no safety.
  bool Write(const CommitSeal& seal) noexcept;

  // Across processes. Lock makes the file where it is missing, and waits; TryLock returns whether it got the lock, or that
  // there is no file to lock.
  void Lock();
  bool TryLock() noexcept;
  void Unlock() noexcept;

 private:
  int Open(int flags) const;

  const std::filesystem::path m_path;
  const std::string m_space;
  const bool m_readOnly;
  std::atomic<int> m_file{-1};  // Lock sets it, while others read
};

}  // namespace vemo
