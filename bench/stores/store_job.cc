#include "bench/stores/store_job.h"

#include <algorithm>
#include <utility>

#include "bench/common/own_process.h"
#include "bench/stores/files.h"

namespace vemo::bench {

namespace {

constexpr std::size_t kLoadBatch = 10'000;
constexpr std::size_t kOverwriteBatch = 1'000;
constexpr std::size_t kMinSingleCommits = 5;
constexpr std::size_t kMaxSingleCommits = 1'000;
constexpr std::size_t kMaxFinds = 100'000;
constexpr std::size_t kMaxOverwrites = 100'000;

constexpr double kMiB = 1'024.0 * 1'024.0;

double PerOperation(double nanoseconds, std::size_t operations) {
  return nanoseconds / static_cast<double>(operations);
}

// Does `change(i)` for i from 0 to count - 1, in commits of `batch` each, and returns the nanoseconds.
template <class Change>
double TimeCommits(StorePeer& peer, std::size_t count, std::size_t batch, const Change& change) {
  const double start = WallNanoseconds();
  for (std::size_t first = 0; first < count; first += batch) {
    peer.Begin();
    for (std::size_t i = first; i < std::min(count, first + batch); ++i) change(i);
    peer.Commit();
  }
  return WallNanoseconds() - start;
}

// Where in `sorted` a share of the values lies below.
double Quantile(const std::vector<double>& sorted, double share) {
  return sorted[static_cast<std::size_t>(share * static_cast<double>(sorted.size() - 1))];
}

}  // namespace

std::uint64_t BoundedCacheBytes(StorePayload payload, std::size_t entries) {
  const std::uint64_t bytesPerEntry = payload == StorePayload::kTombstones ? 130 : 240;
  return bytesPerEntry * entries / 10;
}

StoreJob::StoreJob(const StoreKind& kind, KeyKind keys, StorePayload payload, std::size_t size,
                   std::filesystem::path folder)
    : m_kind(kind),
      m_payload(payload),
      m_folder(std::move(folder)),
      m_keys(MakeKeys(keys, size)),
      m_order(MakeOrder(size, 2)) {}

std::vector<std::string> StoreJob::Operations(const StoreKind& kind) {
  std::vector<std::string> operations{"load",       "load-memory", "commit-median",
                                      "commit-p99", "overwrite",   "erase-half"};
  if (kind.role == StoreRole::kFloor) return operations;
  operations.insert(operations.end(), {"load-disk", "open-cold", "find-cold", "find-warm", "find-memory",
                                       "scan-reopened", "churn-disk"});
  if (kind.hasCache)
    operations.insert(operations.end(), {"find-bounded", "find-bounded-memory", "overwrite-bounded"});
  return operations;
}

std::vector<Measurement> StoreJob::Run() {
  std::vector<Measurement> all;
  const auto run = [&](Phase phase) {
    const std::vector<Measurement> found = RunInOwnProcess([&] { return (this->*phase)(); });
    all.insert(all.end(), found.begin(), found.end());
  };
  const auto measureDisk = [&](const char* operation) {
    const std::vector<Measurement> found = MeasureDisk(operation);
    all.insert(all.end(), found.begin(), found.end());
  };
  const bool isStore = m_kind.role == StoreRole::kStore;

  run(&StoreJob::Load);
  if (isStore) measureDisk("load-disk");
  run(&StoreJob::CommitSingly);
  if (isStore) {
    DropFromPageCache(m_folder);
    run(&StoreJob::FindAfterReopening);
    run(&StoreJob::ScanAfterReopening);
    if (m_kind.hasCache) run(&StoreJob::FindBounded);
  }
  run(&StoreJob::Overwrite);
  if (isStore && m_kind.hasCache) run(&StoreJob::OverwriteBounded);
  run(&StoreJob::EraseHalf);
  if (isStore) measureDisk("churn-disk");
  return all;
}

std::unique_ptr<StorePeer> StoreJob::Open(std::uint64_t cacheBytes) const {
  return m_kind.open({m_folder, m_payload, cacheBytes});
}

std::vector<Measurement> StoreJob::Load() {
  const std::uint64_t before = ResetPeakResident();
  const std::unique_ptr<StorePeer> peer = Open();
  const double nanoseconds =
      TimeCommits(*peer, m_keys.size(), kLoadBatch, [&](std::size_t i) { peer->Put(m_keys[i], i); });
  const double peak = static_cast<double>(PeakResidentBytes() - before) / kMiB;
  return {{"load", "ns/op", PerOperation(nanoseconds, m_keys.size()), m_keys.size()},
          {"load-memory", "MiB", peak, m_keys.size()}};
}

std::vector<Measurement> StoreJob::CommitSingly() {
  const std::unique_ptr<StorePeer> peer = Open();
  // A thousand, or fewer in a store so small that they would take most of the time.
  const std::size_t count = std::clamp(m_keys.size() / 500, kMinSingleCommits, kMaxSingleCommits);
  std::vector<double> microseconds;
  for (std::size_t i = 0; i < count; ++i) {
    const double nanoseconds =
        TimeCommits(*peer, 1, 1, [&](std::size_t) { peer->Put(m_keys[m_order[i]], m_order[i] + 7); });
    microseconds.push_back(nanoseconds / 1'000);
  }
  std::sort(microseconds.begin(), microseconds.end());
  return {{"commit-median", "us", Quantile(microseconds, 0.5), microseconds.size()},
          {"commit-p99", "us", Quantile(microseconds, 0.99), microseconds.size()}};
}

double StoreJob::TimeFinds(StorePeer& peer, std::uint64_t& answers) const {
  const std::size_t count = std::min(m_keys.size(), kMaxFinds);
  answers = 0;
  const double start = WallNanoseconds();
  for (std::size_t i = 0; i < count; ++i) answers += peer.Find(m_keys[m_order[i]]);
  return PerOperation(WallNanoseconds() - start, count);
}

std::vector<Measurement> StoreJob::FindAfterReopening() {
  const std::uint64_t before = ResetPeakResident();
  const double start = WallNanoseconds();
  const std::unique_ptr<StorePeer> peer = Open();
  peer->StartReading();
  const std::uint64_t first = peer->Find(m_keys[m_order.back()]);
  const double opened = WallNanoseconds() - start;
  std::uint64_t cold = 0;
  std::uint64_t warm = 0;
  const double coldNanoseconds = TimeFinds(*peer, cold);
  const double warmNanoseconds = TimeFinds(*peer, warm);
  const double peak = static_cast<double>(PeakResidentBytes() - before) / kMiB;
  return {{"open-cold", "ms", opened / 1e6, first},
          {"find-cold", "ns/op", coldNanoseconds, cold},
          {"find-warm", "ns/op", warmNanoseconds, warm},
          {"find-memory", "MiB", peak, warm}};
}

std::vector<Measurement> StoreJob::ScanAfterReopening() {
  const std::unique_ptr<StorePeer> peer = Open();
  peer->StartReading();
  const double start = WallNanoseconds();
  const std::uint64_t answers = peer->Scan();
  return {{"scan-reopened", "ns/op", PerOperation(WallNanoseconds() - start, m_keys.size()), answers}};
}

std::vector<Measurement> StoreJob::FindBounded() {
  const std::uint64_t before = ResetPeakResident();
  const std::unique_ptr<StorePeer> peer = Open(BoundedCacheBytes(m_payload, m_keys.size()));
  peer->StartReading();
  std::uint64_t answers = 0;
  const double nanoseconds = TimeFinds(*peer, answers);
  const double peak = static_cast<double>(PeakResidentBytes() - before) / kMiB;
  return {{"find-bounded", "ns/op", nanoseconds, answers}, {"find-bounded-memory", "MiB", peak, answers}};
}

double StoreJob::TimeOverwrites(StorePeer& peer, std::size_t payloadShift) const {
  const std::size_t count = std::min(m_keys.size(), kMaxOverwrites);
  const double nanoseconds = TimeCommits(peer, count, kOverwriteBatch, [&](std::size_t i) {
    peer.Put(m_keys[m_order[i]], m_order[i] + payloadShift);
  });
  return PerOperation(nanoseconds, count);
}

std::vector<Measurement> StoreJob::Overwrite() {
  return {{"overwrite", "ns/op", TimeOverwrites(*Open(), 13), m_keys.size()}};
}

std::vector<Measurement> StoreJob::OverwriteBounded() {
  const std::unique_ptr<StorePeer> peer = Open(BoundedCacheBytes(m_payload, m_keys.size()));
  return {{"overwrite-bounded", "ns/op", TimeOverwrites(*peer, 17), m_keys.size()}};
}

std::vector<Measurement> StoreJob::EraseHalf() {
  const std::unique_ptr<StorePeer> peer = Open();
  const std::size_t count = m_keys.size() / 2;
  const double nanoseconds =
      TimeCommits(*peer, count, kLoadBatch, [&](std::size_t i) { peer->Erase(m_keys[m_order[i]]); });
  return {{"erase-half", "ns/op", PerOperation(nanoseconds, count), count}};
}

std::vector<Measurement> StoreJob::MeasureDisk(const char* operation) const {
  const double bytes = static_cast<double>(BytesOnDisk(m_folder));
  return {{operation, "bytes/key", bytes / static_cast<double>(m_keys.size()), m_keys.size()}};
}

}  // namespace vemo::bench
