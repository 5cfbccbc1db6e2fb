#include "tests/engines/damaged_space.h"

#include <cstring>
#include <functional>
#include <stdexcept>
#include <vector>

#include "engines/lmdb/lmdb_engine.h"
#include "tests/engines/lmdb_site.h"

namespace vemo::test {
namespace {

constexpr std::size_t kPageBytes = 4096;
constexpr int kNames = 40;
constexpr NamedTable kNamedTables[] = {NamedTable::kInfo, NamedTable::kRoots, NamedTable::kMeta};

std::uint64_t Hash(const std::string& text) {
  std::uint64_t hash = 0xcbf29ce484222325;
  for (const char c : text) hash = (hash ^ static_cast<unsigned char>(c)) * 0x100000001b3;
  return hash ^ hash >> 29;
}

std::size_t ValueBytes(std::mt19937_64& random) {
  switch (random() % 4) {
    case 0:
      return random() % 30;
    case 1:
      return random() % 9000;
    default:
      return random() % 1200;
  }
}

std::string IdText(std::uint64_t oid) { return std::to_string(oid); }

std::unique_ptr<Engine> OpenUnsynced(const std::filesystem::path& folder) {
  LmdbOptions options;
  options.path = folder;
  options.mapBytes = 64 << 20;
  options.syncEachCommit = false;
  return OpenLmdbEngine(options);
}

[[noreturn]] void Wrong(const std::string& what) { throw std::logic_error("a wrong answer: " + what); }

// One reading of a whole space: which keys gave an answer.
class Examination {
 public:
  Examination(const EngineSnapshot& snapshot, const SpaceModel& model) : m_snapshot(snapshot), m_model(model) {
    if (snapshot.Generation() != model.generation) Wrong("generation " + std::to_string(snapshot.Generation()));
    for (std::uint64_t oid = 0; oid < 2000; ++oid) ReadOne(oid);
    for (const NamedTable table : kNamedTables) {
      for (int i = 0; i < kNames; ++i) ReadName(table, "n" + std::to_string(i));
      ReadName(table, "absent");
      ReadName(table, "zzz");
      ScanNames(table);
    }
    ScanRecords();
    ReadQueue();
  }

  bool anythingRefused() const noexcept { return m_refused; }
  const std::set<std::string>& answered() const noexcept { return m_answered; }
  bool IsPresent(const std::string& what) const { return m_present.contains(what); }  // as the model has it
  const std::string& RefusalOf(const std::string& what) const { return m_refusals.at(what); }

 private:
  // Runs a reading; one that is refused is no answer.
  void Try(const std::string& what, const std::function<void()>& read) {
    try {
      read();
      m_answered.insert(what);
    } catch (const StoreError& error) {
      m_refused = true;
      m_refusals.emplace(what, error.what());
    }
  }

  // A value that is not what was sealed would be refused by the store.
  void Compare(const std::string& what, const std::string& key, const std::string* expected, const std::string* found) {
    if (found != nullptr && !IsSealedValue(key, *found)) throw StoreError(what + ": its seal is broken");
    if ((expected == nullptr) != (found == nullptr)) Wrong(what + (found == nullptr ? " is absent" : " is there"));
    if (expected != nullptr && *expected != *found) Wrong(what + " has another value");
  }

  void ReadOne(std::uint64_t oid) {
    const auto expected = m_model.records.find(oid);
    const std::string what = "record " + IdText(oid);
    if (expected != m_model.records.end()) m_present.insert(what);
    Try(what, [&] {
      const auto found = ToText(m_snapshot.Read(OID(oid)));
      Compare(what, IdText(oid), expected == m_model.records.end() ? nullptr : &expected->second,
              found ? &*found : nullptr);
    });
  }

  void ReadName(NamedTable table, const std::string& name) {
    const auto expected = m_model.named.find({table, name});
    const std::string what = "name " + std::to_string(static_cast<int>(table)) + " " + name;
    if (expected != m_model.named.end()) m_present.insert(what);
    Try(what, [&] {
      const auto found = ToText(m_snapshot.ReadNamed(table, name));
      Compare(what, name, expected == m_model.named.end() ? nullptr : &expected->second, found ? &*found : nullptr);
    });
  }

  void ScanNames(NamedTable table) {
    for (const std::string prefix : {"", "n", "n1", "q"}) {
      Try("names " + std::to_string(static_cast<int>(table)) + " " + prefix, [&] {
        auto next = m_model.named.lower_bound({table, prefix});
        const auto isIn = [&] {
          return next != m_model.named.end() && next->first.first == table && next->first.second.starts_with(prefix);
        };
        m_snapshot.ScanNamed(table, prefix, [&](std::string_view name, ByteView value) {
          const std::string found = ToText(value);
          if (!isIn() || next->first.second != name) Wrong("a scan meets the name " + std::string(name));
          Compare("name in a scan", std::string(name), &next->second, &found);
          ++next;
          return true;
        });
        if (isIn()) Wrong("a scan of names ends early");
      });
    }
  }

  void ScanRecords() {
    for (const std::uint64_t first : {std::uint64_t{0}, std::uint64_t{101}, std::uint64_t{1500}}) {
      Try("records from " + IdText(first), [&] {
        auto next = m_model.records.lower_bound(first);
        m_snapshot.ScanRecords(OID(first), [&](OID oid, ByteView value) {
          const std::string found = ToText(value);
          if (next == m_model.records.end() || next->first != oid.m_value) Wrong("a scan meets " + IdText(oid.m_value));
          Compare("record in a scan", IdText(oid.m_value), &next->second, &found);
          ++next;
          return true;
        });
        if (next != m_model.records.end()) Wrong("a scan of records ends early");
      });
    }
  }

  void ReadQueue() {
    Try("queue", [&] {
      std::set<std::uint64_t> found;
      for (const OID oid : m_snapshot.QueuedDeletions(SIZE_MAX)) found.insert(oid.m_value);
      if (found != m_model.queue) Wrong("the queue of deletions");
    });
  }

  const EngineSnapshot& m_snapshot;
  const SpaceModel& m_model;
  bool m_refused = false;
  std::set<std::string> m_answered;
  std::set<std::string> m_present;
  std::map<std::string, std::string> m_refusals;
};

void FlipBit(std::string& bytes, std::size_t at, unsigned bit) {
  bytes[at] = static_cast<char>(static_cast<unsigned char>(bytes[at]) ^ 1u << bit);
}

// A byte of what a page is found and read by, rather than of a value: its header, its offsets, a node's header or key.
std::size_t StructuralByte(const std::string& data, std::mt19937_64& random) {
  const std::size_t page = random() % (data.size() / kPageBytes) * kPageBytes;
  std::uint16_t flags = 0, lower = 0, offset = 0;
  std::memcpy(&flags, data.data() + page + 10, 2);
  std::memcpy(&lower, data.data() + page + 12, 2);
  if ((flags & 8) != 0) return page + random() % (16 + 136);
  if ((flags & 3) == 0 || lower <= 16 || lower > kPageBytes || random() % 2 == 0) return page + random() % 16;
  const std::size_t nodes = (lower - 16u) / 2u;
  const std::size_t slot = page + 16 + random() % nodes * 2;
  if (random() % 4 == 0) return slot;
  std::memcpy(&offset, data.data() + slot, 2);
  // Behind the key of an id, 8 bytes: the number of an overflow run, or a tag.
  return page + std::min<std::size_t>(offset + random() % 24, kPageBytes - 1);
}

std::uint64_t NumberAt(const std::string& data, std::size_t at, std::size_t bytes) {
  std::uint64_t number = 0;
  std::memcpy(&number, data.data() + at, bytes);
  return number;
}

// The places of all page numbers by which pages are reached or given out again, also in pages that are out of use.
std::vector<std::size_t> ReferencesIn(const std::string& data) {
  std::vector<std::size_t> places;
  for (std::size_t page = 0; page + kPageBytes <= data.size(); page += kPageBytes) {
    const std::uint64_t flags = NumberAt(data, page + 10, 2);
    if (flags == 8) places.insert(places.end(), {page + 16 + 24 + 40, page + 16 + 72 + 40});
    if (flags != 1 && flags != 2) continue;
    const std::uint64_t lower = NumberAt(data, page + 12, 2);
    for (std::size_t slot = page + 16; slot < page + lower; slot += 2) {
      const std::size_t node = page + NumberAt(data, slot, 2);
      const std::size_t value = node + 8 + NumberAt(data, node + 6, 2);
      const std::uint64_t nodeFlags = NumberAt(data, node + 4, 2);
      if (flags == 1) places.push_back(node);
      if (flags == 2 && nodeFlags == 1) places.push_back(value);
      if (flags == 2 && nodeFlags == 2) places.push_back(value + 40);
      // The lists of free pages are the values whose keys are small numbers of the machine.
      const bool isList = flags == 2 && nodeFlags == 0 && value == node + 16 && NumberAt(data, node + 8, 8) < 1000;
      const std::uint64_t bytes = NumberAt(data, node, 4);
      for (std::uint64_t i = 8; isList && i + 8 <= bytes; i += 8) places.push_back(value + i);
    }
  }
  return places;
}

// Makes a reference lead to a page near the right one, often to an older version of it.
std::string Misdirect(std::string& data, std::mt19937_64& random) {
  const std::vector<std::size_t> places = ReferencesIn(data);
  const std::size_t place = places[random() % places.size()];
  std::uint64_t page = NumberAt(data, place, 6);
  const std::uint64_t before = page;
  const std::uint64_t pages = data.size() / kPageBytes;
  const auto flagsOf = [&](std::uint64_t number) { return number < pages ? NumberAt(data, number * kPageBytes + 10, 2) : 0; };
  do {
    page = random() % pages;
  } while (page == before || (before < pages && random() % 16 != 0 && flagsOf(page) != flagsOf(before)));
  std::memcpy(data.data() + place, &page, 6);
  return "page " + std::to_string(page) + " instead of " + std::to_string(before) + " at " + std::to_string(place);
}

}  // namespace

std::string SealedValue(const std::string& key, std::uint64_t version, std::size_t bytes) {
  std::string value = std::to_string(version) + ":" + std::string(bytes, static_cast<char>('a' + version % 26));
  const std::uint64_t hash = Hash(key + "/" + value);
  return value.append(reinterpret_cast<const char*>(&hash), sizeof hash);
}

bool IsSealedValue(const std::string& key, const std::string& value) {
  if (value.size() < sizeof(std::uint64_t)) return false;
  const std::string body = value.substr(0, value.size() - sizeof(std::uint64_t));
  const std::uint64_t hash = Hash(key + "/" + body);
  return std::memcmp(value.data() + body.size(), &hash, sizeof hash) == 0;
}

void SpaceModel::Commit(Engine& engine, std::mt19937_64& random, std::size_t changes) {
  SpaceModel next = *this;
  BatchBuilder batch;
  std::set<std::uint64_t> touched, queued;
  for (std::size_t i = 0; i < changes; ++i) {
    const std::uint64_t oid = 1 + random() % 1000;
    if (random() % 8 == 0 && queued.insert(oid).second) {
      if (next.queue.erase(oid) != 0) {
        batch.Finish(oid);
      } else {
        next.queue.insert(oid);
        batch.Queue(oid);
      }
    }
    if (random() % 8 == 0) {
      const NamedTable table = kNamedTables[random() % 3];
      const std::string name = "n" + std::to_string(random() % kNames);
      if (random() % 3 == 0) {
        next.named.erase({table, name});
        batch.Unname(table, name);
      } else {
        const std::string value = SealedValue(name, random() % 1000, ValueBytes(random));
        next.named[{table, name}] = value;
        batch.Name(table, name, value);
      }
    }
    if (!touched.insert(oid).second) continue;
    if (random() % 3 == 0) {
      next.records.erase(oid);
      batch.Remove(oid);
    } else {
      next.records[oid] = SealedValue(IdText(oid), generation, ValueBytes(random));
      batch.Put(oid, next.records[oid]);
    }
  }
  next.generation = engine.Commit(batch.At(generation));
  *this = std::move(next);
}

// A version with the same letters.
std::string NextVersion(const std::string& key, const std::string& value) {
  constexpr std::size_t kHashBytes = 8;
  const std::size_t digits = value.find(':') + 1;
  return SealedValue(key, std::stoull(value) + 26, value.size() - digits - kHashBytes);
}

void SpaceModel::CommitEdits(Engine& engine, std::mt19937_64& random, std::size_t changes) {
  SpaceModel next = *this;
  BatchBuilder batch;
  std::set<std::uint64_t> touched;
  for (std::size_t i = 0; i < changes && !next.records.empty(); ++i) {
    auto record = next.records.lower_bound(random() % 1000);
    if (record == next.records.end()) record = next.records.begin();
    if (!touched.insert(record->first).second) continue;
    record->second = NextVersion(IdText(record->first), record->second);
    batch.Put(record->first, record->second);
  }
  const std::string name = "n" + std::to_string(random() % kNames);
  if (random() % 4 == 0) {
    next.named.erase({NamedTable::kMeta, name});
    batch.Unname(NamedTable::kMeta, name);
  } else {
    const std::string value = SealedValue(name, random() % 1000, random() % 40);
    next.named[{NamedTable::kMeta, name}] = value;
    batch.Name(NamedTable::kMeta, name, value);
  }
  next.generation = engine.Commit(batch.At(generation));
  *this = std::move(next);
}

SpaceFiles SpaceFiles::Read(const std::filesystem::path& folder) {
  const bool hasLog = std::filesystem::exists(folder / "commits.log");
  return {ReadFile(folder / "data.mdb"), ReadFile(folder / "data.seal"), hasLog ? ReadFile(folder / "commits.log") : ""};
}

void SpaceFiles::Write(const std::filesystem::path& folder) const {
  std::filesystem::remove_all(folder);
  std::filesystem::create_directory(folder);
  WriteFile(folder / "data.mdb", data);
  if (!seal.empty()) WriteFile(folder / "data.seal", seal);
  if (!log.empty()) WriteFile(folder / "commits.log", log);
}

namespace {

// The seal stays: without it, an entry at the end that is not whole looks like one that was never acknowledged.
std::string DamageLog(std::string& log, std::mt19937_64& random) {
  const std::size_t used = log.find_last_not_of('\0') + 1;
  const std::size_t at = random() % (used + 100);
  switch (random() % 8) {
    case 0:
      log.clear();
      return "commits.log is missing";
    case 1:
      log.resize(at);
      return "commits.log cut to " + std::to_string(at) + " bytes";
    case 2: {
      const std::size_t bytes = std::size_t{1} << random() % 10;
      log.replace(at, bytes, bytes, '\0');
      return std::to_string(bytes) + " bytes of commits.log zeroed at " + std::to_string(at);
    }
    default:
      FlipBit(log, at, random() % 8);
      return "a bit of commits.log at " + std::to_string(at);
  }
}

}  // namespace

std::string Damage(SpaceFiles& files, std::mt19937_64& random) {
  if (!files.log.empty() && random() % 4 == 0) return DamageLog(files.log, random);
  const bool isSealMissing = random() % 4 == 0;
  if (isSealMissing) files.seal.clear();
  const std::string prefix = isSealMissing ? "without a seal, " : "";
  const std::uint64_t kind = random() % 16;
  if (kind == 0) {
    const std::size_t bytes = random() % files.data.size();
    files.data.resize(random() % 2 == 0 ? bytes : bytes / kPageBytes * kPageBytes);
    return prefix + "data.mdb cut to " + std::to_string(files.data.size()) + " bytes";
  }
  if (kind == 1 && !isSealMissing) {
    const std::size_t at = random() % files.seal.size();
    FlipBit(files.seal, at, random() % 8);
    return "a bit of data.seal at " + std::to_string(at);
  }
  if (kind < 4) {
    const std::size_t at = random() % files.data.size();
    const std::size_t bytes = std::min<std::size_t>(std::size_t{1} << random() % 14, files.data.size() - at);
    std::memset(files.data.data() + at, 0, bytes);
    return prefix + std::to_string(bytes) + " bytes of data.mdb zeroed at " + std::to_string(at);
  }
  if (kind > 10) return prefix + Misdirect(files.data, random);
  const std::size_t at = kind < 7 ? random() % files.data.size() : StructuralByte(files.data, random);
  const unsigned bit = random() % 8;
  FlipBit(files.data, at, bit);
  return prefix + "bit " + std::to_string(bit) + " of data.mdb at " + std::to_string(at);
}

bool ExamineDamagedSpace(const std::filesystem::path& folder, const SpaceModel& model, std::mt19937_64& random) {
  std::set<std::string> before;
  SpaceModel next = model;
  bool refused = false;
  try {
    const auto engine = OpenUnsynced(folder);
    {
      const auto snapshot = engine->OpenSnapshot();
      const Examination examination(*snapshot, model);
      before = examination.answered();
      refused = examination.anythingRefused();
      refused = !snapshot->CheckStorage().empty() || refused;
    }
    if (engine->Usage().records != model.records.size() && !refused) Wrong("the number of records");
    for (int i = 0; i < 3; ++i) next.Commit(*engine, random, 60);
  } catch (const StoreError&) {
    refused = true;
  }
  try {
    const auto engine = OpenUnsynced(folder);
    const auto snapshot = engine->OpenSnapshot();
    const Examination examination(*snapshot, next);
    // That something is absent may be certain no more, once its neighbours have gone and a damaged one has come beside it.
    for (const std::string& what : before) {
      if (examination.answered().contains(what) || !examination.IsPresent(what)) continue;
      Wrong(what + " was readable before the commit, and now: " + examination.RefusalOf(what));
    }
  } catch (const StoreError&) {
    refused = true;
    if (!before.empty()) Wrong("the space was readable before it was opened again");
  }
  return refused;
}

}  // namespace vemo::test
