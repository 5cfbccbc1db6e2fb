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
#include "engines/lmdb/log_entry.h"

namespace vemo {
namespace {

constexpr std::uint64_t kMagic = 0x6c6165736f6d6576;     // "vemoseal"
constexpr std::uint64_t kLogMagic = 0x676f6c736f6d6576;  // "vemoslog"
constexpr std::size_t kSlotDistance = 512;               // a disk writes so many bytes as a whole, or none of them
constexpr std::size_t kFirstLogSlot = 2;
constexpr std::size_t kSlots = 4;

struct Slot {
  std::uint64_t magic;
  std::array<std::uint64_t, 3> numbers;
  std::uint64_t checksum;
};
static_assert(sizeof(Slot) == 40);

std::uint64_t ChecksumOf(const Slot& slot, std::uint64_t number) {
  return XXH3_64bits_withSeed(&slot, offsetof(Slot, checksum), number);
}

// The numbers of a slot that is whole.
std::optional<std::array<std::uint64_t, 3>> NumbersIn(const std::uint8_t* bytes, std::uint64_t number, std::uint64_t magic) {
  Slot slot;
  std::memcpy(&slot, bytes, sizeof slot);
  if (slot.magic != magic || slot.checksum != ChecksumOf(slot, number)) return std::nullopt;
  return slot.numbers;
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

// Of threads that open the file at the same time, one keeps it.
int SealFile::Keep(int opened) const noexcept {
  int file = -1;
  if (opened < 0 || m_file.compare_exchange_strong(file, opened)) return opened;
  ::close(opened);
  return file;
}

int SealFile::File() const {
  const int file = m_file;
  return file >= 0 ? file : Keep(Open(m_readOnly ? O_RDONLY : O_RDWR));
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
  const int file = File();
  if (file < 0) return read;
  std::array<std::uint8_t, (kSlots - 1) * kSlotDistance + sizeof(Slot)> bytes{};
  // Of a shorter file the rest stays zero, which is no slot.
  if (::pread(file, bytes.data(), bytes.size(), 0) < 0) return read;
  for (std::size_t i = 0; i < kFirstLogSlot; ++i) {
    const auto numbers = NumbersIn(&bytes[i * kSlotDistance], i, kMagic);
    if (numbers && (*numbers)[0] % 2 == i) read.slots[i] = CommitSeal{(*numbers)[0], (*numbers)[1], (*numbers)[2]};
  }
  for (std::size_t i = kFirstLogSlot; i < kSlots; ++i) {
    const auto numbers = NumbersIn(&bytes[i * kSlotDistance], i, kLogMagic);
    if (!numbers) continue;
    const LogSeal seal{(*numbers)[0], (*numbers)[1], (*numbers)[2]};
    const bool isPossible = (seal.last == seal.base || CanBeInLog({seal.last, seal.base})) && seal.end <= kLogBytes;
    if (isPossible && (!read.log || read.log->last < seal.last)) read.log = seal;
  }
  return read;
}

bool SealFile::WriteSlot(std::uint64_t number, std::uint64_t magic, const std::array<std::uint64_t, 3>& numbers) noexcept {
  if (m_file < 0 || m_readOnly) return false;
  Slot slot{magic, numbers, 0};
  slot.checksum = ChecksumOf(slot, number);
  return ::pwrite(m_file, &slot, sizeof slot, static_cast<off_t>(number * kSlotDistance)) == sizeof slot;
}

bool SealFile::Write(const CommitSeal& seal) noexcept {
  return WriteSlot(seal.transaction % 2, kMagic, {seal.transaction, seal.rootsDigest, seal.freeDigest});
}

bool SealFile::Write(const LogSeal& seal) noexcept {
  return WriteSlot(kFirstLogSlot + seal.last % 2, kLogMagic, {seal.base, seal.last, seal.end});
}

void SealFile::Lock() {
  if (m_file < 0) Keep(Open(O_RDWR | O_CREAT));
  while (m_file >= 0 && ::flock(m_file, LOCK_EX) != 0) {
    if (errno != EINTR) throw LmdbError("lock for a commit", m_space, errno);
  }
}

bool SealFile::TryLock() {
  const int file = File();
  return file < 0 || ::flock(file, LOCK_EX | LOCK_NB) == 0;
}

void SealFile::Unlock() noexcept {
  if (m_file >= 0) ::flock(m_file, LOCK_UN);
}

}  // namespace vemo
