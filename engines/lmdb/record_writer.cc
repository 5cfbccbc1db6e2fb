#include "engines/lmdb/record_writer.h"

#include <algorithm>
#include <cmath>
#include <map>
#include <optional>
#include <utility>

#include "engines/lmdb/change_log.h"
#include "engines/record_delta.h"

namespace vemo {

namespace {

// A delta may be that long whatever the record's size: the record of a map changes with every entry that comes or goes.
constexpr std::size_t kAlwaysShortBytes = 64;
// Where all of a small commit are deltas, it goes to the log and waits for one flush instead of two: they may be longer there.
constexpr std::size_t kFewRecords = 8;
constexpr std::size_t kShortForTheLogBytes = 1024;
// The load, of which 1 is the bound, at which a round begins, and how much may come on top until it ends.
constexpr double kRoundBegins = 0.5;
constexpr double kRoundAdds = 0.4;
// How much of a bound the log may have.
constexpr double kLogMayHold = 0.25;
// The most that waits, as a part of what the records take, where that is less than the bound, and what may always wait.
constexpr std::uint64_t kPartOfRecords = 5;
constexpr std::uint64_t kAlwaysFewBytes = std::uint64_t{1} << 20;

SettlingBounds BoundsFor(SettlingBounds bounds, const SpaceState& state) {
  const TableRoot& records = state.Table(kRecordsTable)->root;
  const std::uint64_t bytes = (records.leafPages + records.overflowPages) * state.pageBytes;
  bounds.bytes = std::max<std::uint64_t>(1, std::min(bounds.bytes, std::max(bytes / kPartOfRecords, kAlwaysFewBytes)));
  bounds.commits = std::max<std::uint64_t>(1, bounds.commits);
  bounds.records = std::max<std::uint64_t>(1, bounds.records);
  return bounds;
}

}  // namespace

RecordWriter::RecordWriter(SpaceWriter& writer, const ChangeIndex& index, const SettlingBounds& bounds, SettlingRound round)
    : m_writer(writer),
      m_index(index),
      m_bounds(BoundsFor(bounds, *writer.state().data->state)),
      m_round(std::move(round)),
      m_commit(writer.state().Commit() + 1),
      m_tail(*writer.state().log.tail),
      m_kept(writer.state().data->numbers.changes) {
  const auto logged = m_tail.ChangingBounds(m_commit - 1);
  if (!logged) return;
  if (m_kept.first == 0) m_kept.first = logged->first;
  m_kept.last = logged->second;
}

void RecordWriter::Write(const CommitBatch& batch) {
  if (m_index.HasDamage() || m_tail.HasDamage(m_commit)) {
    m_writer.FailChanges("the changes of a commit are damaged, so that nothing may be written");
  }
  m_isSmall = batch.records.size() <= kFewRecords;
  for (const OID oid : batch.removedRecords) m_writer.RemoveRecord(oid);
  // In the order of ids, so that neighbours are written while their page is at hand.
  std::vector<const CommitBatch::Record*> sorted;
  sorted.reserve(batch.records.size());
  for (const CommitBatch::Record& record : batch.records) sorted.push_back(&record);
  std::sort(sorted.begin(), sorted.end(), [](const auto* a, const auto* b) { return a->oid < b->oid; });
  std::vector<OID> touched(batch.removedRecords);
  for (const CommitBatch::Record* record : sorted) touched.push_back(record->oid);
  std::sort(touched.begin(), touched.end());
  ChangeBlobBuilder changes(m_commit);
  for (const CommitBatch::Record* record : sorted) WriteRecord(*record, changes);
  const Bytes blob = changes.empty() ? Bytes() : changes.Finish(m_kept.last);
  const ChangeIndex::Load added{blob.size(), blob.empty() ? 0u : 1u, changes.count()};
  if (TryLog(batch, added, blob)) return;

  if (!blob.empty()) {
    if (m_kept.first == 0) m_kept.first = m_commit;
    m_kept.last = m_commit;
  }
  Settle(touched, WithLogged(added));
  WriteChanges(blob);
}

// The log must not grow so far that the next commit of tables has to settle all at once.
bool RecordWriter::TryLog(const CommitBatch& batch, const ChangeIndex::Load& added, ByteView blob) {
  const bool hasDeletions =
      !batch.removedRecords.empty() || !batch.queuedDeletions.empty() || !batch.finishedDeletions.empty();
  if (m_hasWhole || hasDeletions || !m_writer.MayLog()) return false;
  std::map<std::string_view, std::optional<ByteView>> meta;  // of a name that is there more than once the last value counts
  for (const CommitBatch::NamedValue& named : batch.namedValues) {
    if (named.table != NamedTable::kMeta) return false;
    meta[named.name] = named.value ? std::optional(ByteView(*named.value)) : std::nullopt;
  }
  if (LoadOf(WithLogged(added)) > kLogMayHold) return false;
  if (LoadOf(m_index.CurrentLoad()) >= kRoundBegins + kRoundAdds) return false;
  if (!m_writer.HasLog()) {
    m_writer.MakeLog();
    return false;
  }
  std::vector<LoggedCommit::MetaValue> values;
  for (const auto& [name, value] : meta) values.push_back({name, value});
  return m_writer.Log(m_commit, PayloadOf(blob, values));
}

void RecordWriter::WriteRecord(const CommitBatch::Record& record, ChangeBlobBuilder& changes) {
  const bool isTooMuch = changes.bytes() > m_bounds.bytes / 2 || changes.count() > m_bounds.records / 2;
  if (const auto stored = isTooMuch ? std::nullopt : m_writer.Stored(record.oid)) {
    const std::size_t mostBytes = std::max(record.bytes.size() / 2, m_isSmall ? kShortForTheLogBytes : kAlwaysShortBytes);
    if (const std::optional<Bytes> delta = RecordDelta(stored->record, record.bytes, mostBytes)) {
      changes.Add(record.oid, *delta);
      return;
    }
  }
  m_writer.PutRecord(record.oid, m_commit, record.bytes);
  m_hasWhole = true;
}

double RecordWriter::LoadOf(const ChangeIndex::Load& load) const noexcept {
  const auto part = [](std::uint64_t n, std::uint64_t of) { return static_cast<double>(n) / static_cast<double>(of); };
  return std::max({part(load.bytes, m_bounds.bytes), part(load.blobs, m_bounds.commits), part(load.records, m_bounds.records)});
}

ChangeIndex::Load RecordWriter::WithLogged(const ChangeIndex::Load& added) const {
  const LogTail::Size logged = m_tail.CurrentSize();
  return {added.bytes + logged.bytes, added.blobs + logged.commits, added.records + logged.records};
}

// A record that this commit touches is left alone: its new change leads from the record as it is stored. `added` is what has
// been added since the last commit of tables.
void RecordWriter::Settle(const std::vector<OID>& touched, const ChangeIndex::Load& added) {
  if (m_round.records == nullptr) {
    if (LoadOf(m_index.CurrentLoad()) < kRoundBegins) return;
    m_round = {std::make_shared<const std::vector<OID>>(m_index.Records()), 0, m_commit - 1};
  }
  const std::vector<OID>& records = *m_round.records;
  // What writers that come and go have left of their rounds adds up, until one of them writes all of it.
  const bool isLate = LoadOf(m_index.CurrentLoad()) >= kRoundBegins + kRoundAdds;
  const double part = isLate ? 1 : std::min(1.0, LoadOf(added) / kRoundAdds);
  const auto slice = static_cast<std::size_t>(std::ceil(static_cast<double>(records.size()) * part));
  const std::size_t end = std::min(records.size(), m_round.next + std::max<std::size_t>(slice, 1));
  for (; m_round.next < end; ++m_round.next) {
    const OID oid = records[m_round.next];
    if (!std::binary_search(touched.begin(), touched.end(), oid)) SettleRecord(oid);
  }
  if (m_round.next == records.size()) DropBlobs();
}

// Nothing to do for a record that was removed, or written whole meanwhile.
void RecordWriter::SettleRecord(OID oid) {
  const std::optional<StoredRecord> stored = m_writer.Stored(oid);
  const std::optional<ChangeIndex::Version> version = m_index.Find(oid, m_commit - 1);
  if (!stored || !version || version->commit <= stored->commit) return;
  m_writer.PutRecord(oid, m_commit, m_writer.CurrentRecord(oid, m_index, m_changed));
}

void RecordWriter::DropBlobs() {
  m_kept.first = m_kept.last == m_commit ? m_commit : 0;
  for (const std::uint64_t commit : m_index.Commits()) {
    if (commit > m_round.begin) {
      m_kept.first = commit;
      break;
    }
    if (commit <= m_tail.base()) m_writer.RemoveChanges(commit);
  }
  if (m_kept.first == 0) m_kept.last = 0;
  m_round = {};
}

// Those of the log that are still needed, and `blob`, those of this commit.
void RecordWriter::WriteChanges(ByteView blob) {
  for (const std::uint64_t commit : m_tail.Changing(m_tail.base(), m_commit - 1)) {
    const bool isKept = m_kept.first != 0 && commit >= m_kept.first;
    if (isKept) m_writer.PutChanges(commit, *m_tail.Changes(commit));
  }
  if (!blob.empty()) m_writer.PutChanges(m_commit, blob);
  const ChangesRange& before = m_writer.state().data->numbers.changes;
  if (m_kept.first != before.first) m_writer.PutFirstChanges(m_kept.first);
  if (m_kept.last != before.last) m_writer.PutLastChanges(m_kept.last);
}

}  // namespace vemo
