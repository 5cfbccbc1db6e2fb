#include <wiredtiger.h>

#include <algorithm>
#include <stdexcept>

#include "bench/stores/bytes_peer.h"

namespace vemo::bench {

namespace {

void Check(int code) {
  if (code != 0) throw std::runtime_error(std::string("WiredTiger: ") + ::wiredtiger_strerror(code));
}

WT_ITEM ToItem(std::string_view bytes) {
  WT_ITEM item{};
  item.data = bytes.data();
  item.size = bytes.size();
  return item;
}

// A row store with a log that is synced at every commit, and one cursor for everything.
class WiredTigerPeer : public BytesPeer {
 public:
  explicit WiredTigerPeer(const StoreSetup& setup) : BytesPeer(setup) {
    // A transaction keeps the pages that it changes in the cache, of 32 KiB and more: one of a thousand keys that lie apart is
    // rolled back, as often as it is tried, where there is less room. So its bounded cache is larger than others'.
    const std::uint64_t cacheBytes = std::max<std::uint64_t>(setup.CacheBytes(), 64U << 20);
    const std::string options = "create,cache_size=" + std::to_string(cacheBytes) +
                                ",log=(enabled=true),transaction_sync=(enabled=true,method=fsync)";
    Check(::wiredtiger_open(setup.folder.c_str(), nullptr, options.c_str(), &m_connection));
    Check(m_connection->open_session(m_connection, nullptr, nullptr, &m_session));
    Check(m_session->create(m_session, "table:entries", "key_format=u,value_format=u"));
    Check(m_session->open_cursor(m_session, "table:entries", nullptr, nullptr, &m_cursor));
  }
  ~WiredTigerPeer() override { m_connection->close(m_connection, nullptr); }
  WiredTigerPeer(const WiredTigerPeer&) = delete;
  WiredTigerPeer& operator=(const WiredTigerPeer&) = delete;

  void Begin() override { Check(m_session->begin_transaction(m_session, nullptr)); }
  void Commit() override { Check(m_session->commit_transaction(m_session, nullptr)); }
  void StartReading() override { Check(m_session->begin_transaction(m_session, nullptr)); }
  std::uint64_t Scan() override {
    Check(m_cursor->reset(m_cursor));
    std::uint64_t sum = 0;
    int code = 0;
    while ((code = m_cursor->next(m_cursor)) == 0) sum = ScanStep(sum, ReadValue());
    if (code != WT_NOTFOUND) Check(code);
    return sum;
  }

 protected:
  void PutBytes(std::string_view key, std::string_view payload) override {
    const WT_ITEM k = ToItem(key);
    const WT_ITEM v = ToItem(payload);
    m_cursor->set_key(m_cursor, &k);
    m_cursor->set_value(m_cursor, &v);
    Check(m_cursor->insert(m_cursor));
  }
  void EraseBytes(std::string_view key) override {
    const WT_ITEM k = ToItem(key);
    m_cursor->set_key(m_cursor, &k);
    Check(m_cursor->remove(m_cursor));
  }
  std::uint64_t FindBytes(std::string_view key) override {
    const WT_ITEM k = ToItem(key);
    m_cursor->set_key(m_cursor, &k);
    const int code = m_cursor->search(m_cursor);
    if (code == WT_NOTFOUND) return 0;
    Check(code);
    return ReadValue();
  }

 private:
  std::uint64_t ReadValue() {
    WT_ITEM value{};
    Check(m_cursor->get_value(m_cursor, &value));
    return Read(value.data);
  }

  WT_CONNECTION* m_connection = nullptr;
  WT_SESSION* m_session = nullptr;
  WT_CURSOR* m_cursor = nullptr;
};

}  // namespace

StoreKind WiredTigerStore() {
  return MakeStoreKind<WiredTigerPeer>("WiredTiger", StoreRole::kStore, true);
}

}  // namespace vemo::bench
