#include <leveldb/cache.h>
#include <leveldb/db.h>
#include <leveldb/filter_policy.h>
#include <leveldb/write_batch.h>

#include <stdexcept>

#include "bench/stores/bytes_peer.h"

namespace vemo::bench {

namespace {

void Check(const leveldb::Status& status) {
  if (!status.ok()) throw std::runtime_error("LevelDB: " + status.ToString());
}

leveldb::Slice ToSlice(std::string_view bytes) {
  return {bytes.data(), bytes.size()};
}

// A block cache, a Bloom filter of 10 bits and a larger write buffer, as its documentation advises; write
// batches.
class LevelDbPeer : public BytesPeer {
 public:
  explicit LevelDbPeer(const StoreSetup& setup)
      : BytesPeer(setup),
        m_cache(leveldb::NewLRUCache(setup.CacheBytes())),
        m_filter(leveldb::NewBloomFilterPolicy(10)) {
    leveldb::Options options;
    options.create_if_missing = true;
    options.block_cache = m_cache.get();
    options.filter_policy = m_filter.get();
    options.write_buffer_size = setup.cacheBytes == 0 ? 64U << 20 : setup.cacheBytes / 2;
    leveldb::DB* database = nullptr;
    Check(leveldb::DB::Open(options, (setup.folder / "db").string(), &database));
    m_database.reset(database);
    m_durably.sync = true;
  }

  void Begin() override { m_batch.Clear(); }
  void Commit() override { Check(m_database->Write(m_durably, &m_batch)); }
  std::uint64_t Scan() override {
    const std::unique_ptr<leveldb::Iterator> it(m_database->NewIterator(leveldb::ReadOptions()));
    std::uint64_t sum = 0;
    for (it->SeekToFirst(); it->Valid(); it->Next()) sum = ScanStep(sum, Read(it->value().data()));
    Check(it->status());
    return sum;
  }

 protected:
  void PutBytes(std::string_view key, std::string_view payload) override {
    m_batch.Put(ToSlice(key), ToSlice(payload));
  }
  void EraseBytes(std::string_view key) override { m_batch.Delete(ToSlice(key)); }
  std::uint64_t FindBytes(std::string_view key) override {
    const leveldb::Status status = m_database->Get(leveldb::ReadOptions(), ToSlice(key), &m_value);
    if (status.IsNotFound()) return 0;
    Check(status);
    return Read(m_value.data());
  }

 private:
  std::unique_ptr<leveldb::Cache> m_cache;
  std::unique_ptr<const leveldb::FilterPolicy> m_filter;
  std::unique_ptr<leveldb::DB> m_database;
  leveldb::WriteOptions m_durably;
  leveldb::WriteBatch m_batch;
  std::string m_value;
};

}  // namespace

StoreKind LevelDbStore() {
  return MakeStoreKind<LevelDbPeer>("LevelDB", StoreRole::kStore, true);
}

}  // namespace vemo::bench
