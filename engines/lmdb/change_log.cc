#include "engines/lmdb/change_log.h"

#include <algorithm>
#include <mutex>
#include <string>

#include "engines/lmdb/big_endian.h"
#include "engines/lmdb/lmdb_layout.h"
#include "engines/record_delta.h"
#include "platform/error.h"

namespace vemo {

namespace {

std::string KeyOf(std::uint64_t commit) {
  const BigEndian64 key = ToBigEndian(commit);
  return {reinterpret_cast<const char*>(key.data()), key.size()};
}

std::uint64_t CommitOf(const TreeCursor& cursor) {
  if (cursor.Key().size() != sizeof(BigEndian64)) cursor.Fail("a key stands there that is no number of a commit");
  return FromBigEndian(cursor.Key().data());
}

// Takes in the blobs from `from` to `last`; `previous` is the one before them, where that is known. Returns the last one there was.
std::uint64_t TakeIn(ChangeIndex& index, TreeCursor& cursor, std::uint64_t from, std::uint64_t last,
                     std::optional<std::uint64_t> previous) {
  for (bool found = cursor.Seek(KeyOf(from)); found; found = cursor.Next()) {
    const std::uint64_t commit = CommitOf(cursor);
    if (commit > last) break;
    const auto damaged = [&] { index.AddDamaged(commit); };
    try {
      const ByteView bytes = cursor.Value();
      const ChangeBlob blob = ParseChangeBlob(bytes, commit);
      if (previous && blob.previous != *previous) index.AddDamaged(blob.previous);
      index.Add(commit, blob, bytes.size());
    } catch (const MalformedBytes&) {
      damaged();
    } catch (const DamagedStorage&) {
      damaged();
    }
    previous = commit;
  }
  return previous.value_or(0);
}

// Takes in what `state`, that of `commit`, keeps, with nobody else at it.
void Follow(ChangeIndex& index, PageReader& reader, const SpaceState& state, std::uint64_t commit) {
  const ChangesRange kept = ReadChangesRange(reader, state);
  const std::uint64_t newest = index.Newest();
  index.Follow(commit);
  if (kept.last > newest) {
    std::uint64_t last = 0;
    try {
      TreeCursor cursor(reader, *state.Table(kChangesTable));
      // What is older than the first that is kept has been written into the records.
      const bool followsNewest = newest >= kept.first;
      if (!followsNewest && !cursor.Find(KeyOf(kept.first))) index.AddDamaged(kept.first);
      last = TakeIn(index, cursor, std::max(newest + 1, kept.first), kept.last,
                    followsNewest ? std::optional(newest) : std::nullopt);
    } catch (const DamagedStorage&) {
      // The blobs from there on are not known, and what the last one makes doubtful covers all that theirs would.
    }
    if (last != kept.last) index.AddDamaged(kept.last);
  }
  if (commit >= newest) index.Drop(kept.first != 0 ? kept.first : commit + 1, commit);
}

}  // namespace

StoredRecord ReadStoredRecord(const TreeCursor& cursor) {
  const ByteView value = cursor.Value();
  if (value.size() < kCommitBytes) cursor.Fail("a record is too short");
  const auto commit = LoadAs<std::uint64_t>(value.data());
  const auto tag = LoadAs<std::uint64_t>(value.data() - kTagBytes);
  if (LoadAs<std::uint64_t>(value.data() + sizeof commit) != CommitStamp(tag, commit)) {
    cursor.Fail("the number of the commit that wrote a record is damaged");
  }
  return {commit, value.subspan(kCommitBytes)};
}

ByteView ReadChanges(PageReader& reader, const SpaceState& state, std::uint64_t commit) {
  TreeCursor cursor(reader, *state.Table(kChangesTable));
  if (cursor.Find(KeyOf(commit))) return cursor.Value();
  const PageTable& table = *state.Table(kChangesTable);
  reader.Fail(table.root.root, table, ("the changes of commit " + std::to_string(commit) + " are missing").c_str(), {});
}

void FollowChanges(ChangeIndex& index, PageReader& reader, const SpaceState& state, std::uint64_t commit) {
  const std::lock_guard following(index.following());
  Follow(index, reader, state, commit);
}

bool OpenChanges(ChangeIndex& index, PageReader& reader, const SpaceState& state, std::uint64_t commit) {
  const std::lock_guard following(index.following());
  if (!index.Open(commit)) return false;
  try {
    Follow(index, reader, state, commit);
  } catch (...) {
    index.Close(commit);
    throw;
  }
  return true;
}

ByteView ReadRecord(OID oid, std::uint64_t commit, const TreeCursor& cursor, const ChangeIndex& index, PageReader& reader,
                    const SpaceState& state, Bytes& changed) {
  const StoredRecord stored = ReadStoredRecord(cursor);
  const std::optional<ChangeIndex::Version> version = index.Find(oid, commit);
  const bool isChanged = version && version->commit > stored.commit;
  if (index.IsInDoubt(isChanged ? version->commit : stored.commit, commit)) {
    cursor.Fail("changes that may concern a record there are damaged");
  }
  if (!isChanged) return stored.record;
  constexpr const char* kDamaged = "the changes of a record there are damaged";
  ByteView blob;
  try {
    blob = ReadChanges(reader, state, version->commit);
  } catch (const DamagedStorage&) {
    cursor.Fail(kDamaged);
  }
  if (version->offset > blob.size() || version->length > blob.size() - version->offset) cursor.Fail(kDamaged);
  const ByteView delta = blob.subspan(version->offset, version->length);
  if (DeltaCheck(oid, version->commit, delta) != version->check) cursor.Fail(kDamaged);
  try {
    changed = ApplyRecordDelta(stored.record, delta);
  } catch (const MalformedBytes& malformed) {
    cursor.Fail((std::string("the changes of a record there do not fit it: ") + malformed.what()).c_str());
  }
  return changed;
}

}  // namespace vemo
