// The changes that a space keeps beside its records: reading them.
#pragma once

#include <cstdint>
#include <optional>

#include "engines/lmdb/change_index.h"
#include "engines/lmdb/log_tail.h"
#include "engines/lmdb/sealed_space.h"
#include "engines/lmdb/tree_cursor.h"

namespace vemo {

// A value of the table of records.
struct StoredRecord {
  std::uint64_t commit;  // that wrote it; changes of later ones are not in it
  ByteView record;
};

// Of the entry that `cursor` is at. Throws DamagedStorage where it is none.
StoredRecord ReadStoredRecord(const TreeCursor& cursor);

// A state of the space: what data.mdb has of it, and the log behind that.
struct CommitState {
  KnownStatePtr data;
  LogPosition log;

  std::uint64_t Commit() const noexcept { return log.commit; }
};

// The changes of `commit`. Throws DamagedStorage where they are not there.
ByteView ReadChanges(PageReader& reader, const CommitState& state, std::uint64_t commit);

// Takes in the changes, which the index does not know yet, of all commits up to that of `state`, and forgets those that it
// no longer keeps. What cannot be read is remembered as damaged.
void FollowChanges(ChangeIndex& index, PageReader& reader, const CommitState& state);

// The same for a snapshot of `state`, which is then open in the index. False, and it is not, when the index may have
// forgotten what it needs: another thread has opened a newer one meanwhile.
bool OpenChanges(ChangeIndex& index, PageReader& reader, const CommitState& state);

// The record of the entry that `cursor`, a position in the table of records of `state`, is at, as it is in `state`:
// as it is stored, or with its change applied, and then the bytes lie in `changed`.
// Throws DamagedStorage where the changes that it needs are damaged.
ByteView ReadRecord(OID oid, const TreeCursor& cursor, const ChangeIndex& index, PageReader& reader, const CommitState& state,
                    Bytes& changed);

}  // namespace vemo
