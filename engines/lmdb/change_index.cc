#include "engines/lmdb/change_index.h"

#include <algorithm>
#include <mutex>

namespace vemo {

std::uint64_t ChangeIndex::Newest() const {
  const std::shared_lock lock(m_mutex);
  return m_newest;
}

void ChangeIndex::Add(std::uint64_t commit, const ChangeBlob& blob, std::size_t bytes) {
  const std::unique_lock lock(m_mutex);
  if (commit <= m_newest) return;  // another thread was faster
  for (const ChangeBlob::Change& change : blob.changes) {
    std::vector<Version>& versions = m_versions[change.oid];
    // A call that ran out of memory half-way is made again.
    if (versions.empty() || versions.back().commit < commit) versions.push_back({commit, change.offset, change.length});
  }
  m_blobs.push_back({commit, bytes});
  m_bytes += bytes;
  m_newest = commit;
}

void ChangeIndex::AddDamaged(std::uint64_t commit) {
  const std::unique_lock lock(m_mutex);
  m_damaged.insert(commit);
  m_newest = std::max(m_newest, commit);
}

bool ChangeIndex::HasDamage() const {
  const std::shared_lock lock(m_mutex);
  return !m_damaged.empty();
}

std::vector<std::uint64_t> ChangeIndex::Damaged() const {
  const std::shared_lock lock(m_mutex);
  return {m_damaged.begin(), m_damaged.end()};
}

bool ChangeIndex::IsInDoubt(std::uint64_t since, std::uint64_t commit) const {
  const std::shared_lock lock(m_mutex);
  const auto damaged = m_damaged.upper_bound(since);
  return damaged != m_damaged.end() && *damaged <= commit;
}

std::optional<ChangeIndex::Version> ChangeIndex::Find(OID oid, std::uint64_t commit) const {
  const std::shared_lock lock(m_mutex);
  const auto found = m_versions.find(oid);
  if (found == m_versions.end()) return std::nullopt;
  const std::vector<Version>& versions = found->second;
  const auto later = std::upper_bound(versions.begin(), versions.end(), commit,
                                      [](std::uint64_t c, const Version& version) { return c < version.commit; });
  if (later == versions.begin()) return std::nullopt;
  return *std::prev(later);
}

void ChangeIndex::Open(std::uint64_t commit) {
  const std::unique_lock lock(m_mutex);
  m_open.insert(commit);
}

void ChangeIndex::Close(std::uint64_t commit) noexcept {
  const std::unique_lock lock(m_mutex);
  m_open.erase(m_open.find(commit));
}

// Of the versions of a record, a reader finds the latest one up to its commit. So what is before the one that the oldest reader
// finds is of no use to anybody; and where no reader is older than `commit`, neither is what is before `first`.
void ChangeIndex::Drop(std::uint64_t first, std::uint64_t commit) noexcept {
  const std::unique_lock lock(m_mutex);
  const std::uint64_t oldestReader = m_open.empty() ? commit : *m_open.begin();
  const bool isNews = first > m_droppedBefore;
  if (!isNews && (m_oldestAtDrop == 0 || m_oldestAtDrop == oldestReader)) return;
  m_droppedBefore = std::max(m_droppedBefore, first);
  m_oldestAtDrop = oldestReader < commit ? oldestReader : 0;
  for (; !m_blobs.empty() && m_blobs.front().commit < first; m_blobs.pop_front()) m_bytes -= m_blobs.front().bytes;
  for (auto entry = m_versions.begin(); entry != m_versions.end();) {
    std::vector<Version>& versions = entry->second;
    auto kept = std::upper_bound(versions.begin(), versions.end(), oldestReader,
                                 [](std::uint64_t c, const Version& version) { return c < version.commit; });
    if (kept != versions.begin()) --kept;
    if (oldestReader >= commit) {
      while (kept != versions.end() && kept->commit < first) ++kept;
    }
    versions.erase(versions.begin(), kept);
    entry = versions.empty() ? m_versions.erase(entry) : std::next(entry);
  }
}

std::uint64_t ChangeIndex::DroppedBefore() const {
  const std::shared_lock lock(m_mutex);
  return m_droppedBefore;
}

std::vector<OID> ChangeIndex::Records() const {
  std::vector<OID> ids;
  {
    const std::shared_lock lock(m_mutex);
    ids.reserve(m_versions.size());
    for (const auto& [oid, versions] : m_versions) ids.push_back(oid);
  }
  std::sort(ids.begin(), ids.end());
  return ids;
}

std::vector<std::uint64_t> ChangeIndex::Commits() const {
  const std::shared_lock lock(m_mutex);
  std::vector<std::uint64_t> commits;
  commits.reserve(m_blobs.size());
  for (const Blob& blob : m_blobs) commits.push_back(blob.commit);
  return commits;
}

ChangeIndex::Load ChangeIndex::CurrentLoad() const {
  const std::shared_lock lock(m_mutex);
  return {m_bytes, m_blobs.size(), m_versions.size()};
}

}  // namespace vemo
