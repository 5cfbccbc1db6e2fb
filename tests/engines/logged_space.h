// A space of which small commits go to the log, as several tests begin with it.
#pragma once

#include <gtest/gtest.h>

#include <cstdint>
#include <filesystem>
#include <memory>
#include <optional>
#include <string>

#include "tests/engines/lmdb_site.h"
#include "tests/support/temp_folder.h"

namespace vemo::test {

enum class Syncs { kEachCommit, kNothing };
enum class Access { kWriting, kReading };

inline std::unique_ptr<Engine> OpenSpace(const std::filesystem::path& path, Syncs syncs = Syncs::kEachCommit,
                                         Access access = Access::kWriting) {
  LmdbOptions options;
  options.path = path;
  options.syncEachCommit = syncs == Syncs::kEachCommit;
  options.create = access == Access::kWriting;
  options.readOnly = access == Access::kReading;
  return OpenLmdbEngine(options);
}

inline constexpr std::uint64_t kEdited = 3;

// The first commit makes records, the second one the log.
class LoggedSpace : public testing::Test {
 protected:
  LoggedSpace() {
    const auto engine = OpenSpace(space());
    BatchBuilder batch;
    for (std::uint64_t oid = 1; oid <= 20; ++oid) batch.Put(oid, EditedRecord(oid, 0));
    engine->Commit(batch.At(0));
    Edit(*engine, 1, 1);
  }
  std::filesystem::path space() const { return m_folder.path() / "space"; }
  std::filesystem::path file(const char* name) const { return space() / name; }

  static void Edit(Engine& engine, std::uint64_t generation, std::uint64_t version) {
    BatchBuilder batch;
    engine.Commit(batch.Put(kEdited, EditedRecord(kEdited, version)).At(generation));
  }
  // A commit that no log takes.
  static void AddRecord(Engine& engine, std::uint64_t generation) {
    BatchBuilder batch;
    engine.Commit(batch.Put(1000 + generation, "new").At(generation));
  }
  static std::uint64_t GenerationOf(Engine& engine) { return engine.OpenSnapshot()->Generation(); }
  static std::optional<std::string> EditedIn(Engine& engine) {
    return ToText(engine.OpenSnapshot()->Read(OID(kEdited)));
  }

 private:
  TempFolder m_folder;
};

}  // namespace vemo::test
