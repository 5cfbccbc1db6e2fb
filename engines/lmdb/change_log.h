// The changes that a space keeps beside its records: reading them.
#pragma once

#include <cstdint>
#include <optional>

#include "engines/lmdb/change_index.h"
#include "engines/lmdb/space_state.h"
#include "engines/lmdb/tree_cursor.h"

namespace vemo {

// A value of the table of records.
struct StoredRecord {
  std::uint64_t commit;  // that wrote it; changes of later ones are not in it
  ByteView record;
};

// Of the entry that `cursor` is at. Throws DamagedStorage where it is none.
StoredRecord ReadStoredRecord(const TreeCursor& cursor);

// The changes of `commit`. Throws DamagedStorage where they are not there.
ByteView ReadChanges(PageReader& reader, const SpaceState& state, std::uint64_t commit);

// Takes in the changes, which the index does not know yet, of all commits up to `commit`, that of `state`, and forgets those that it
// no longer keeps. What cannot be read is remembered as damaged. False when the index has forgotten what `state` still needs: it is
// an older state, and its reader was not entered in the index in time.
bool FollowChanges(ChangeIndex& index, PageReader& reader, const SpaceState& state, std::uint64_t commit);

// The record of the entry that `cursor`, a position in the table of records of `state`, is at, as it is after `commit`, that of
// `state`: as it is stored, or with its change applied, and then the bytes lie in `changed`. Throws DamagedStorage where the
// changes that it needs are damaged.
ByteView ReadRecord(OID oid, std::uint64_t commit, const TreeCursor& cursor, const ChangeIndex& index, PageReader& reader,
                    const SpaceState& state, Bytes& changed);

}  // namespace vemo
