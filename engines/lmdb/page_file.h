// data.mdb as it can be read without LMDB: mapped for reading, and never touched beyond its end.
//
// Any thread may call; what At returned stays mapped as long as the file is open. It shows what is written meanwhile.
#pragma once

#include <atomic>
#include <cstdint>
#include <filesystem>
#include <mutex>
#include <string>
#include <utility>
#include <vector>

namespace vemo {

class PageFile {
 public:
  // Throws StoreError when the file cannot be opened or mapped. `space` is the name for messages; the file may grow to
  // `room` bytes without being mapped anew.
  PageFile(const std::filesystem::path& path, const std::string& space, std::uint64_t room = 0);
  ~PageFile();
  PageFile(const PageFile&) = delete;
  PageFile& operator=(const PageFile&) = delete;

  // The bytes from `offset` on, or null where the file ends before offset + bytes or cannot be mapped so far.
  const std::uint8_t* At(std::uint64_t offset, std::uint64_t bytes) {
    const std::uint64_t known = m_readable.load(std::memory_order_acquire);
    if (bytes <= known && offset <= known - bytes) return m_base.load(std::memory_order_relaxed) + offset;
    return AtAfterLooking(offset, bytes);
  }

  // A page is about to be read. While these are few, as when a space is opened for a look at some of its fields, the system reads
  // from the disk what it is asked for and nothing around it; then it may read ahead. Readers count the pages that they reach for
  // the first time, and each big value, so that a page may be counted more than once.
  void CountReached() noexcept {
    if (m_reached.load(std::memory_order_relaxed) < kFewPages && m_reached.fetch_add(1) + 1 == kFewPages) ReadAhead();
  }

  // These bytes will be read soon: while the file is new to this process, the system is asked to read them from the disk
  // meanwhile.
  void WillNeed(std::uint64_t offset, std::uint64_t bytes) noexcept {
    if (m_asked.load(std::memory_order_relaxed) < kMostAsked && m_asked.fetch_add(1) < kMostAsked) AskFor(offset, bytes);
  }

  // Asks the system anew how long the file is: one that was cut off meanwhile must not be touched there. Returns it.
  std::uint64_t Measure();

  // Makes room for the file to grow. Nothing that At returned may be in use. Throws StoreError, and then the room is as
  // before.
  void Remap(std::uint64_t room);

 private:
  // Opening a space reaches some tens of pages, and one at least for each commit that has left changes which wait.
  static constexpr int kFewPages = 256;
  // Opening asks for the roots of the tables, the list of free pages and the changes that wait; what is left is for the first big
  // values that are read.
  static constexpr int kMostAsked = 64;

  void AskFor(std::uint64_t offset, std::uint64_t bytes) noexcept;
  void ReadAhead() noexcept;
  const std::uint8_t* AtAfterLooking(std::uint64_t offset, std::uint64_t bytes);
  std::uint64_t FileBytes() const;
  bool Map(std::uint64_t bytes);
  void Unmap(std::size_t count) noexcept;
  void Publish(std::uint64_t bytes) noexcept;

  int m_file = -1;
  const std::string m_space;
  std::uint64_t m_room;
  std::atomic<int> m_reached{0}, m_asked{0};
  std::mutex m_mapping;                               // guards what follows, of the last two the changes
  bool m_readsAhead = false;
  std::vector<std::pair<void*, std::size_t>> m_maps;  // readers may still be in those before the last
  std::atomic<const std::uint8_t*> m_base{nullptr};
  std::atomic<std::uint64_t> m_readable{0};  // bytes that are both in the file and mapped at m_base
};

}  // namespace vemo
