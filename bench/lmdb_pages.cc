// What checking LMDB's pages costs: random reads of records by the engine and by mdb_get, from one file; the first read of
// a page in a snapshot; opening a snapshot; commits of one record.
//
//   lmdb_pages FOLDER [RECORDS]     makes a space of that many records (16,000) of 1,100 bytes in FOLDER
#include <lmdb.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <memory>
#include <random>
#include <string>
#include <vector>

#include "engines/lmdb/lmdb_engine.h"

namespace {

using Clock = std::chrono::steady_clock;

double Nanoseconds(Clock::time_point start) {
  return std::chrono::duration<double, std::nano>(Clock::now() - start).count();
}

double Median(std::vector<double> values) {
  std::nth_element(values.begin(), values.begin() + static_cast<std::ptrdiff_t>(values.size() / 2), values.end());
  return values[values.size() / 2];
}

std::vector<std::uint64_t> RandomIds(std::uint64_t records, std::size_t count) {
  std::mt19937_64 random(1);
  std::vector<std::uint64_t> ids(count);
  for (std::uint64_t& id : ids) id = 1 + random() % records;
  return ids;
}

// The median time of a read, over batches short enough to be left alone by other processes.
template <typename Read>
double TimeOf(const std::vector<std::uint64_t>& ids, const Read& read) {
  constexpr std::size_t kBatch = 100;
  std::vector<double> batches;
  for (std::size_t i = 0; i + kBatch <= ids.size(); i += kBatch) {
    const auto start = Clock::now();
    for (std::size_t j = i; j < i + kBatch; ++j) read(ids[j]);
    batches.push_back(Nanoseconds(start) / kBatch);
  }
  return Median(std::move(batches));
}

std::unique_ptr<vemo::Engine> Open(const std::string& folder, bool syncEachCommit) {
  vemo::LmdbOptions options;
  options.path = folder;
  options.create = true;
  options.syncEachCommit = syncEachCommit;
  return vemo::OpenLmdbEngine(options);
}

volatile std::uint8_t g_sink;  // what is read into it must be read

void Use(std::uint8_t byte) { g_sink = byte; }

double ReadByEngine(const vemo::EngineSnapshot& snapshot, const std::vector<std::uint64_t>& ids) {
  return TimeOf(ids, [&](std::uint64_t id) { Use((*snapshot.Read(vemo::OID(id)))[0]); });
}

// The median time of a commit of one record, in microseconds.
double CommitTime(vemo::Engine& engine, const std::vector<std::uint64_t>& ids, const vemo::Bytes& record) {
  std::uint64_t generation = engine.OpenSnapshot()->Generation();
  std::vector<double> commits;
  for (std::size_t i = 0; i < 300; ++i) {
    vemo::CommitBatch batch;
    batch.expectedGeneration = generation;
    batch.records.push_back({vemo::OID(ids[i]), record});
    const auto start = Clock::now();
    generation = engine.Commit(batch);
    commits.push_back(Nanoseconds(start) / 1000);
  }
  return Median(std::move(commits));
}

double ReadByLmdb(const std::string& folder, const std::vector<std::uint64_t>& ids) {
  MDB_env* env = nullptr;
  MDB_txn* txn = nullptr;
  MDB_dbi dbi = 0;
  mdb_env_create(&env);
  mdb_env_set_maxdbs(env, 8);
  mdb_env_set_mapsize(env, std::size_t{1} << 30);
  if (mdb_env_open(env, folder.c_str(), MDB_RDONLY | MDB_NOLOCK, 0) != 0) std::exit(1);
  mdb_txn_begin(env, nullptr, MDB_RDONLY, &txn);
  mdb_dbi_open(txn, "records", 0, &dbi);
  const auto read = [&](std::uint64_t id) {
    std::uint64_t bytes = __builtin_bswap64(id);
    MDB_val key{sizeof bytes, &bytes};
    MDB_val value{};
    if (mdb_get(txn, dbi, &key, &value) != 0) std::exit(1);
    Use(static_cast<std::uint8_t*>(value.mv_data)[8]);
  };
  TimeOf(ids, read);  // warms up
  const double spent = TimeOf(ids, read);
  mdb_txn_abort(txn);
  mdb_env_close(env);
  return spent;
}

}  // namespace

int main(int argc, char** argv) {
  if (argc < 2) return 2;
  const std::string folder = argv[1];
  const std::uint64_t records = argc > 2 ? std::strtoull(argv[2], nullptr, 10) : 16'000;
  const std::vector<std::uint64_t> ids = RandomIds(records, 100'000);
  const vemo::Bytes record(1100, 'x');
  {
    const auto engine = Open(folder, true);
    vemo::CommitBatch batch;
    for (std::uint64_t id = 1; id <= records; ++id) batch.records.push_back({vemo::OID(id), record});
    engine->Commit(batch);
    std::printf("a durable commit of one record: %.0f us\n", CommitTime(*engine, ids, record));
    std::vector<double> openings;
    for (int i = 0; i < 1000; ++i) {
      const auto start = Clock::now();
      engine->OpenSnapshot();
      openings.push_back(Nanoseconds(start));
    }
    std::printf("opening and closing a snapshot: %.0f ns\n", Median(openings));
    const auto snapshot = engine->OpenSnapshot();
    const std::vector<std::uint64_t> few(ids.begin(), ids.begin() + 2000);
    std::printf("reading a record, mostly for the first time in the snapshot: %.0f ns\n", ReadByEngine(*snapshot, few));
    ReadByEngine(*snapshot, ids);
    std::printf("reading a record again: %.0f ns\n", ReadByEngine(*snapshot, ids));
  }
  std::printf("the same by mdb_get: %.0f ns\n", ReadByLmdb(folder, ids));
  {
    const auto engine = Open(folder, false);
    std::printf("a commit that is not synced: %.1f us\n", CommitTime(*engine, ids, record));
  }
}
