// Small named values of the user's own.
#include <algorithm>

#include "tests/store/store_fixture.h"

namespace vemo::test {
namespace {

using Values = std::vector<std::pair<std::string, std::string>>;

template <class Source>
Values ScanAll(const Source& source, const std::string& prefix = "") {
  Values values;
  source.ScanMeta(prefix, [&](std::string_view name, std::string_view value) {
    values.emplace_back(name, value);
    return true;
  });
  return values;
}

using MetaTest = StoreTest;
INSTANTIATE_STORE_TEST(MetaTest);

TEST_P(MetaTest, IsCommittedWithTheMapsAndGoneAfterAnAbort) {
  {
    WriteTransaction transaction(space());
    transaction.SetMeta("kept", "1");
    Fill(transaction.Root<TombstonesMap>("t"), 1, 3);
    transaction.Commit();
  }
  {
    WriteTransaction transaction(space());
    transaction.SetMeta("kept", "2");
    transaction.SetMeta("dropped", "x");
    EXPECT_EQ(transaction.Meta("kept"), "2");
    EXPECT_EQ(transaction.Meta("dropped"), "x");
  }
  site.Reopen();
  WriteTransaction transaction(space());
  EXPECT_EQ(ScanAll(transaction), (Values{{"kept", "1"}}));
  transaction.EraseMeta("kept");
  EXPECT_EQ(transaction.Meta("kept"), std::nullopt);
  EXPECT_EQ(Snapshot(space()).Meta("kept"), "1");
  transaction.Commit();
  EXPECT_EQ(Snapshot(space()).Meta("kept"), std::nullopt);
  EXPECT_TRUE(Stored().meta.empty());
}

TEST_P(MetaTest, AScanMergesWhatIsStoredWithWhatChanged) {
  {
    WriteTransaction transaction(space());
    for (const char* name : {"a", "b/1", "b/2", "b/4", "c"}) transaction.SetMeta(name, "old");
    transaction.Commit();
  }
  WriteTransaction transaction(space());
  transaction.SetMeta("b/0", "new");
  transaction.SetMeta("b/2", "changed");
  transaction.SetMeta("b/3", "new");
  transaction.EraseMeta("b/4");
  transaction.SetMeta("b/5", "erased again");
  transaction.EraseMeta("b/5");
  transaction.EraseMeta("never there");
  transaction.SetMeta("d", "new");
  const Values b{{"b/0", "new"}, {"b/1", "old"}, {"b/2", "changed"}, {"b/3", "new"}};
  EXPECT_EQ(ScanAll(transaction, "b/"), b);
  EXPECT_EQ(ScanAll(transaction, "b/4"), Values{});
  EXPECT_EQ(ScanAll(transaction, "d"), (Values{{"d", "new"}}));
  EXPECT_EQ(ScanAll(transaction, "e"), Values{});
  Values all{{"a", "old"}};
  all.insert(all.end(), b.begin(), b.end());
  all.insert(all.end(), {{"c", "old"}, {"d", "new"}});
  EXPECT_EQ(ScanAll(transaction), all);
  transaction.Commit();
  EXPECT_EQ(ScanAll(Snapshot(space())), all);
  EXPECT_EQ(ScanAll(Snapshot(space()), "b/"), b);
}

TEST_P(MetaTest, AScanStopsWhereItIsTold) {
  {
    WriteTransaction transaction(space());
    for (const char* name : {"b", "d", "f"}) transaction.SetMeta(name, "");
    transaction.Commit();
  }
  WriteTransaction transaction(space());
  for (const char* name : {"a", "c", "e", "g"}) transaction.SetMeta(name, "");
  const std::string names = "abcdefg";
  for (std::size_t stop = 1; stop <= names.size(); ++stop) {
    std::string seen;
    transaction.ScanMeta("", [&](std::string_view name, std::string_view) {
      seen += name;
      return seen.size() < stop;
    });
    EXPECT_EQ(seen, names.substr(0, stop));
  }
}

TEST_P(MetaTest, AnyByteAndManySizesComeBackAsTheyWere) {
  Values expected;
  for (const std::size_t size : {0u, 1u, 7u, 8u, 255u, 4096u, 70'000u, 3'000'000u}) {
    std::string value(size, '\0');
    for (std::size_t i = 0; i < size; ++i) value[i] = static_cast<char>(i * 31);
    expected.emplace_back("size " + std::to_string(size), value);
  }
  expected.emplace_back(std::string("\0", 1), "a zero");
  expected.emplace_back(std::string("\0\xff\n\"", 4), "odd");
  expected.emplace_back(std::string(400, 'n'), "longest");
  {
    WriteTransaction transaction(space());
    for (const auto& [name, value] : expected) transaction.SetMeta(name, value);
    transaction.Commit();
  }
  site.Reopen();
  Snapshot snapshot(space());
  for (const auto& [name, value] : expected) EXPECT_TRUE(snapshot.Meta(name) == value) << name.substr(0, 20);
  std::sort(expected.begin(), expected.end());
  EXPECT_TRUE(ScanAll(snapshot) == expected);
}

TEST_P(MetaTest, NamesOfOtherLengthsAreRefusedWhereTheyAreWrittenAndFindNothing) {
  WriteTransaction transaction(space());
  for (const std::size_t length : {0u, 401u, 5000u}) {
    const std::string name(length, 'n');
    EXPECT_NE(MessageOf<UsageError>([&] { transaction.SetMeta(name, ""); }).find("1 to 400 bytes"),
              std::string::npos);
    EXPECT_THROW(transaction.EraseMeta(name), UsageError);
    EXPECT_EQ(transaction.Meta(name), std::nullopt);
    EXPECT_EQ(Snapshot(space()).Meta(name), std::nullopt);
  }
  EXPECT_EQ(ScanAll(transaction, std::string(5000, 'n')), Values{});
}

TEST_P(MetaTest, ADamagedValueIsFoundAndNamed) {
  {
    WriteTransaction transaction(space());
    transaction.SetMeta("name", "some value");
    transaction.SetMeta("sound", "1");
    transaction.Commit();
  }
  const Bytes sealed = Stored().meta.at("name");
  for (std::size_t i = 0; i < sealed.size(); ++i) {
    Bytes damaged = sealed;
    damaged[i] ^= 0x20;
    site.TamperNamed(NamedTable::kMeta, "name", damaged);
    Snapshot snapshot(space());
    const std::string message = MessageOf<CorruptRecord>([&] { snapshot.Meta("name"); });
    EXPECT_NE(message.find("\"name\""), std::string::npos) << message;
    EXPECT_THROW(ScanAll(snapshot), CorruptRecord);
    EXPECT_EQ(snapshot.Meta("sound"), "1");
    WriteTransaction transaction(space());
    EXPECT_THROW(transaction.Meta("name"), CorruptRecord);
  }
  site.TamperNamed(NamedTable::kMeta, "other name", sealed);
  EXPECT_THROW(Snapshot(space()).Meta("other name"), CorruptRecord);
}

}  // namespace
}  // namespace vemo::test
