// The life of one store, from an empty folder to one that was written, read, overwritten and halved.
//
// Each phase runs in a process of its own on the folder that the one before left, so that nothing is in a
// peer's memory that the phase did not put there.
#pragma once

#include <cstddef>
#include <filesystem>
#include <string>
#include <vector>

#include "bench/common/entries.h"
#include "bench/common/measure.h"
#include "bench/stores/store_peer.h"

namespace vemo::bench {

class StoreJob {
 public:
  // `folder` exists and is empty.
  StoreJob(const StoreKind& kind, KeyKind keys, StorePayload payload, std::size_t size,
           std::filesystem::path folder);

  // Runs all phases. Throws what RunInOwnProcess does.
  std::vector<Measurement> Run();

  // What Run reports, without the keys and the payload.
  static std::vector<std::string> Operations(const StoreKind& kind);

 private:
  using Phase = std::vector<Measurement> (StoreJob::*)();

  std::unique_ptr<StorePeer> Open(std::uint64_t cacheBytes = 0) const;
  std::vector<Measurement> Load();
  std::vector<Measurement> CommitSingly();
  std::vector<Measurement> FindAfterReopening();
  std::vector<Measurement> ScanAfterReopening();
  std::vector<Measurement> FindBounded();
  std::vector<Measurement> Overwrite();
  std::vector<Measurement> OverwriteBounded();
  std::vector<Measurement> EraseHalf();
  std::vector<Measurement> MeasureDisk(const char* operation) const;

  double TimeOverwrites(StorePeer& peer, std::size_t payloadShift) const;
  double TimeFinds(StorePeer& peer, std::uint64_t& answers) const;

  const StoreKind& m_kind;
  StorePayload m_payload;
  std::filesystem::path m_folder;
  std::vector<FieldId> m_keys;
  std::vector<std::uint32_t> m_order;
};

// A tenth of what `entries` entries take in the memory of a map of this library.
std::uint64_t BoundedCacheBytes(StorePayload payload, std::size_t entries);

}  // namespace vemo::bench
