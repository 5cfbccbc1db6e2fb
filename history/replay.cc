#include "history/replay.h"

#include "history/edit_digest.h"
#include "history/meta_number.h"
#include "history/recorder.h"
#include "platform/error.h"
#include "store/transaction.h"

namespace vemo {

namespace {

// Feeds a recorder, a transaction a batch.
class Replayer : public EditVisitor {
 public:
  Replayer(CSpace& space, EditSource& source, const ReplayOptions& options)
      : m_space(space), m_source(source), m_options(options), m_prefix(ReplayMetaPrefix(source)) {}

  ReplayReport Run() {
    BeginBatch();
    Start();
    m_source.Replay(*this);
    if (m_index < m_applied)
      RefuseResume("it has " + std::to_string(m_index) + " edits, fewer than are recorded");
    if (m_index == m_applied && m_report.editsApplied == 0) RequireSameBeginning();
    CommitBatch();
    m_report.edits = m_index;
    return m_report;
  }

  void OnSite(const Guid& site, std::string_view author) override {
    ++m_report.sites;
    const std::string startName = m_prefix + "start/" + GuidText(site);
    const std::string nextName = NextNumberMetaName(site);
    if (const auto start = m_txn->Meta(startName)) {
      m_numbers.SetNext(site, static_cast<ssize_t>(ParseMetaNumber(startName, *start)));
      return;
    }
    const auto next = m_txn->Meta(nextName);
    m_numbers.SetNext(site, next ? static_cast<ssize_t>(ParseMetaNumber(nextName, *next)) : 0);
    m_txn->SetMeta(startName, std::to_string(m_numbers.Next(site)));
    m_txn->SetMeta(SiteMetaName(site), author);
  }

  void OnObject(OID object, std::string_view path) override {
    ++m_report.objects;
    if (IsNew()) m_txn->SetMeta(ObjectMetaName(object), path);
  }

  void OnCommit(const Commit& commit) override {
    ++m_report.sourceCommits;
    m_commitToName = commit.id;
  }

  void OnEdit(const Edit& edit) override {
    const auto n = static_cast<ssize_t>(edit.inserted.size()) + edit.deleted;
    if (m_index == m_applied) RequireSameBeginning();
    m_digest.Add(edit);
    if (!m_commitToName.empty()) {
      if (IsNew()) m_txn->SetMeta(CommitMetaName(edit.site, m_numbers.Next(edit.site)), m_commitToName);
      m_commitToName.clear();
    }
    if (IsNew()) {
      Apply(edit);
    } else {
      m_numbers.Take(edit.site, n);
    }
    ++m_index;
    if (m_options.progress) m_options.progress(m_index);
    if (m_editsInBatch >= m_options.batchEdits) {
      CommitBatch();
      BeginBatch();
    }
  }

 private:
  bool IsNew() const { return m_index >= m_applied; }

  void Apply(const Edit& edit) {
    if (edit.deleted > 0) {
      m_recorder->Delete(edit.site, edit.field, edit.position, edit.deleted);
    } else {
      m_recorder->Insert(edit.site, edit.field, edit.position, static_cast<ssize_t>(edit.inserted.size()));
    }
    m_report.elementsDeleted += static_cast<std::uint64_t>(edit.deleted);
    m_report.elementsInserted += edit.inserted.size();
    ++m_report.editsApplied;
    ++m_editsInBatch;
  }

  void BeginBatch() {
    m_txn.emplace(m_space);
    m_recorder.emplace(m_txn->Root<FieldIdToVectorInsertionsMap>(kInsertionsRoot),
                       m_txn->Root<FieldIdToVectorTombstonesMap>(kTombstonesRoot),
                       m_txn->Root<FieldIdToVectorInsertionsAndDeletionsMap>(kHistoryRoot), m_numbers);
    m_editsInBatch = 0;
  }

  void CommitBatch() {
    m_recorder->Settle();
    m_recorder.reset();
    if (IsNew()) {
      for (const auto& [site, next] : m_numbers.All())
        m_txn->SetMeta(NextNumberMetaName(site), std::to_string(next));
      m_txn->SetMeta(m_prefix + "edits", std::to_string(m_index));
      m_txn->SetMeta(m_prefix + "digest", m_digest.Text());
    }
    m_txn->Commit();
    m_txn.reset();
    ++m_report.storeCommits;
  }

  // Where the replay begins: at the first edit, or behind the last one applied.
  void Start() {
    const auto applied = m_txn->Meta(m_prefix + "edits");
    if (applied && m_options.resume) {
      m_applied = ParseMetaNumber(m_prefix + "edits", *applied);
      m_digestApplied = m_txn->Meta(m_prefix + "digest").value_or("");
      return;
    }
    const auto& insertions = m_txn->View<FieldIdToVectorInsertionsMap>(kInsertionsRoot);
    const std::optional<FieldId> field = m_source.OnlyField();
    if (applied || (field ? insertions.contains(*field) : !insertions.empty())) {
      throw UsageError(
          m_space.Name() + ": " +
          (field ? "field " + FieldIdText(*field) + " exists already"
                 : std::string("it holds fields already, and a repository wants a space of its own")) +
          "; go on with --resume, or replay into a new space");
    }
  }

  // At the point from where edits are new: everything before must be what was recorded.
  void RequireSameBeginning() {
    if (m_applied == 0) return;
    if (m_digest.Text() != m_digestApplied)
      RefuseResume("its first " + std::to_string(m_applied) + " edits are others");
    for (const auto& [site, next] : m_numbers.All()) {
      const std::string name = NextNumberMetaName(site);
      const auto stored = m_txn->Meta(name);
      if (stored && static_cast<ssize_t>(ParseMetaNumber(name, *stored)) != next) {
        throw UsageError(m_space.Name() + ": site " + GuidText(site) +
                         " has recorded other operations since this replay stopped, so it cannot be resumed");
      }
    }
  }

  [[noreturn]] void RefuseResume(const std::string& reason) {
    throw UsageError(m_space.Name() + ": " + m_source.Describe() +
                     " is not what was replayed before: " + reason);
  }

  CSpace& m_space;
  EditSource& m_source;
  const ReplayOptions& m_options;
  std::string m_prefix;
  SiteNumbers m_numbers;
  EditDigest m_digest;
  std::uint64_t m_index = 0;    // of the next edit
  std::uint64_t m_applied = 0;  // edits recorded before this run
  std::string m_digestApplied;
  std::string m_commitToName;  // the commit that has no operation yet
  std::uint64_t m_editsInBatch = 0;
  ReplayReport m_report;
  std::optional<WriteTransaction> m_txn;
  std::optional<Recorder> m_recorder;
};

}  // namespace

std::string SiteMetaName(const Guid& site) {
  return "site/" + GuidText(site);
}
std::string NextNumberMetaName(const Guid& site) {
  return "next/" + GuidText(site);
}
std::string CommitMetaName(const Guid& site, ssize_t firstNumber) {
  return "commit/" + GuidText(site) + "/" + HexText(static_cast<std::uint64_t>(firstNumber));
}
std::string ObjectMetaName(OID object) {
  return "object/" + HexText(object.m_value);
}
std::string ReplayMetaPrefix(const EditSource& source) {
  const std::optional<FieldId> field = source.OnlyField();
  return "replay/" + (field ? FieldIdText(*field) : std::string("git")) + "/";
}

ReplayReport Replay(CSpace& space, EditSource& source, const ReplayOptions& options) {
  return Replayer(space, source, options).Run();
}

}  // namespace vemo
