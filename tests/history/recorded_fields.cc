#include "recorded_fields.h"

namespace vemo::test {

namespace {

template <class Run>
std::string RunText(const Run& run) {
  std::string text(1, static_cast<char>(run.m_opid.s.Data1));
  text += std::to_string(run.m_opid.t);
  if (run.m_n > 1) text += "-" + std::to_string(run.m_opid.t + run.m_n - 1);
  return text + "@" + std::to_string(run.m_q);
}

template <class List>
std::string ListText(const List& runs) {
  std::string text;
  for (const auto* run = runs.m_first; run != nullptr; run = run->m_next) {
    if (!text.empty()) text += ' ';
    text += RunText(*run);
  }
  return text;
}

// The node behind which to append; null in an empty list.
template <class List>
auto* LastOf(const List& runs) {
  auto* last = runs.m_first;
  while (last != nullptr && last->m_next != nullptr) last = last->m_next;
  return last;
}

}  // namespace

Guid Site(char name) {
  Guid site;
  site.Data1 = static_cast<std::uint32_t>(name);
  site.Data4[7] = 1;
  return site;
}

FieldId Field(std::uint64_t object, Path::Element step) {
  return {OID(object), Path{step}};
}

std::string RunsText(const VectorInsertions::List& runs) {
  return ListText(runs);
}
std::string RunsText(const VectorDeletions& runs) {
  return ListText(runs);
}

void AppendRun(VectorInsertions& insertions, const Opid& first, ssize_t n) {
  VectorInsertionInterval run;
  run.m_opid = first;
  run.m_q = insertions.m_u2;
  run.m_n = n;
  run.m_u = first.t + n - 1;
  insertions.m_c.InsertAfter(LastOf(insertions.m_c), run);
  insertions.m_u2 += n;
}

void AppendRun(VectorDeletions& deletions, const Opid& first, ssize_t q, ssize_t n) {
  VectorDeletionInterval run;
  run.m_opid = first;
  run.m_q = q;
  run.m_n = n;
  deletions.InsertAfter(LastOf(deletions), run);
}

PayloadBytes CommittedBytes(CSpace& space) {
  Snapshot snapshot(space);
  PayloadBytes bytes;
  AddPayloadBytes(snapshot.Root<FieldIdToVectorInsertionsMap>(kInsertionsRoot), kInsertionsRoot, bytes);
  AddPayloadBytes(snapshot.Root<FieldIdToVectorTombstonesMap>(kTombstonesRoot), kTombstonesRoot, bytes);
  AddPayloadBytes(snapshot.Root<FieldIdToVectorInsertionsAndDeletionsMap>(kHistoryRoot), kHistoryRoot, bytes);
  return bytes;
}

void RecordingSpace::Begin() {
  m_transaction.emplace(*m_space);
  m_recorder.emplace(insertions(), tombstones(), history(), m_numbers);
}

void RecordingSpace::Commit() {
  Settle();
  m_recorder.reset();
  m_transaction->Commit();
  m_transaction.reset();
  Begin();
}

void RecordingSpace::Abort() {
  m_recorder.reset();
  m_transaction.reset();
  Begin();
}

std::unique_ptr<CSpace> RecordingSpace::Release() {
  m_recorder.reset();
  m_transaction.reset();
  return std::move(m_space);
}

PayloadBytes RecordingSpace::Contents() {
  Settle();
  PayloadBytes bytes;
  AddPayloadBytes(std::as_const(insertions()), kInsertionsRoot, bytes);
  AddPayloadBytes(std::as_const(tombstones()), kTombstonesRoot, bytes);
  AddPayloadBytes(std::as_const(history()), kHistoryRoot, bytes);
  return bytes;
}

}  // namespace vemo::test
