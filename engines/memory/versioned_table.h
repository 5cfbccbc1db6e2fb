// A sorted table that keeps old versions of its values for the snapshots that are open.
//
// 1. The versions of a key are ordered by generation; a version is what every snapshot from its own
// generation up to
//    the next version's sees. A version without value says that the key was removed.
// 2. Apart from keys that are staged or listed, no chain is empty and no chain starts with a removal.
// 3. A chain with more than one version is listed. A listed node is erased by Sweep() alone, which holds the
// list.
// 4. Staging changes nothing that a reader can see; all memory that publishing needs is allocated by it.
//
// Not synchronised: the engine's lock guards every call. The buffer of a version and the key of a node stay
// where they are until trimmed, so that views of them outlive the lock.
#pragma once

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <limits>
#include <map>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/types.h"

namespace vemo {

// The generations of the open snapshots, each with the number of them.
using OpenGenerations = std::map<std::uint64_t, std::size_t>;

template <typename Key>
class VersionedTable {
 public:
  struct Entry {
    const Key* key;
    const Bytes* value;
  };

  // Prepares to put `value` under `key`, or to remove the key. The last one staged for a key counts. Throws
  // std::bad_alloc; DropStaged() must follow then.
  void Stage(Key key, std::optional<Bytes> value);

  // Makes what is staged the versions of `generation`.
  void Publish(std::uint64_t generation, const OpenGenerations& open) noexcept;

  void DropStaged() noexcept;

  // Drops the versions that no snapshot of `open` sees any more. Unless `all`, it waits until enough keys are
  // listed for its cost to vanish among the commits that listed them.
  void Sweep(const OpenGenerations& open, bool all) noexcept;

  // The value that a snapshot of `generation` sees, or null.
  template <typename K>
  const Bytes* Find(const K& key, std::uint64_t generation) const {
    const auto found = m_chains.find(key);
    return found == m_chains.end() ? nullptr : VisibleValue(found->second, generation);
  }

  // The first entry from `key` on (or after it) that a snapshot of `generation` sees.
  template <typename K>
  std::optional<Entry> Next(const K& key, bool afterKey, std::uint64_t generation) const {
    for (auto it = afterKey ? m_chains.upper_bound(key) : m_chains.lower_bound(key); it != m_chains.end();
         ++it) {
      if (const Bytes* value = VisibleValue(it->second, generation)) return Entry{&it->first, value};
    }
    return std::nullopt;
  }

  std::uint64_t liveKeys() const noexcept { return m_liveKeys; }  // in the newest commit
  std::uint64_t bytes() const noexcept { return m_bytes; }        // keys and values of all versions

 private:
  struct Version {
    std::uint64_t generation;
    std::optional<Bytes> value;
  };
  static constexpr std::size_t kNotStaged = std::numeric_limits<std::size_t>::max();
  struct Chain {
    std::vector<Version> versions;
    std::size_t stagedAt = kNotStaged;  // the place in m_staged
    bool listed = false;
  };
  using Chains = std::map<Key, Chain, std::less<>>;
  struct StagedValue {
    typename Chains::iterator position;
    std::optional<Bytes> value;
  };

  static const Bytes* VisibleValue(const Chain& chain, std::uint64_t generation);
  static std::size_t KeyBytes(const std::string& key) noexcept { return key.size(); }
  template <typename K>
  static std::size_t KeyBytes(const K&) noexcept {
    return sizeof(K);
  }
  static std::size_t VersionBytes(const Key& key, const Version& version) noexcept {
    return KeyBytes(key) + (version.value ? version.value->size() : 0);
  }
  template <typename T>
  static void MakeRoom(std::vector<T>& list, std::size_t size) {
    if (list.capacity() < size) list.reserve(std::max(size, 2 * list.capacity()));
  }
  void Trim(typename Chains::iterator position, const OpenGenerations& open) noexcept;

  Chains m_chains;
  std::vector<StagedValue> m_staged;
  std::vector<typename Chains::iterator> m_listed;
  std::size_t m_listedAfterSweep = 0;
  std::uint64_t m_liveKeys = 0;
  std::uint64_t m_bytes = 0;
};

template <typename Key>
void VersionedTable<Key>::Stage(Key key, std::optional<Bytes> value) {
  MakeRoom(m_staged, m_staged.size() + 1);
  MakeRoom(m_listed, m_listed.size() + m_staged.size() + 1);
  const auto position = m_chains.try_emplace(std::move(key)).first;
  Chain& chain = position->second;
  if (chain.stagedAt != kNotStaged) {
    m_staged[chain.stagedAt].value = std::move(value);
    return;
  }
  chain.stagedAt = m_staged.size();
  m_staged.push_back({position, std::move(value)});
  chain.versions.reserve(chain.versions.size() + 1);
}

template <typename Key>
void VersionedTable<Key>::Publish(std::uint64_t generation, const OpenGenerations& open) noexcept {
  for (StagedValue& staged : m_staged) {
    Chain& chain = staged.position->second;
    chain.stagedAt = kNotStaged;
    const bool wasLive = !chain.versions.empty() && chain.versions.back().value.has_value();
    const bool isLive = staged.value.has_value();
    m_liveKeys = m_liveKeys - (wasLive ? 1 : 0) + (isLive ? 1 : 0);
    chain.versions.push_back({generation, std::move(staged.value)});
    m_bytes += VersionBytes(staged.position->first, chain.versions.back());

    Trim(staged.position, open);
    if (chain.listed) continue;
    if (chain.versions.empty()) {
      m_chains.erase(staged.position);
    } else if (chain.versions.size() > 1) {
      chain.listed = true;
      m_listed.push_back(staged.position);
    }
  }
  m_staged.clear();
}

template <typename Key>
void VersionedTable<Key>::DropStaged() noexcept {
  for (StagedValue& staged : m_staged) {
    Chain& chain = staged.position->second;
    chain.stagedAt = kNotStaged;
    if (chain.versions.empty() && !chain.listed) m_chains.erase(staged.position);
  }
  m_staged.clear();
}

template <typename Key>
void VersionedTable<Key>::Sweep(const OpenGenerations& open, bool all) noexcept {
  constexpr std::size_t kWorthASweep = 64;
  if (!all && m_listed.size() < 2 * m_listedAfterSweep + kWorthASweep) return;
  std::size_t kept = 0;
  for (const auto position : m_listed) {
    Trim(position, open);
    Chain& chain = position->second;
    if (chain.versions.size() > 1) {
      m_listed[kept++] = position;
    } else if (chain.versions.empty()) {
      m_chains.erase(position);
    } else {
      chain.listed = false;
    }
  }
  m_listed.erase(m_listed.begin() + static_cast<std::ptrdiff_t>(kept), m_listed.end());
  m_listedAfterSweep = kept;
}

template <typename Key>
const Bytes* VersionedTable<Key>::VisibleValue(const Chain& chain, std::uint64_t generation) {
  for (auto version = chain.versions.rbegin(); version != chain.versions.rend(); ++version) {
    if (version->generation <= generation) return version->value ? &*version->value : nullptr;
  }
  return nullptr;
}

template <typename Key>
void VersionedTable<Key>::Trim(typename Chains::iterator position, const OpenGenerations& open) noexcept {
  std::vector<Version>& versions = position->second.versions;
  std::size_t kept = 0;
  for (std::size_t i = 0; i < versions.size(); ++i) {
    bool needed = i + 1 == versions.size();  // the newest is what the next snapshot sees
    if (!needed) {
      const auto reader = open.lower_bound(versions[i].generation);
      needed = reader != open.end() && reader->first < versions[i + 1].generation;
    }
    // Before a removal that comes first there is nothing to tell it from.
    if (kept == 0 && !versions[i].value) needed = false;
    if (!needed) {
      m_bytes -= VersionBytes(position->first, versions[i]);
      continue;
    }
    if (kept != i) versions[kept] = std::move(versions[i]);
    ++kept;
  }
  versions.erase(versions.begin() + static_cast<std::ptrdiff_t>(kept), versions.end());
}

}  // namespace vemo
