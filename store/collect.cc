#include "store/collect.h"

#include <algorithm>
#include <optional>

#include "platform/error.h"
#include "store/commit_builder.h"
#include "store/envelope.h"
#include "store/reach.h"
#include "store/snapshot.h"
#include "store/transaction.h"

namespace vemo {

namespace {

// How many records a transaction of the sweep looks at, so that others need not wait where there is little to remove.
constexpr std::uint64_t kScannedPerTransaction = 65'536;

class Collection {
 public:
  Collection(CSpace& space, const CollectOptions& options) : m_space(space), m_options(options) {}

  CollectReport Run() {
    if (!m_options.dryRun && WriteTransaction::OnThisThread() != nullptr) {
      throw UsageError(m_space.Name() + ": a transaction is open on this thread; collect before or after it");
    }
    if (Mark() && !m_options.dryRun && WorkOffQueue()) Sweep();
    return m_report;
  }

 private:
  using Phase = CollectProgress::Phase;

  // False when the caller wants to end.
  bool Tell(Phase phase, std::uint64_t done, std::uint64_t of) {
    if (m_options.progress && !m_options.progress({phase, done, of})) m_report.cancelled = true;
    return !m_report.cancelled;
  }

  // The snapshot ends with the marking, so that the sweep does not run beside a reader of its own who keeps every page.
  bool Mark() {
    Snapshot snapshot(m_space, "collection");
    m_commit = snapshot.Generation();
    const std::uint64_t total = m_space.Usage().records;
    const auto goOn = [this, total](std::uint64_t done) { return Tell(Phase::kMarking, done, total); };
    Reach reach(snapshot, goOn);
    if (!reach.Run()) return false;
    m_kept = reach.TakeReached();
    m_report.marked = m_kept.size();
    m_report.awaitingDeletion = reach.NumAwaitingDeletion();
    snapshot.Objects().State().ScanRecords(OID(), [this](OID oid, ByteView record) {
      ++m_report.records;
      if (m_kept.Contains(oid)) return true;
      ++m_report.unreachable;
      m_report.unreachableBytes += record.size();
      if (!IsSealed(oid, record)) m_damaged.Insert(oid);
      return true;
    });
    m_report.marked -= m_report.awaitingDeletion;
    return true;
  }

  static bool IsSealed(OID oid, ByteView record) {
    try {
      OpenRecord(record, oid);
      return true;
    } catch (const MalformedBytes&) {
      return false;
    }
  }

  // As commits do, only in larger slices. What others queue meanwhile is left to them.
  bool WorkOffQueue() {
    const std::uint64_t total = m_report.awaitingDeletion;
    for (std::uint64_t done = 0; done < total;) {
      const std::uint64_t entries = DeleteSlice();
      if (entries == 0) break;
      done = std::min(total, done + entries);
      if (!Tell(Phase::kDeleting, done, total)) return false;
    }
    return true;
  }

  std::uint64_t DeleteSlice() {
    WriteTransaction transaction(m_space);
    const std::uint64_t entries = transaction.BaseState().QueuedDeletions(m_options.recordsPerCommit).size();
    if (entries == 0) return 0;
    transaction.SetQueueSlice(m_options.recordsPerCommit);
    transaction.Commit();
    return entries;
  }

  void Sweep() {
    for (std::optional<OID> next = OID(); next;) {
      next = SweepSlice(*next);
      if (!Tell(Phase::kSweeping, m_report.swept, m_report.unreachable)) return;
    }
  }

  // Removes unreachable records from `first` on, up to one commit's worth. Returns where to go on, if there is more.
  std::optional<OID> SweepSlice(OID first) {
    WriteTransaction transaction(m_space);
    std::optional<OID> next;
    std::uint64_t removed = 0, bytes = 0, scanned = 0;
    transaction.BaseState().ScanRecords(first, [&](OID oid, ByteView record) {
      if (removed == m_options.recordsPerCommit || scanned == kScannedPerTransaction) {
        next = oid;
        return false;
      }
      ++scanned;
      if (!IsUnreachable(oid, record)) return true;
      transaction.DropUnreachable(oid);
      ++removed;
      bytes += record.size();
      return true;
    });
    if (removed > 0) transaction.Commit();
    m_report.swept += removed;
    m_report.sweptBytes += bytes;
    return next;
  }

  // Whether the record was there when the marking was, and was not reached. The commit that a damaged one names is no evidence.
  bool IsUnreachable(OID oid, ByteView record) const {
    if (m_kept.Contains(oid)) return false;
    return IsSealed(oid, record) ? CommitOfRecord(record) <= m_commit : m_damaged.Contains(oid);
  }

  CSpace& m_space;
  const CollectOptions& m_options;
  CollectReport m_report;
  std::uint64_t m_commit = 0;
  IdSet m_kept;     // reached, or on the way out by the queue
  IdSet m_damaged;  // unreached records of m_commit that no longer tell which commit wrote them
};

}  // namespace

CollectReport Collect(CSpace& space, const CollectOptions& options) {
  if (options.recordsPerCommit == 0) throw UsageError(space.Name() + ": a collection removes at least one record a commit");
  return Collection(space, options).Run();
}

}  // namespace vemo
