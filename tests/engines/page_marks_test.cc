// Who relies on the checks of whom: the readers of one state of data.mdb on those of each other, what changes it on none.
#include "engines/lmdb/page_marks.h"

#include <gtest/gtest.h>

#include <atomic>
#include <cstring>
#include <fstream>
#include <functional>
#include <thread>
#include <vector>

#include "engines/lmdb/big_endian.h"
#include "tests/engines/logged_space.h"

namespace vemo::test {
namespace {

constexpr std::size_t kPageBytes = 4096;
constexpr int kThreads = 4;

TEST(PageMarks, APageKeepsThePlaceFromWhichItWasReachedFirst) {
  constexpr PageNumber kLast = 5'000;
  PageMarks marks(kLast);
  for (const PageNumber page : {PageNumber{0}, PageNumber{511}, PageNumber{512}, kLast}) {
    EXPECT_EQ(marks.Of(page), 0u);
    EXPECT_TRUE(marks.Set(page, page + 7));
    EXPECT_TRUE(marks.Set(page, page + 7));
    EXPECT_FALSE(marks.Set(page, page + 8));
    EXPECT_EQ(marks.Of(page), page + 7);
  }
  EXPECT_EQ(marks.Of(1), 0u);
}

TEST(PageMarks, OfThreadsThatReachAPageFromDifferentPlacesAllButOneAreTold) {
  constexpr PageNumber kPages = 3'000;
  PageMarks marks(kPages - 1);
  std::vector<std::atomic<int>> accepted(kPages);
  std::vector<std::thread> threads;
  for (int thread = 1; thread <= kThreads; ++thread) {
    threads.emplace_back([&, place = static_cast<std::uint64_t>(thread)] {
      for (PageNumber page = 0; page < kPages; ++page) {
        if (marks.Set(page, place)) {
          ++accepted[page];
          EXPECT_EQ(marks.Of(page), place);
        } else {
          EXPECT_NE(marks.Of(page), place);
        }
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  for (PageNumber page = 0; page < kPages; ++page) EXPECT_EQ(accepted[page], 1) << page;
}

// Records on many pages, in one version each, and a log.
class SharedChecks : public testing::Test {
 protected:
  static constexpr std::uint64_t kRecords = 400;
  static constexpr std::uint64_t kNear = 100, kFar = 300;  // on different pages

  SharedChecks() {
    const auto engine = OpenSpace(space());
    BatchBuilder batch;
    for (std::uint64_t oid = 1; oid <= kRecords; ++oid) batch.Put(oid, RecordOf(oid, 0));
    engine->Commit(batch.At(0));
    Edit(*engine, kRecords, 1);  // makes the log
  }
  std::filesystem::path space() const { return m_folder.path() / "space"; }
  std::filesystem::path data() const { return space() / "data.mdb"; }

  static std::string RecordOf(std::uint64_t oid, std::uint64_t version) { return EditedRecord(oid % 26, version); }
  static void Commit(Engine& engine, BatchBuilder& batch) { engine.Commit(batch.At(engine.OpenSnapshot()->Generation())); }
  static void Edit(Engine& engine, std::uint64_t oid, std::uint64_t version) {
    BatchBuilder batch;
    Commit(engine, batch.Put(oid, RecordOf(oid, version)));
  }
  static std::optional<std::string> Read(Engine& engine, std::uint64_t oid) {
    return ToText(engine.OpenSnapshot()->Read(OID(oid)));
  }

  // Damages the leaf where the record is in a way that a check finds, and that makes no difference to who does without: the page
  // has another number.
  void DamageLeafOf(std::uint64_t oid) {
    const BigEndian64 key = ToBigEndian(oid);
    std::string text = ReadFile(data());
    std::size_t found = 0;
    for (std::size_t page = 0; page + kPageBytes <= text.size(); page += kPageBytes) {
      std::uint16_t flags = 0, lower = 0;
      std::memcpy(&flags, &text[page + 10], 2);
      std::memcpy(&lower, &text[page + 12], 2);
      if (flags != kLeafPage) continue;
      for (std::size_t slot = kPageHeaderBytes; slot < lower; slot += 2) {
        std::uint16_t offset = 0;
        std::memcpy(&offset, &text[page + slot], 2);
        const NodeView node(reinterpret_cast<const std::uint8_t*>(&text[page + offset]));
        if (node.keyBytes() != key.size() || std::memcmp(node.key().data(), key.data(), key.size()) != 0) continue;
        ++found;
        std::fstream file(data(), std::ios::in | std::ios::out | std::ios::binary);
        file.seekp(static_cast<std::streamoff>(page));
        file.put(static_cast<char>(text[page] ^ 0x40));
      }
    }
    ASSERT_EQ(found, 1u);
  }
  static void ExpectDamaged(const std::function<void()>& act) {
    const std::string message = MessageOf<DamagedStorage>(act);
    EXPECT_TRUE(Contains(message, "the number of another page")) << message;
  }

 private:
  TempFolder m_folder;
};

TEST_F(SharedChecks, APageThatASnapshotHasReadIsNotCheckedByTheNextOne) {
  const auto engine = OpenSpace(space());
  EXPECT_EQ(Read(*engine, kNear), RecordOf(kNear, 0));
  DamageLeafOf(kNear);
  DamageLeafOf(kFar);
  EXPECT_EQ(Read(*engine, kNear), RecordOf(kNear, 0));
  ExpectDamaged([&] { Read(*engine, kFar); });
  ExpectDamaged([&] { Read(*engine, kFar); });
}

TEST_F(SharedChecks, ACommitToTheLogDoesNotCheckWhatWasRead) {
  const auto engine = OpenSpace(space());
  EXPECT_EQ(Read(*engine, kNear), RecordOf(kNear, 0));
  DamageLeafOf(kNear);
  DamageLeafOf(kFar);
  const std::string before = ReadFile(data());
  Edit(*engine, kNear, 2);
  EXPECT_EQ(Read(*engine, kNear), RecordOf(kNear, 2));
  EXPECT_EQ(ReadFile(data()), before);
  ExpectDamaged([&] { Edit(*engine, kFar, 2); });
}

TEST_F(SharedChecks, ASnapshotDoesNotCheckWhatACommitToTheLogHasRead) {
  const auto engine = OpenSpace(space());
  Edit(*engine, kNear, 2);
  DamageLeafOf(kNear);
  EXPECT_EQ(Read(*engine, kNear), RecordOf(kNear, 2));
}

// LMDB would follow what stands there.
TEST_F(SharedChecks, WhatLmdbReadsForAChangeIsCheckedForEachTransaction) {
  const auto engine = OpenSpace(space());
  EXPECT_EQ(Read(*engine, kNear), RecordOf(kNear, 0));
  DamageLeafOf(kNear);
  BatchBuilder whole, without, neighbour;
  ExpectDamaged([&] { Commit(*engine, whole.Put(kNear, std::string(700, '!'))); });
  ExpectDamaged([&] { Commit(*engine, without.Remove(kNear)); });
  for (std::uint64_t oid = kNear - 8; oid < kNear; ++oid) neighbour.Remove(oid);
  ExpectDamaged([&] { Commit(*engine, neighbour); });
  EXPECT_EQ(engine->OpenSnapshot()->Generation(), 2u);
}

TEST_F(SharedChecks, BeginAnewWithTheNextCommitToTheTables) {
  const auto engine = OpenSpace(space());
  const auto old = engine->OpenSnapshot();
  EXPECT_EQ(ToText(old->Read(OID(kNear))), RecordOf(kNear, 0));
  DamageLeafOf(kNear);
  BatchBuilder batch;
  Commit(*engine, batch.Put(kRecords + 1, "new"));
  ExpectDamaged([&] { Read(*engine, kNear); });
  EXPECT_EQ(Read(*engine, kRecords + 1), "new");
  EXPECT_EQ(ToText(old->Read(OID(kNear))), RecordOf(kNear, 0));
}

TEST_F(SharedChecks, TheCheckOfAllPagesReliesOnNone) {
  const auto engine = OpenSpace(space());
  const auto snapshot = engine->OpenSnapshot();
  EXPECT_TRUE(snapshot->Read(OID(kNear)));
  EXPECT_TRUE(snapshot->CheckStorage().empty());
  DamageLeafOf(kNear);
  EXPECT_EQ(snapshot->CheckStorage().size(), 1u);
}

TEST_F(SharedChecks, AreMadeByThreadsThatReadTheSamePagesAtOnce) {
  const auto engine = OpenSpace(space(), Syncs::kNothing);
  std::atomic<bool> isOver = false;
  std::atomic<std::uint64_t> newest = 0;
  std::vector<std::thread> readers;
  for (int thread = 0; thread < kThreads; ++thread) {
    readers.emplace_back([&] {
      do {
        const std::uint64_t atLeast = newest;
        const auto snapshot = engine->OpenSnapshot();
        for (std::uint64_t oid = 1; oid < kRecords; ++oid) {
          const std::string record = ToText(snapshot->Read(OID(oid))).value_or("");
          if (oid == kNear) {
            EXPECT_GE(record, RecordOf(kNear, atLeast));
          } else {
            EXPECT_EQ(record, RecordOf(oid, 0));
          }
        }
      } while (!isOver);
    });
  }
  for (std::uint64_t version = 1; version <= 60; ++version) {
    Edit(*engine, kNear, version);
    newest = version;
    BatchBuilder batch;
    if (version % 10 == 0) Commit(*engine, batch.Put(kRecords + version, "new"));
  }
  isOver = true;
  for (std::thread& reader : readers) reader.join();
}

}  // namespace
}  // namespace vemo::test
