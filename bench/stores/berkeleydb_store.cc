#include <db.h>

#include <stdexcept>

#include "bench/stores/bytes_peer.h"

namespace vemo::bench {

namespace {

void Check(int code) {
  if (code != 0) throw std::runtime_error(std::string("Berkeley DB: ") + ::db_strerror(code));
}

DBT ToDbt(std::string_view bytes) {
  DBT dbt{};
  dbt.data = const_cast<char*>(bytes.data());
  dbt.size = static_cast<std::uint32_t>(bytes.size());
  return dbt;
}

// A B-tree in an environment with transactions and a log; without locks, as its manual allows a single
// thread. Values are read in a buffer of the caller's.
class BerkeleyDbPeer : public BytesPeer {
 public:
  explicit BerkeleyDbPeer(const StoreSetup& setup) : BytesPeer(setup), m_buffer(4'096) {
    Check(::db_env_create(&m_environment, 0));
    const std::uint64_t cacheBytes = setup.CacheBytes();
    Check(m_environment->set_cachesize(m_environment, 0, static_cast<std::uint32_t>(cacheBytes), 1));
    Check(m_environment->set_lg_bsize(m_environment, 4U << 20));
    Check(m_environment->set_lg_max(m_environment, 64U << 20));
    Check(m_environment->log_set_config(m_environment, DB_LOG_AUTO_REMOVE, 1));
    Check(m_environment->open(m_environment, setup.folder.c_str(),
                              DB_CREATE | DB_INIT_MPOOL | DB_INIT_TXN | DB_INIT_LOG | DB_PRIVATE | DB_RECOVER,
                              0644));
    Check(::db_create(&m_database, m_environment, 0));
    Check(m_database->open(m_database, nullptr, "entries.db", nullptr, DB_BTREE, DB_CREATE | DB_AUTO_COMMIT,
                           0644));
  }
  ~BerkeleyDbPeer() override {
    m_database->close(m_database, 0);
    m_environment->txn_checkpoint(m_environment, 0, 0, DB_FORCE);
    m_environment->close(m_environment, 0);
  }
  BerkeleyDbPeer(const BerkeleyDbPeer&) = delete;
  BerkeleyDbPeer& operator=(const BerkeleyDbPeer&) = delete;

  void Begin() override { Check(m_environment->txn_begin(m_environment, nullptr, &m_transaction, 0)); }
  void Commit() override {
    DB_TXN* transaction = m_transaction;
    m_transaction = nullptr;
    Check(transaction->commit(transaction, DB_TXN_SYNC));
  }
  std::uint64_t Scan() override {
    DBC* cursor = nullptr;
    Check(m_database->cursor(m_database, nullptr, &cursor, DB_CURSOR_BULK));
    std::uint64_t sum = 0;
    DBT key{};
    DBT value{};
    int code = 0;
    while ((code = cursor->get(cursor, &key, &value, DB_NEXT)) == 0) sum = ScanStep(sum, Read(value.data));
    cursor->close(cursor);
    if (code != DB_NOTFOUND) Check(code);
    return sum;
  }

 protected:
  void PutBytes(std::string_view key, std::string_view payload) override {
    DBT k = ToDbt(key);
    DBT v = ToDbt(payload);
    Check(m_database->put(m_database, m_transaction, &k, &v, 0));
  }
  void EraseBytes(std::string_view key) override {
    DBT k = ToDbt(key);
    Check(m_database->del(m_database, m_transaction, &k, 0));
  }
  std::uint64_t FindBytes(std::string_view key) override {
    DBT k = ToDbt(key);
    DBT v{};
    v.flags = DB_DBT_USERMEM;
    v.data = m_buffer.data();
    v.ulen = static_cast<std::uint32_t>(m_buffer.size());
    const int code = m_database->get(m_database, nullptr, &k, &v, 0);
    if (code == DB_NOTFOUND) return 0;
    Check(code);
    return Read(v.data);
  }

 private:
  DB_ENV* m_environment = nullptr;
  DB* m_database = nullptr;
  DB_TXN* m_transaction = nullptr;
  std::vector<char> m_buffer;
};

}  // namespace

StoreKind BerkeleyDbStore() {
  return MakeStoreKind<BerkeleyDbPeer>("BerkeleyDB", StoreRole::kStore, true);
}

}  // namespace vemo::bench
