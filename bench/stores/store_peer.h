// A key-value store on disk as the workloads see it.
#pragma once

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/field_id.h"

namespace vemo::bench {

// The payloads of a job: P1 and P2 of bench/common/entries.h.
enum class StorePayload { kTombstones, kInsertions };

// What a store keeps of the data in memory where nothing else is asked for.
inline constexpr std::uint64_t kAmpleCacheBytes = 512ULL << 20;

struct StoreSetup {
  std::filesystem::path folder;  // exists; empty when the store is made
  StorePayload payload = StorePayload::kTombstones;
  // What the peer may keep of the data in memory of its own, in bytes; 0: enough for all of it.
  std::uint64_t cacheBytes = 0;

  // The same where a peer wants a number in any case.
  std::uint64_t CacheBytes() const { return cacheBytes == 0 ? kAmpleCacheBytes : cacheBytes; }
};

// One store, opened by its factory and closed by the destructor. Used by one thread. Every commit is durable
// when Commit returns. Payloads are named by their number in the pool of the job. Throws what the store does,
// or std::runtime_error.
class StorePeer {
 public:
  virtual ~StorePeer() = default;

  virtual void Begin() = 0;
  // An existing key gets the new payload.
  virtual void Put(const FieldId& key, std::size_t payload) = 0;
  virtual void Erase(const FieldId& key) = 0;
  virtual void Commit() = 0;

  // Reading sees the newest commit at that time; no commit follows. Does nothing where a peer reads without more ado.
  virtual void StartReading() {}
  // A number made of the whole payload under `key`; nothing is 0.
  virtual std::uint64_t Find(const FieldId& key) = 0;
  // A number made of all payloads in ascending order of keys.
  virtual std::uint64_t Scan() = 0;
};

// A peer that only shows what the machine can do takes part in the writing rows alone.
enum class StoreRole { kStore, kFloor };

struct StoreKind {
  std::string peer;
  StoreRole role = StoreRole::kStore;
  bool hasCache = true;  // obeys StoreSetup::cacheBytes
  std::function<std::unique_ptr<StorePeer>(const StoreSetup&)> open;
};

template <class Peer>
StoreKind MakeStoreKind(std::string peer, StoreRole role, bool hasCache) {
  return {std::move(peer), role, hasCache, [](const StoreSetup& setup) { return std::make_unique<Peer>(setup); }};
}

StoreKind VemoStore();
StoreKind AppendFloor();
StoreKind LmdbStore();
StoreKind RocksDbStore();
StoreKind LevelDbStore();
StoreKind SqliteStore();
StoreKind BerkeleyDbStore();
StoreKind WiredTigerStore();

// Those that were installed when this was built; vemo first.
std::vector<StoreKind> AllStoreKinds();

}  // namespace vemo::bench
