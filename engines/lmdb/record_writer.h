// How the records of a commit are written.
//
// A commit that changes a few entries of many nodes would rewrite as many pages. So of a record that is there already only what
// changed is written, all changes of a commit together as one value (change_blob.h); what is pending is written into the records
// a slice at a time by later commits, in the order of ids, where neighbours share pages. The slices are as large as keeps the
// pending changes, and so the memory and the time that opening a space takes for them, within bounds. After a round through all
// records that had changes when it began, the blobs of before are dropped.
//
// The idea of a log of small changes beside large sorted runs is that of O'Neil, Cheng, Gawlick and O'Neil, "The log-structured
// merge-tree" (Acta Informatica 33, 1996).
#pragma once

#include <cstdint>
#include <memory>
#include <vector>

#include "engines/lmdb/change_index.h"
#include "engines/lmdb/lmdb_engine.h"
#include "engines/lmdb/space_writer.h"

namespace vemo {

// A round of writing pending changes into records. It is not stored: whoever opens the space begins another.
struct SettlingRound {
  std::shared_ptr<const std::vector<OID>> records;  // null between rounds
  std::size_t next = 0;                             // of these, the first that is not settled yet
  std::uint64_t begin = 0;                          // the commit up to which changes are settled by the end
};

class RecordWriter {
 public:
  // Writes as the commit after the state that `writer` began with. `index` knows the changes up to there.
  RecordWriter(SpaceWriter& writer, const ChangeIndex& index, const SettlingBounds& bounds, SettlingRound round);

  // Writes the commit to the log where that suffices (SpaceWriter::logged), and else the records and what the log has to the
  // tables. Throws DamagedStorage where changes are damaged, also of a record that is to be settled; then nothing may be
  // committed.
  void Write(const CommitBatch& batch);

  // The round as it stands once the commit is made.
  const SettlingRound& round() const noexcept { return m_round; }

 private:
  void WriteRecord(const CommitBatch::Record& record, ChangeBlobBuilder& changes);
  bool TryLog(const CommitBatch& batch, const ChangeIndex::Load& added, ByteView blob);
  void Settle(const std::vector<OID>& touched, const ChangeIndex::Load& added);
  void WriteChanges(ByteView blob);
  void SettleRecord(OID oid);
  void DropBlobs();
  ChangeIndex::Load WithLogged(const ChangeIndex::Load& added) const;
  double LoadOf(const ChangeIndex::Load& load) const noexcept;

  SpaceWriter& m_writer;
  const ChangeIndex& m_index;
  const SettlingBounds m_bounds;
  SettlingRound m_round;
  const std::uint64_t m_commit;
  const LogTail& m_tail;
  ChangesRange m_kept;  // of all changes once the commit is made, those of the log among them
  bool m_isSmall = false;
  bool m_hasWhole = false;  // records are written as a whole
  Bytes m_changed;          // the record that is being settled
};

}  // namespace vemo
