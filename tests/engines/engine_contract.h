// The contract of store/engine.h as tests: every engine is one line in engine_sites.cc, and each file
// *_contract_test.cc runs over all of them; tests that close the engine and open it again run over those that
// are persistent.
#pragma once

#include <gtest/gtest.h>

#include <functional>
#include <memory>
#include <optional>
#include <ostream>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "store/engine.h"

namespace vemo::test {

// A place where one space is, or can be made.
class EngineSite {
 public:
  virtual ~EngineSite() = default;

  // Opens the space, making it the first time. At most one engine of a site is open at a time.
  virtual std::unique_ptr<Engine> Open() = 0;
};

struct EngineKind {
  std::string name;
  bool isPersistent;  // the space is there when the site is opened again
  std::function<std::unique_ptr<EngineSite>()> makeSite;
};
inline void PrintTo(const EngineKind& kind, std::ostream* os) {
  *os << kind.name;
}

const std::vector<EngineKind>& AllEngineKinds();
std::vector<EngineKind> PersistentEngineKinds();

inline Bytes ToBytes(std::string_view text) {
  return Bytes(text.begin(), text.end());
}
inline std::string ToText(ByteView bytes) {
  return std::string(bytes.begin(), bytes.end());
}
std::optional<std::string> ToText(const std::optional<ByteView>& bytes);

// A batch that owns the bytes of its records.
class BatchBuilder {
 public:
  BatchBuilder& Put(std::uint64_t oid, std::string bytes);
  BatchBuilder& Remove(std::uint64_t oid);
  BatchBuilder& Queue(std::uint64_t oid);
  BatchBuilder& Finish(std::uint64_t oid);
  BatchBuilder& Name(NamedTable table, std::string name, std::string value);
  BatchBuilder& Unname(NamedTable table, std::string name);

  // Valid until the next call on this builder.
  const CommitBatch& At(std::uint64_t expectedGeneration);

 private:
  std::vector<std::pair<OID, std::string>> m_records;
  CommitBatch m_batch;
};

using Records = std::vector<std::pair<std::uint64_t, std::string>>;
using Named = std::vector<std::pair<std::string, std::string>>;

// All that a snapshot shows, in the order of its scans.
struct Contents {
  std::uint64_t generation = 0;
  Records records;
  Named info, roots, meta;
  std::vector<std::uint64_t> queue;

  friend bool operator==(const Contents& a, const Contents& b) {
    return a.generation == b.generation && a.records == b.records && a.info == b.info && a.roots == b.roots &&
           a.meta == b.meta && a.queue == b.queue;
  }
};
void PrintTo(const Contents& contents, std::ostream* os);

Records AllRecords(const EngineSnapshot& snapshot, std::uint64_t first = 0);
Named AllNamed(const EngineSnapshot& snapshot, NamedTable table, std::string_view prefix = {});
std::vector<std::uint64_t> Queue(const EngineSnapshot& snapshot, std::size_t limit = 1000);
Contents ContentsOf(const EngineSnapshot& snapshot);
Contents NewestContents(Engine& engine);

class EngineContract : public testing::TestWithParam<EngineKind> {
 protected:
  EngineContract() : m_site(GetParam().makeSite()), m_engine(m_site->Open()) {}

  Engine& engine() { return *m_engine; }
  bool IsPersistent() const { return GetParam().isPersistent; }
  void Reopen() {
    m_engine.reset();
    m_engine = m_site->Open();
  }
  std::uint64_t Commit(BatchBuilder& batch) {
    const std::uint64_t newest = m_engine->OpenSnapshot()->Generation();
    return m_engine->Commit(batch.At(newest));
  }

 private:
  std::unique_ptr<EngineSite> m_site;
  std::unique_ptr<Engine> m_engine;
};

std::string EngineKindName(const testing::TestParamInfo<EngineKind>& info);

}  // namespace vemo::test
