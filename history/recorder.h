// Recording edits of sequence fields in the three maps.
//
// What the maps say of a field:
//   tombstones   the runs of q positions that were deleted.
//   insertions   m_c: runs that tile all q positions in order. A run names the operation of its first
//   element; the others
//                follow it number by number. m_u: the number of the run's last element, so that m_u - t + 1 =
//                m_n. m_u2: how many q positions the field has, live or not.
//   history      the same insertions and, beside them, the runs of deleted positions with the operations that
//   deleted them.
// Neighbours that continue each other (same site, next number, adjacent position) are one run in each list.
#pragma once

#include <cstdint>
#include <limits>
#include <unordered_map>

#include "history/run_cursor.h"
#include "platform/field_id.h"
#include "platform/guid.h"
#include "vxOperation/src/WorkingSet/CompOp/VectorOT.h"

namespace vemo {

// Operation numbers and positions are 32 bits wide in the records.
inline constexpr ssize_t kMaxRecordedNumber = std::numeric_limits<std::uint32_t>::max();

struct GuidHash {
  std::size_t operator()(const Guid& guid) const noexcept;
};
struct FieldIdHash {
  std::size_t operator()(const FieldId& field) const noexcept;
};

// The next operation number of each site, over all its fields.
class SiteNumbers {
 public:
  ssize_t Next(const Guid& site) const;
  void SetNext(const Guid& site, ssize_t next) { m_next[site] = next; }
  // Throws UsageError when the site has no `n` numbers left.
  void RequireRoom(const Guid& site, ssize_t n) const;
  // Takes `n` numbers and returns the first.
  ssize_t Take(const Guid& site, ssize_t n);
  const std::unordered_map<Guid, ssize_t, GuidHash>& All() const noexcept { return m_next; }

 private:
  std::unordered_map<Guid, ssize_t, GuidHash> m_next;
};

// Edits the payloads of three maps of one open transaction in place. Positions in the payloads are right
// again only after Settle, which must come before the commit; while a recorder has unsettled edits, nobody
// else may touch the maps.
//
// An edit that is refused (UsageError) has changed nothing. One that is interrupted by another exception
// poisons the transaction.
//
// Cost: the look-up of the field in three maps, and the way in runs from the field's last edit.
class Recorder {
 public:
  Recorder(FieldIdToVectorInsertionsMap& insertions, FieldIdToVectorTombstonesMap& tombstones,
           FieldIdToVectorInsertionsAndDeletionsMap& history, SiteNumbers& numbers)
      : m_insertions(insertions), m_tombstones(tombstones), m_history(history), m_numbers(numbers) {}
  Recorder(const Recorder&) = delete;
  Recorder& operator=(const Recorder&) = delete;

  // `n` new elements at live position `position` (0 .. live length): directly behind the live element before
  // it and so in front of tombstones that follow that one, which keeps runs of tombstones whole; at position
  // 0, in front of everything.
  void Insert(const Guid& site, const FieldId& field, ssize_t position, ssize_t n);

  // The `n` live elements from live position `position` on become tombstones.
  void Delete(const Guid& site, const FieldId& field, ssize_t position, ssize_t n);

  // How many elements of the field are live.
  ssize_t LiveLength(const FieldId& field) const;

  void Settle() noexcept;

 private:
  using InsertionCursor = RunCursor<VectorInsertions::List>;
  using DeletionCursor = RunCursor<VectorDeletions>;

  // What the recorder remembers of a field between its edits.
  struct FieldState {
    ssize_t length;
    ssize_t tombstones;
    InsertionCursor insertions;
    InsertionCursor historyInsertions;
    DeletionCursor deletions;
  };
  // The payloads of one field, found for writing; they move when another field is added.
  struct Payloads {
    VectorInsertions* insertions;
    VectorTombstones* tombstones;
    VectorInsertionsAndDeletions* history;
  };

  Payloads FindForWriting(const FieldId& field);
  FieldState& StateOf(const FieldId& field, const Payloads& payloads);
  static void AddInsertedRun(InsertionCursor& cursor, VectorInsertions& insertions, const Opid& first,
                             ssize_t q, ssize_t n);
  static void AddDeletedRun(DeletionCursor& cursor, VectorDeletions& deletions, const Opid& first, ssize_t q,
                            ssize_t n);

  FieldIdToVectorInsertionsMap& m_insertions;
  FieldIdToVectorTombstonesMap& m_tombstones;
  FieldIdToVectorInsertionsAndDeletionsMap& m_history;
  SiteNumbers& m_numbers;
  std::unordered_map<FieldId, FieldState, FieldIdHash> m_fields;
};

}  // namespace vemo
