#include "engines/lmdb/change_index.h"

#include <algorithm>

namespace vemo {

void ChangeIndex::Follow(std::uint64_t commit) {
  const std::unique_lock lock(m_mutex);
  m_followed = std::max(m_followed, commit);
}

std::uint64_t ChangeIndex::Newest() const {
  const std::shared_lock lock(m_mutex);
  return m_newest;
}

// A change before the next one of its record is what snapshots of commits in between find.
bool ChangeIndex::IsNeeded(const Version& version, std::uint64_t nextCommit) const noexcept {
  const auto reader = m_open.lower_bound(version.commit);
  return reader != m_open.end() && *reader < nextCommit;
}

void ChangeIndex::DropUnneeded(Versions& versions) const noexcept {
  std::uint64_t next = versions.newest.commit;
  auto kept = versions.older.end();
  for (auto version = versions.older.end(); version != versions.older.begin();) {
    --version;
    const std::uint64_t commit = version->commit;
    if (IsNeeded(*version, next)) *--kept = *version;
    next = commit;
  }
  versions.older.erase(versions.older.begin(), kept);
}

void ChangeIndex::Add(std::uint64_t commit, const ChangeBlob& blob, std::size_t bytes) {
  const std::unique_lock lock(m_mutex);
  if (commit <= m_newest || commit < m_droppedBefore) return;
  if (m_versions.empty()) m_versions.reserve(blob.changes.size());
  for (const ChangeBlob::Change& change : blob.changes) {
    const Version version{commit, change.offset, change.length, change.check};
    const auto [entry, isNew] = m_versions.try_emplace(change.oid, Versions{version, {}});
    Versions& versions = entry->second;
    // A call that ran out of memory half-way is made again.
    if (isNew || versions.newest.commit == commit) continue;
    if (versions.newest.commit < m_droppedBefore) --m_retained;
    if (IsNeeded(versions.newest, commit)) versions.older.push_back(versions.newest);
    versions.newest = version;
    if (!versions.older.empty()) DropUnneeded(versions);
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
  const auto& [newest, older] = found->second;
  if (newest.commit <= commit) return newest;
  const auto later = std::upper_bound(older.begin(), older.end(), commit,
                                      [](std::uint64_t c, const Version& version) { return c < version.commit; });
  if (later == older.begin()) return std::nullopt;
  return *std::prev(later);
}

bool ChangeIndex::Open(std::uint64_t commit) {
  const std::unique_lock lock(m_mutex);
  if (commit < m_followed && !m_open.contains(commit)) return false;
  m_open.insert(commit);
  return true;
}

void ChangeIndex::Close(std::uint64_t commit) noexcept {
  const std::unique_lock lock(m_mutex);
  m_open.erase(m_open.find(commit));
}

// Where no reader is older than `commit`, nobody needs what is before `first`.
void ChangeIndex::Drop(std::uint64_t first, std::uint64_t commit) noexcept {
  const std::unique_lock lock(m_mutex);
  const std::uint64_t oldestReader = m_open.empty() ? commit : *m_open.begin();
  const bool isNews = first > m_droppedBefore;
  if (!isNews && (m_oldestAtDrop == 0 || m_oldestAtDrop == oldestReader)) return;
  m_droppedBefore = std::max(m_droppedBefore, first);
  m_oldestAtDrop = oldestReader < commit ? oldestReader : 0;
  for (; !m_blobs.empty() && m_blobs.front().commit < first; m_blobs.pop_front()) m_bytes -= m_blobs.front().bytes;
  m_retained = 0;
  for (auto entry = m_versions.begin(); entry != m_versions.end();) {
    Versions& versions = entry->second;
    DropUnneeded(versions);
    const bool isSettled = versions.newest.commit < m_droppedBefore;
    const bool isGone = oldestReader >= commit && isSettled;
    if (isSettled && !isGone) ++m_retained;
    entry = isGone ? m_versions.erase(entry) : std::next(entry);
  }
  if (oldestReader >= commit) m_damaged.erase(m_damaged.begin(), m_damaged.lower_bound(m_droppedBefore));
}

std::vector<OID> ChangeIndex::Records() const {
  std::vector<OID> ids;
  {
    const std::shared_lock lock(m_mutex);
    ids.reserve(m_versions.size());
    for (const auto& [oid, versions] : m_versions) {
      if (versions.newest.commit >= m_droppedBefore) ids.push_back(oid);
    }
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
  return {m_bytes, m_blobs.size(), m_versions.size() - m_retained};
}

}  // namespace vemo
