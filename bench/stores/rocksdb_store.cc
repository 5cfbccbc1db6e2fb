#include <rocksdb/cache.h>
#include <rocksdb/db.h>
#include <rocksdb/filter_policy.h>
#include <rocksdb/options.h>
#include <rocksdb/table.h>
#include <rocksdb/write_batch.h>

#include <stdexcept>

#include "bench/stores/bytes_peer.h"

namespace vemo::bench {

namespace {

void Check(const rocksdb::Status& status) {
  if (!status.ok()) throw std::runtime_error("RocksDB: " + status.ToString());
}

rocksdb::Slice ToSlice(std::string_view bytes) {
  return {bytes.data(), bytes.size()};
}

// As its tuning guide begins: background threads for the cores, level compaction with a memtable budget, a
// block cache and Bloom filters of 10 bits, which the cache holds as well; write batches, and pinned values
// instead of copies.
class RocksDbPeer : public BytesPeer {
 public:
  explicit RocksDbPeer(const StoreSetup& setup) : BytesPeer(setup) {
    rocksdb::Options options;
    options.create_if_missing = true;
    options.IncreaseParallelism(2);
    rocksdb::BlockBasedTableOptions table;
    table.filter_policy.reset(rocksdb::NewBloomFilterPolicy(10));
    if (setup.cacheBytes == 0) {
      options.OptimizeLevelStyleCompaction(kAmpleCacheBytes);
      table.block_cache = rocksdb::NewLRUCache(kAmpleCacheBytes);
    } else {
      table.block_cache = rocksdb::NewLRUCache(setup.cacheBytes);
      table.cache_index_and_filter_blocks = true;
      options.write_buffer_size = setup.cacheBytes / 2;
    }
    options.table_factory.reset(rocksdb::NewBlockBasedTableFactory(table));
    rocksdb::DB* database = nullptr;
    Check(rocksdb::DB::Open(options, (setup.folder / "db").string(), &database));
    m_database.reset(database);
    m_durably.sync = true;
  }

  void Begin() override { m_batch.Clear(); }
  void Commit() override { Check(m_database->Write(m_durably, &m_batch)); }
  std::uint64_t Scan() override {
    const std::unique_ptr<rocksdb::Iterator> it(m_database->NewIterator(rocksdb::ReadOptions()));
    std::uint64_t sum = 0;
    for (it->SeekToFirst(); it->Valid(); it->Next()) sum = ScanStep(sum, Read(it->value().data()));
    Check(it->status());
    return sum;
  }

 protected:
  void PutBytes(std::string_view key, std::string_view payload) override {
    Check(m_batch.Put(ToSlice(key), ToSlice(payload)));
  }
  void EraseBytes(std::string_view key) override { Check(m_batch.Delete(ToSlice(key))); }
  std::uint64_t FindBytes(std::string_view key) override {
    m_value.Reset();
    const rocksdb::Status status =
        m_database->Get(rocksdb::ReadOptions(), m_database->DefaultColumnFamily(), ToSlice(key), &m_value);
    if (status.IsNotFound()) return 0;
    Check(status);
    return Read(m_value.data());
  }

 private:
  std::unique_ptr<rocksdb::DB> m_database;
  rocksdb::WriteOptions m_durably;
  rocksdb::WriteBatch m_batch;
  rocksdb::PinnableSlice m_value;
};

}  // namespace

StoreKind RocksDbStore() {
  return MakeStoreKind<RocksDbPeer>("RocksDB", StoreRole::kStore, true);
}

}  // namespace vemo::bench
