// What a snapshot reads: records, names, the order of scans, and the sizes that fit.
#include <stdexcept>

#include "tests/engines/engine_contract.h"

namespace vemo::test {
namespace {

using ReadingContract = EngineContract;
INSTANTIATE_TEST_SUITE_P(Engines, ReadingContract, testing::ValuesIn(AllEngineKinds()), EngineKindName);

TEST_P(ReadingContract, AMissingRecordIsNothing) {
  BatchBuilder batch;
  batch.Put(10, "ten");
  Commit(batch);
  const auto snapshot = engine().OpenSnapshot();
  EXPECT_EQ(ToText(snapshot->Read(OID(10))), "ten");
  EXPECT_EQ(ToText(snapshot->Read(OID(9))), std::nullopt);
  EXPECT_EQ(ToText(snapshot->Read(OID())), std::nullopt);
}

TEST_P(ReadingContract, ScansRecordsInTheOrderOfUnsignedIds) {
  const std::vector<std::uint64_t> ids{
      1, 255, 256, 65536, 0x7fffffffffffffff, 0x8000000000000000, ~std::uint64_t{0}};
  BatchBuilder batch;
  for (auto id = ids.rbegin(); id != ids.rend(); ++id) batch.Put(*id, std::to_string(*id));
  Commit(batch);
  Records expected;
  for (const std::uint64_t id : ids) expected.emplace_back(id, std::to_string(id));
  EXPECT_EQ(AllRecords(*engine().OpenSnapshot()), expected);
}

TEST_P(ReadingContract, AScanStartsAtTheFirstIdOrTheNextOneThere) {
  BatchBuilder batch;
  batch.Put(10, "a").Put(20, "b").Put(30, "c");
  Commit(batch);
  const auto snapshot = engine().OpenSnapshot();
  EXPECT_EQ(AllRecords(*snapshot, 20), (Records{{20, "b"}, {30, "c"}}));
  EXPECT_EQ(AllRecords(*snapshot, 21), (Records{{30, "c"}}));
  EXPECT_EQ(AllRecords(*snapshot, 31), Records());
}

TEST_P(ReadingContract, AScanEndsWhenTheVisitorSaysSo) {
  BatchBuilder batch;
  batch.Put(1, "a").Put(2, "b").Put(3, "c");
  batch.Name(NamedTable::kRoots, "x", "").Name(NamedTable::kRoots, "y", "");
  Commit(batch);
  const auto snapshot = engine().OpenSnapshot();
  std::vector<std::uint64_t> visited;
  snapshot->ScanRecords(OID(), [&](OID oid, ByteView) {
    visited.push_back(oid.m_value);
    return oid.m_value < 2;
  });
  EXPECT_EQ(visited, (std::vector<std::uint64_t>{1, 2}));
  int names = 0;
  snapshot->ScanNamed(NamedTable::kRoots, "", [&](std::string_view, ByteView) { return ++names < 1; });
  EXPECT_EQ(names, 1);
}

TEST_P(ReadingContract, AnExceptionOfTheVisitorLeavesTheScanAndHarmsNothing) {
  BatchBuilder batch;
  batch.Put(1, "a").Put(2, "b");
  Commit(batch);
  const auto snapshot = engine().OpenSnapshot();
  EXPECT_THROW(
      snapshot->ScanRecords(OID(), [](OID, ByteView) -> bool { throw std::runtime_error("visitor"); }),
      std::runtime_error);
  EXPECT_EQ(AllRecords(*snapshot), (Records{{1, "a"}, {2, "b"}}));
  EXPECT_EQ(Commit(batch), 2u);
}

TEST_P(ReadingContract, AVisitorMayUseTheEngine) {
  BatchBuilder batch;
  batch.Put(1, "a").Put(2, "b").Put(3, "c");
  Commit(batch);
  const auto snapshot = engine().OpenSnapshot();
  Records seen;
  snapshot->ScanRecords(OID(), [&](OID oid, ByteView bytes) {
    EXPECT_EQ(ToText(snapshot->Read(oid)), ToText(bytes));
    BatchBuilder meanwhile;
    meanwhile.Remove(oid.m_value).Remove(oid.m_value + 1).Put(oid.m_value + 100, "new");
    Commit(meanwhile);
    seen.emplace_back(oid.m_value, ToText(bytes));
    return true;
  });
  EXPECT_EQ(seen, (Records{{1, "a"}, {2, "b"}, {3, "c"}}));
}

TEST_P(ReadingContract, ScansNamesBytewiseWithinAPrefix) {
  BatchBuilder batch;
  for (const char* name : {"b", "ab", "a\xff", "a", "B", "ba", "\xff", "abc"}) {
    batch.Name(NamedTable::kRoots, name, std::string("value of ") + name);
  }
  Commit(batch);
  const auto snapshot = engine().OpenSnapshot();
  std::vector<std::string> all, within;
  for (const auto& [name, value] : AllNamed(*snapshot, NamedTable::kRoots)) {
    EXPECT_EQ(value, "value of " + name);
    all.push_back(name);
  }
  for (const auto& [name, value] : AllNamed(*snapshot, NamedTable::kRoots, "a")) within.push_back(name);
  EXPECT_EQ(all, (std::vector<std::string>{"B", "a", "ab", "abc", "a\xff", "b", "ba", "\xff"}));
  EXPECT_EQ(within, (std::vector<std::string>{"a", "ab", "abc", "a\xff"}));
  EXPECT_EQ(AllNamed(*snapshot, NamedTable::kRoots, "abcd"), Named());
  EXPECT_EQ(AllNamed(*snapshot, NamedTable::kMeta, "a"), Named());
}

TEST_P(ReadingContract, NamesMayHoldAnyByte) {
  std::string everyByte;
  for (int byte = 0; byte < 256; ++byte) everyByte.push_back(static_cast<char>(byte));
  const std::vector<std::string> names{std::string(1, '\0'), std::string(2, '\0'), everyByte,
                                       std::string("a\0b", 3), "a"};
  BatchBuilder batch;
  for (const std::string& name : names) batch.Name(NamedTable::kMeta, name, "<" + name + ">");
  Commit(batch);
  const auto snapshot = engine().OpenSnapshot();
  for (const std::string& name : names) {
    EXPECT_EQ(ToText(snapshot->ReadNamed(NamedTable::kMeta, name)), "<" + name + ">");
  }
  EXPECT_EQ(AllNamed(*snapshot, NamedTable::kMeta, std::string_view("\0", 1)).size(), 3u);
  EXPECT_EQ(AllNamed(*snapshot, NamedTable::kMeta, std::string_view("a\0", 2)).size(), 1u);
}

TEST_P(ReadingContract, NamesMayHave400BytesAndDifferInTheLast) {
  const std::string one = std::string(399, 'n') + "1";
  const std::string two = std::string(399, 'n') + "2";
  BatchBuilder batch;
  batch.Name(NamedTable::kRoots, one, "1").Name(NamedTable::kRoots, two, "2");
  Commit(batch);
  const auto snapshot = engine().OpenSnapshot();
  EXPECT_EQ(ToText(snapshot->ReadNamed(NamedTable::kRoots, one)), "1");
  EXPECT_EQ(ToText(snapshot->ReadNamed(NamedTable::kRoots, two)), "2");
  EXPECT_EQ(AllNamed(*snapshot, NamedTable::kRoots, one), (Named{{one, "1"}}));
}

TEST_P(ReadingContract, ThereIsNothingUnderANameThatCannotBe) {
  BatchBuilder batch;
  batch.Name(NamedTable::kMeta, "name", "value");
  Commit(batch);
  const auto snapshot = engine().OpenSnapshot();
  EXPECT_EQ(ToText(snapshot->ReadNamed(NamedTable::kMeta, "")), std::nullopt);
  EXPECT_EQ(ToText(snapshot->ReadNamed(NamedTable::kMeta, std::string(600, 'n'))), std::nullopt);
  EXPECT_EQ(AllNamed(*snapshot, NamedTable::kMeta, std::string(600, 'n')), Named());
}

TEST_P(ReadingContract, AnEmptyValueIsNotAMissingOne) {
  BatchBuilder batch;
  batch.Put(1, "").Name(NamedTable::kMeta, "empty", "");
  Commit(batch);
  const auto snapshot = engine().OpenSnapshot();
  EXPECT_EQ(ToText(snapshot->Read(OID(1))), "");
  EXPECT_EQ(ToText(snapshot->ReadNamed(NamedTable::kMeta, "empty")), "");
  EXPECT_EQ(AllRecords(*snapshot), (Records{{1, ""}}));
}

TEST_P(ReadingContract, ValuesMayBeLarge) {
  constexpr std::size_t kSize = std::size_t{16} << 20;
  std::string record(kSize, 'r');
  record.front() = '<';
  record.back() = '>';
  const std::string named(kSize + 1, 'n');
  BatchBuilder batch;
  batch.Put(1, record).Put(2, "small").Name(NamedTable::kMeta, "large", named);
  Commit(batch);
  const auto snapshot = engine().OpenSnapshot();
  EXPECT_TRUE(ToText(snapshot->Read(OID(1))) == record);
  EXPECT_EQ(ToText(snapshot->Read(OID(2))), "small");
  EXPECT_TRUE(ToText(snapshot->ReadNamed(NamedTable::kMeta, "large")) == named);
}

TEST_P(ReadingContract, ValuesOfEverySizeAroundThePagesComeBack) {
  std::string value;
  for (int i = 0; i < 9000; ++i) value.push_back(static_cast<char>(i * 31));
  BatchBuilder batch;
  std::uint64_t oid = 0;
  for (const std::size_t size :
       {1, 8, 100, 1023, 1024, 2030, 2040, 2048, 4079, 4080, 4096, 8175, 8192, 9000}) {
    batch.Put(++oid, value.substr(0, size));
  }
  Commit(batch);
  const auto snapshot = engine().OpenSnapshot();
  for (const auto& [id, bytes] : AllRecords(*snapshot)) EXPECT_EQ(bytes, value.substr(0, bytes.size())) << id;
  EXPECT_EQ(snapshot->Read(OID(oid))->size(), 9000u);
}

}  // namespace
}  // namespace vemo::test
