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

// `previous` is the commit with changes before this one, 0 where that is not known; `read` gives the changes.
template <typename Read>
void TakeIn(ChangeIndex& index, std::uint64_t commit, std::uint64_t previous, const Read& read) {
  try {
    const ByteView bytes = read();
    const ChangeBlob blob = ParseChangeBlob(bytes, commit);
    if (previous != 0 && blob.previous != previous) index.AddDamaged(blob.previous);
    index.Add(commit, blob, bytes.size());
  } catch (const MalformedBytes&) {
    index.AddDamaged(commit);
  } catch (const DamagedStorage&) {
    index.AddDamaged(commit);
  }
}

// Those of data.mdb, as far as they are not known yet.
void TakeInStored(ChangeIndex& index, PageReader& reader, const KnownState& data) {
  const ChangesRange& kept = data.numbers.changes;
  const std::uint64_t newest = index.Newest();
  if (kept.last <= newest) return;
  std::uint64_t last = newest >= kept.first ? newest : 0;
  try {
    TreeCursor cursor(reader, *data.state->Table(kChangesTable));
    // What is older than the first that is kept has been written into the records.
    if (last == 0 && !cursor.Find(KeyOf(kept.first))) index.AddDamaged(kept.first);
    for (bool found = cursor.Seek(KeyOf(std::max(newest + 1, kept.first))); found; found = cursor.Next()) {
      const std::uint64_t commit = CommitOf(cursor);
      if (commit > kept.last) break;
      TakeIn(index, commit, last, [&] { return cursor.Value(); });
      last = commit;
    }
  } catch (const DamagedStorage&) {
    // The blobs from there on are not known, and what the last one makes doubtful covers all that theirs would.
  }
  if (last != kept.last) index.AddDamaged(kept.last);
}

// Those of the log, as far as they are not known yet.
void TakeInLogged(ChangeIndex& index, const LogPosition& log) {
  for (const std::uint64_t commit : log.tail->Changing(index.Newest(), log.commit)) {
    if (const std::optional<ByteView> changes = log.tail->Changes(commit)) {
      TakeIn(index, commit, 0, [&] { return *changes; });
    } else {
      index.AddDamaged(commit);
    }
  }
}

// The first commit whose changes are kept in `state`, 0 for none.
std::uint64_t FirstKept(const CommitState& state) {
  const std::uint64_t stored = state.data->numbers.changes.first;
  return stored != 0 || state.log.commit == state.log.tail->base() ? stored : state.log.tail->base() + 1;
}

// Takes in what `state` keeps, with nobody else at it.
void Follow(ChangeIndex& index, PageReader& reader, const CommitState& state) {
  const std::uint64_t newest = index.Newest();
  index.Follow(state.Commit());
  TakeInStored(index, reader, *state.data);
  TakeInLogged(index, state.log);
  const std::uint64_t first = FirstKept(state);
  if (state.Commit() >= newest) index.Drop(first != 0 ? first : state.Commit() + 1, state.Commit());
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

ByteView ReadChanges(PageReader& reader, const CommitState& state, std::uint64_t commit) {
  if (commit > state.log.tail->base()) {
    // A commit that is damaged there is none that the index could have found.
    return state.log.tail->Changes(commit).value_or(ByteView());
  }
  const PageTable& table = *state.data->state->Table(kChangesTable);
  TreeCursor cursor(reader, table);
  if (cursor.Find(KeyOf(commit))) return cursor.Value();
  reader.Fail(table.root.root, table, ("the changes of commit " + std::to_string(commit) + " are missing").c_str(), {});
}

void FollowChanges(ChangeIndex& index, PageReader& reader, const CommitState& state) {
  const std::lock_guard following(index.following());
  Follow(index, reader, state);
}

bool OpenChanges(ChangeIndex& index, PageReader& reader, const CommitState& state) {
  const std::lock_guard following(index.following());
  if (!index.Open(state.Commit())) return false;
  try {
    Follow(index, reader, state);
  } catch (...) {
    index.Close(state.Commit());
    throw;
  }
  return true;
}

ByteView ReadRecord(OID oid, const TreeCursor& cursor, const ChangeIndex& index, PageReader& reader, const CommitState& state,
                    Bytes& changed) {
  const StoredRecord stored = ReadStoredRecord(cursor);
  const std::optional<ChangeIndex::Version> version = index.Find(oid, state.Commit());
  const bool isChanged = version && version->commit > stored.commit;
  if (index.IsInDoubt(isChanged ? version->commit : stored.commit, state.Commit())) {
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
    ApplyRecordDelta(stored.record, delta, changed);
  } catch (const MalformedBytes& malformed) {
    cursor.Fail((std::string("the changes of a record there do not fit it: ") + malformed.what()).c_str());
  }
  return changed;
}

}  // namespace vemo
