#include "engines/lmdb/page_file.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <optional>

#include "engines/lmdb/file_status.h"
#include "engines/lmdb/lmdb_error.h"

namespace vemo {
PageFile::PageFile(const std::filesystem::path& path, const std::string& space, std::uint64_t room)
    : m_space(space), m_room(room) {
  m_file = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (m_file < 0) throw LmdbError("open", space, errno);
  try {
    Measure();
  } catch (...) {
    ::close(m_file);
    throw;
  }
}

PageFile::~PageFile() {
  Unmap(m_maps.size());
  ::close(m_file);
}

std::uint64_t PageFile::FileBytes() const {
  const std::optional<FileStatus> status = StatusOf(m_file);
  if (!status) throw LmdbError("read", m_space, errno);
  return status->bytes;
}

bool PageFile::Map(std::uint64_t bytes) {
  m_maps.reserve(m_maps.size() + 1);
  void* map = ::mmap(nullptr, bytes, PROT_READ, MAP_SHARED, m_file, 0);
  if (map == MAP_FAILED) return false;
  if (!m_readsAhead) ::madvise(map, bytes, MADV_RANDOM);  // a hint: where it fails, the rest is the same
  m_maps.emplace_back(map, bytes);
  return true;
}

void PageFile::AskFor(std::uint64_t offset, std::uint64_t bytes) noexcept {
  ::posix_fadvise(m_file, static_cast<off_t>(offset), static_cast<off_t>(bytes), POSIX_FADV_WILLNEED);
}

void PageFile::ReadAhead() noexcept {
  const std::lock_guard lock(m_mapping);
  m_readsAhead = true;
  for (const auto& [map, bytes] : m_maps) ::madvise(map, bytes, MADV_NORMAL);
}

void PageFile::Unmap(std::size_t count) noexcept {
  for (std::size_t i = 0; i < count; ++i) ::munmap(m_maps[i].first, m_maps[i].second);
  m_maps.erase(m_maps.begin(), m_maps.begin() + static_cast<std::ptrdiff_t>(count));
}

std::uint64_t PageFile::Measure() {
  const std::lock_guard lock(m_mapping);
  const std::uint64_t bytes = FileBytes();
  if (m_maps.empty() || m_maps.back().second < bytes) {
    constexpr std::uint64_t kLeastRoom = std::uint64_t{1} << 20;
    const std::uint64_t room = std::max({m_room, bytes, kLeastRoom});
    if (!Map(room) && (bytes == 0 || !Map(bytes))) throw LmdbError("read", m_space, errno);
  }
  Publish(bytes);
  return bytes;
}

void PageFile::Remap(std::uint64_t room) {
  const std::lock_guard lock(m_mapping);
  const std::uint64_t bytes = FileBytes();
  const std::uint64_t before = m_maps.back().second;
  m_readable = 0;
  Unmap(m_maps.size());
  const bool isMapped = Map(std::max(room, bytes));
  const int failure = errno;
  if (isMapped) m_room = room;
  if (isMapped || Map(before)) Publish(bytes);
  if (!isMapped) throw LmdbError("enlarge the map of", m_space, failure);
}

// Whoever sees the new length must see the map that reaches so far.
void PageFile::Publish(std::uint64_t bytes) noexcept {
  m_readable.store(std::min(bytes, m_readable.load(std::memory_order_relaxed)), std::memory_order_release);
  m_base.store(static_cast<const std::uint8_t*>(m_maps.back().first), std::memory_order_release);
  m_readable.store(bytes, std::memory_order_release);
}

const std::uint8_t* PageFile::AtAfterLooking(std::uint64_t offset, std::uint64_t bytes) {
  const std::uint64_t known = Measure();
  if (bytes > known || offset > known - bytes) return nullptr;
  return m_base.load(std::memory_order_acquire) + offset;
}

}  // namespace vemo
