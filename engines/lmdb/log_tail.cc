#include "engines/lmdb/log_tail.h"

#include <algorithm>
#include <mutex>
#include <utility>

namespace vemo {

std::uint64_t LogTail::Last() const {
  const std::shared_lock lock(m_mutex);
  return m_base + m_commits.size();
}

std::uint64_t LogTail::End() const {
  const std::shared_lock lock(m_mutex);
  return m_end;
}

LogTail::Size LogTail::CurrentSize() const {
  const std::shared_lock lock(m_mutex);
  return m_size;
}

namespace {

template <typename T>
void ReserveOneMore(std::vector<T>& items) {
  constexpr std::size_t kFirst = 8;
  if (items.size() == items.capacity()) items.reserve(std::max(kFirst, 2 * items.size()));
}

}  // namespace

void LogTail::MakeRoomFor(const std::optional<LoggedCommit>& commit) {
  const std::unique_lock lock(m_mutex);
  ReserveOneMore(m_commits);
  ReserveOneMore(m_changing);
  if (!commit) return;
  for (const LoggedCommit::MetaValue& named : commit->meta) ReserveOneMore(m_meta[std::string(named.name)]);
}

void LogTail::Add(std::optional<LoggedCommit> commit, std::uint64_t end) {
  const std::unique_lock lock(m_mutex);
  m_commits.push_back(std::move(commit));
  const std::uint64_t number = m_base + m_commits.size();
  const std::optional<LoggedCommit>& added = m_commits.back();
  if (!added || !added->changes.empty()) m_changing.push_back(number);
  if (added) {
    for (const LoggedCommit::MetaValue& named : added->meta)
      m_meta.find(named.name)->second.push_back({number, named.value});
    m_size.bytes += added->changes.size();
    m_size.records += added->numRecords;
  } else if (m_firstDamaged == 0) {
    m_firstDamaged = number;
  }
  ++m_size.commits;
  m_end = end;
}

std::vector<std::uint64_t> LogTail::Changing(std::uint64_t after, std::uint64_t last) const {
  const std::shared_lock lock(m_mutex);
  const auto end = std::upper_bound(m_changing.begin(), m_changing.end(), last);
  return {std::upper_bound(m_changing.begin(), end, after), end};
}

std::optional<std::pair<std::uint64_t, std::uint64_t>> LogTail::ChangingBounds(std::uint64_t last) const {
  const std::shared_lock lock(m_mutex);
  const auto end = std::upper_bound(m_changing.begin(), m_changing.end(), last);
  if (end == m_changing.begin()) return std::nullopt;
  return std::pair(m_changing.front(), *std::prev(end));
}

std::optional<ByteView> LogTail::Changes(std::uint64_t commit) const {
  const std::shared_lock lock(m_mutex);
  const std::optional<LoggedCommit>& found = m_commits.at(commit - m_base - 1);
  return found ? std::optional(found->changes) : std::nullopt;
}

bool LogTail::HasDamage(std::uint64_t commit) const {
  const std::shared_lock lock(m_mutex);
  return m_firstDamaged != 0 && m_firstDamaged <= commit;
}

const LogTail::MetaVersion* LogTail::LatestOf(const std::vector<MetaVersion>& versions,
                                              std::uint64_t commit) noexcept {
  const auto later =
      std::upper_bound(versions.begin(), versions.end(), commit,
                       [](std::uint64_t c, const MetaVersion& version) { return c < version.commit; });
  return later == versions.begin() ? nullptr : &*std::prev(later);
}

std::optional<std::optional<ByteView>> LogTail::FindMeta(std::string_view name, std::uint64_t commit) const {
  const std::shared_lock lock(m_mutex);
  const auto found = m_meta.find(name);
  const MetaVersion* version = found == m_meta.end() ? nullptr : LatestOf(found->second, commit);
  if (version == nullptr) return std::nullopt;
  return std::make_optional(version->value);
}

std::map<std::string_view, std::optional<ByteView>> LogTail::Meta(std::uint64_t commit) const {
  const std::shared_lock lock(m_mutex);
  std::map<std::string_view, std::optional<ByteView>> values;
  for (const auto& [name, versions] : m_meta) {
    if (const MetaVersion* version = LatestOf(versions, commit)) values.emplace(name, version->value);
  }
  return values;
}

}  // namespace vemo
