#include "store/commit_outcome.h"

#include <algorithm>
#include <map>
#include <utility>

namespace vemo {

namespace {

enum class Outcome { kNotApplied, kApplied, kOvertaken, kUnknown };

bool Equal(const std::optional<ByteView>& stored, ByteView wanted) {
  return stored && std::equal(stored->begin(), stored->end(), wanted.begin(), wanted.end());
}

bool Shows(const EngineSnapshot& state, const CommitBatch& batch) {
  for (const CommitBatch::Record& record : batch.records) {
    if (!Equal(state.Read(record.oid), record.bytes)) return false;
  }
  for (const OID oid : batch.removedRecords) {
    if (state.Read(oid)) return false;
  }
  std::map<std::pair<NamedTable, std::string_view>, const std::optional<Bytes>*> named;  // the last one of a name counts
  for (const CommitBatch::NamedValue& value : batch.namedValues) {
    named.insert_or_assign({value.table, value.name}, &value.value);
  }
  for (const auto& [place, value] : named) {
    const std::optional<ByteView> stored = state.ReadNamed(place.first, place.second);
    if (*value ? !Equal(stored, **value) : stored.has_value()) return false;
  }
  return true;
}

Outcome LookForOutcome(Engine& engine, const CommitBatch& batch) {
  try {
    const auto state = engine.OpenSnapshot();
    if (state->Generation() == batch.expectedGeneration) return Outcome::kNotApplied;
    if (state->Generation() != batch.expectedGeneration + 1) return Outcome::kUnknown;
    return Shows(*state, batch) ? Outcome::kApplied : Outcome::kOvertaken;
  } catch (const std::exception&) {
    return Outcome::kUnknown;
  }
}

[[noreturn]] void ThrowUnknown(const Engine& engine, const CommitBatch& batch, const std::string& reason) {
  throw UnknownOutcome(engine.Name() + ": whether commit " + std::to_string(batch.expectedGeneration + 1) +
                       " was made is not known (" + reason +
                       "); end this transaction, and look in the next whether the change is there");
}

}  // namespace

std::uint64_t CommitAndSettle(Engine& engine, const CommitBatch& batch) {
  const std::uint64_t next = batch.expectedGeneration + 1;
  try {
    return engine.Commit(batch);
  } catch (const UnknownOutcome& unknown) {
    switch (LookForOutcome(engine, batch)) {
      case Outcome::kApplied: return next;
      case Outcome::kNotApplied:
        throw StoreError(engine.Name() + ": nothing was committed, as reading the space back shows (" + unknown.what() +
                         "); try again");
      case Outcome::kOvertaken: throw StaleGeneration(batch.expectedGeneration, next);
      case Outcome::kUnknown: break;
    }
    ThrowUnknown(engine, batch, unknown.what());
  } catch (const StaleGeneration&) {
    if (LookForOutcome(engine, batch) == Outcome::kApplied) return next;
    throw;
  } catch (const StoreError& failure) {
    if (LookForOutcome(engine, batch) == Outcome::kApplied) ThrowUnknown(engine, batch, failure.what());
    throw;
  }
}

}  // namespace vemo
