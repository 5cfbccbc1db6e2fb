#include "bench/stores/store_peer.h"

namespace vemo::bench {

std::vector<StoreKind> AllStoreKinds() {
  std::vector<StoreKind> kinds{VemoStore(), LmdbStore()};
#ifdef VEMO_BENCH_ROCKSDB
  kinds.push_back(RocksDbStore());
#endif
#ifdef VEMO_BENCH_LEVELDB
  kinds.push_back(LevelDbStore());
#endif
#ifdef VEMO_BENCH_SQLITE
  kinds.push_back(SqliteStore());
#endif
#ifdef VEMO_BENCH_BERKELEYDB
  kinds.push_back(BerkeleyDbStore());
#endif
#ifdef VEMO_BENCH_WIREDTIGER
  kinds.push_back(WiredTigerStore());
#endif
  kinds.push_back(AppendFloor());
  return kinds;
}

}  // namespace vemo::bench
