#include "engines/lmdb/seal_file.h"

#define XXH_INLINE_ALL
#include <xxhash.h>

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "engines/lmdb/lmdb_error.h"

namespace vemo {
namespace {

constexpr std::uint64_t kMagic = 0x6c6165736f6d6576;  // "vemoseal"
constexpr off_t kSlotDistance = 512;                   // a disk writes so many bytes as a whole, or none of them

struct Slot {
  std::uint64_t magic;
  std::uint64_t transaction;
  std::uint64_t rootsDigest;
  std::uint64_t freeDigest;
  std::uint64_t checksum;
};
static_assert(sizeof(Slot) == 40);

std::uint64_t ChecksumOf(const Slot& slot, std::uint64_t number) {
  return XXH3_64bits_withSeed(&slot, offsetof(Slot, checksum), number);
}

}  // namespace

SealFile::SealFile(const std::filesystem::path& path, const std::string& space, bool readOnly)
    : m_path(path), m_space(space), m_readOnly(readOnly), m_file(Open(readOnly ? O_RDONLY : O_RDWR)) {}

// -1 where there is no file.
int SealFile::Open(int flags) const {
  // Without O_NONBLOCK a pipe of this name would wait for its other end.
  const int file = ::open(m_path.c_str(), flags | O_CLOEXEC | O_NONBLOCK, 0666);
  if (file < 0 && (errno == ENOENT || (m_readOnly && errno == EACCES))) return -1;
  if (file < 0 && errno != EISDIR) throw LmdbError("open", m_space, errno);
  struct stat status {};
  if (file >= 0 && ::fstat(file, &status) == 0 && S_ISREG(status.st_mode)) return file;
  if (file >= 0) ::close(file);
  throw IncompatibleSpace("cannot open " + m_space + ": " + m_path.filename().string() + " in it is not a file");
}

SealFile::~SealFile() {
  if (m_file >= 0) ::close(m_file);
}

std::optional<CommitSeal> SealFile::Slots::Of(std::uint64_t transaction) const {
  const std::optional<CommitSeal>& slot = slots[transaction % 2];
  return slot && slot->transaction == transaction ? slot : std::nullopt;
}

std::uint64_t SealFile::Slots::Newest() const {
  std::uint64_t newest = 0;
  for (const std::optional<CommitSeal>& slot : slots) newest = std::max(newest, slot ? slot->transaction : 0);
  return newest;
}

SealFile::Slots SealFile::Read() const {
  Slots read;
  for (std::uint64_t i = 0; i < 2 && m_file >= 0; ++i) {
    Slot slot{};
    const ssize_t bytes = ::pread(m_file, &slot, sizeof slot, static_cast<off_t>(i) * kSlotDistance);
    if (bytes != sizeof slot || slot.magic != kMagic || slot.checksum != ChecksumOf(slot, i)) continue;
    if (slot.transaction % 2 != i) continue;
    read.slots[i] = CommitSeal{slot.transaction, slot.rootsDigest, slot.freeDigest};
  }
  return read;
}

bool SealFile::Write(const CommitSeal& seal) noexcept {
  if (m_file < 0 || m_readOnly) return false;
  const std::uint64_t number = seal.transaction % 2;
  Slot slot{kMagic, seal.transaction, seal.rootsDigest, seal.freeDigest, 0};
  slot.checksum = ChecksumOf(slot, number);
  return ::pwrite(m_file, &slot, sizeof slot, static_cast<off_t>(number) * kSlotDistance) == sizeof slot;
}

void SealFile::Lock() {
  if (m_file < 0) m_file = Open(O_RDWR | O_CREAT);
  while (m_file >= 0 && ::flock(m_file, LOCK_EX) != 0) {
    if (errno != EINTR) throw LmdbError("lock for a commit", m_space, errno);
  }
}

bool SealFile::TryLock() noexcept { return m_file < 0 || ::flock(m_file, LOCK_EX | LOCK_NB) == 0; }

void SealFile::Unlock() noexcept {
  if (m_file >= 0) ::flock(m_file, LOCK_UN);
}

}  // namespace vemo
