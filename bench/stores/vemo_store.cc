#include <memory>
#include <optional>
#include <utility>

#include "bench/common/entries.h"
#include "bench/stores/bytes_peer.h"
#include "bench/stores/store_peer.h"
#include "vemo/store.h"

namespace vemo::bench {

namespace {

template <class Map>
class VemoStorePeer : public StorePeer {
 public:
  using Payload = typename Map::mapped_type;

  explicit VemoStorePeer(const StoreSetup& setup) : m_isBounded(setup.cacheBytes > 0) {
    SpaceOptions options;
    options.create = true;
    if (m_isBounded) options.cacheBytes = setup.cacheBytes;
    m_space = CSpace::Open("lmdb:" + (setup.folder / "space").string(), options);
  }

  void Begin() override {
    m_transaction.emplace(*m_space);
    m_map = &m_transaction->Root<Map>("measured");
  }
  void Put(const FieldId& key, std::size_t payload) override {
    m_map->Insert(key, m_payloads[payload], true);
    m_transaction->Trim();
  }
  void Erase(const FieldId& key) override {
    m_map->Delete(key);
    m_transaction->Trim();
  }
  void Commit() override {
    m_transaction->Commit();
    m_transaction.reset();
  }

  void StartReading() override {
    m_snapshot.emplace(*m_space);
    m_read = &m_snapshot->Root<Map>("measured");
  }
  std::uint64_t Find(const FieldId& key) override {
    return m_isBounded ? FindWithoutRoom(key) : Read(m_read->rFind(key));
  }
  std::uint64_t Scan() override {
    std::uint64_t sum = 0;
    ScanMap(*m_snapshot, *m_read, FieldId(), [&sum](const FieldId&, const Payload& payload) {
      sum = ScanStep(sum, PayloadKind<Payload>::Read(payload));
      return true;
    });
    return sum;
  }

 private:
  static std::uint64_t Read(const Payload* payload) { return payload != nullptr ? PayloadKind<Payload>::Read(*payload) : 0; }

  // As docs/operations.md advises where a small part of the map fits into the budget.
  std::uint64_t FindWithoutRoom(const FieldId& key) {
    const std::optional<Payload> payload = PeekMap(*m_snapshot, *m_read, key);
    m_snapshot->Trim();
    return Read(payload ? &*payload : nullptr);
  }

  const bool m_isBounded;
  PayloadPool<Payload> m_payloads;
  std::unique_ptr<CSpace> m_space;
  std::optional<WriteTransaction> m_transaction;
  std::optional<Snapshot> m_snapshot;
  Map* m_map = nullptr;
  const Map* m_read = nullptr;
};

}  // namespace

StoreKind VemoStore() {
  return {"vemo", StoreRole::kStore, true, [](const StoreSetup& setup) -> std::unique_ptr<StorePeer> {
            if (setup.payload == StorePayload::kTombstones)
              return std::make_unique<VemoStorePeer<FieldIdToVectorTombstonesMap>>(setup);
            return std::make_unique<VemoStorePeer<FieldIdToVectorInsertionsMap>>(setup);
          }};
}

}  // namespace vemo::bench
