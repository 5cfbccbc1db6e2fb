#include <sqlite3.h>

#include <stdexcept>

#include "bench/stores/bytes_peer.h"

namespace vemo::bench {

namespace {

// A write-ahead log that is synced at every commit, a table that is its own index, prepared statements, and
// values bound and read without a copy.
class SqlitePeer : public BytesPeer {
 public:
  explicit SqlitePeer(const StoreSetup& setup) : BytesPeer(setup) {
    Check(::sqlite3_open((setup.folder / "db").c_str(), &m_database));
    const std::uint64_t cacheBytes = setup.CacheBytes();
    Execute("PRAGMA journal_mode=WAL");
    Execute("PRAGMA synchronous=FULL");
    Execute("PRAGMA cache_size=-" + std::to_string(cacheBytes / 1024));
    if (setup.cacheBytes == 0) Execute("PRAGMA mmap_size=" + std::to_string(4 * kAmpleCacheBytes));
    Execute("CREATE TABLE IF NOT EXISTS entries(k BLOB PRIMARY KEY, v BLOB NOT NULL) WITHOUT ROWID");
    m_begin = Prepare("BEGIN IMMEDIATE");
    m_commit = Prepare("COMMIT");
    m_put = Prepare("INSERT INTO entries VALUES(?1, ?2) ON CONFLICT(k) DO UPDATE SET v = excluded.v");
    m_erase = Prepare("DELETE FROM entries WHERE k = ?1");
    m_find = Prepare("SELECT v FROM entries WHERE k = ?1");
    m_scan = Prepare("SELECT v FROM entries ORDER BY k");
  }
  ~SqlitePeer() override {
    for (sqlite3_stmt* statement : {m_begin, m_commit, m_put, m_erase, m_find, m_scan})
      ::sqlite3_finalize(statement);
    ::sqlite3_close(m_database);
  }
  SqlitePeer(const SqlitePeer&) = delete;
  SqlitePeer& operator=(const SqlitePeer&) = delete;

  void Begin() override { Run(m_begin); }
  void Commit() override { Run(m_commit); }
  void StartReading() override { Execute("BEGIN"); }
  std::uint64_t Scan() override {
    std::uint64_t sum = 0;
    while (Step(m_scan)) sum = ScanStep(sum, Read(::sqlite3_column_blob(m_scan, 0)));
    Check(::sqlite3_reset(m_scan));
    return sum;
  }

 protected:
  void PutBytes(std::string_view key, std::string_view payload) override {
    Bind(m_put, 1, key);
    Bind(m_put, 2, payload);
    Run(m_put);
  }
  void EraseBytes(std::string_view key) override {
    Bind(m_erase, 1, key);
    Run(m_erase);
  }
  std::uint64_t FindBytes(std::string_view key) override {
    Bind(m_find, 1, key);
    const std::uint64_t found = Step(m_find) ? Read(::sqlite3_column_blob(m_find, 0)) : 0;
    Check(::sqlite3_reset(m_find));
    return found;
  }

 private:
  void Check(int code) {
    if (code != SQLITE_OK) throw std::runtime_error(std::string("SQLite: ") + ::sqlite3_errmsg(m_database));
  }
  void Execute(const std::string& sql) {
    Check(::sqlite3_exec(m_database, sql.c_str(), nullptr, nullptr, nullptr));
  }
  sqlite3_stmt* Prepare(const char* sql) {
    sqlite3_stmt* statement = nullptr;
    Check(::sqlite3_prepare_v3(m_database, sql, -1, SQLITE_PREPARE_PERSISTENT, &statement, nullptr));
    return statement;
  }
  void Bind(sqlite3_stmt* statement, int parameter, std::string_view bytes) {
    Check(::sqlite3_bind_blob(statement, parameter, bytes.data(), static_cast<int>(bytes.size()),
                              SQLITE_STATIC));
  }
  // Whether there is a row.
  bool Step(sqlite3_stmt* statement) {
    const int code = ::sqlite3_step(statement);
    if (code != SQLITE_ROW && code != SQLITE_DONE) Check(code);
    return code == SQLITE_ROW;
  }
  void Run(sqlite3_stmt* statement) {
    Step(statement);
    Check(::sqlite3_reset(statement));
  }

  sqlite3* m_database = nullptr;
  sqlite3_stmt* m_begin = nullptr;
  sqlite3_stmt* m_commit = nullptr;
  sqlite3_stmt* m_put = nullptr;
  sqlite3_stmt* m_erase = nullptr;
  sqlite3_stmt* m_find = nullptr;
  sqlite3_stmt* m_scan = nullptr;
};

}  // namespace

StoreKind SqliteStore() {
  return MakeStoreKind<SqlitePeer>("SQLite", StoreRole::kStore, true);
}

}  // namespace vemo::bench
