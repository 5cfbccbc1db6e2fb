#include "engines/record_delta.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <random>
#include <string>
#include <vector>

#include "platform/error.h"
#include "tests/support/seed.h"

namespace vemo {
namespace {

constexpr std::size_t kAnySize = SIZE_MAX;

Bytes ToBytes(const std::string& text) { return {text.begin(), text.end()}; }

Bytes RandomBytes(std::mt19937_64& random, std::size_t size) {
  Bytes bytes(size);
  for (std::uint8_t& byte : bytes) byte = static_cast<std::uint8_t>(random());
  return bytes;
}

Bytes Applied(ByteView old, ByteView delta) {
  Bytes next = ToBytes("what was there before");
  ApplyRecordDelta(old, delta, next);
  return next;
}

std::size_t DeltaSize(const Bytes& old, const Bytes& next) {
  const auto delta = RecordDelta(old, next, kAnySize);
  EXPECT_EQ(Applied(old, *delta), next);
  return delta->size();
}

TEST(RecordDelta, OfEqualVersionsIsEmpty) {
  EXPECT_EQ(DeltaSize({}, {}), 0u);
  EXPECT_EQ(DeltaSize(ToBytes("a node of entries"), ToBytes("a node of entries")), 0u);
}

TEST(RecordDelta, LeadsFromAndToNothing) {
  EXPECT_EQ(DeltaSize({}, ToBytes("new")), 6u);
  EXPECT_EQ(DeltaSize(ToBytes("old"), {}), 3u);
}

TEST(RecordDelta, OfAnInsertionCostsTheInsertion) {
  std::mt19937_64 random(1);
  const Bytes old = RandomBytes(random, 1000);
  Bytes next = old;
  const Bytes entry = RandomBytes(random, 30);
  next.insert(next.begin() + 500, entry.begin(), entry.end());
  EXPECT_LE(DeltaSize(old, next), 40u);
  EXPECT_LE(DeltaSize(next, old), 10u);
}

TEST(RecordDelta, OfAFewOverwrittenBytesCostsThose) {
  std::mt19937_64 random(2);
  const Bytes old = RandomBytes(random, 1000);
  Bytes next = old;
  for (const std::size_t at : {3, 400, 401, 992}) next[at] ^= 0x55;
  EXPECT_LE(DeltaSize(old, next), 24u);
}

TEST(RecordDelta, SeesAStretchThatGrewByAFewBytes) {
  std::mt19937_64 random(3);
  const Bytes old = RandomBytes(random, 1000);
  Bytes next = old;
  const Bytes longer = RandomBytes(random, 9);
  next.erase(next.begin() + 300, next.begin() + 304);
  next.insert(next.begin() + 300, longer.begin(), longer.end());
  EXPECT_LE(DeltaSize(old, next), 24u);
}

// Behind the change stands another, so that the ends of the records tell nothing.
TEST(RecordDelta, SeesALongStretchThatWasReplacedByALongerOne) {
  std::mt19937_64 random(5);
  const Bytes old = RandomBytes(random, 2000);
  Bytes next = old;
  next[1500] ^= 0x55;
  const Bytes longer = RandomBytes(random, 100);
  next.erase(next.begin() + 300, next.begin() + 370);
  next.insert(next.begin() + 300, longer.begin(), longer.end());
  EXPECT_LE(DeltaSize(old, next), 115u);
  EXPECT_LE(DeltaSize(next, old), 85u);
}

// As the sites of operations recur in the lists of many entries.
class RecordOfLists {
 public:
  explicit RecordOfLists(std::mt19937_64& random) : m_random(random) {
    for (Bytes& site : m_sites) site = RandomBytes(random, 16);
    for (std::size_t i = 0; i < 70; ++i) m_entries.push_back({RandomBytes(random, 8), List(1 + i % 3)});
  }

  void Replace(std::size_t entry, std::size_t intervals) { m_entries[entry].list = List(intervals); }
  void DropLast(std::size_t entry) { m_entries[entry].list.pop_back(); }
  void AddInterval(std::size_t entry) { m_entries[entry].list.push_back(Interval()); }
  void Erase(std::size_t entry) { m_entries.erase(m_entries.begin() + static_cast<std::ptrdiff_t>(entry)); }

  Bytes Join() const {
    Bytes all;
    for (const Entry& entry : m_entries) {
      all.insert(all.end(), entry.key.begin(), entry.key.end());
      all.push_back(static_cast<std::uint8_t>(entry.list.size()));
      for (const Bytes& interval : entry.list) all.insert(all.end(), interval.begin(), interval.end());
    }
    return all;
  }

 private:
  struct Entry {
    Bytes key;
    std::vector<Bytes> list;
  };

  Bytes Interval() {
    Bytes bytes = m_sites[m_random() % m_sites.size()];
    const Bytes numbers = RandomBytes(m_random, 5);
    bytes.insert(bytes.end(), numbers.begin(), numbers.end());
    return bytes;
  }
  std::vector<Bytes> List(std::size_t intervals) {
    std::vector<Bytes> list(intervals);
    for (Bytes& interval : list) interval = Interval();
    return list;
  }

  std::mt19937_64& m_random;
  std::array<Bytes, 4> m_sites;
  std::vector<Entry> m_entries;
};

TEST(RecordDelta, IsNotMisledByWhatRecurs) {
  std::mt19937_64 random(6);
  constexpr std::size_t kChanges = 8;
  const auto deltaOf = [&](auto&& change) {
    RecordOfLists record(random);
    const Bytes old = record.Join();
    for (std::size_t i = kChanges; i-- > 0;) change(record, 8 * i + 2);  // entries of three intervals, and others
    return DeltaSize(old, record.Join());
  };
  EXPECT_LE(deltaOf([](RecordOfLists& record, std::size_t i) { record.DropLast(i); }), kChanges * 10);
  EXPECT_LE(deltaOf([](RecordOfLists& record, std::size_t i) { record.AddInterval(i); }), kChanges * 34);
  EXPECT_LE(deltaOf([](RecordOfLists& record, std::size_t i) { record.Erase(i); }), kChanges * 10);
  EXPECT_LE(deltaOf([](RecordOfLists& record, std::size_t i) { record.Replace(i, 3); }), kChanges * 75);
}

TEST(RecordDelta, OfSmallChangesInNeighbouringEntriesCostsThose) {
  std::mt19937_64 random(8);
  const Bytes old = RandomBytes(random, 1000);
  Bytes next = old;
  next[500] ^= 0x55;
  next[530] ^= 0x55;
  EXPECT_LE(DeltaSize(old, next), 12u);
}

// A record ends with a checksum, so that the last bytes differ whatever has changed.
TEST(RecordDelta, OfOneChangeBeforeAChecksumIsTwoSteps) {
  std::mt19937_64 random(7);
  const Bytes old = RandomBytes(random, 1000);
  Bytes next = old;
  const Bytes changed = RandomBytes(random, 400);
  std::copy(changed.begin(), changed.end(), next.begin() + 500);
  for (std::size_t i = 992; i < 1000; ++i) next[i] ^= 0x55;
  EXPECT_EQ(DeltaSize(old, next), 400u + 6u + 8u + 3u);
}

TEST(RecordDelta, IsRefusedWhereItWouldBeTooLong) {
  std::mt19937_64 random(4);
  const Bytes old = RandomBytes(random, 500), next = RandomBytes(random, 500);
  EXPECT_FALSE(RecordDelta(old, next, 250));
  const auto delta = RecordDelta(old, next, kAnySize);
  EXPECT_FALSE(RecordDelta(old, next, delta->size() - 1));
  EXPECT_EQ(RecordDelta(old, next, delta->size()), delta);
}

TEST(RecordDelta, AppliesToAnyPairOfRandomVersions) {
  std::mt19937_64 random(test::TestSeed(20261121));
  for (int round = 0; round < 3000; ++round) {
    // Few values, so that stretches recur and anchors are found in wrong places too.
    const std::size_t values = 1 + random() % 6;
    const auto make = [&](std::size_t most) {
      Bytes bytes(random() % (most + 1));
      for (std::uint8_t& byte : bytes) byte = static_cast<std::uint8_t>(random() % values);
      return bytes;
    };
    const Bytes old = make(300);
    Bytes next = old;
    for (std::size_t change = random() % 8; change > 0; --change) {
      const std::size_t from = random() % (next.size() + 1);
      const std::size_t count = std::min(next.size() - from, random() % 40);
      next.erase(next.begin() + static_cast<std::ptrdiff_t>(from), next.begin() + static_cast<std::ptrdiff_t>(from + count));
      const Bytes added = make(40);
      next.insert(next.begin() + static_cast<std::ptrdiff_t>(from), added.begin(), added.end());
    }
    const auto delta = RecordDelta(old, next, kAnySize);
    ASSERT_EQ(Applied(old, *delta), next) << "round " << round;
  }
}

// Whatever the bytes are, applying ends, with an exception of ours or with a version no larger than both together.
TEST(RecordDelta, HostileBytesAreRefusedOrApplied) {
  std::mt19937_64 random(test::TestSeed(20261121));
  std::size_t refused = 0;
  for (int round = 0; round < 20000; ++round) {
    const Bytes old = RandomBytes(random, random() % 60);
    Bytes delta = RandomBytes(random, random() % 40);
    for (std::uint8_t& byte : delta) {
      if (random() % 2 == 0) byte &= 0x0F;
    }
    try {
      ASSERT_LE(Applied(old, delta).size(), old.size() + delta.size());
    } catch (const MalformedBytes&) {
      ++refused;
    }
  }
  EXPECT_GT(refused, 1000u);
}

TEST(RecordDelta, StepsBeyondTheOldVersionAreRefused) {
  const Bytes old = ToBytes("old");
  EXPECT_THROW(Applied(old, Bytes{4, 0, 0}), MalformedBytes);
  EXPECT_THROW(Applied(old, Bytes{2, 2, 0}), MalformedBytes);
  EXPECT_THROW(Applied(old, Bytes{1, 1, 2, 'x'}), MalformedBytes);
  EXPECT_THROW(Applied(old, Bytes{1, 1}), MalformedBytes);
  EXPECT_EQ(Applied(old, Bytes{1, 1, 1, 'x'}), ToBytes("oxd"));
}

TEST(RecordDelta, StepsThatChangeNothingAreRefused) {
  const Bytes old(20, 1);
  EXPECT_THROW(Applied(old, Bytes{0, 0, 0}), MalformedBytes);
  EXPECT_THROW(Applied(old, Bytes{5, 0, 0}), MalformedBytes);
}

}  // namespace
}  // namespace vemo
