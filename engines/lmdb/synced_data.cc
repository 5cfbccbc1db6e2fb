#include "engines/lmdb/synced_data.h"

#include <cstring>
#include <utility>

namespace vemo {

SyncedData::SyncedData(std::shared_ptr<PageFile> file) : m_file(std::move(file)) {}

SyncedData::MetaPages SyncedData::Current() const noexcept {
  const std::size_t pageBytes = PageBytesOf(*m_file);
  return {ReadMetaPage(*m_file, 0, pageBytes), ReadMetaPage(*m_file, 1, pageBytes)};
}

bool SyncedData::IsOnDisk(const MetaPages& pages) const noexcept {
  return m_onDisk && std::memcmp(m_onDisk->data(), pages.data(), sizeof pages) == 0;
}

bool SyncedData::IsOnDisk() const noexcept {
  return IsOnDisk(Current());
}

void SyncedData::Require(const std::function<void()>& sync) {
  const MetaPages pages = Current();
  if (IsOnDisk(pages)) return;
  sync();
  m_onDisk = pages;
}

}  // namespace vemo
