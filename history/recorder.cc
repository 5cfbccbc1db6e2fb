#include "history/recorder.h"

#include <string>

#include "platform/error.h"
#include "vxPersistStore/MutationScope.h"

namespace vemo {

namespace {

std::size_t Mix(std::size_t seed, std::uint64_t value) noexcept {
  value *= 0x9E3779B97F4A7C15u;
  return (seed ^ (value >> 32) ^ value) * 0xBF58476D1CE4E5B9u;
}

[[noreturn]] void RefuseEdit(const FieldId& field, const std::string& reason) {
  throw UsageError("field " + FieldIdText(field) + ": " + reason);
}

void RequireWithin(const FieldId& field, ssize_t position, ssize_t limit, ssize_t length) {
  if (position < 0 || position > limit) {
    RefuseEdit(field, "live position " + std::to_string(position) + " is out of range; the field has " +
                          std::to_string(length) + " live elements");
  }
}

// Finds the payload of `field` for writing in place, made if missing, with its leaf marked.
template <class Map>
auto* FindAndMark(Map& map, const FieldId& field) {
  typename Map::wFindRet found;
  map.wFind(found, field, true);
  found.m_leaf->MarkAsDirtyWithoutTrace();
  return found.m_payload;
}

}  // namespace

std::size_t GuidHash::operator()(const Guid& guid) const noexcept {
  std::uint64_t halves[2];
  std::memcpy(halves, &guid, sizeof(guid));
  return Mix(Mix(0, halves[0]), halves[1]);
}

std::size_t FieldIdHash::operator()(const FieldId& field) const noexcept {
  std::size_t hash = Mix(0, field.oid.m_value);
  for (const Path::Element element : field.path.elements()) hash = Mix(hash, element);
  return hash;
}

ssize_t SiteNumbers::Next(const Guid& site) const {
  const auto found = m_next.find(site);
  return found == m_next.end() ? 0 : found->second;
}

void SiteNumbers::RequireRoom(const Guid& site, ssize_t n) const {
  if (n > kMaxRecordedNumber + 1 - Next(site)) {
    throw UsageError("site " + GuidText(site) + " has no " + std::to_string(n) +
                     " operation numbers left; numbers end at " + std::to_string(kMaxRecordedNumber));
  }
}

ssize_t SiteNumbers::Take(const Guid& site, ssize_t n) {
  RequireRoom(site, n);
  ssize_t& next = m_next[site];
  next += n;
  return next - n;
}

ssize_t Recorder::LiveLength(const FieldId& field) const {
  const auto known = m_fields.find(field);
  if (known != m_fields.end()) return known->second.length - known->second.tombstones;
  const VectorInsertions* insertions = m_insertions.rFind(field);
  if (insertions == nullptr) return 0;
  const VectorTombstones* tombstones = m_tombstones.rFind(field);
  return insertions->m_u2 - (tombstones == nullptr ? 0 : tombstones->NumTombstones());
}

Recorder::Payloads Recorder::FindForWriting(const FieldId& field) {
  return {FindAndMark(m_insertions, field), FindAndMark(m_tombstones, field), FindAndMark(m_history, field)};
}

Recorder::FieldState& Recorder::StateOf(const FieldId& field, const Payloads& payloads) {
  const auto known = m_fields.find(field);
  if (known != m_fields.end()) return known->second;
  FieldState state{payloads.insertions->m_u2, payloads.tombstones->NumTombstones(),
                   InsertionCursor(payloads.insertions->m_c),
                   InsertionCursor(payloads.history->m_insertions.m_c),
                   DeletionCursor(payloads.history->m_deletions)};
  return m_fields.emplace(field, state).first->second;
}

void Recorder::Insert(const Guid& site, const FieldId& field, ssize_t position, ssize_t n) {
  const ssize_t live = LiveLength(field);
  RequireWithin(field, position, live, live);
  if (n <= 0) RefuseEdit(field, "an insertion of " + std::to_string(n) + " elements");
  const auto known = m_fields.find(field);
  const VectorInsertions* stored = known == m_fields.end() ? m_insertions.rFind(field) : nullptr;
  const ssize_t length = known != m_fields.end() ? known->second.length
                         : stored != nullptr     ? stored->m_u2
                                                 : 0;
  if (n > kMaxRecordedNumber - length) {
    RefuseEdit(field, "it cannot grow by " + std::to_string(n) + " elements; positions end at " +
                          std::to_string(kMaxRecordedNumber));
  }
  m_numbers.RequireRoom(site, n);

  MutationScope scope(&m_insertions);
  const Payloads payloads = FindForWriting(field);
  FieldState& state = StateOf(field, payloads);
  const ssize_t q = position == 0 ? 0 : payloads.tombstones->GetQ(position - 1) + 1;
  const Opid first{site, m_numbers.Next(site)};
  AddInsertedRun(state.insertions, *payloads.insertions, first, q, n);
  AddInsertedRun(state.historyInsertions, payloads.history->m_insertions, first, q, n);
  payloads.tombstones->Insert(q, n);
  state.deletions.Seek(q);
  state.deletions.Shift(n);
  state.length += n;
  m_numbers.Take(site, n);
  scope.Complete();
}

void Recorder::Delete(const Guid& site, const FieldId& field, ssize_t position, ssize_t n) {
  const ssize_t live = LiveLength(field);
  RequireWithin(field, position, live, live);
  if (n <= 0) RefuseEdit(field, "a deletion of " + std::to_string(n) + " elements");
  if (n > live - position) {
    RefuseEdit(field, "a deletion of " + std::to_string(n) + " elements at live position " +
                          std::to_string(position) + " is out of range; the field has " +
                          std::to_string(live) + " live elements");
  }
  m_numbers.RequireRoom(site, n);

  MutationScope scope(&m_insertions);
  const Payloads payloads = FindForWriting(field);
  FieldState& state = StateOf(field, payloads);
  IntervalList<ssize_t> erased;
  payloads.tombstones->Erasep(position, n, erased);
  ssize_t number = m_numbers.Next(site);
  for (ssize_t i = 0; i < erased.size(); ++i) {
    AddDeletedRun(state.deletions, payloads.history->m_deletions, Opid{site, number}, erased[i].t1,
                  erased[i].size());
    number += erased[i].size();
  }
  state.tombstones += n;
  m_numbers.Take(site, n);
  scope.Complete();
}

void Recorder::AddInsertedRun(InsertionCursor& cursor, VectorInsertions& insertions, const Opid& first,
                              ssize_t q, ssize_t n) {
  cursor.Seek(q);
  auto* before = cursor.before();
  if (before != nullptr && before->m_q + before->m_n > q) {
    VectorInsertionInterval tail = *before;
    const ssize_t kept = q - before->m_q;
    tail.m_opid.t += kept;
    tail.m_q = q;
    tail.m_n -= kept;
    cursor.InsertAfter(insertions.m_c, tail);
    before->m_n = kept;
    before->m_u = before->m_opid.t + kept - 1;
  }
  cursor.Shift(n);
  const bool continues = before != nullptr && before->m_opid.s == first.s && before->m_u + 1 == first.t &&
                         before->m_q + before->m_n == q;
  if (continues) {
    before->m_n += n;
    before->m_u += n;
  } else {
    VectorInsertionInterval run;
    run.m_opid = first;
    run.m_q = q;
    run.m_n = n;
    run.m_u = first.t + n - 1;
    cursor.InsertBefore(insertions.m_c, run);
  }
  insertions.m_u2 += n;
}

void Recorder::AddDeletedRun(DeletionCursor& cursor, VectorDeletions& deletions, const Opid& first, ssize_t q,
                             ssize_t n) {
  cursor.Seek(q);
  auto* before = cursor.before();
  const bool continues = before != nullptr && before->m_opid.s == first.s &&
                         before->m_opid.t + before->m_n == first.t && before->m_q + before->m_n == q;
  if (continues) {
    before->m_n += n;
    return;
  }
  VectorDeletionInterval run;
  run.m_opid = first;
  run.m_q = q;
  run.m_n = n;
  cursor.InsertBefore(deletions, run);
}

void Recorder::Settle() noexcept {
  for (auto& [field, state] : m_fields) {
    state.insertions.Settle();
    state.historyInsertions.Settle();
    state.deletions.Settle();
  }
  m_fields.clear();
}

}  // namespace vemo
