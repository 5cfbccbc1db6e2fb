#include <lmdb.h>

#include <stdexcept>

#include "bench/stores/bytes_peer.h"

namespace vemo::bench {

namespace {

void Check(int code) {
  if (code != MDB_SUCCESS) throw std::runtime_error(std::string("LMDB: ") + ::mdb_strerror(code));
}

MDB_val ToValue(std::string_view bytes) {
  return {bytes.size(), const_cast<char*>(bytes.data())};
}

// A transaction a commit; values are read in place in the map. LMDB has no cache of its own to bound.
class LmdbPeer : public BytesPeer {
 public:
  explicit LmdbPeer(const StoreSetup& setup) : BytesPeer(setup) {
    Check(::mdb_env_create(&m_environment));
    Check(::mdb_env_set_mapsize(m_environment, 16ULL << 30));
    Check(::mdb_env_open(m_environment, setup.folder.c_str(), 0, 0644));
    MDB_txn* transaction = nullptr;
    Check(::mdb_txn_begin(m_environment, nullptr, 0, &transaction));
    Check(::mdb_dbi_open(transaction, nullptr, 0, &m_database));
    Check(::mdb_txn_commit(transaction));
  }
  ~LmdbPeer() override {
    if (m_transaction != nullptr) ::mdb_txn_abort(m_transaction);
    ::mdb_env_close(m_environment);
  }
  LmdbPeer(const LmdbPeer&) = delete;
  LmdbPeer& operator=(const LmdbPeer&) = delete;

  void Begin() override { Check(::mdb_txn_begin(m_environment, nullptr, 0, &m_transaction)); }
  void Commit() override {
    MDB_txn* transaction = m_transaction;
    m_transaction = nullptr;
    Check(::mdb_txn_commit(transaction));
  }
  void StartReading() override { Check(::mdb_txn_begin(m_environment, nullptr, MDB_RDONLY, &m_transaction)); }
  std::uint64_t Scan() override {
    MDB_cursor* cursor = nullptr;
    Check(::mdb_cursor_open(m_transaction, m_database, &cursor));
    std::uint64_t sum = 0;
    MDB_val key{};
    MDB_val value{};
    int code = ::mdb_cursor_get(cursor, &key, &value, MDB_FIRST);
    for (; code == MDB_SUCCESS; code = ::mdb_cursor_get(cursor, &key, &value, MDB_NEXT))
      sum = ScanStep(sum, Read(value.mv_data));
    ::mdb_cursor_close(cursor);
    if (code != MDB_NOTFOUND) Check(code);
    return sum;
  }

 protected:
  void PutBytes(std::string_view key, std::string_view payload) override {
    MDB_val k = ToValue(key);
    MDB_val v = ToValue(payload);
    Check(::mdb_put(m_transaction, m_database, &k, &v, 0));
  }
  void EraseBytes(std::string_view key) override {
    MDB_val k = ToValue(key);
    Check(::mdb_del(m_transaction, m_database, &k, nullptr));
  }
  std::uint64_t FindBytes(std::string_view key) override {
    MDB_val k = ToValue(key);
    MDB_val v{};
    const int code = ::mdb_get(m_transaction, m_database, &k, &v);
    if (code == MDB_NOTFOUND) return 0;
    Check(code);
    return Read(v.mv_data);
  }

 private:
  MDB_env* m_environment = nullptr;
  MDB_dbi m_database = 0;
  MDB_txn* m_transaction = nullptr;
};

}  // namespace

StoreKind LmdbStore() {
  return MakeStoreKind<LmdbPeer>("LMDB", StoreRole::kStore, false);
}

}  // namespace vemo::bench
